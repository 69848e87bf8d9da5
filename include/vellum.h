// Everything a host needs from vellum, in one include.
#pragma once

#include "vellum/QualifiedName.h"
#include "vellum/QXLStr.h"
#include "vellum/TDAttributeHandles.h"
#include "vellum/TDEnumHandles.h"
#include "vellum/TDHandles.h"
#include "vellum/TDLayout.h"
#include "vellum/TDNumericHandles.h"
#include "vellum/TDSimpleHandles.h"
#include "vellum/TDUnitsHandles.h"
#include "vellum/TDVisitor.h"
#include "vellum/TypeCodes.h"
#include "vellum/TypeManagerHooks.h"
