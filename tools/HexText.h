// Bytes written as hex text, the way the vellum tool prints them and reads them back, on the
// command line and inside JSON values alike.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

// The value of one hex digit in either case; -1 for any other character.
int HexDigitValue(char c);

// Two lowercase digits per byte, nothing between them.
std::string LowerHex(const uint8_t* data, size_t size);

// Two hex digits per byte in either case; blanks may stand anywhere between them. Appends the
// bytes to *bytes and answers "", or answers what is wrong with the text (*bytes may then hold
// the bytes before the fault).
std::string ParseHex(const std::string& text, std::vector<uint8_t>* bytes);
