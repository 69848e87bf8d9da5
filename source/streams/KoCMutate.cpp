// Version rules: whether bytes saved by one version predate a change of the format, across
// release branches that were developed side by side.
#include "source/streams/KoCMutate.h"

#include <array>
#include <initializer_list>

#include "runtime/DebugStream.h"
#include "runtime/PXApp.h"
#include "vellum/TypeCodes.h"

VELLUM_DIAGNOSTIC_MODULE("KoCMutate");

namespace {

struct VersionPair {
  uint32_t limit;
  uint32_t equivalent;
};

// A change made on branch `from` reached branch `to` in the builds the pairs give: a change made
// at or before `limit` on `from` is in every build of `to` from `equivalent` on.
struct BranchRow {
  uint8_t fromMajor, fromMinor, toMajor, toMinor;
  std::initializer_list<VersionPair> pairs;
};

const std::array<BranchRow, 15>& BranchTable() {
  static const std::array<BranchRow, 15> table{{
      {21, 0, 22, 3, {{0x21008000, 0x22302000}}},
      {20, 0, 21, 0, {{0x20008000, 0x21002000}}},
      {19, 0, 20, 0, {{0x19008000, 0x20002000}}},
      {18, 0, 19, 0, {{0x18008000, 0x19002000}}},
      {17, 0, 18, 0, {{0x17008000, 0x18002000}}},
      {16, 0, 17, 0, {{0x16008000, 0x17002000}}},
      {15, 0, 16, 0,
       {{0x15008000, 0x16002006}, {0x15006071, 0x16002004}, {0x15006063, 0x16002001}, {0x15006011, 0x16002000}}},
      {14, 0, 15, 0, {{0x14006084, 0x15002000}, {0x14006127, 0x15002010}, {0x14008000, 0x15002030}}},
      {13, 0, 14, 0,
       {{0x13006012, 0x14002000},
        {0x13006055, 0x14002003},
        {0x13006067, 0x14002004},
        {0x13006096, 0x14002005},
        {0x13008000, 0x14002020},
        {0x13008027, 0x14002055},
        {0x13008096, 0x14004012}}},
      {12, 0, 13, 0,
       {{0x12006014, 0x13002000},
        {0x12006072, 0x13002002},
        {0x12006081, 0x13002005},
        {0x12006116, 0x13002010},
        {0x12006134, 0x13002020},
        {0x12006140, 0x13002025},
        {0x12008004, 0x13002030},
        {0x12012017, 0x13002165}}},
      {11, 0, 12, 0, {{0x11006112, 0x12002000}, {0x11006116, 0x12002001}, {0x11008012, 0x12002012}}},
      {10, 5, 11, 0, {{0x10502001, 0x11002237}}},
      {10, 0, 11, 0,
       {{0x10006022, 0x11002000},
        {0x10006062, 0x11002005},
        {0x10006080, 0x11002006},
        {0x10006086, 0x11002010},
        {0x10006109, 0x11002020},
        {0x10006120, 0x11002022},
        {0x10008000, 0x11002026},
        {0x10008009, 0x11002030},
        {0x10008023, 0x11002055},
        {0x10008029, 0x11002068},
        {0x10008033, 0x11002075}}},
      {9, 0, 10, 0,
       {{0x9006068, 0x10002010},
        {0x9006049, 0x10002000},
        {0x9006128, 0x10002044},
        {0x9008002, 0x10002071},
        {0x9008011, 0x10002081},
        {0x9008019, 0x10002094},
        {0x9008023, 0x10002105}}},
      {8, 6, 9, 0,
       {{0x8602021, 0x9002000},
        {0x8602027, 0x9002002},
        {0x8602034, 0x9002003},
        {0x8604001, 0x9002005},
        {0x8604013, 0x9002006},
        {0x8604020, 0x9002008},
        {0x8606000, 0x9002009},
        {0x8606004, 0x9002010},
        {0x8606012, 0x9002012},
        {0x8608000, 0x9002014},
        {0x8608001, 0x9002016},
        {0x8608002, 0x9002162}}},
  }};
  return table;
}

uint32_t Major(uint32_t version) { return (version >> 28) * 10 + ((version >> 24) & 15); }
uint32_t Minor(uint32_t version) { return (version >> 20) & 15; }

bool IsTo(const BranchRow& row, uint32_t version) {
  return row.toMajor == Major(version) && row.toMinor == Minor(version);
}
bool IsFrom(const BranchRow& row, uint32_t version) {
  return row.fromMajor == Major(version) && row.fromMinor == Minor(version);
}

const BranchRow* RowTo(uint32_t current) {
  for (const BranchRow& row : BranchTable())
    if (IsTo(row, current)) return &row;
  return nullptr;
}

}  // namespace

bool VersionShouldMutate(uint32_t saved, uint32_t mutation) {
  return VersionShouldMutate(saved, mutation, PXApp::Instance().GetVersion());
}

bool VersionShouldMutate(uint32_t saved, uint32_t mutation, uint32_t current) {
  if (saved == current) return false;
  if (RowTo(current) == nullptr) {
    (VELLUM_DEBUG(3) << "Version tables need to be updated for VersionShouldMutate for this branch: ")
        .AppendHex32(current)
        .Process();
    return saved < mutation;
  }
  for (const BranchRow& row : BranchTable()) {
    if (!IsFrom(row, mutation) || !IsTo(row, saved)) continue;
    for (const VersionPair& pair : row.pairs)
      if (mutation <= pair.limit) return saved < pair.equivalent;
    return saved < current + 1;
  }
  return saved < mutation;
}

uint32_t GetBranchCompatibleVersion(uint32_t version) {
  return GetBranchCompatibleVersion(version, PXApp::Instance().GetVersion());
}

uint32_t GetBranchCompatibleVersion(uint32_t version, uint32_t current) {
  const BranchRow* row = RowTo(current);
  if (row == nullptr) {
    (VELLUM_DEBUG(3) << "Version tables need to be updated for GetBranchCompatibleVersion for this branch: ")
        .AppendHex32(current)
        .Process();
    return version;
  }
  if (!IsFrom(*row, version)) return version;
  for (const VersionPair& pair : row->pairs)
    if (version <= pair.limit) return pair.equivalent;
  return current + 1;
}

// The kinds' table carries the version as a number, as exported headers cannot name it.
static_assert(FindTypeCode(static_cast<int32_t>(TypeCode::AlignmentMarker))->firstVersion == kAlignmentMarkerVersion);

uint32_t FirstVersionWithTypeCode(int32_t code) {
  const TypeCodeInfo* info = FindTypeCode(code);
  return info != nullptr ? info->firstVersion : 0;
}
