// Basic types shared by the runtime layer and everything above it: status codes, handles
// and the counted (LStr) and length-byte (PStr) string layouts.
#pragma once

#include <cstddef>
#include <cstdint>

// Every operation that can fail returns one of these; 0 is success.
constexpr int32_t kStatusNoError = 0;
constexpr int32_t kStatusBadArgument = 1;
constexpr int32_t kStatusOutOfMemory = 2;
constexpr int32_t kStatusNullHandle = 42;
constexpr int32_t kStatusCorruptData = 74;
constexpr int32_t kStatusImplausibleData = 116;
constexpr int32_t kStatusTooNew = 122;
constexpr int32_t kStatusReadAllocationFailed = 1156;

// A handle is a pointer to a master pointer to a relocatable block (see DSMemory.h).
using UPtr = uint8_t*;
using UHandle = uint8_t**;

// Counted string: a signed 32-bit byte count followed by the bytes, no terminator. Lives in a
// handle whose size is at least 4 + cnt.
struct LStr {
  int32_t cnt;
  uint8_t str[1];
};
using LStrPtr = LStr*;
using LStrHandle = LStr**;

inline int32_t LStrLen(const LStr* s) { return s ? s->cnt : 0; }
inline uint8_t* LStrBuf(LStr* s) { return s ? s->str : nullptr; }
// Length of the string in a handle; 0 for a null handle or a null master pointer.
inline int32_t LHStrLen(LStrHandle h) { return (h && *h) ? (*h)->cnt : 0; }

// Pascal string: one length byte, then up to 255 bytes. A null pointer reads as empty.
inline int32_t PStrLen(const uint8_t* p) { return p ? p[0] : 0; }
inline const uint8_t* PStrBuf(const uint8_t* p) { return p ? p + 1 : nullptr; }
inline uint8_t* PStrBuf(uint8_t* p) { return p ? p + 1 : nullptr; }

// The host's application context. Opaque: this library only carries the pointer along.
struct KoContext;
