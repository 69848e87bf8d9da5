// Fuzz target for the fixed-point text readers: decimal numbers (with and without a format tag),
// range specifications and hexadecimal words. Whatever one of them accepts is printed and read
// back, and must come back identical.
//
// Input: byte 0 picks the reader (bits 6-7) and the word length (bits 0-5); byte 1 the
// quantization mode and signedness; byte 2 the integer word length; the rest is the text.
#include <cstdint>
#include <cstring>
#include <string>

#include "FixedPoint/fxp.h"

namespace {

using vellum::FXP;
using vellum::FXPMeta;

void Check(bool ok) {
  if (!ok) __builtin_trap();
}

// The reader stopped inside the text it was given (never past the terminator).
void CheckEnd(const std::string& text, const char* end) {
  Check(end >= text.c_str() && end <= text.c_str() + std::strlen(text.c_str()));
}

void Decimal(const std::string& text, int maxWordLength, int qMode) {
  const char* end = nullptr;
  const FXP r = FXP::fromDecimalString(maxWordLength, text.c_str(), &end, qMode);
  CheckEnd(text, end);
  Check(r.check_invariant());
  if (end == text.c_str()) return;
  // Tagged text names the value and its format exactly.
  const std::string tagged = r.toDecimalString(0, FXP::kDecimalTagged, '.');
  const FXP again = FXP::fromDecimalString(1, tagged.c_str(), &end, qMode);
  Check(again.identical(r) && *end == 0);
  // Plain and scientific text read back into the same format.
  const std::string plain = r.toDecimalString();
  Check(FXP::fromDecimalString(r, plain.c_str(), &end).identical(r) && *end == 0);
  const std::string scientific = r.toDecimalString(0, FXP::kDecimalScientific, ',');
  Check(FXP::fromDecimalString(r, scientific.c_str(), &end).identical(r) && *end == 0);
}

void DecimalInFormat(const std::string& text, const FXPMeta& format, int qMode) {
  const char* end = nullptr;
  const FXP r = FXP::fromDecimalString(format, text.c_str(), &end, static_cast<FXP::QuantizationMode>(qMode));
  CheckEnd(text, end);
  Check(r.sameFormat(format) && r.check_invariant());
  if (end == text.c_str()) return;
  const std::string plain = r.toDecimalString();
  Check(FXP::fromDecimalString(format, plain.c_str(), &end).identical(r) && *end == 0);
}

void RangeSpec(const std::string& text) {
  bool isSigned = false;
  int wl = 0;
  int iwl = 0;
  const char* end = nullptr;
  const bool ok = FXP::signAndLengthsForRangeSpec(text.c_str(), &isSigned, &wl, &iwl, &end);
  CheckEnd(text, end);
  Check(wl >= 1 && wl <= 64);
  if (!ok) return;
  const std::string printed = std::string("<") + (isSigned ? "s," : "u,") + std::to_string(wl) + "," + std::to_string(iwl) + ">";
  bool s2 = false;
  int wl2 = 0;
  int iwl2 = 0;
  Check(FXP::signAndLengthsForRangeSpec(printed.c_str(), &s2, &wl2, &iwl2, &end));
  Check(s2 == isSigned && wl2 == wl && iwl2 == iwl && *end == 0);
}

void Hexadecimal(const std::string& text, const FXPMeta& format) {
  const char* end = nullptr;
  const FXP r = FXP::fromHexadecimalString(format, text.c_str(), &end);
  CheckEnd(text, end);
  Check(r.sameFormat(format) && r.check_invariant());
  if (end == text.c_str()) return;
  char buf[20000];
  const int n = r.toHexadecimalString(sizeof buf, buf);
  Check(n > 0 && static_cast<size_t>(n) <= sizeof buf);
  Check(FXP::fromHexadecimalString(format, buf, &end).identical(r) && *end == 0);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 3) return 0;
  const int reader = data[0] >> 6;
  const int wl = 1 + (data[0] & 63);
  const int qMode = (data[1] & 15) % 8;  // 7 is an unknown mode, read as convergent
  const bool isSigned = (data[1] & 16) != 0;
  const int iwl = static_cast<int8_t>(data[2]) * ((data[1] & 32) != 0 ? 16 : 1);
  const std::string text(reinterpret_cast<const char*>(data + 3), size - 3);
  switch (reader) {
    case 0: Decimal(text, wl, qMode); break;
    case 1: DecimalInFormat(text, FXPMeta(wl, iwl, isSigned), qMode); break;
    case 2: RangeSpec(text); break;
    default: Hexadecimal(text, FXPMeta(wl, iwl, isSigned)); break;
  }
  return 0;
}
