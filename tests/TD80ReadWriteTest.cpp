// Type strings: the stored bytes of descriptor records and lists, loading them back, the
// version rules, and the refusals that keep damaged or hostile strings from harming the host.
#include <gtest/gtest.h>

#include <pthread.h>
#include <sys/mman.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstring>
#include <functional>
#include <string>
#include <vector>

#include "support/TestDatum.h"
#include "support/TestSupport.h"
#include "support/TypeSystemFixture.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXApp.h"
#include "runtime/PXResources.h"
#include "vellum/DataStreams.h"
#include "vellum/TypeStrings.h"
#include "runtime/PXStrings.h"
#include "vellum/Dictionaries.h"
#include "vellum.h"

namespace {

class TD80ReadWriteTest : public TypeSystemTest {};

std::string Flat(const TDR& type, uint32_t version = PXApp::Instance().GetVersion()) {
  const PersistTDData persist(version);
  UHandle h = nullptr;
  const int32_t status = FlattenOneType(&persist, type, &h, nullptr);
  if (status != kStatusNoError) return "status " + std::to_string(status);
  std::string text = HexBytes(*h, DSGetHandleSize(h));
  DSDisposeHandle(h);
  return text;
}

std::string FlatList(const std::vector<TDR>& types) {
  TMTypeList list;
  for (const TDR& type : types) EXPECT_EQ(list.AppendType(type, nullptr), kStatusNoError);
  UHandle h = nullptr;
  const int32_t status = FlattenListOfTypes(nullptr, &list, nullptr, &h, 0, nullptr, 0);
  if (status != kStatusNoError) return "status " + std::to_string(status);
  std::string text = HexBytes(*h, DSGetHandleSize(h));
  DSDisposeHandle(h);
  return text;
}

int32_t Load(const std::vector<uint8_t>& bytes, TDR* out, uint32_t version = PXApp::Instance().GetVersion()) {
  const PersistTDData persist(version);
  return UnFlattenOneType(&persist, bytes.data(), static_cast<uint32_t>(bytes.size()), out, nullptr);
}

TDR RoundTrip(const TDR& type) {
  UHandle h = nullptr;
  EXPECT_EQ(FlattenOneType(nullptr, type, &h, nullptr), kStatusNoError);
  TDR back;
  EXPECT_EQ(UnFlattenOneType(nullptr, h, &back, nullptr), kStatusNoError);
  DSDisposeHandle(h);
  return back;
}

// --- the stored bytes --------------------------------------------------------------------------------

TEST_F(TD80ReadWriteTest, GoldenRecordsOfTheCommonShapes) {
  EXPECT_EQ(Flat(GetiL()), "00 00 00 01 00 05 00 03 00 00 01 00 00");
  EXPECT_EQ(Flat(GetStringTD()), "00 00 00 01 00 08 00 30 FF FF FF FF 00 01 00 00");
  EXPECT_EQ(Flat(TDRArray(1, GetfD())),
            "00 00 00 02 00 05 00 0A 00 00 0C 00 40 00 01 FF FF FF FF 00 00 00 01 00 01");
  TDWCluster mixed;
  mixed << GetiL() << GetStringTD();
  EXPECT_EQ(Flat(mixed.CheckIn()),
            "00 00 00 03 00 05 00 03 00 00 08 00 30 FF FF FF FF 00 0A 00 50 00 02 00 00 00 01 00 01 00 02");
  TDWCluster twins;
  twins << GetiL() << GetiL();
  EXPECT_EQ(Flat(twins.CheckIn()), "00 00 00 02 00 05 00 03 00 00 0A 00 50 00 02 00 00 00 00 00 01 00 01");
  EXPECT_EQ(Flat(TDR()), "00 00 00 00 00 00");
  EXPECT_EQ(FlatList({}), "00 00 00 00 00 00");
  // Equal descriptors share one record; the list refers to it twice.
  EXPECT_EQ(FlatList({GetiL(), GetStringTD(), GetiL()}),
            "00 00 00 02 00 05 00 03 00 00 08 00 30 FF FF FF FF 00 03 00 00 00 01 00 00");
}

TEST_F(TD80ReadWriteTest, NamesArePaddedToEvenLength) {
  TDWInt32 three;
  EXPECT_EQ(three.SetName("abc"), kStatusNoError);
  EXPECT_EQ(Flat(three.CheckIn()), "00 00 00 01 00 09 40 03 00 03 61 62 63 00 01 00 00");
  TDWInt32 four;
  EXPECT_EQ(four.SetName("abcd"), kStatusNoError);
  EXPECT_EQ(Flat(four.CheckIn()), "00 00 00 01 00 0B 40 03 00 04 61 62 63 64 00 00 01 00 00");
  EXPECT_EQ(RoundTrip(three.CheckIn()), three.CheckIn());
  EXPECT_EQ(RoundTrip(four.CheckIn()), four.CheckIn());
}

TEST_F(TD80ReadWriteTest, TypedefLinkPrecedesTheCodeWord) {
  TDWInt32 linked;
  ASSERT_EQ(linked.SetTypedef(Link("abcde", 0x01020304)), kStatusNoError);
  const TDR type = linked.CheckIn();
  EXPECT_EQ(Flat(type), "00 00 00 01 00 17 00 F1 01 02 03 04 00 00 00 01 05 61 62 63 64 65 00 09 00 03 00 00 01 00 00");
  EXPECT_EQ(RoundTrip(type), type);
  // Before 0x08608002 the inner size left out what the one-name layout took, ((n + 2) | 1) + 7:
  // the same as now for five letters, one more for six.
  TDWInt32 six;
  ASSERT_EQ(six.SetTypedef(Link("abcdef", 0x01020304)), kStatusNoError);
  EXPECT_EQ(Flat(six.CheckIn()), "00 00 00 01 00 18 00 F1 01 02 03 04 00 00 00 01 06 61 62 63 64 65 66 00 09 00 03 00 00 01 00 00");
  EXPECT_EQ(Flat(six.CheckIn(), 0x08608001),
            "00 00 00 01 00 18 00 F1 01 02 03 04 00 00 00 01 06 61 62 63 64 65 66 00 08 00 03 00 00 01 00 00");
}

TEST_F(TD80ReadWriteTest, TypedefsOfVersionsBeforeQualifiedNamesHoldOneName) {
  // Only the file name travels, in a PStr padded to even length, and reads back as the one name.
  TDWInt32 linked;
  ASSERT_EQ(linked.SetTypedef(Link("abcdef", 0x01020304)), kStatusNoError);
  const std::string flat = Flat(linked.CheckIn(), 0x08006000);
  EXPECT_EQ(flat, "00 00 00 01 00 14 00 F1 01 02 03 04 06 61 62 63 64 65 66 00 00 04 00 03 00 01 00 00");
  TDR back;
  ASSERT_EQ(Load(BytesFromHex(flat), &back, 0x08006000), kStatusNoError);
  EXPECT_EQ(back, linked.CheckIn());
}

TEST_F(TD80ReadWriteTest, KindsNewerThanTheVersionAreNeitherSavedNorLoaded) {
  TDWAlignmentMarker marker;
  ASSERT_EQ(marker.SetAlignmentSource(GetiL()), kStatusNoError);
  const TDR type = marker.CheckIn();
  DebugCapture capture;
  EXPECT_EQ(Flat(type, 0x08601FFF), "status 42");
  EXPECT_TRUE(capture.Contains("Invalid type write"));
  // What the first version with markers writes is refused by a reader of the version before.
  const std::vector<uint8_t> bytes = BytesFromHex(Flat(type, 0x08602000));
  TDR back;
  EXPECT_EQ(Load(bytes, &back, 0x08601FFF), kStatusOutOfMemory);
  EXPECT_FALSE(back);
  EXPECT_TRUE(capture.Contains("Type string refused: type code 101 did not exist in version 0x08601fff"));
  ASSERT_EQ(Load(bytes, &back, 0x08602000), kStatusNoError);
  EXPECT_EQ(back, type);
}

TEST_F(TD80ReadWriteTest, CodeWordFlags) {
  TDWInt32 flagged;
  EXPECT_EQ(flagged.SetNoSelectMask(1), kStatusNoError);
  EXPECT_EQ(flagged.SetGenericness(1), kStatusNoError);
  flagged.EphemeralizeTD();
  const TDR type = flagged.CheckIn();
  EXPECT_EQ(Flat(type), "00 00 00 01 00 05 86 03 00 00 01 00 00");
  EXPECT_EQ(RoundTrip(type), type);
  // The generic bit is left out before 0x09002000, and so is the flag byte before 0x08604012.
  EXPECT_EQ(Flat(type, 0x08604011), "00 00 00 01 00 04 82 03 00 01 00 00");

  TDWBoolean discard;
  EXPECT_EQ(discard.SetEventDiscardMask(1), kStatusNoError);
  EXPECT_EQ(Flat(discard.CheckIn()), "00 00 00 01 00 04 01 21 00 01 00 00");
  EXPECT_EQ(RoundTrip(discard.CheckIn()), discard.CheckIn());
  // The event-discard bit means nothing on another code.
  TDR loaded;
  ASSERT_EQ(Load(BytesFromHex("00 00 00 01 00 05 01 03 00 00 01 00 00"), &loaded), kStatusNoError);
  EXPECT_EQ(loaded, GetiL());
}

TEST_F(TD80ReadWriteTest, LongRecordsAndIndicesTakeFourBytes) {
  // An enumeration of 200 names of 200 letters makes a record above 32767 bytes.
  TDWEnum items;
  const std::string item(200, 'q');
  for (int i = 0; i < 200; ++i) items << (item + std::to_string(i)).c_str();
  const TDR big = TDWUInt16(items, nullptr).CheckIn();
  const std::string flat = Flat(big);
  const std::vector<uint8_t> bytes = BytesFromHex(flat);
  ASSERT_GT(bytes.size(), 32768u);
  EXPECT_EQ(bytes[4] & 0x80, 0x80) << "the size field has bit 31 set";
  const uint32_t size = ((bytes[4] & 0x7Fu) << 24) | (bytes[5] << 16) | (bytes[6] << 8) | bytes[7];
  EXPECT_EQ(size, bytes.size() - 4 - 4);
  TDR back;
  ASSERT_EQ(Load(bytes, &back), kStatusNoError);
  EXPECT_EQ(back, big);

  // A cluster of 32770 distinct elements refers to its last ones with 4-byte indices.
  TDWCluster wide;
  for (int i = 0; i < 32770; ++i) {
    TDWInt8 element;
    EXPECT_EQ(element.SetName(std::to_string(i)), kStatusNoError);
    wide << element;
  }
  const TDR cluster = wide.CheckIn();
  UHandle h = nullptr;
  ASSERT_EQ(FlattenOneType(nullptr, cluster, &h, nullptr), kStatusNoError);
  const size_t total = DSGetHandleSize(h);
  // The tail: the cluster's last indices 0x80008000, 0x80008001, then one entry, index 32770.
  EXPECT_EQ(HexBytes(*h + total - 14, 14), "80 00 80 00 80 00 80 01 00 01 80 00 80 02");
  TDR wideBack;
  ASSERT_EQ(UnFlattenOneType(nullptr, h, &wideBack, nullptr), kStatusNoError);
  EXPECT_EQ(wideBack, cluster);
  DSDisposeHandle(h);
}

TEST_F(TD80ReadWriteTest, OneTypeLoadsAsTheSharedDescriptor) {
  TDR loaded;
  ASSERT_EQ(Load(BytesFromHex("00 00 00 01 00 05 00 03 00 00 01 00 00"), &loaded), kStatusNoError);
  EXPECT_EQ(loaded.GetImpPtr(), GetiL().GetImpPtr());
  ASSERT_EQ(Load(BytesFromHex("00 00 00 00 00 00"), &loaded), kStatusNoError);
  EXPECT_FALSE(loaded);
  TMTypeList list;
  ASSERT_EQ(UnFlattenListOfTypes(nullptr, BytesFromHex("00 00 00 00 00 00").data(), 6, &list, nullptr, 0, nullptr),
            kStatusNoError);
  EXPECT_EQ(list.GetNumTypes(), 0);
}

TEST_F(TD80ReadWriteTest, ExtraValuesFollowTheirIndices) {
  TMTypeList list;
  EXPECT_EQ(list.AppendType(GetiL(), nullptr), kStatusNoError);
  EXPECT_EQ(list.AppendType(GetfD(), nullptr), kStatusNoError);
  const uint32_t extra[] = {7, 40000};
  UHandle h = nullptr;
  ASSERT_EQ(FlattenListOfTypes(nullptr, &list, extra, &h, 0, nullptr, 0), kStatusNoError);
  EXPECT_EQ(HexBytes(*h, DSGetHandleSize(h)),
            "00 00 00 02 00 05 00 03 00 00 05 00 0A 00 00 02 00 00 00 07 00 01 80 00 9C 40");
  TMTypeList back;
  uint32_t* values = nullptr;
  ASSERT_EQ(UnFlattenListOfTypes(nullptr, h, &back, &values, 0, nullptr), kStatusNoError);
  ASSERT_EQ(back.GetNumTypes(), 2);
  EXPECT_EQ(back.GetType(1), GetfD());
  ASSERT_NE(values, nullptr);
  EXPECT_EQ(values[0], 7u);
  EXPECT_EQ(values[1], 40000u);
  DSDisposePtr(reinterpret_cast<UPtr>(values));
  DSDisposeHandle(h);
}

TEST_F(TD80ReadWriteTest, SkippedEmptyEntriesReuseThePreviousIndex) {
  TMTypeList list;
  EXPECT_EQ(list.AppendType(TDR(), nullptr), kStatusNoError);
  EXPECT_EQ(list.AppendType(GetfD(), nullptr), kStatusNoError);
  EXPECT_EQ(list.AppendType(TDR(), nullptr), kStatusNoError);
  UHandle h = nullptr;
  ASSERT_EQ(FlattenListOfTypes(nullptr, &list, nullptr, &h, 0, nullptr, 1), kStatusNoError);
  EXPECT_EQ(HexBytes(*h, DSGetHandleSize(h)), "00 00 00 01 00 05 00 0A 00 00 03 00 00 00 00 00 00");
  DSDisposeHandle(h);
}

TEST_F(TD80ReadWriteTest, SavedResourcesLoadBack) {
  TDWCluster cluster;
  cluster << GetiL() << GetPathTD();
  const TDR type = cluster.CheckIn();
  ASSERT_EQ(SaveListOfOneType(nullptr, 9, 128, 0x54595045, type), kStatusNoError);
  TDR back;
  ASSERT_EQ(LoadListOfOneType(nullptr, 9, 128, 0x54595045, &back), kStatusNoError);
  EXPECT_EQ(back, type);
  EXPECT_EQ(LoadListOfOneType(nullptr, 9, 129, 0x54595045, &back), kStatusNullHandle);
  RCloseFile(9);
}

// --- refusals ----------------------------------------------------------------------------------------

TEST_F(TD80ReadWriteTest, DamagedStringsFailWithAMessage) {
  DebugCapture capture;
  TDR out;
  // A record size below 4.
  EXPECT_EQ(Load(BytesFromHex("00 00 00 01 00 03 00 03 00 01 00 00"), &out), kStatusOutOfMemory);
  // An unknown code.
  EXPECT_EQ(Load(BytesFromHex("00 00 00 01 00 04 00 EE 00 01 00 00"), &out), kStatusOutOfMemory);
  EXPECT_TRUE(capture.Contains("ConstructEltTD(): type code 238 is invalid.")) << ::testing::PrintToString(capture.Texts());
  // Truncated in the middle of a record.
  EXPECT_EQ(Load(BytesFromHex("00 00 00 01 00 08 00 30 FF FF"), &out), kStatusOutOfMemory);
  // A container whose element index is outside the table.
  EXPECT_EQ(Load(BytesFromHex("00 00 00 01 00 06 00 40 00 01 FF FF FF FF 00 05 00 01 00 00"), &out),
            kStatusOutOfMemory);
  // An entry index outside the table is the null descriptor.
  ASSERT_EQ(Load(BytesFromHex("00 00 00 01 00 05 00 03 00 00 01 00 07"), &out), kStatusNoError);
  EXPECT_FALSE(out);
  // More than one entry for one type.
  capture.Clear();
  EXPECT_EQ(Load(BytesFromHex("00 00 00 01 00 05 00 03 00 00 02 00 00 00 00"), &out), kStatusNullHandle);
  EXPECT_TRUE(capture.Contains("UnFlattenOneType : We're only supposed to have one type."));
  // Counts far beyond the input reserve nothing they cannot fill.
  EXPECT_EQ(Load(BytesFromHex("FF FF FF FF 00 05"), &out), kStatusOutOfMemory);
  TMTypeList list;
  const std::vector<uint8_t> manyEntries = BytesFromHex("00 00 00 00 7F FF");
  EXPECT_EQ(UnFlattenListOfTypes(nullptr, manyEntries.data(), 6, &list, nullptr, 0, nullptr), kStatusOutOfMemory);
  EXPECT_EQ(UnFlattenListOfTypes(nullptr, manyEntries.data(), 6, nullptr, nullptr, 0, nullptr), kStatusBadArgument);
}

TEST_F(TD80ReadWriteTest, ClustersTooWideToLoadAreNotSaved) {
  TDWCluster wide;
  ASSERT_EQ(wide.ReserveElementCount(65536), kStatusNoError);
  for (int32_t i = 0; i < 65535; ++i) ASSERT_EQ(wide.AppendEltTD(GetiB()), kStatusNoError);
  const TDR widest = wide.CheckIn();
  EXPECT_EQ(RoundTrip(widest), widest);

  ASSERT_EQ(wide.AppendEltTD(GetiB()), kStatusNoError);
  DebugCapture capture;
  UHandle h = nullptr;
  EXPECT_EQ(FlattenOneType(nullptr, wide.CheckIn(), &h, nullptr), kStatusBadArgument);
  EXPECT_EQ(h, nullptr);
  EXPECT_EQ(capture.Texts(), (std::vector<std::string>{"Too many elements in a container to save: 65536",
                                                       "Saving type descriptors encountered an error!",
                                                       "KoDataWriter finished with 1 error"}));
}

TEST_F(TD80ReadWriteTest, LoadTableIndicesOutsideTheTableAreNull) {
  // One record; entries at index 0, at 1 (one past the table) and at 32768 (a four-byte index).
  const std::vector<uint8_t> bytes = BytesFromHex("00 00 00 01 00 05 00 03 00 00 03 00 00 00 01 80 00 80 00");
  DebugCapture capture;
  TMTypeList list;
  ASSERT_EQ(UnFlattenListOfTypes(nullptr, bytes.data(), static_cast<uint32_t>(bytes.size()), &list, nullptr, 0,
                                 nullptr),
            kStatusNoError);
  ASSERT_EQ(list.GetNumTypes(), 3);
  EXPECT_EQ(list.GetType(0), GetiL());
  EXPECT_FALSE(list.GetType(1));
  EXPECT_FALSE(list.GetType(2));
  EXPECT_TRUE(capture.Texts().empty());
}

TEST_F(TD80ReadWriteTest, NullOutputHandleIsRefused) {
  DebugCapture capture;
  TMTypeList list;
  EXPECT_EQ(FlattenListOfTypes(nullptr, &list, nullptr, nullptr, 0, nullptr, 0), kStatusNullHandle);
  EXPECT_TRUE(capture.Contains("FlattenListOfTypes : Do not pass hdl as NULL in FlattenListOfTypes"));
}

TEST_F(TD80ReadWriteTest, SanityCheckIsReportedButDoesNotStopTheSave) {
  DebugCapture capture;
  SetTDSanityCheckProc([](const TD&) -> int32_t { return 0; });
  TDR back = RoundTrip(GetiL());
  SetTDSanityCheckProc(nullptr);
  EXPECT_EQ(back, GetiL());
  EXPECT_TRUE(capture.Contains("Saving an insane type descriptor."));
  EXPECT_TRUE(capture.Contains("UnFlattenListOfTypes : Loading an insane type descriptor."));
}

// --- consolidated types, types inside data -----------------------------------------------------------

TEST_F(TD80ReadWriteTest, ConsolidatedListsReferToTheSharedList) {
  TMTypeList shared;
  const PersistTDData persist(&shared, nullptr, PXApp::Instance().GetVersion(), 0);
  ASSERT_TRUE(persist.PersistingWithConsolidatedTypes());
  TMTypeList list;
  EXPECT_EQ(list.AppendType(GetiL(), nullptr), kStatusNoError);
  EXPECT_EQ(list.AppendType(GetfD(), nullptr), kStatusNoError);
  UHandle h = nullptr;
  ASSERT_EQ(FlattenListOfTypes(&persist, &list, nullptr, &h, 0, nullptr, 0), kStatusNoError);
  EXPECT_EQ(HexBytes(*h, DSGetHandleSize(h)), "00 02 00 01");
  ASSERT_EQ(shared.GetNumTypes(), 2);
  DSDisposeHandle(h);
  // The same run again is found where it stands; a one-type reference has no count.
  TMTypeList second;
  EXPECT_EQ(second.AppendType(GetfD(), nullptr), kStatusNoError);
  ASSERT_EQ(FlattenListOfTypes(&persist, &second, nullptr, &h, 1, nullptr, 0), kStatusNoError);
  EXPECT_EQ(HexBytes(*h, DSGetHandleSize(h)), "00 02");
  EXPECT_EQ(shared.GetNumTypes(), 2);
  TDR back;
  ASSERT_EQ(UnFlattenOneType(&persist, h, &back, nullptr), kStatusNoError);
  EXPECT_EQ(back, GetfD());
  DSDisposeHandle(h);

  // Without consolidation (an old version, or suppressed) the ordinary form is written.
  const PersistTDData old(&shared, nullptr, 0x08602038, 0);
  EXPECT_FALSE(old.PersistingWithConsolidatedTypes());
  const PersistTDData suppressed(&shared, nullptr, PXApp::Instance().GetVersion(), kPersistSuppressConsolidation);
  EXPECT_FALSE(suppressed.PersistingWithConsolidatedTypes());
}

TEST_F(TD80ReadWriteTest, DeferredReferencesPassThroughThePendingQueue) {
  DebugCapture capture;
  const PersistTDData persist(nullptr, nullptr, PXApp::Instance().GetVersion(), kPersistDeferIndices);
  TMTypeList read;
  const std::vector<uint8_t> bytes = BytesFromHex("00 05");
  ASSERT_EQ(UnFlattenListOfTypes(&persist, bytes.data(), 2, &read, nullptr, 1, nullptr), kStatusNoError);
  TMTypeList list;
  EXPECT_EQ(list.AppendType(GetiL(), nullptr), kStatusNoError);
  UHandle h = nullptr;
  ASSERT_EQ(FlattenListOfTypes(&persist, &list, nullptr, &h, 1, nullptr, 0), kStatusNoError);
  EXPECT_EQ(HexBytes(*h, DSGetHandleSize(h)), "00 05");
  DSDisposeHandle(h);
  // The queue is empty now.
  EXPECT_EQ(FlattenListOfTypes(&persist, &list, nullptr, &h, 1, nullptr, 0), kStatusNullHandle);
  EXPECT_TRUE(capture.Contains("invalid call"));
}

TEST_F(TD80ReadWriteTest, TypesInsideDataAndTheOldFormatHooks) {
  OutputBuf out;
  {
    KoDataWriter writer(&out, PXApp::Instance().GetVersion(), nullptr, 0);
    ASSERT_EQ(writer.WriteTD(GetStringTD()), kStatusNoError);
  }
  EXPECT_EQ(HexBytes(out.Data(), out.GetBytesWritten()), "00 00 00 01 00 08 00 30 FF FF FF FF 00 01 00 00");
  InputBuf in(out.Data(), out.GetBytesWritten());
  KoDataReader reader(&in, PXApp::Instance().GetVersion(), nullptr, nullptr, 0);
  EXPECT_EQ(reader.ReadTD(), GetStringTD());
  EXPECT_EQ(reader.BytesLeft(), 0u);

  // Descriptors in data older than 0x08002184 belong to the host's procedures.
  SetWriteOldTDProc([](KoDataWriter* writer, const TDR& type) -> uint32_t {
    return static_cast<uint32_t>(writer->WriteU8(static_cast<uint8_t>(type.GetTypeCode())));
  });
  SetReadOldTDProc([](KoDataReader* source) -> TDR {
    uint8_t code = 0;
    source->ReadU8(&code);
    return MakeDefaultTDRForTypeCode(code);
  });
  OutputBuf old;
  {
    KoDataWriter writer(&old, 0x07000000, nullptr, 0);
    ASSERT_EQ(writer.WriteTD(GetfD()), kStatusNoError);
  }
  EXPECT_EQ(HexBytes(old.Data(), old.GetBytesWritten()), "0A");
  InputBuf oldIn(old.Data(), old.GetBytesWritten());
  KoDataReader oldReader(&oldIn, 0x07000000, nullptr, nullptr, 0);
  EXPECT_EQ(oldReader.ReadTD(), GetfD());
  SetWriteOldTDProc(nullptr);
  SetReadOldTDProc(nullptr);

  DebugCapture capture;
  OutputBuf none;
  KoDataWriter writer(&none, 0x07000000, nullptr, 0);
  EXPECT_EQ(writer.WriteTD(GetfD()), kStatusNullHandle);
  EXPECT_TRUE(capture.Contains("No callback to write old TD"));
}

TEST_F(TD80ReadWriteTest, AllocationFailuresLeaveNothingBehind) {
  TDWCluster cluster;
  cluster << GetiL() << TDRArray(1, GetStringTD());
  EXPECT_EQ(cluster.SetName("sweep"), kStatusNoError);
  const TDR type = cluster.CheckIn();
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    UHandle h = nullptr;
    const int32_t status = FlattenOneType(nullptr, type, &h, nullptr);
    if (status == kStatusNoError) DSDisposeHandle(h);
    return status;
  });
  UHandle h = nullptr;
  ASSERT_EQ(FlattenOneType(nullptr, type, &h, nullptr), kStatusNoError);
  SweepAllocationFailures(kStatusOutOfMemory, [&] {
    TDR back;
    const int32_t status = UnFlattenOneType(nullptr, h, &back, nullptr);
    if (status == kStatusNoError && !(back == type)) return -1;
    return status;
  });
  DSDisposeHandle(h);
}

