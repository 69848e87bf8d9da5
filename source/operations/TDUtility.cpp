// Type utilities: scalar test, wrapper and view removal, the context walk, the value text of
// numbers and Booleans, the analog waveform flavors, and the shared error cluster.
#include "source/operations/TDUtility.h"

#include <complex>
#include <cstring>
#include <sstream>
#include <type_traits>

#include "runtime/PXNumbers.h"
#include "source/model/TypeManager.h"
#include "vellum/TDArrayHandles.h"
#include "vellum/TDContainerHandles.h"
#include "vellum/TDNumericHandles.h"
#include "vellum/TDSimpleHandles.h"
#include "vellum/TDStringHandles.h"

VELLUM_DIAGNOSTIC_MODULE("TDUtility");

namespace {

template <class T>
std::string Print(const void* data) {
  T value;
  std::memcpy(&value, data, sizeof value);
  std::ostringstream text;
  if constexpr (sizeof(T) == 1 && std::is_integral_v<T>) {
    text << static_cast<int32_t>(value);
  } else {
    text << value;
  }
  return text.str();
}

const uint8_t* U(const char* text) { return reinterpret_cast<const uint8_t*>(text); }

}  // namespace

int32_t IsScalarType(const TDR& type) {
  const TDR t = IgnoreMDTWrapper(type);
  return t.IsArrayBase() != 0 || t.IsClust() != 0 || t.IsRepeatedBlock() != 0 ? 0 : 1;
}

TDR IgnoreMDTWrapper(const TDR& type) { return type; }

TDR TDRFromSubType(const TDR& type) {
  if (type.GetTypeCode() == static_cast<int16_t>(TypeCode::SubString)) {
    const TDRString converted = TDRSubString(type.GetImpPtr(), 1).ConvertToString();
    return converted ? TDR(converted) : type;
  }
  if (type.GetTypeCode() == static_cast<int16_t>(TypeCode::SubArray)) {
    const TDRArray converted = TDRSubArray(type.GetImpPtr(), 1).ConvertToArray();
    return converted ? TDR(converted) : type;
  }
  return type;
}

const KoContext* TDRGetContextIfAvailable(const TDR& type) { return type.GetContextRecursive(); }

std::string ValueToString(const TDR& type, const void* data) {
  if (!type || data == nullptr) return "NULL";
  switch (StripTypeCodeModifier(type.GetTypeCode())) {
    case static_cast<int32_t>(TypeCode::Int8):
      return Print<int8_t>(data);
    case static_cast<int32_t>(TypeCode::Int16):
      return Print<int16_t>(data);
    case static_cast<int32_t>(TypeCode::Int32):
      return Print<int32_t>(data);
    case static_cast<int32_t>(TypeCode::Int64):
      return Print<int64_t>(data);
    case static_cast<int32_t>(TypeCode::UInt8):
      return Print<uint8_t>(data);
    case static_cast<int32_t>(TypeCode::UInt16):
      return Print<uint16_t>(data);
    case static_cast<int32_t>(TypeCode::UInt32):
      return Print<uint32_t>(data);
    case static_cast<int32_t>(TypeCode::UInt64):
      return Print<uint64_t>(data);
    case static_cast<int32_t>(TypeCode::Float32):
      return Print<float>(data);
    case static_cast<int32_t>(TypeCode::Float64):
      return Print<double>(data);
    case static_cast<int32_t>(TypeCode::Boolean):
      return *static_cast<const uint8_t*>(data) != 0 ? "1" : "0";
    default:
      return "?";
  }
}

int32_t BoundedOrFixedArrayType(const TDR& array) {
  const TDRArray type(array.GetImpPtr(), 1);
  if (!type) {
    DebugReport(kDiagnosticModule, __LINE__, 4, "Bad array");
    return static_cast<int32_t>(0x80000000u);
  }
  return type.BoundedOrFixed();
}

int32_t IsMDTAnalogWaveformFlavor(uint16_t flavor) {
  return flavor == 1 || flavor == 2 || flavor == 3 || flavor == 5 || (flavor >= 10 && flavor <= 20) ? 1 : 0;
}

const TDR& GetErrorIOCTD() {
  static GlobalTypeEntry entry;
  return SharedGlobalType(entry, [] {
    TDWCluster cluster(U("error IO"));
    cluster << TDWBoolean(U("status")) << TDWInt32(U("code")) << TDWString(U("source"));
    // A chain broken by a failed allocation leaves a shorter cluster, which must not be shared.
    return cluster.GetNumElts() == 3 ? cluster.GetImpPtr() : TDImpPtr();
  });
}
