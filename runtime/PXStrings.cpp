// Byte blocks and string conversions; thin, null-tolerant wrappers over the standard library.
#include "runtime/PXStrings.h"

#include <algorithm>
#include <cstring>
#include <limits>

#include "runtime/DSMemory.h"

namespace {

int32_t Sign(int v) { return v < 0 ? -1 : (v > 0 ? 1 : 0); }

uint8_t FoldAscii(uint8_t c) { return (c >= 'A' && c <= 'Z') ? static_cast<uint8_t>(c + ('a' - 'A')) : c; }

// Orders two byte ranges: unsigned bytes, then the shorter first.
int32_t CompareBytes(const uint8_t* a, size_t na, const uint8_t* b, size_t nb) {
  const size_t n = std::min(na, nb);
  if (n != 0) {
    if (int c = std::memcmp(a, b, n)) return Sign(c);
  }
  return na < nb ? -1 : (na > nb ? 1 : 0);
}

const uint8_t kEmpty[1] = {0};

}  // namespace

void MoveBlock(const void* src, void* dst, size_t n) {
  if (n != 0 && src && dst) std::memmove(dst, src, n);
}

void ClearMem(void* p, size_t n) {
  if (n != 0 && p) std::memset(p, 0, n);
}

void SwapBlock(void* a, void* b, size_t n) {
  if (n == 0 || !a || !b || a == b) return;
  auto* x = static_cast<uint8_t*>(a);
  auto* y = static_cast<uint8_t*>(b);
  std::swap_ranges(x, x + n, y);
}

int32_t BlockCmp(const void* a, const void* b, size_t n) {
  if (n == 0) return 0;
  if (!a || !b) return a ? 1 : (b ? -1 : 0);
  return Sign(std::memcmp(a, b, n));
}

int32_t StrLen(const uint8_t* s) {
  if (!s) return 0;
  const size_t n = std::strlen(reinterpret_cast<const char*>(s));
  return n > static_cast<size_t>(std::numeric_limits<int32_t>::max()) ? std::numeric_limits<int32_t>::max()
                                                                        : static_cast<int32_t>(n);
}

uint8_t* StrCpy(uint8_t* dst, const uint8_t* src) {
  if (!dst) return dst;
  if (!src) {
    dst[0] = 0;
    return dst;
  }
  std::memmove(dst, src, std::strlen(reinterpret_cast<const char*>(src)) + 1);
  return dst;
}

uint8_t* StrCat(uint8_t* dst, const uint8_t* src) {
  if (!dst || !src) return dst;
  StrCpy(dst + std::strlen(reinterpret_cast<const char*>(dst)), src);
  return dst;
}

int32_t StrCmp(const uint8_t* a, const uint8_t* b) {
  const uint8_t* x = a ? a : kEmpty;
  const uint8_t* y = b ? b : kEmpty;
  return Sign(std::strcmp(reinterpret_cast<const char*>(x), reinterpret_cast<const char*>(y)));
}

int32_t StrCaseCmp(const uint8_t* a, const uint8_t* b) {
  const uint8_t* x = a ? a : kEmpty;
  const uint8_t* y = b ? b : kEmpty;
  for (;; ++x, ++y) {
    const uint8_t cx = FoldAscii(*x);
    const uint8_t cy = FoldAscii(*y);
    if (cx != cy) return cx < cy ? -1 : 1;
    if (cx == 0) return 0;
  }
}

int32_t PStrCmp(const uint8_t* a, const uint8_t* b) {
  return CompareBytes(PStrBuf(a), static_cast<size_t>(PStrLen(a)), PStrBuf(b), static_cast<size_t>(PStrLen(b)));
}

uint8_t* PStrCpy(uint8_t* dst, const uint8_t* src) {
  if (!dst) return dst;
  if (!src) {
    dst[0] = 0;
    return dst;
  }
  std::memmove(dst, src, static_cast<size_t>(src[0]) + 1);
  return dst;
}

uint8_t* CToPStr(const uint8_t* c, uint8_t* p) {
  if (!p) return p;
  size_t n = 0;
  if (c) {
    while (n < 255 && c[n] != 0) ++n;
    std::memmove(p + 1, c, n);
  }
  p[0] = static_cast<uint8_t>(n);
  return p;
}

uint8_t* PToCStr(const uint8_t* p, uint8_t* c) {
  if (!c) return c;
  const size_t n = static_cast<size_t>(PStrLen(p));
  if (n != 0) std::memmove(c, p + 1, n);
  c[n] = 0;
  return c;
}

int32_t CToLStr(const uint8_t* c, LStrHandle* out) {
  if (!out) return kStatusBadArgument;
  *out = nullptr;
  const std::string_view s = c ? std::string_view(reinterpret_cast<const char*>(c)) : std::string_view();
  return StringUtils::ToLStr(s, out);
}

int32_t LHStrCmp(LStrHandle a, LStrHandle b) {
  const uint8_t* pa = (a && *a) ? (*a)->str : nullptr;
  const uint8_t* pb = (b && *b) ? (*b)->str : nullptr;
  const int32_t na = std::max(LHStrLen(a), 0);
  const int32_t nb = std::max(LHStrLen(b), 0);
  return CompareBytes(pa, static_cast<size_t>(na), pb, static_cast<size_t>(nb));
}

const uint8_t* EmptyPStr() { return kEmpty; }

namespace StringUtils {

std::string FromPStr(const uint8_t* p) {
  if (!p) return std::string();
  return std::string(reinterpret_cast<const char*>(p + 1), p[0]);
}

std::string FromLStr(LStrHandle h) {
  const int32_t n = LHStrLen(h);
  if (n <= 0) return std::string();
  return std::string(reinterpret_cast<const char*>((*h)->str), static_cast<size_t>(n));
}

int32_t ToLStr(std::string_view s, LStrHandle* h) {
  if (!h) return kStatusBadArgument;
  if (s.size() > static_cast<size_t>(std::numeric_limits<int32_t>::max()) - sizeof(int32_t))
    return kStatusBadArgument;
  const size_t bytes = sizeof(int32_t) + s.size();
  UHandle u = reinterpret_cast<UHandle>(*h);
  if (int32_t err = DSSetHandleSizeOrNewHandle(&u, bytes)) return err;
  *h = reinterpret_cast<LStrHandle>(u);
  (**h)->cnt = static_cast<int32_t>(s.size());
  if (!s.empty()) std::memcpy((**h)->str, s.data(), s.size());
  return kStatusNoError;
}

int32_t CaseInsensitiveCompare(std::string_view a, std::string_view b) {
  const size_t n = std::min(a.size(), b.size());
  for (size_t i = 0; i < n; ++i) {
    const uint8_t ca = FoldAscii(static_cast<uint8_t>(a[i]));
    const uint8_t cb = FoldAscii(static_cast<uint8_t>(b[i]));
    if (ca != cb) return ca < cb ? -1 : 1;
  }
  return a.size() < b.size() ? -1 : (a.size() > b.size() ? 1 : 0);
}

int32_t ToPStr(std::string_view s, uint8_t* buf256) {
  if (!buf256) return kStatusBadArgument;
  const size_t n = std::min<size_t>(s.size(), 255);
  if (n != 0) std::memcpy(buf256 + 1, s.data(), n);
  buf256[0] = static_cast<uint8_t>(n);
  return s.size() > 255 ? kStatusBadArgument : kStatusNoError;
}

}  // namespace StringUtils
