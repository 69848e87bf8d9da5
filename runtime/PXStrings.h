// Blocks of bytes and the three string forms: CStr (zero-terminated uint8_t*), PStr (length
// byte + up to 255 bytes) and LStr handles (see PXTypes.h). A null pointer or handle is
// treated as the empty string by every function here.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "runtime/PXTypes.h"

// Blocks. Overlapping src/dst is allowed for MoveBlock. Null pointers are allowed when n is 0.
void MoveBlock(const void* src, void* dst, size_t n);
void ClearMem(void* p, size_t n);
void SwapBlock(void* a, void* b, size_t n);
// Unsigned byte order: <0, 0 or >0.
int32_t BlockCmp(const void* a, const void* b, size_t n);

// CStr. The copies return dst; the caller provides room.
int32_t StrLen(const uint8_t* s);
uint8_t* StrCpy(uint8_t* dst, const uint8_t* src);
uint8_t* StrCat(uint8_t* dst, const uint8_t* src);
int32_t StrCmp(const uint8_t* a, const uint8_t* b);      // unsigned bytes, <0/0/>0
int32_t StrCaseCmp(const uint8_t* a, const uint8_t* b);  // ASCII letters folded

// PStr. PStrCmp orders by unsigned bytes, a prefix first. PStrCpy copies 1 + length bytes.
int32_t PStrCmp(const uint8_t* a, const uint8_t* b);
uint8_t* PStrCpy(uint8_t* dst, const uint8_t* src);
// Converts at most the first 255 bytes of c into p (which has room for 256 bytes); returns p.
uint8_t* CToPStr(const uint8_t* c, uint8_t* p);
// c needs room for length + 1 bytes; returns c.
uint8_t* PToCStr(const uint8_t* p, uint8_t* c);

// LStr. CToLStr makes a new handle in *out (null on failure, status 2); the caller owns it.
int32_t CToLStr(const uint8_t* c, LStrHandle* out);
// Unsigned byte order, a prefix first.
int32_t LHStrCmp(LStrHandle a, LStrHandle b);

// A shared, constant empty PStr.
const uint8_t* EmptyPStr();

namespace StringUtils {
std::string FromPStr(const uint8_t* p);
std::string FromLStr(LStrHandle h);
// Stores s in *h: allocates a new handle when *h is null, resizes it otherwise. 1 when s is
// longer than an LStr can count; 2 when memory runs out (then *h is unchanged).
int32_t ToLStr(std::string_view s, LStrHandle* h);
// ASCII letters folded, then unsigned byte order: <0, 0 or >0.
int32_t CaseInsensitiveCompare(std::string_view a, std::string_view b);
// Writes s as a PStr into buf256. 1 (and the first 255 bytes) when s is longer than 255.
int32_t ToPStr(std::string_view s, uint8_t* buf256);
}  // namespace StringUtils
