// Byte moves for the copy paths of typed data, where most moves are a few dozen bytes: those are
// done in registers here instead of through a library call.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "runtime/PXTypes.h"

namespace vellum_detail {

struct Bytes16 {
  uint64_t low;
  uint64_t high;
};

template <class T>
inline T LoadAt(const uint8_t* at) {
  T value;
  std::memcpy(&value, at, sizeof value);
  return value;
}

template <class T>
inline void StoreAt(uint8_t* at, T value) {
  std::memcpy(at, &value, sizeof value);
}

}  // namespace vellum_detail

// A value of type T kept at any address inside a datum.
template <class T>
inline T Load(const void* data) {
  T value;
  std::memcpy(&value, data, sizeof value);
  return value;
}

template <class T>
inline void Store(void* data, T value) {
  std::memcpy(data, &value, sizeof value);
}

// Moves `count` bytes from `src` to `dst`; the two may overlap. Up to 64 bytes every load is made
// before the first store, which is what makes an overlapping move safe.
inline void MoveBytes(void* dst, const void* src, size_t count) {
  using namespace vellum_detail;
  auto* d = static_cast<uint8_t*>(dst);
  const auto* s = static_cast<const uint8_t*>(src);
  if (count > 64) {
    std::memmove(d, s, count);
  } else if (count >= 32) {
    const auto a = LoadAt<Bytes16>(s);
    const auto b = LoadAt<Bytes16>(s + 16);
    const auto c = LoadAt<Bytes16>(s + count - 32);
    const auto e = LoadAt<Bytes16>(s + count - 16);
    StoreAt(d, a);
    StoreAt(d + 16, b);
    StoreAt(d + count - 32, c);
    StoreAt(d + count - 16, e);
  } else if (count >= 16) {
    const auto a = LoadAt<Bytes16>(s);
    const auto b = LoadAt<Bytes16>(s + count - 16);
    StoreAt(d, a);
    StoreAt(d + count - 16, b);
  } else if (count >= 8) {
    const auto a = LoadAt<uint64_t>(s);
    const auto b = LoadAt<uint64_t>(s + count - 8);
    StoreAt(d, a);
    StoreAt(d + count - 8, b);
  } else if (count >= 4) {
    const auto a = LoadAt<uint32_t>(s);
    const auto b = LoadAt<uint32_t>(s + count - 4);
    StoreAt(d, a);
    StoreAt(d + count - 4, b);
  } else if (count != 0) {
    const uint8_t a = s[0];
    const uint8_t b = s[count / 2];
    const uint8_t c = s[count - 1];
    d[0] = a;
    d[count / 2] = b;
    d[count - 1] = c;
  }
}

// The steady state of copying a variable string again and again: when both data hold a string
// handle and the lengths already agree, moves the bytes and returns true; otherwise touches
// nothing and returns false, and the caller takes the general path (allocation, resizing).
inline bool MoveSameLengthLStr(const void* src, void* dst) {
  LStrHandle from = nullptr;
  LStrHandle into = nullptr;
  std::memcpy(&from, src, sizeof from);
  std::memcpy(&into, dst, sizeof into);
  if (from == nullptr || into == nullptr) return false;
  const int32_t count = (*from)->cnt;
  if (count < 0 || (*into)->cnt != count) return false;
  const auto* bytes = reinterpret_cast<const uint8_t*>(*from) + sizeof(int32_t);
  MoveBytes(reinterpret_cast<uint8_t*>(*into) + sizeof(int32_t), bytes, static_cast<size_t>(count));
  return true;
}
