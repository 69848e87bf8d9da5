// Ordering of typed data: the comparison of any datum by its descriptor and the registration
// table of comparisons that families supply for their type codes.
#pragma once

#include "source/model/TD.h"
#include "vellum/TDCompare.h"