// --- limits ------------------------------------------------------------------------------------------

// Type strings written byte by byte: short records (2-byte size fields and indices), then a list
// of one entry, the last record.
class TypeStringBytes {
 public:
  // A record of `code` with `payload` and, when `name` is not empty, a name part.
  void Record(uint16_t code, const std::vector<uint8_t>& payload, const std::string& name = "") {
    std::vector<uint8_t> body;
    PutU16(body, name.empty() ? code : static_cast<uint16_t>(code | 0x4000));
    body.insert(body.end(), payload.begin(), payload.end());
    if (!name.empty()) {
      body.push_back(static_cast<uint8_t>(name.size()));
      body.insert(body.end(), name.begin(), name.end());
      if ((name.size() + 1) % 2 != 0) body.push_back(0);
    }
    PutU16(records_, static_cast<uint16_t>(body.size() + 2));
    records_.insert(records_.end(), body.begin(), body.end());
    ++count_;
  }
  uint16_t Count() const { return count_; }

  std::vector<uint8_t> OneEntryList() const {
    std::vector<uint8_t> bytes = {0, 0, static_cast<uint8_t>(count_ >> 8), static_cast<uint8_t>(count_)};
    bytes.insert(bytes.end(), records_.begin(), records_.end());
    PutU16(bytes, 1);
    PutU16(bytes, static_cast<uint16_t>(count_ - 1));
    return bytes;
  }

