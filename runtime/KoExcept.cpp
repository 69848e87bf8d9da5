// KoExcept: a status, a message and where it was raised.
#include "runtime/KoExcept.h"

#include <new>
#include <utility>

#include "runtime/PXTypes.h"

KoExcept::KoExcept(int32_t status, std::string message, const char* file, int32_t line)
    : status_(status), message_(std::move(message)), file_(file ? file : ""), line_(line) {}

const char* KoExcept::what() const noexcept { return message_.c_str(); }

KoExcept KoExcept::FromStd(const std::exception& e, const char* file, int32_t line) {
  if (const auto* k = dynamic_cast<const KoExcept*>(&e)) return *k;
  const int32_t status = dynamic_cast<const std::bad_alloc*>(&e) ? kStatusOutOfMemory : kStatusBadArgument;
  return KoExcept(status, e.what(), file, line);
}
