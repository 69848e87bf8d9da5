// The host API: the session, the holders, one value flattened and read back, and the reason of a
// refusal. Everything here is exported; this is the module's header.
#pragma once

#include "vellum/Host.h"