  static std::vector<uint8_t> U16s(std::initializer_list<uint16_t> values) {
    std::vector<uint8_t> bytes;
    for (const uint16_t v : values) PutU16(bytes, v);
    return bytes;
  }
  static std::vector<uint8_t> U32(uint32_t v) {
    return {static_cast<uint8_t>(v >> 24), static_cast<uint8_t>(v >> 16), static_cast<uint8_t>(v >> 8),
            static_cast<uint8_t>(v)};
  }

 private:
  static void PutU16(std::vector<uint8_t>& bytes, uint16_t v) {
    bytes.push_back(static_cast<uint8_t>(v >> 8));
    bytes.push_back(static_cast<uint8_t>(v));
  }
  std::vector<uint8_t> records_;
  uint16_t count_ = 0;
};

constexpr uint16_t kCodeInt32 = 0x03;
constexpr uint16_t kCodeString = 0x30;
constexpr uint16_t kCodeCluster = 0x50;
constexpr uint16_t kCodeBlock = 0x60;

// `levels` records: a variable String named `innermost`, then clusters each holding the record
// before it, the last one named `outermost` (when not empty). Record i is i + 1 levels deep.
std::vector<uint8_t> ClusterChain(int32_t levels, const std::string& innermost, const std::string& outermost) {
  TypeStringBytes bytes;
  bytes.Record(kCodeString, TypeStringBytes::U32(0xFFFFFFFF), innermost);
  for (int32_t i = 1; i < levels; ++i) {
    bytes.Record(kCodeCluster, TypeStringBytes::U16s({1, static_cast<uint16_t>(i - 1)}),
                 i == levels - 1 ? outermost : std::string());
  }
  return bytes.OneEntryList();
}

