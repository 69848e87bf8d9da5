// File paths as a type and a list of name components, independent of any file system.
//
// Name rules: a component is 1 to 255 bytes, none of them NUL, '/' or '\'. Names compare with
// ASCII letters folded to lower case, then by unsigned bytes, the shorter first (NameCompare);
// "Data" and "DATA" are the same name. FPathCmpExact tells them apart.
//
// Flattened form (FFlattenPath2), integers in the endianizer's order (big-endian here):
//   4 bytes   tag "PTH0"
//   uint32    number of bytes that follow
//   uint16    path type (kAbsPath, kRelPath, kNotAPath, kUNCPath)
//   uint16    number of components
//   then each component as a PStr (length byte, bytes)
// The empty absolute path is 50 54 48 30 00 00 00 04 00 00 00 00 (12 bytes). A not-a-path has
// no components.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/DSMemory.h"
#include "runtime/PXTypes.h"

class BinDataWriter;
class BinDataReader;

enum : int32_t { kAbsPath = 0, kRelPath = 1, kNotAPath = 2, kUNCPath = 3 };

// Most components a path may have (their count is 16 bits in the flattened form).
constexpr int32_t kMaxPathDepth = 65535;

struct PathRef {
  using Name = std::basic_string<char, std::char_traits<char>, PXAllocator<char>>;

  int32_t type = kAbsPath;
  std::vector<Name, PXAllocator<Name>> names;

  static int32_t NameCompare(std::string_view a, std::string_view b);  // <0, 0, >0
  static bool NameEquals(std::string_view a, std::string_view b);
  static bool IsValidName(std::string_view name);
};
using Path = PathRef*;

// Paths are objects owned by whoever created them (FEmptyPath, FNotAPath, FPathCopy,
// FUnFlattenPath2) and freed with FDestroyPath. They are not locked: one thread at a time.
// Functions given a null path return 42 unless stated otherwise.

// *out is a new empty absolute path, or null on failure (2).
int32_t FEmptyPath(Path* out);
// *out is a new not-a-path, or null on failure (2).
int32_t FNotAPath(Path* out);
// Appends a component given as a PStr. 1 for an invalid name, for a not-a-path or beyond
// kMaxPathDepth; 2 when memory runs out. The path is unchanged on failure.
int32_t FAppendName(Path p, const uint8_t* pstrName);
// Number of components; 0 for a null path.
int32_t FDepth(Path p);
int32_t FGetPathType(Path p, int32_t* type);
// 1 for an unknown type. Making a path a not-a-path drops its components.
int32_t FSetPathType(Path p, int32_t type);
// A total order: null equals null and precedes every path; then the type; then the components
// pairwise by NameCompare; then the shorter path first. Returns -1, 0 or 1.
int32_t FPathCmp(Path a, Path b);
// The same order with component names compared byte for byte.
int32_t FPathCmpExact(Path a, Path b);
// 1 when p is a live path made here with a known type, valid names, and no names if it is a
// not-a-path; else 0. A pointer that is not a live path is never read.
int32_t FIsSanePath(Path p);
// *dst is a new copy of src (null for a null src). On failure *dst is null (2).
int32_t FPathCopy(Path src, Path* dst);
// Frees *p and sets it null. A null *p is fine; a null p, or a *p that is not a live path made
// here (already destroyed, or garbage), is 1 and nothing is touched.
int32_t FDestroyPath(Path* p);

// Writes p in the flattened form; a null path is written as a not-a-path. Errors go to the
// writer's sticky status, which is returned.
int32_t FFlattenPath2(Path p, BinDataWriter& w);
// Bytes FFlattenPath2 writes for p.
size_t FFlattenedPath2Size(Path p);
// Reads one flattened path into *out (a new path owned by the caller; null on failure). Safe on
// any bytes: 74 for a wrong tag, type, count or name, or a byte count that disagrees with the
// components; 2 when memory runs out. Errors go to the reader's sticky status.
int32_t FUnFlattenPath2(BinDataReader& r, Path* out);
