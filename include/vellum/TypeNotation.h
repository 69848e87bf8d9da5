// The one-line text form of a descriptor: written by TypeToInterpretedString, read back by
// InterpretedStringToType into an interned descriptor.
#pragma once

#include <cstdint>
#include <exception>
#include <string>

#include "vellum/TDHandles.h"

// The caller's linker: builds what the library cannot build from the text alone. Each answer may
// be the null descriptor, which fails the parse with "invalid type".
class IVILinkMediator {
 public:
  virtual ~IVILinkMediator() = default;
  // A refnum of a linked kind from its kind number and two strings.
  virtual TDR LinkRefnum(int32_t kind, const std::string& first, char selector, const std::string& second) = 0;
  // A class type from its name (token "C").
  virtual TDR LinkClass(const std::string& className) = 0;
  // A type from one character (token "x").
  virtual TDR LinkCharacter(char code) = 0;
};

// Raised inside the parser; the public entry points turn it into the null descriptor.
class ParseException : public std::exception {
 public:
  explicit ParseException(const char* message) noexcept : message_(message) {}
  const char* what() const noexcept override { return message_; }

 private:
  const char* message_;  // always a static text
};

// Deepest nesting of types the parser accepts: deeper text is refused, so that no walk over a
// parsed descriptor can run out of stack.
constexpr int32_t kMaxInterpretedNesting = 256;

// All three may be called from any thread while the type manager service runs; the linker is
// called on the calling thread, during the parse.

// The text of `type`; "N" for the null descriptor, "?" for kinds without a token. Never fails.
std::string TypeToInterpretedString(const TDR& type);
// The interned descriptor the text describes, or the null descriptor when it does not parse.
TDR InterpretedStringToType(const std::string& text);
TDR InterpretedStringToType(const std::string& text, IVILinkMediator* linker);
// The same parse for callers that want the reason: raises ParseException instead of answering
// the null descriptor (the text "N" alone gives the null descriptor without raising).
TDR ParseInterpretedString(const std::string& text, IVILinkMediator* linker);