// An Int32 named `leaf`, then `doublings` clusters each of two copies of the record before it;
// the last one named `outermost`. Record i counts 2^(i + 1) - 1 descriptors when expanded.
std::vector<uint8_t> DoublingChain(int32_t doublings, const std::string& leaf, const std::string& outermost) {
  TypeStringBytes bytes;
  bytes.Record(kCodeInt32, {0}, leaf);
  for (int32_t i = 1; i <= doublings; ++i) {
    const auto previous = static_cast<uint16_t>(i - 1);
    bytes.Record(kCodeCluster, TypeStringBytes::U16s({2, previous, previous}),
                 i == doublings ? outermost : std::string());
  }
  return bytes.OneEntryList();
}

// A Block of 0x40000000 bytes named `block`, another of `secondSize` bytes, and a cluster of the
// two named `outermost`.
std::vector<uint8_t> BigBlocks(uint32_t secondSize, const std::string& block, const std::string& outermost) {
  TypeStringBytes bytes;
  bytes.Record(kCodeBlock, TypeStringBytes::U32(0x40000000), block);
  uint16_t second = 0;
  if (secondSize != 0x40000000) {
    bytes.Record(kCodeBlock, TypeStringBytes::U32(secondSize));
    second = 1;
  }
  bytes.Record(kCodeCluster, TypeStringBytes::U16s({2, 0, second}), outermost);
  return bytes.OneEntryList();
}

