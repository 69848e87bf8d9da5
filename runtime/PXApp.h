// The application object: what the running environment reports about itself.
#pragma once

#include <cstdint>

// Major version two decimal digits in the top byte, minor in bits 20-23, then the build.
constexpr uint32_t kPXAppVersion = 0x22308000;

class PXApp {
 public:
  static PXApp& Instance();
  uint32_t GetVersion() const { return kPXAppVersion; }

 private:
  PXApp() = default;
};
