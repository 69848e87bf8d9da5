// Objects built in static storage whose destruction the host schedules at its own shutdown,
// instead of leaving it to the unordered destruction of statics at process exit.
#pragma once

#include <cstdint>

// Remembers destroy(object) for RunPlacementDeletes. Any thread may register.
void RegisterPlacementDelete(void (*destroy)(void*), void* object);
// Runs the registered deletes, newest first, each once; a delete may register further ones,
// which run in the same call. Registrations made afterwards wait for the next call.
void RunPlacementDeletes();
// Number of deletes registered and not yet run.
int32_t PendingPlacementDeletes();