// What the interning dictionaries hold, after a collection has dropped what nobody uses.
struct InternedCounts {
  uint32_t types;
  uint32_t names;
  bool operator==(const InternedCounts&) const = default;
};

InternedCounts CollectAndCount() {
  GarbageCollectDictionaries();
  return {DictionarySize("TD"), DictionarySize("Name")};
}

struct LimitCase {
  const char* name;
  std::vector<uint8_t> bytes;
  const char* message;
  // Records before the refused one, each new and interned by the load; only the first is named.
  uint32_t completeRecords;
};

TEST_F(TD80ReadWriteTest, StringsBeyondTheLimitsAreRefusedAndLeaveNothingBehind) {
  const LimitCase kCases[] = {
      {"Nesting", ClusterChain(257, "innermost-a", "refused-a"),
       "Type string refused: nesting deeper than 256 levels", 256},
      {"Expansion", DoublingChain(24, "leaf-b", "refused-b"),
       "Type string refused: more than 16777216 descriptors when expanded", 24},
      {"DataSize", BigBlocks(0x40000000, "block-c", "refused-c"),
       "Type string refused: data size does not fit in 31 bits", 1},
  };
  for (const LimitCase& c : kCases) {
    SCOPED_TRACE(c.name);
    const InternedCounts before = CollectAndCount();
    DebugCapture capture;
    const auto start = std::chrono::steady_clock::now();
    TDR out;
    EXPECT_EQ(Load(c.bytes, &out), kStatusOutOfMemory);
    const double ms = std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start).count();
    std::printf("%s refused in %.2f ms\n", c.name, ms);
    EXPECT_FALSE(out);
    EXPECT_EQ(capture.Texts(), std::vector<std::string>{c.message});
    // The complete records were interned and nothing of the refused one: not even its name,
    // which no other record uses.
    EXPECT_EQ(DictionarySize("TD"), before.types + c.completeRecords);
    EXPECT_EQ(DictionarySize("Name"), before.names + 1);
    EXPECT_EQ(CollectAndCount(), before);
  }
}

