// The byte-string interface that hosts hand to the library, and CQXLStr over an LStr handle.
// The classes are exported; nothing private is added here.
#pragma once

#include "vellum/QXLStr.h"
