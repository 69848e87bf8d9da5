// Diagnostic lines: a DebugStream collects text for one message and emits it once through the
// installed sink. Emitting never changes a result; a sink must not call back into the code that
// reported (it runs outside every runtime lock, on the reporting thread).
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <type_traits>

struct DebugMessage {
  std::string module;  // the reporting module's name
  int32_t line;
  int32_t level;       // 0 informational, 1 collection log, 2-3 errors, 4 must abort
  std::string text;
};

using DebugSink = std::function<void(const DebugMessage&)>;

// Installs the sink for every later message, from any thread. An empty function restores the
// default sink, which writes "module(line) level: text" and a newline to stderr.
void SetDebugSink(DebugSink sink);

class DebugStream;

namespace debugstream_detail {
// Anything else streamed is handed to ToDebugStream(DebugStream&, const T&), found by
// argument-dependent lookup next to T; types like descriptors provide one.
template <class T>
void Forward(DebugStream& s, const T& v);
}  // namespace debugstream_detail

// Builds one message. Usage: (VELLUM_DEBUG(3) << "bad count " << n).Process();
class DebugStream {
 public:
  // `module` is the module's name, or a source file's path, whose base name without extension
  // is taken.
  DebugStream(const char* module, int32_t line, int32_t level);
  DebugStream(const DebugStream&) = delete;
  DebugStream& operator=(const DebugStream&) = delete;

  DebugStream& Append(std::string_view s);
  DebugStream& Append(const char* s);  // null appends nothing
  DebugStream& Append(char c);
  DebugStream& Append(int64_t v);
  DebugStream& Append(uint64_t v);
  DebugStream& Append(int32_t v);
  DebugStream& Append(uint32_t v);
  DebugStream& Append(double v);  // as std::ostream prints it by default (6 significant digits)
  DebugStream& Append(const void* p);  // "0x" and hex digits
  DebugStream& AppendHex32(uint32_t v);  // "0x%08x"
  DebugStream& AppendPStr(const uint8_t* p);  // null appends nothing

  // Integers of any width go to the 64-bit Appends (int8_t/uint8_t print as numbers, char as a
  // character, bool as 1 or 0), floating values to Append(double), text to Append(string_view).
  template <class T>
  DebugStream& operator<<(const T& v) {
    using U = std::remove_cv_t<T>;
    if constexpr (std::is_same_v<U, char>) {
      Append(v);
    } else if constexpr (std::is_integral_v<U> && std::is_signed_v<U>) {
      Append(static_cast<int64_t>(v));
    } else if constexpr (std::is_integral_v<U>) {
      Append(static_cast<uint64_t>(v));
    } else if constexpr (std::is_floating_point_v<U>) {
      Append(static_cast<double>(v));
    } else if constexpr (std::is_convertible_v<const U&, const char*>) {
      Append(static_cast<const char*>(v));
    } else if constexpr (std::is_convertible_v<const U&, std::string_view>) {
      Append(std::string_view(v));
    } else if constexpr (std::is_pointer_v<U>) {
      Append(static_cast<const void*>(v));
    } else {
      debugstream_detail::Forward(*this, v);
    }
    return *this;
  }

  // Emits the message through the sink. A second call does nothing. A stream that is never
  // processed emits nothing.
  void Process();
  std::string Text() const;
  const std::string& Module() const { return module_; }
  int32_t Line() const { return line_; }
  int32_t Level() const { return level_; }

 private:
  std::string module_;
  int32_t line_;
  int32_t level_;
  std::string text_;
  bool processed_ = false;
};

namespace debugstream_detail {
template <class T>
void Forward(DebugStream& s, const T& v) {
  ToDebugStream(s, v);
}
}  // namespace debugstream_detail

// Every .cpp that reports names its module once, after its includes:
//   VELLUM_DIAGNOSTIC_MODULE("TDArray");
// so that moving or splitting a file never changes the module its messages carry.
#define VELLUM_DIAGNOSTIC_MODULE(name)                                \
  namespace {                                                         \
  [[maybe_unused]] constexpr const char* kDiagnosticModule = (name); \
  }                                                                   \
  static_assert(true)

#define VELLUM_DEBUG(level) DebugStream(kDiagnosticModule, __LINE__, (level))

// The first error-level message (level 2 or more) written on this thread since the last
// ClearFirstDebugError(), whatever the sink; null when there is none. The pointer is valid until
// the thread writes or clears again.
const DebugMessage* FirstDebugError();
void ClearFirstDebugError();

// One whole message in one call; `module` as for the DebugStream constructor.
void DebugReport(const char* module, int32_t line, int32_t level, std::string_view text);

// The module name a message from `file` carries: "TD" for ".../source/TD.cpp".
std::string DebugModuleName(const char* file);