TEST_F(TD80ReadWriteTest, StringsAtTheLimitsLoad) {
  TDR deep;
  ASSERT_EQ(Load(ClusterChain(256, "innermost", ""), &deep), kStatusNoError);
  int32_t levels = 1;
  for (TDR level = deep; level.IsClust() != 0; level = vellum::As<TDRCluster>(level).GetEltTD(0)) ++levels;
  EXPECT_EQ(levels, 256);

  // 2^24 - 1 descriptors when expanded.
  TDR wide;
  ASSERT_EQ(Load(DoublingChain(23, "leaf", ""), &wide), kStatusNoError);
  EXPECT_EQ(wide.DataSize(), 4 << 23);

  TDR big;
  ASSERT_EQ(Load(BigBlocks(0x3FFFFFFE, "block", ""), &big), kStatusNoError);
  EXPECT_EQ(big.DataSize(), 0x7FFFFFFE);
}

TEST_F(TD80ReadWriteTest, WhatNoLoadAcceptsIsNotSaved) {
  TDR deep = GetiL();  // one level; 255 clusters around it make 256
  for (int i = 0; i < 255; ++i) {
    TDWCluster level;
    level << deep;
    deep = level.CheckIn();
  }
  TDWCluster deeper;
  deeper << deep;
  const TDR tooDeep = deeper.CheckIn();
  UHandle h = nullptr;
  ASSERT_EQ(FlattenOneType(nullptr, deep, &h, nullptr), kStatusNoError);  // 256 levels
  TDR back;
  EXPECT_EQ(UnFlattenOneType(nullptr, h, &back, nullptr), kStatusNoError);
  EXPECT_EQ(back, deep);
  DSDisposeHandle(h);
  DebugCapture capture;
  h = nullptr;
  EXPECT_EQ(FlattenOneType(nullptr, tooDeep, &h, nullptr), kStatusBadArgument);
  EXPECT_EQ(h, nullptr);
  EXPECT_TRUE(capture.Contains("Type not saved, no load would accept it: nesting deeper than 256 levels"));
}

