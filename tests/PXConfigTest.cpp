// Configuration lookup: overrides, the environment and the configuration file, and parsing.
#include "runtime/PXConfig.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>

#include "runtime/PXStrings.h"

namespace {

// A PStr key for the duration of one expression.
struct Key {
  uint8_t buf[256];
  explicit Key(std::string_view s) { StringUtils::ToPStr(s, buf); }
};

// Sets (or clears) one environment variable for a scope.
class ScopedEnv {
 public:
  ScopedEnv(const char* name, const char* value) : name_(name) {
    if (const char* old = std::getenv(name)) old_ = old, hadOld_ = true;
    if (value)
      setenv(name, value, 1);
    else
      unsetenv(name);
  }
  ~ScopedEnv() {
    if (hadOld_)
      setenv(name_.c_str(), old_.c_str(), 1);
    else
      unsetenv(name_.c_str());
  }
  ScopedEnv(const ScopedEnv&) = delete;
  ScopedEnv& operator=(const ScopedEnv&) = delete;

 private:
  std::string name_;
  std::string old_;
  bool hadOld_ = false;
};

class PXConfigTest : public ::testing::Test {
 protected:
  void SetUp() override { CfgClearOverrides(); }
  void TearDown() override { CfgClearOverrides(); }
  ScopedEnv noFile_{"VELLUM_CONFIG", nullptr};
};

TEST_F(PXConfigTest, EnvironmentNames) {
  EXPECT_EQ(CfgEnvironmentName("vellum.garbageCollection.logging"), "VELLUM_GARBAGECOLLECTION_LOGGING");
  EXPECT_EQ(CfgEnvironmentName("a-b c9"), "A_B_C9");
}

TEST_F(PXConfigTest, BooleanValues) {
  struct Case {
    const char* text;
    bool known;
    bool value;
  };
  const Case kCases[] = {
      {"1", true, true},     {"TRUE", true, true},  {" yes ", true, true}, {"On", true, true},
      {"0", true, false},    {"false", true, false}, {"No", true, false},  {"OFF", true, false},
      {"2", false, false},   {"", false, false},     {"tru", false, false},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.text);
    CfgSetOverride("test.flag", c.text);
    bool value = !c.value;
    const bool untouched = value;
    EXPECT_EQ(CfgGetDefault(Key("test.flag").buf, &value), c.known);
    EXPECT_EQ(value, c.known ? c.value : untouched);
  }
}

TEST_F(PXConfigTest, IntegerValues) {
  struct Case {
    const char* text;
    bool known;
    int32_t value;
  };
  const Case kCases[] = {
      {"42", true, 42},          {"-7", true, -7},           {"+3", true, 3},
      {"0x1F", true, 31},        {"2147483647", true, INT32_MAX}, {"-2147483648", true, INT32_MIN},
      {"2147483648", false, 0},  {"12abc", false, 0},        {"--1", false, 0},
      {"", false, 0},            {"0x", false, 0},
  };
  for (const Case& c : kCases) {
    SCOPED_TRACE(c.text);
    CfgSetOverride("test.number", c.text);
    int32_t value = 555;
    EXPECT_EQ(CfgGetDefault(Key("test.number").buf, &value), c.known);
    EXPECT_EQ(value, c.known ? c.value : 555);
  }
}

TEST_F(PXConfigTest, LookupOrderIsOverrideThenEnvironmentThenFile) {
  const std::filesystem::path file = std::filesystem::temp_directory_path() / "vellum_config_test.cfg";
  {
    std::ofstream out(file);
    out << "# comment line\n"
        << "\n"
        << "Test.Order = from-file\n"
        << "test.fileonly=  spaced value  \n"
        << "no equals sign here\n";
  }
  ScopedEnv config("VELLUM_CONFIG", file.c_str());
  std::string value;
  EXPECT_TRUE(CfgGetDefault(Key("test.order").buf, &value));
  EXPECT_EQ(value, "from-file") << "file keys ignore case";
  EXPECT_TRUE(CfgGetDefault(Key("test.fileonly").buf, &value));
  EXPECT_EQ(value, "spaced value");
  {
    ScopedEnv env("TEST_ORDER", "from-env");
    EXPECT_TRUE(CfgGetDefault(Key("test.order").buf, &value));
    EXPECT_EQ(value, "from-env");
    CfgSetOverride("test.order", "from-override");
    EXPECT_TRUE(CfgGetDefault(Key("test.order").buf, &value));
    EXPECT_EQ(value, "from-override");
  }
  value = "untouched";
  EXPECT_FALSE(CfgGetDefault(Key("test.absent").buf, &value));
  EXPECT_EQ(value, "untouched");
  EXPECT_FALSE(CfgGetDefault(nullptr, &value));
  std::filesystem::remove(file);
  CfgClearOverrides();
  EXPECT_FALSE(CfgGetDefault(Key("test.order").buf, &value)) << "a missing file is no error";
}

TEST_F(PXConfigTest, GarbageCollectionLoggingKeyFromEnvironment) {
  ScopedEnv env("VELLUM_GARBAGECOLLECTION_LOGGING", "yes");
  bool logging = false;
  EXPECT_TRUE(CfgGetDefault(Key("vellum.garbageCollection.logging").buf, &logging));
  EXPECT_TRUE(logging);
}

}  // namespace
