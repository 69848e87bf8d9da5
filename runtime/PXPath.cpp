// Paths: a type and a list of validated names, allocated through PXAlloc, with a bounded reader
// for their flattened form.
#include "runtime/PXPath.h"

#include <algorithm>
#include <cstring>
#include <mutex>
#include <new>
#include <unordered_set>

#include "runtime/BinData.h"
#include "runtime/PXInternal.h"
#include "runtime/PXStrings.h"

namespace {

constexpr uint8_t kPathTag[4] = {'P', 'T', 'H', '0'};
constexpr size_t kHeaderBytes = 12;       // tag, byte count, type, component count
constexpr uint32_t kCountedHeaderBytes = 4;  // type and component count, inside the byte count

bool IsKnownType(int32_t type) { return type >= kAbsPath && type <= kUNCPath; }

// Every live path, so that a stray pointer handed in as a path is recognised without being read
// (data verification meets paths in memory it did not make).
struct LivePaths {
  std::mutex mutex;  // guards paths
  std::unordered_set<const PathRef*> paths;
};

LivePaths& TheLivePaths() {
  static pxinternal::NoDestructor<LivePaths> live;
  return live.get();
}

bool IsLive(const PathRef* p) {
  if (!p) return false;
  LivePaths& live = TheLivePaths();
  std::lock_guard lock(live.mutex);
  return live.paths.count(p) != 0;
}

int32_t NewPath(int32_t type, Path* out) {
  if (!out) return kStatusBadArgument;
  *out = nullptr;
  void* block = PXAlloc(sizeof(PathRef));
  if (!block) return kStatusOutOfMemory;
  Path p = ::new (block) PathRef();
  p->type = type;
  try {
    LivePaths& live = TheLivePaths();
    std::lock_guard lock(live.mutex);
    live.paths.insert(p);
  } catch (const std::bad_alloc&) {
    p->~PathRef();
    PXFree(p);
    return kStatusOutOfMemory;
  }
  *out = p;
  return kStatusNoError;
}

int32_t Sign(int32_t v) { return v < 0 ? -1 : (v > 0 ? 1 : 0); }

int32_t ExactCompare(std::string_view a, std::string_view b) { return Sign(a.compare(b)); }

template <class Compare>
int32_t ComparePaths(Path a, Path b, Compare compare) {
  if (!a || !b) return a ? 1 : (b ? -1 : 0);
  if (a->type != b->type) return a->type < b->type ? -1 : 1;
  const size_t n = std::min(a->names.size(), b->names.size());
  for (size_t i = 0; i < n; ++i) {
    const std::string_view x(a->names[i].data(), a->names[i].size());
    const std::string_view y(b->names[i].data(), b->names[i].size());
    if (int32_t c = compare(x, y)) return Sign(c);
  }
  if (a->names.size() != b->names.size()) return a->names.size() < b->names.size() ? -1 : 1;
  return 0;
}

size_t NamesBytes(Path p) {
  size_t bytes = 0;
  if (p && p->type != kNotAPath)
    for (const PathRef::Name& n : p->names) bytes += 1 + n.size();
  return bytes;
}

}  // namespace

int32_t PathRef::NameCompare(std::string_view a, std::string_view b) {
  return StringUtils::CaseInsensitiveCompare(a, b);
}

bool PathRef::NameEquals(std::string_view a, std::string_view b) { return NameCompare(a, b) == 0; }

bool PathRef::IsValidName(std::string_view name) {
  if (name.empty() || name.size() > 255) return false;
  return name.find_first_of(std::string_view("\0/\\", 3)) == std::string_view::npos;
}

int32_t FEmptyPath(Path* out) { return NewPath(kAbsPath, out); }

int32_t FNotAPath(Path* out) { return NewPath(kNotAPath, out); }

int32_t FAppendName(Path p, const uint8_t* pstrName) {
  if (!p) return kStatusNullHandle;
  if (p->type == kNotAPath || !pstrName) return kStatusBadArgument;
  const std::string_view name(reinterpret_cast<const char*>(pstrName + 1), pstrName[0]);
  if (!PathRef::IsValidName(name)) return kStatusBadArgument;
  if (p->names.size() >= static_cast<size_t>(kMaxPathDepth)) return kStatusBadArgument;
  try {
    p->names.emplace_back(name.data(), name.size());
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;  // emplace_back leaves the vector as it was
  }
  return kStatusNoError;
}

int32_t FDepth(Path p) { return p ? static_cast<int32_t>(p->names.size()) : 0; }

int32_t FGetPathType(Path p, int32_t* type) {
  if (!type) return kStatusBadArgument;
  *type = kNotAPath;
  if (!p) return kStatusNullHandle;
  *type = p->type;
  return kStatusNoError;
}

int32_t FSetPathType(Path p, int32_t type) {
  if (!p) return kStatusNullHandle;
  if (!IsKnownType(type)) return kStatusBadArgument;
  p->type = type;
  if (type == kNotAPath) p->names.clear();
  return kStatusNoError;
}