// --- recursion on a small stack ----------------------------------------------------------------------

constexpr uint8_t kStackPattern = 0xA5;

// The bytes at the low end of the stack that nothing wrote. Reads memory the sanitizer may still
// consider the exited thread's.
__attribute__((no_sanitize("address"))) size_t UntouchedBytes(const uint8_t* low, size_t size) {
  size_t n = 0;
  while (n < size && low[n] == kStackPattern) ++n;
  return n;
}

// Runs `work` on a thread of its own whose stack is `size` bytes with an inaccessible page below,
// so that an overflow faults at once, and answers how many bytes of the stack were written (the
// thread's own bookkeeping at its top included).
size_t RunOnStack(size_t size, const std::function<void()>& work) {
  const auto page = static_cast<size_t>(sysconf(_SC_PAGESIZE));
  void* region = mmap(nullptr, size + page, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS | MAP_STACK, -1, 0);
  if (region == MAP_FAILED) {
    ADD_FAILURE() << "no memory for the stack";
    return 0;
  }
  auto* low = static_cast<uint8_t*>(region) + page;
  EXPECT_EQ(mprotect(region, page, PROT_NONE), 0);
  std::memset(low, kStackPattern, size);
  pthread_attr_t attributes;
  pthread_attr_init(&attributes);
  EXPECT_EQ(pthread_attr_setstack(&attributes, low, size), 0);
  pthread_t thread;
  auto body = [](void* argument) -> void* {
    (*static_cast<const std::function<void()>*>(argument))();
    return nullptr;
  };
  EXPECT_EQ(pthread_create(&thread, &attributes, body, const_cast<std::function<void()>*>(&work)), 0);
  pthread_join(thread, nullptr);
  pthread_attr_destroy(&attributes);
  const size_t used = size - UntouchedBytes(low, size);
  munmap(region, size + page);
  return used;
}

constexpr size_t kSmallStack = size_t{1} << 20;
constexpr int32_t kDeepLevels = 256;

// A writable chain of kDeepLevels levels around a variable String named `innermost`; `wrap`
// makes level i (1 and up) around the level below.
TDW BuildChain(const std::string& innermost, const std::function<TDW(int32_t, const TDW&)>& wrap) {
  TDW level = TDWString(U(innermost.c_str()), vellum::bound::kVariable);
  for (int32_t i = 1; i < kDeepLevels; ++i) level = wrap(i, level);
  return level;
}

TDW ClusterAround(const TDW& inner) {
  TDWCluster cluster;
  cluster << inner;
  return cluster;
}

struct DeepCase {
  const char* name;
  std::function<TDW(int32_t, const TDW&)> wrap;
};

