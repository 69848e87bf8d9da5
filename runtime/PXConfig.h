// Configuration lookup for hosts and tests.
//
// A key (given as a PStr, e.g. "vellum.garbageCollection.logging") is looked up in order:
//   1. overrides set with CfgSetOverride (the key exactly as given);
//   2. the environment variable named by the key uppercased with every character that is not
//      an ASCII letter or digit turned into '_' (VELLUM_GARBAGECOLLECTION_LOGGING);
//   3. the file named by the environment variable VELLUM_CONFIG: lines "key = value", blank
//      lines and lines starting with '#' ignored, keys matched without regard to ASCII case,
//      the last line for a key winning. The file is read at each lookup.
// The first source that has the key decides, even when its value does not parse.
// Values are trimmed of blanks. Booleans: 1/true/yes/on and 0/false/no/off, ASCII case ignored.
// Integers: decimal with an optional sign, or hexadecimal after "0x", within int32_t.
// Every function may be called from any thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

// True when the key is set to a value of the requested kind; *value is untouched otherwise.
bool CfgGetDefault(const uint8_t* pstrKey, bool* value);
bool CfgGetDefault(const uint8_t* pstrKey, int32_t* value);
bool CfgGetDefault(const uint8_t* pstrKey, std::string* value);

void CfgSetOverride(std::string_view key, std::string_view value);
void CfgClearOverrides();

// The environment variable name for a key, as described above.
std::string CfgEnvironmentName(std::string_view key);
