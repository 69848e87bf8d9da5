// Zeroed, aligned storage for one datum of a type, for tests of what fills it (default data,
// copies, conversion), its handles given back when it goes; and the hexadecimal byte strings that
// golden tests compare. A datum that starts as the type's default value is a vellum::Value.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "runtime/HandleAllocation.h"
#include "runtime/PXStrings.h"
#include "vellum.h"

class Datum {
 public:
  explicit Datum(const TD& type) : type_(type), bytes_((static_cast<size_t>(type.DataSize()) + 15) / 8 + 1, 0) {}
  ~Datum() { type_.DeflateData(Data(), Data() + bytes_.size() * sizeof(uint64_t), 1, NormalHandleAllocator()); }
  Datum(const Datum&) = delete;
  Datum& operator=(const Datum&) = delete;

  uint8_t* Data() { return reinterpret_cast<uint8_t*>(bytes_.data()); }
  template <class T>
  T Get(int64_t offset = 0) {
    T value;
    std::memcpy(&value, Data() + offset, sizeof value);
    return value;
  }
  template <class T>
  void Put(int64_t offset, T value) {
    std::memcpy(Data() + offset, &value, sizeof value);
  }
  // A string element at `offset` takes the text.
  void PutString(int64_t offset, const std::string& text) {
    auto h = Get<LStrHandle>(offset);
    ASSERT_EQ(StringUtils::ToLStr(text, &h), 0);
    Put(offset, h);
  }
  UHandle Handle(int64_t offset = 0) { return Get<UHandle>(offset); }

 private:
  TD type_;
  std::vector<uint64_t> bytes_;
};

// "00 05 ..." for bytes.
inline std::string HexBytes(const uint8_t* data, size_t size) {
  std::string text;
  for (size_t i = 0; i < size; ++i) {
    char pair[4];
    std::snprintf(pair, sizeof pair, i == 0 ? "%02X" : " %02X", data[i]);
    text += pair;
  }
  return text;
}
inline std::string HexBytes(const std::vector<uint8_t>& bytes) { return HexBytes(bytes.data(), bytes.size()); }

// The bytes of "00 05 ..." (blanks anywhere between digit pairs).
inline std::vector<uint8_t> BytesFromHex(const std::string& text) {
  std::vector<uint8_t> bytes;
  for (size_t i = 0; i < text.size();) {
    if (text[i] == ' ') {
      ++i;
      continue;
    }
    bytes.push_back(static_cast<uint8_t>(std::stoul(text.substr(i, 2), nullptr, 16)));
    i += 2;
  }
  return bytes;
}