int32_t FPathCmp(Path a, Path b) { return ComparePaths(a, b, &PathRef::NameCompare); }

int32_t FPathCmpExact(Path a, Path b) { return ComparePaths(a, b, &ExactCompare); }

int32_t FIsSanePath(Path p) {
  if (!IsLive(p) || !IsKnownType(p->type)) return 0;
  if (p->type == kNotAPath && !p->names.empty()) return 0;
  if (p->names.size() > static_cast<size_t>(kMaxPathDepth)) return 0;
  for (const PathRef::Name& n : p->names)
    if (!PathRef::IsValidName(std::string_view(n.data(), n.size()))) return 0;
  return 1;
}

int32_t FPathCopy(Path src, Path* dst) {
  if (!dst) return kStatusBadArgument;
  *dst = nullptr;
  if (!src) return kStatusNoError;
  Path copy = nullptr;
  if (int32_t err = NewPath(src->type, &copy)) return err;
  try {
    copy->names = src->names;
  } catch (const std::bad_alloc&) {
    FDestroyPath(&copy);
    return kStatusOutOfMemory;
  }
  *dst = copy;
  return kStatusNoError;
}

int32_t FDestroyPath(Path* p) {
  if (!p) return kStatusBadArgument;
  if (Path path = *p) {
    {
      LivePaths& live = TheLivePaths();
      std::lock_guard lock(live.mutex);
      // Not a path this layer made, or one already destroyed: leave the memory alone.
      if (live.paths.erase(path) == 0) return kStatusBadArgument;
    }
    *p = nullptr;
    path->~PathRef();
    PXFree(path);
  }
  return kStatusNoError;
}

size_t FFlattenedPath2Size(Path p) { return kHeaderBytes + NamesBytes(p); }

int32_t FFlattenPath2(Path p, BinDataWriter& w) {
  if (w.GetError() != 0) return w.GetError();
  const int32_t type = p ? p->type : kNotAPath;
  const size_t depth = (p && type != kNotAPath) ? p->names.size() : 0;
  if (!IsKnownType(type) || depth > static_cast<size_t>(kMaxPathDepth)) {
    w.SetError(kStatusBadArgument);
    return w.GetError();
  }
  // At most 65535 names of at most 256 bytes each, so the count fits in 32 bits.
  w.WriteBytes(kPathTag, sizeof kPathTag);
  w.WriteU32(static_cast<uint32_t>(kCountedHeaderBytes + NamesBytes(p)));
  w.WriteU16(static_cast<uint16_t>(type));
  w.WriteU16(static_cast<uint16_t>(depth));
  for (size_t i = 0; i < depth; ++i) {
    const PathRef::Name& n = p->names[i];
    w.WriteU8(static_cast<uint8_t>(n.size()));
    w.WriteBytes(n.data(), n.size());
  }
  return w.GetError();
}

int32_t FUnFlattenPath2(BinDataReader& r, Path* out) {
  if (!out) {
    r.SetError(kStatusBadArgument);
    return r.GetError();
  }
  *out = nullptr;
  if (r.GetError() != 0) return r.GetError();

  uint8_t tag[4] = {};
  uint32_t byteCount = 0;
  uint16_t type = 0;
  uint16_t depth = 0;
  r.ReadBytes(tag, sizeof tag);
  if (r.GetError() == 0 && std::memcmp(tag, kPathTag, sizeof tag) != 0) r.SetError(kStatusCorruptData);
  r.ReadU32(&byteCount);
  if (r.GetError() == 0 && (byteCount < kCountedHeaderBytes || byteCount > r.BytesLeft()))
    r.SetError(kStatusCorruptData);
  const size_t start = r.Position();
  r.ReadU16(&type);
  r.ReadU16(&depth);
  if (r.GetError() != 0) return r.GetError();
  // Each name takes at least two bytes; the byte count bounds the work before any allocation.
  const size_t nameBytes = byteCount - kCountedHeaderBytes;
  if (!IsKnownType(type) || (type == kNotAPath && depth != 0) || size_t{depth} * 2 > nameBytes) {
    r.SetError(kStatusCorruptData);
    return r.GetError();
  }

  Path p = nullptr;
  if (int32_t err = NewPath(type, &p)) {
    r.SetError(err);
    return r.GetError();
  }
  try {
    p->names.reserve(depth);
  } catch (const std::bad_alloc&) {
    r.SetError(kStatusOutOfMemory);
  }
  uint8_t name[256];
  for (uint16_t i = 0; i < depth && r.GetError() == 0; ++i) {
    if (r.ReadPStr(name) != 0) break;
    if (r.Position() - start > byteCount) {
      r.SetError(kStatusCorruptData);
      break;
    }
    if (int32_t err = FAppendName(p, name)) r.SetError(err == kStatusOutOfMemory ? err : kStatusCorruptData);
  }
  if (r.GetError() == 0 && r.Position() - start != byteCount) r.SetError(kStatusCorruptData);
  if (r.GetError() != 0) {
    FDestroyPath(&p);
    return r.GetError();
  }
  *out = p;
  return kStatusNoError;
}
