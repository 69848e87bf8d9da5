// Hierarchical names made of string components. The class is exported; this header adds the
// stream classes that its flat form is written and read with.
#pragma once

#include "source/streams/KoDataReader.h"
#include "source/streams/KoDataWriter.h"
#include "vellum/QualifiedName.h"
