// The data flattener's stream state: the context of one save or load (PersistTDData) and the
// writer that adds a version, that context and options to the runtime's binary writer. Both are
// exported; this is their module's header.
#pragma once

#include "vellum/DataStreams.h"
