// Bytes written as hex text, the way the vellum tool prints them and reads them back, on the
// command line and inside JSON values alike.
#include "HexText.h"

#include <cstdio>

int HexDigitValue(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

std::string LowerHex(const uint8_t* data, size_t size) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string text;
  text.reserve(2 * size);
  for (size_t i = 0; i < size; ++i) {
    text += kDigits[data[i] >> 4];
    text += kDigits[data[i] & 0x0F];
  }
  return text;
}

std::string ParseHex(const std::string& text, std::vector<uint8_t>* bytes) {
  int high = -1;
  for (size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (c == ' ' || c == '\t' || c == '\n' || c == '\r') continue;
    const int digit = HexDigitValue(c);
    if (digit < 0) {
      char shown[16];
      std::snprintf(shown, sizeof shown, c > ' ' && c < 0x7F ? "'%c'" : "byte 0x%02x", static_cast<unsigned char>(c));
      return std::string(shown) + " at offset " + std::to_string(i) + " is not a hex digit";
    }
    if (high < 0) {
      high = digit;
    } else {
      bytes->push_back(static_cast<uint8_t>(high << 4 | digit));
      high = -1;
    }
  }
  if (high >= 0) return "an odd number of hex digits";
  return std::string();
}
