// Hierarchical names made of string components. The class is exported; this header adds the
// stream classes that its flat form is written and read with.
#pragma once

#include "vellum/QualifiedName.h"
#include "source/KoDataReader.h"
#include "source/KoDataWriter.h"
