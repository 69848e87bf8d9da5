// The exception that carries a status across the runtime boundary.
#pragma once

#include <cstdint>
#include <exception>
#include <string>

class KoExcept : public std::exception {
 public:
  // `file` should be a string with static storage (normally __FILE__); null is kept as "".
  KoExcept(int32_t status, std::string message, const char* file, int32_t line);
  int32_t Status() const { return status_; }
  const std::string& Message() const { return message_; }
  const char* File() const { return file_; }
  int32_t Line() const { return line_; }
  const char* what() const noexcept override;
  // A KoExcept comes back as it is; std::bad_alloc becomes status 2, anything else status 1,
  // with e.what() as the message.
  static KoExcept FromStd(const std::exception& e, const char* file, int32_t line);

 private:
  int32_t status_;
  std::string message_;
  const char* file_;
  int32_t line_;
};
