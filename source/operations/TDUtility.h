// Type utilities: small questions about descriptors, the value text, and the shared error
// cluster.
#pragma once

#include "source/model/TD.h"
#include "vellum/TDUtility.h"
