// Type strings of one record, built by hand and read as a descriptor inside data: how the tests
// of the parts a record carries (units, enumerations) reach their stored form.
#pragma once

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdint>
#include <vector>

#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "vellum.h"

namespace records {

using Bytes = std::vector<uint8_t>;

// The version the record tests write and read: one with the numeric record's flag byte.
constexpr uint32_t kVersion = 0x22308000;

// The type string of one record of `code` that carries `part`, then the flag byte 0 and the list's
// one entry. The record count, the size field and the code word take the 8 bytes before `part`.
inline Bytes OneRecordWith(uint8_t code, const Bytes& part) {
  const size_t size = 4 + part.size() + 1;
  Bytes bytes = {0x00, 0x00, 0x00, 0x01, static_cast<uint8_t>(size >> 8), static_cast<uint8_t>(size), 0x00, code};
  for (const uint8_t byte : part) bytes.push_back(byte);
  for (const uint8_t byte : {0x00, 0x00, 0x01, 0x00, 0x00}) bytes.push_back(byte);
  return bytes;
}
constexpr size_t kPartOffset = 8;

// The one-type string of `type`; its status in *status, or expected to be 0 without one.
inline Bytes Saved(const TDR& type, int32_t* status = nullptr) {
  static const BigEndianizer kBigEndian;
  const PersistTDData persist(kVersion);
  UHandle h = nullptr;
  const int32_t result = FlattenOneType(&persist, type, &h, &kBigEndian);
  if (status != nullptr) {
    *status = result;
  } else {
    EXPECT_EQ(result, 0);
  }
  if (h == nullptr) return {};
  Bytes bytes(*h, *h + DSGetHandleSize(h));
  DSDisposeHandle(h);
  return bytes;
}

struct Loaded {
  int32_t status = -1;  // the reader's error, which a failing part's reader becomes
  TDR type;
  size_t consumed = 0;
};

// Reads `bytes` as a descriptor inside data, which keeps the exact status of a part's reader.
inline Loaded Load(const Bytes& bytes) {
  static const BigEndianizer kBigEndian;
  const PersistTDData persist(kVersion);
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&persist, &in, &kBigEndian, 0);
  Loaded loaded;
  loaded.type = reader.ReadTD();
  loaded.status = reader.GetError();
  loaded.consumed = reader.Position();
  return loaded;
}

}  // namespace records
