// The data unflattener's stream state: the runtime's binary reader with the version of the
// format being read, the persist context, options and the variable-size field. Exported; this is
// the module's header.
#pragma once

#include "vellum/DataStreams.h"
