// Diagnostic messages and the replaceable sink they go to. The sink is copied under a mutex and
// called outside it, so a slow or re-entrant sink never blocks other threads' installation.
#include "runtime/DebugStream.h"

#include <cinttypes>
#include <cstdio>
#include <mutex>
#include <sstream>

#include "runtime/PXInternal.h"

namespace {

struct SinkHolder {
  std::mutex mutex;  // guards sink
  DebugSink sink;
};

SinkHolder& TheSink() {
  static pxinternal::NoDestructor<SinkHolder> holder;
  return holder.get();
}

void DefaultSink(const DebugMessage& m) {
  std::fprintf(stderr, "%s(%" PRId32 ") %" PRId32 ": %s\n", m.module.c_str(), m.line, m.level, m.text.c_str());
}

// The first error-level message of this thread since the record was last cleared: the reason a
// refused call gives, for hosts that install no sink.
struct FirstError {
  bool held = false;
  DebugMessage message;
};
thread_local FirstError tFirstError;

void Emit(const DebugMessage& m) {
  if (m.level >= 2 && !tFirstError.held) {
    tFirstError.message = m;
    tFirstError.held = true;
  }
  DebugSink sink;
  {
    SinkHolder& h = TheSink();
    std::lock_guard lock(h.mutex);
    sink = h.sink;
  }
  if (sink)
    sink(m);
  else
    DefaultSink(m);
}

}  // namespace

void SetDebugSink(DebugSink sink) {
  DebugSink old;
  SinkHolder& h = TheSink();
  {
    std::lock_guard lock(h.mutex);
    old.swap(h.sink);
    h.sink = std::move(sink);
  }
  // `old` is destroyed here, outside the lock: its captures may do anything.
}

const DebugMessage* FirstDebugError() { return tFirstError.held ? &tFirstError.message : nullptr; }

void ClearFirstDebugError() { tFirstError.held = false; }

std::string DebugModuleName(const char* file) {
  std::string_view path = file ? std::string_view(file) : std::string_view();
  const size_t slash = path.find_last_of("/\\");
  if (slash != std::string_view::npos) path.remove_prefix(slash + 1);
  const size_t dot = path.find_last_of('.');
  if (dot != std::string_view::npos && dot != 0) path = path.substr(0, dot);
  return std::string(path);
}

DebugStream::DebugStream(const char* file, int32_t line, int32_t level)
    : module_(DebugModuleName(file)), line_(line), level_(level) {}

DebugStream& DebugStream::Append(std::string_view s) {
  text_.append(s);
  return *this;
}

DebugStream& DebugStream::Append(const char* s) {
  if (s) text_.append(s);
  return *this;
}

DebugStream& DebugStream::Append(char c) {
  text_.push_back(c);
  return *this;
}

DebugStream& DebugStream::Append(int64_t v) {
  text_.append(std::to_string(v));
  return *this;
}

DebugStream& DebugStream::Append(uint64_t v) {
  text_.append(std::to_string(v));
  return *this;
}

DebugStream& DebugStream::Append(int32_t v) { return Append(static_cast<int64_t>(v)); }

DebugStream& DebugStream::Append(uint32_t v) { return Append(static_cast<uint64_t>(v)); }

DebugStream& DebugStream::Append(double v) {
  std::ostringstream out;
  out << v;
  text_.append(out.str());
  return *this;
}

DebugStream& DebugStream::Append(const void* p) {
  char buf[2 + 2 * sizeof(uintptr_t) + 1];
  std::snprintf(buf, sizeof buf, "0x%" PRIxPTR, reinterpret_cast<uintptr_t>(p));
  text_.append(buf);
  return *this;
}

DebugStream& DebugStream::AppendHex32(uint32_t v) {
  char buf[11];
  std::snprintf(buf, sizeof buf, "0x%08" PRIx32, v);
  text_.append(buf);
  return *this;
}

DebugStream& DebugStream::AppendPStr(const uint8_t* p) {
  if (p) text_.append(reinterpret_cast<const char*>(p + 1), p[0]);
  return *this;
}

void DebugStream::Process() {
  if (processed_) return;
  processed_ = true;
  Emit(DebugMessage{module_, line_, level_, text_});
}

std::string DebugStream::Text() const { return text_; }

void DebugReport(const char* file, int32_t line, int32_t level, std::string_view text) {
  DebugStream s(file, line, level);
  s.Append(text);
  s.Process();
}
