// Type lists: the exported class lives in include/vellum/TMTypeList.h.
#pragma once

#include "vellum/TMTypeList.h"
