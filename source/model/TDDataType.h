// The handle classes `TD`, `TDR`, `TDW` and the typed-handle support: construction and admission,
// check-in, check-out and clone, the common setters and the recursive walks.
#pragma once

#include "source/model/TD.h"
#include "vellum/TDAttributeHandles.h"
#include "vellum/TDHandles.h"
