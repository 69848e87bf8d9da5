// Type strings: lists of descriptors saved as one flat byte string and loaded back.
#pragma once

#include "source/model/TD.h"
#include "source/streams/TDDataStreams.h"
#include "vellum/TypeStrings.h"
