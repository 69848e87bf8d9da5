// In-memory resources of saved files: handles filed under (file, type, id). The store owns the
// handles it holds. Every function may be called from any thread.
#pragma once

#include <cstdint>

#include "runtime/PXTypes.h"

// Files h under the key; on success the store owns h and disposes the handle it replaces (the
// same handle filed again is kept). 42 for a null h, 1 for a handle not made by DSMemory, 2 when
// memory runs out (then the caller still owns h).
int32_t RAdd(UHandle h, uint32_t resId, uint32_t resType, int32_t fileRef, int32_t flags);
// *out is the stored handle, still owned by the store; 42 (and *out null) when absent.
int32_t RGet(uint32_t resId, uint32_t resType, int32_t fileRef, UHandle* out);
// The flags given to RAdd; 42 when absent.
int32_t RGetFlags(uint32_t resId, uint32_t resType, int32_t fileRef, int32_t* flags);
// Disposes the stored handle; 42 when absent.
int32_t RRemove(uint32_t resId, uint32_t resType, int32_t fileRef);
// Disposes every resource of the file.
void RCloseFile(int32_t fileRef);
