// The textual type notation: the exported entry points live in include/vellum/TypeNotation.h.
#pragma once

#include "vellum/TypeNotation.h"
