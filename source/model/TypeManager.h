// Type factories by code, the type manager service with its start and stop sequences, the
// registry of shared global descriptors released at stop, and the host's procedure hooks.
#pragma once

#include <atomic>
#include <cstdint>

#include "source/model/TD.h"
#include "vellum/TypeManagerHooks.h"

// The factory of a kind whose descriptors start empty and are filled by their ConstructTD.
template <class Imp>
class EmptyTypeFactory final : public TDTypeFactory {
 public:
  TDImpPtr CreateTD(TDDataReader*, uint16_t, int32_t* status) const override {
    TDImpPtr type = MakeCounted<Imp>();
    if (status != nullptr) *status = type ? kStatusNoError : kStatusOutOfMemory;
    return type;
  }
};

// Each family announces, as it loads, the factories the service registers at start; `order`
// is the factory's place in the registration sequence.
void AnnounceTypeFactory(int32_t order, uint16_t typeCode, TDTypeFactory* factory);

// Each family announces the getter of its shared default descriptor per code.
using DefaultTypeGetter = const TDR& (*)();
void RegisterDefaultTypeGetter(int32_t code, DefaultTypeGetter getter);
bool HasDefaultTypeGetter(int32_t code);

// The shared descriptor held by `entry`, built on first use by checking in `make()`. Builders
// on several threads all obtain the same interned object. The null `TDR` when memory runs out.
const TDR& SharedGlobalType(GlobalTypeEntry& entry, TDImpPtr (*make)());

