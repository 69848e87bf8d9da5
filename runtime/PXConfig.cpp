// Configuration lookup: overrides, then the environment, then an optional key = value file.
#include "runtime/PXConfig.h"

#include <charconv>
#include <cstdlib>
#include <fstream>
#include <map>
#include <mutex>
#include <optional>

#include "runtime/PXInternal.h"
#include "runtime/PXStrings.h"

namespace {

struct Overrides {
  std::mutex mutex;  // guards values
  std::map<std::string, std::string, std::less<>> values;
};

Overrides& TheOverrides() {
  static pxinternal::NoDestructor<Overrides> overrides;
  return overrides.get();
}

std::mutex& EnvironmentMutex() {
  static pxinternal::NoDestructor<std::mutex> mutex;
  return mutex.get();
}

std::string_view Trim(std::string_view s) {
  const size_t first = s.find_first_not_of(" \t\r\n");
  if (first == std::string_view::npos) return {};
  const size_t last = s.find_last_not_of(" \t\r\n");
  return s.substr(first, last - first + 1);
}

std::optional<std::string> GetEnvironment(const std::string& name) {
  std::lock_guard lock(EnvironmentMutex());
  const char* v = std::getenv(name.c_str());
  if (!v) return std::nullopt;
  return std::string(v);
}

std::optional<std::string> FromFile(std::string_view key) {
  const std::optional<std::string> path = GetEnvironment("VELLUM_CONFIG");
  if (!path || path->empty()) return std::nullopt;
  std::ifstream in(*path);
  std::optional<std::string> found;
  std::string line;
  while (std::getline(in, line)) {
    const std::string_view text = Trim(line);
    if (text.empty() || text.front() == '#') continue;
    const size_t eq = text.find('=');
    if (eq == std::string_view::npos) continue;
    if (StringUtils::CaseInsensitiveCompare(Trim(text.substr(0, eq)), key) == 0)
      found = std::string(Trim(text.substr(eq + 1)));
  }
  return found;
}

std::optional<std::string> Lookup(const uint8_t* pstrKey) {
  const std::string key = StringUtils::FromPStr(pstrKey);
  if (key.empty()) return std::nullopt;
  {
    Overrides& o = TheOverrides();
    std::lock_guard lock(o.mutex);
    if (auto it = o.values.find(key); it != o.values.end()) return it->second;
  }
  if (std::optional<std::string> v = GetEnvironment(CfgEnvironmentName(key))) return std::string(Trim(*v));
  return FromFile(key);
}

}  // namespace

std::string CfgEnvironmentName(std::string_view key) {
  std::string name(key);
  for (char& c : name) {
    if (c >= 'a' && c <= 'z')
      c = static_cast<char>(c - 'a' + 'A');
    else if (!((c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9')))
      c = '_';
  }
  return name;
}

bool CfgGetDefault(const uint8_t* pstrKey, bool* value) {
  if (!value) return false;
  const std::optional<std::string> v = Lookup(pstrKey);
  if (!v) return false;
  static constexpr std::string_view kTrue[] = {"1", "true", "yes", "on"};
  static constexpr std::string_view kFalse[] = {"0", "false", "no", "off"};
  for (std::string_view t : kTrue)
    if (StringUtils::CaseInsensitiveCompare(*v, t) == 0) return *value = true, true;
  for (std::string_view f : kFalse)
    if (StringUtils::CaseInsensitiveCompare(*v, f) == 0) return *value = false, true;
  return false;
}

bool CfgGetDefault(const uint8_t* pstrKey, int32_t* value) {
  if (!value) return false;
  const std::optional<std::string> v = Lookup(pstrKey);
  if (!v) return false;
  std::string_view text = *v;
  bool negative = false;
  if (!text.empty() && (text.front() == '-' || text.front() == '+')) {
    negative = text.front() == '-';
    text.remove_prefix(1);
  }
  int base = 10;
  if (text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X')) {
    base = 16;
    text.remove_prefix(2);
  }
  if (text.empty() || text.front() == '-' || text.front() == '+') return false;
  int64_t magnitude = 0;
  const auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), magnitude, base);
  if (ec != std::errc() || end != text.data() + text.size()) return false;
  const int64_t signedValue = negative ? -magnitude : magnitude;
  if (signedValue < INT32_MIN || signedValue > INT32_MAX) return false;
  *value = static_cast<int32_t>(signedValue);
  return true;
}

bool CfgGetDefault(const uint8_t* pstrKey, std::string* value) {
  if (!value) return false;
  std::optional<std::string> v = Lookup(pstrKey);
  if (!v) return false;
  *value = std::move(*v);
  return true;
}

void CfgSetOverride(std::string_view key, std::string_view value) {
  Overrides& o = TheOverrides();
  std::lock_guard lock(o.mutex);
  o.values.insert_or_assign(std::string(key), std::string(Trim(value)));
}

void CfgClearOverrides() {
  Overrides& o = TheOverrides();
  std::lock_guard lock(o.mutex);
  o.values.clear();
}
