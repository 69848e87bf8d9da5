// How a host embeds vellum: start the library, build and intern a type, hold a value of it,
// flatten the value to bytes and read them back. Built and run with the tests.
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "runtime/PXStrings.h"
#include "vellum.h"

int main() {
  const vellum::Session session;  // starts the type manager and what it needs; stops them at the end
  if (!session) return 1;

  // A writable descriptor, built and then interned: equal types are one shared object.
  TDWCluster reading;
  reading << TDWInt32("count") << TDWString("label");
  const TDRCluster type = reading.CheckIn();
  if (!(reading.CheckIn() == type)) return 1;

  // One value of the type: default data now, its handles given back when `value` goes.
  vellum::Value value(type);
  if (value.Status() != 0) return 1;
  // Data is packed unless the host sets an alignment (SetDSAlign): elements are moved by bytes.
  const int32_t count = 3;
  std::memcpy(type.GetEltPtr(0, value.Data()), &count, sizeof count);
  LStrHandle label = nullptr;
  std::memcpy(&label, type.GetEltPtr(1, value.Data()), sizeof label);
  if (StringUtils::ToLStr("three samples", &label) != 0) return 1;
  std::memcpy(type.GetEltPtr(1, value.Data()), &label, sizeof label);

  // Its flattened form: portable big-endian bytes of the running version.
  std::vector<uint8_t> bytes;
  if (const int32_t status = vellum::FlattenData(value, &bytes); status != 0) {
    std::fprintf(stderr, "cannot flatten (status %d): %s\n", status, vellum::LastRefusal().c_str());
    return 1;
  }
  for (const uint8_t byte : bytes) std::printf("%02x", byte);
  std::printf("\n");

  // Read back into a second value: equal to the first.
  vellum::Value back(type);
  if (const int32_t status = vellum::UnflattenData(bytes, &back); status != 0) {
    std::fprintf(stderr, "cannot read back (status %d): %s\n", status, vellum::LastRefusal().c_str());
    return 1;
  }
  if (CompareDataTDR(type, value.Data(), back.Data(), 0, 0) != 0) return 1;

  // A descriptor seen as the kind it is, or null for another.
  if (!vellum::As<TDRCluster>(type) || vellum::As<TDRArray>(type)) return 1;

  // Bytes that say more than they hold are refused with a status and a reason, never a crash.
  const std::vector<uint8_t> damaged = {0x00, 0x00, 0x00, 0x03, 0x7f, 0xff, 0xff, 0xff};
  const int32_t refused = vellum::UnflattenData(damaged, &back);
  std::printf("damaged bytes: status %d, %s\n", refused, vellum::LastRefusal().c_str());
  return refused != 0 ? 0 : 1;
}