TEST_F(TD80ReadWriteTest, EveryWalkOverTheDeepestDescriptorFitsASmallStack) {
  const DeepCase kCases[] = {
      {"clusters", [](int32_t, const TDW& inner) { return ClusterAround(inner); }},
      // Kinds whose data holds the level below in place.
      {"blocks", [](int32_t i, const TDW& inner) -> TDW {
         switch (i % 3) {
           case 0: {
             TDWRepeatedBlock repeated;
             EXPECT_EQ(repeated.SetEltTD(inner), kStatusNoError);
             EXPECT_EQ(repeated.SetNumBlocks(1), kStatusNoError);
             return repeated;
           }
           case 1: {
             TDWTypeBlock block;
             EXPECT_EQ(block.SetEltTD(inner), kStatusNoError);
             return block;
           }
           default: {
             TDWCluster cluster;
             cluster << TDWInt8() << inner;
             return cluster;
           }
         }
       }},
      // Kinds that refer to the level below only through the descriptor.
      {"pointers", [](int32_t i, const TDW& inner) -> TDW {
         switch (i % 4) {
           case 1: return TDWArray(1, inner);
           case 3: {
             TDWAlignmentMarker marker;
             EXPECT_EQ(marker.SetAlignmentSource(inner), kStatusNoError);
             return marker;
           }
           default: {
             TDWPtrTo pointer;
             EXPECT_EQ(pointer.SetEltTD(inner), kStatusNoError);
             return pointer;
           }
         }
       }},
  };
  SetDSAlign(8);  // alignment walks stop at once when everything is packed
  const size_t baseline = RunOnStack(kSmallStack, [] {});
  for (const DeepCase& c : kCases) {
    SCOPED_TRACE(c.name);
    const std::string innermost = std::string("deep innermost ") + c.name;
    const InternedCounts before = CollectAndCount();
    TDW separate;
    TDR deep;
    std::vector<uint8_t> bytes;
    TDR loaded;
    const std::vector<std::pair<const char*, std::function<void()>>> kSteps = {
        {"build", [&] {
           separate = BuildChain(innermost, c.wrap);
           deep = BuildChain(innermost, c.wrap).CheckIn();
         }},
        {"flatten", [&] {
           UHandle h = nullptr;
           ASSERT_EQ(FlattenOneType(nullptr, deep, &h, nullptr), kStatusNoError);
           bytes.assign(*h, *h + DSGetHandleSize(h));
           DSDisposeHandle(h);
           if (std::string(c.name) == "clusters") {
             EXPECT_EQ(bytes, ClusterChain(kDeepLevels, innermost, ""));
           }
         }},
        {"load", [&] { ASSERT_EQ(Load(bytes, &loaded), kStatusNoError); }},
        {"compare", [&] {
           EXPECT_EQ(loaded, deep);
           EXPECT_EQ(deep.IsSameAs(separate), 1);
           EXPECT_EQ(separate.IsSameAs(deep), 1);
           EXPECT_EQ(deep.CmpTD(separate, 0), 0);
           EXPECT_EQ(separate.CmpTD(deep, 0), 0);
         }},
        {"hash", [&] { EXPECT_EQ(separate.GetHashValue(), deep.GetHashValue()); }},
        {"check in", [&] { EXPECT_EQ(separate.CheckIn(), deep); }},
        {"layout", [&] {
           EXPECT_EQ(separate.DataSize(), deep.DataSize());
           EXPECT_EQ(separate.GetAlignment(), deep.GetAlignment());
           TestPlatform platform(4, 0, 4);
           EXPECT_EQ(separate.DataSize(&platform), deep.DataSize(&platform));
           EXPECT_EQ(deep.GetAlignment(&platform), separate.GetAlignment(&platform));
         }},
        {"text", [&] {
           EXPECT_NE(ToString(deep), "");
           EXPECT_NE(TypeToInterpretedString(deep), "");
           DebugCapture capture;
           deep.PrintDebugStr();
           EXPECT_GT(capture.Messages().size(), static_cast<size_t>(kDeepLevels));
         }},
        {"traverse", [&] {
           int32_t visited = 0;
           deep.TraverseTDR(
               [](const TDR&, void* count) -> TDTraverseValue {
                 ++*static_cast<int32_t*>(count);
                 return kTraverseContinue;
               },
               &visited, nullptr);
           EXPECT_GE(visited, kDeepLevels);
           EXPECT_EQ(deep.ContainsTypedef(), 0);
         }},
        {"data", [&] {
           const auto size = static_cast<size_t>(deep.DataSize());
           std::vector<uint64_t> a(size / 8 + 1, 0);
           std::vector<uint64_t> b(size / 8 + 1, 0);
           auto* first = reinterpret_cast<uint8_t*>(a.data());
           auto* second = reinterpret_cast<uint8_t*>(b.data());
           ASSERT_EQ(deep.InflateDefData(first, 0, 1, 0), kStatusNoError);
           ASSERT_EQ(deep.InflateDefData(second, 0, 1, 0), kStatusNoError);
           ASSERT_EQ(deep.CopyData(first, second, nullptr, 0), kStatusNoError);
           EXPECT_EQ(deep.VerifyData(second, nullptr), kStatusNoError);
           EXPECT_EQ(deep.ResetToDefaultData(second), kStatusNoError);
           deep.DeflateData(first, first + size, 1, NormalHandleAllocator());
           deep.DeflateData(second, second + size, 1, NormalHandleAllocator());
         }},
        {"release", [&] {
           separate = TDW();
           deep = TDR();
           loaded = TDR();
           GarbageCollectDictionaries();
         }},
    };
    // How much of the stack each step took, for the record.
    std::string figures = std::string(c.name) + ", bytes of stack:";
    for (const auto& [step, work] : kSteps) {
      const size_t used = RunOnStack(kSmallStack, work);
      figures += std::string(" ") + step + " " + std::to_string(used > baseline ? used - baseline : 0) + ";";
    }
    std::printf("%s\n", figures.c_str());
    EXPECT_EQ(CollectAndCount(), before);
  }
  SetDSAlign(0);
}

// --- versions ----------------------------------------------------------------------------------------

TEST(KoCMutateTest, VersionRulesAcrossBranches) {
  for (const uint32_t m : {0x08604012u, 0x22302005u, 0u}) EXPECT_FALSE(VersionShouldMutate(0x22308000, m, 0x22308000));
  // The change of 8.6 build 4012 reached 9.0 in build 2006.
  EXPECT_TRUE(VersionShouldMutate(0x09002005, 0x08604012, 0x22308000));
  EXPECT_FALSE(VersionShouldMutate(0x09002006, 0x08604012, 0x22308000));
  // Branches that no row pairs compare as numbers.
  EXPECT_TRUE(VersionShouldMutate(0x21009000, 0x22302005, 0x22308000));
  EXPECT_FALSE(VersionShouldMutate(0x22303000, 0x22302005, 0x22308000));
  // A change later than every pair of its row reached the newer branch only after the current build.
  EXPECT_TRUE(VersionShouldMutate(0x22308000, 0x21009000, 0x22308001));
  // Row 13's second pair is reached only above the first limit.
  EXPECT_TRUE(VersionShouldMutate(0x10002009, 0x09006000, 0x22308000));
  EXPECT_FALSE(VersionShouldMutate(0x10002010, 0x09006000, 0x22308000));

  EXPECT_EQ(GetBranchCompatibleVersion(0x21005000, 0x22308000), 0x22302000u);
  EXPECT_EQ(GetBranchCompatibleVersion(0x21009000, 0x22308000), 0x22308001u);
  EXPECT_EQ(GetBranchCompatibleVersion(0x20005000, 0x22308000), 0x20005000u);
  EXPECT_EQ(GetBranchCompatibleVersion(0x21005000), 0x22302000u);

  DebugCapture capture;
  EXPECT_TRUE(VersionShouldMutate(0x30000000, 0x30000001, 0x30005000));
  EXPECT_EQ(GetBranchCompatibleVersion(0x21005000, 0x30005000), 0x21005000u);
  EXPECT_EQ(capture.Texts(),
            (std::vector<std::string>{
                "Version tables need to be updated for VersionShouldMutate for this branch: 0x30005000",
                "Version tables need to be updated for GetBranchCompatibleVersion for this branch: 0x30005000"}));
}

}  // namespace
