// The stream state of flattened data: the variable-size field, options, versions, persist
// contexts, sticky errors and the writer's closing diagnostic.
#include <gtest/gtest.h>

#include <cstdint>
#include <optional>
#include <vector>

#include "support/TestSupport.h"
#include "runtime/BinData.h"
#include "runtime/PXApp.h"
#include "vellum/DataStreams.h"
#include "vellum/TypeStrings.h"

namespace {

using Bytes = std::vector<uint8_t>;

constexpr uint32_t kVersion = 0x21008000;
const BigEndianizer kBigEndian;

Bytes WriteField(int32_t value) {
  OutputBuf out;
  KoDataWriter writer(&out, kVersion, &kBigEndian, 0);
  EXPECT_EQ(writer.WriteVariableSizeField(value), 0);
  return out.Bytes();
}

// The value read, or nothing when the read failed (with that failure in *status).
std::optional<int32_t> ReadField(const Bytes& bytes, int32_t* status = nullptr,
                                 size_t* consumed = nullptr) {
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&in, kVersion, nullptr, &kBigEndian, 0);
  int32_t value = -1;
  const int32_t result = reader.ReadVariableSizeField(&value);
  if (status) *status = result;
  if (consumed) *consumed = reader.Position();
  if (result != 0) {
    EXPECT_EQ(value, 0) << "a failed read clears its destination";
    return std::nullopt;
  }
  return value;
}

struct SizeFieldCase {
  const char* name;
  int32_t value;
  Bytes bytes;
};

const SizeFieldCase kSizeFieldCases[] = {
    {"Zero", 0, {0x00, 0x00}},
    {"Control", 5, {0x00, 0x05}},
    {"Largest16Bit", 32767, {0x7F, 0xFF}},
    {"Smallest32Bit", 32768, {0x80, 0x00, 0x80, 0x00}},
    {"SecondWordOnly", 65535, {0x80, 0x00, 0xFF, 0xFF}},
    {"FirstWordCarries", 65536, {0x80, 0x01, 0x00, 0x00}},
    {"Largest", 0x7FFFFFFF, {0xFF, 0xFF, 0xFF, 0xFF}},
};

TEST(KoDataStreamTest, VariableSizeFieldGoldenBytesRoundTrip) {
  for (const SizeFieldCase& c : kSizeFieldCases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(WriteField(c.value), c.bytes);
    EXPECT_EQ(KoDataWriter::GetSizeOfVariableSizeField(c.value),
              static_cast<int32_t>(c.bytes.size()));
    size_t consumed = 0;
    EXPECT_EQ(ReadField(c.bytes, nullptr, &consumed), c.value);
    EXPECT_EQ(consumed, c.bytes.size());
  }
}

TEST(KoDataStreamTest, VariableSizeFieldReadsTheLongFormOfASmallValue) {
  EXPECT_EQ(ReadField({0x80, 0x00, 0x00, 0x05}), 5);
}

// A negative value has no form that reads back, so the writer refuses it rather than writing two
// bytes a reader would take for the start of a four-byte field.
TEST(KoDataStreamTest, NegativeVariableSizeFieldIsReportedAndRefused) {
  DebugCapture capture;
  OutputBuf out;
  KoDataWriter writer(&out, kVersion, &kBigEndian, 0);
  EXPECT_EQ(writer.WriteVariableSizeField(-2), kStatusBadArgument);
  EXPECT_EQ(writer.GetError(), kStatusBadArgument);
  EXPECT_TRUE(out.Bytes().empty());
  ASSERT_EQ(capture.Messages().size(), 1u);
  EXPECT_EQ(capture.Messages()[0].text, "Exceeded limits of TDDataWriter::WriteVariableSizeField");
  EXPECT_EQ(capture.Messages()[0].level, 3);
  EXPECT_EQ(capture.Messages()[0].module, "KoDataWriter");
  EXPECT_EQ(KoDataWriter::GetSizeOfVariableSizeField(-2), 2);
}

TEST(KoDataStreamTest, TruncatedVariableSizeFieldIsCorrupt) {
  const Bytes kTruncated[] = {{}, {0x00}, {0x80}, {0x80, 0x00}, {0x80, 0x00, 0x01}};
  for (const Bytes& bytes : kTruncated) {
    SCOPED_TRACE(testing::PrintToString(bytes));
    int32_t status = 0;
    EXPECT_EQ(ReadField(bytes, &status), std::nullopt);
    EXPECT_EQ(status, kStatusCorruptData);
  }
}

TEST(KoDataStreamTest, ReaderErrorIsSticky) {
  const Bytes bytes = {0x80, 0x00, 0x01, 0x00, 0x07};
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&in, kVersion, nullptr, &kBigEndian, 0);
  int32_t value = 0;
  ASSERT_EQ(reader.ReadVariableSizeField(&value), 0);
  EXPECT_EQ(value, 256);
  EXPECT_EQ(reader.ReadVariableSizeField(&value), kStatusCorruptData);  // one byte left
  reader.GetInputBuf()->Seek(4);
  EXPECT_EQ(reader.ReadVariableSizeField(&value), kStatusCorruptData);
  EXPECT_EQ(value, 0);
}

TEST(KoDataStreamTest, SkippingAVariableSizeField) {
  const Bytes bytes = {0x80, 0x00, 0x01, 0x00, 0x00, 0x07};
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&in, kVersion, nullptr, &kBigEndian, 0);
  EXPECT_EQ(reader.ReadVariableSizeField(nullptr), 0);
  int32_t value = 0;
  EXPECT_EQ(reader.ReadVariableSizeField(&value), 0);
  EXPECT_EQ(value, 7);
}

TEST(KoDataStreamTest, WriterErrorIsStickyAndReportedWhenTheWriterEnds) {
  DebugCapture capture;
  OutputBuf out;
  {
    KoDataWriter writer(&out, kVersion, &kBigEndian, 0);
    writer.SetError(kStatusCorruptData);
    EXPECT_EQ(writer.WriteVariableSizeField(40000), kStatusCorruptData);
    EXPECT_EQ(writer.WriteBool(true), kStatusCorruptData);
    EXPECT_TRUE(capture.Messages().empty());
  }
  EXPECT_TRUE(out.Bytes().empty());
  ASSERT_EQ(capture.Messages().size(), 1u);
  EXPECT_EQ(capture.Messages()[0].text, "KoDataWriter finished with 74 error");
  EXPECT_EQ(capture.Messages()[0].level, 0);
}

TEST(KoDataStreamTest, WriterWithoutErrorEndsSilently) {
  DebugCapture capture;
  {
    OutputBuf out;
    KoDataWriter writer(&out, kVersion, &kBigEndian, 0);
    writer.WriteVariableSizeField(1);
  }
  EXPECT_TRUE(capture.Messages().empty());
}

TEST(KoDataStreamTest, BoolIsOneByte) {
  OutputBuf out;
  KoDataWriter writer(&out, kVersion, &kBigEndian, 0);
  EXPECT_EQ(writer.WriteBool(true), 0);
  EXPECT_EQ(writer.WriteBool(false), 0);
  EXPECT_EQ(out.Bytes(), (Bytes{0x01, 0x00}));
}

TEST(KoDataStreamTest, SizeOnlyWritersAndCountingBuffers) {
  OutputBuf out;
  PreflightOutputBuf counter;
  KoDataWriter plain(&out, kVersion, &kBigEndian, 0);
  KoDataWriter withoutData(&out, kVersion, &kBigEndian, kKoDataWriterDeterminingSizeWithoutData);
  KoDataWriter counting(&counter, kVersion, &kBigEndian, 0);
  EXPECT_FALSE(plain.IsDeterminingSizeWithoutData());
  EXPECT_TRUE(withoutData.IsDeterminingSizeWithoutData());
  EXPECT_FALSE(withoutData.IsOnlyDeterminingSize());
  EXPECT_TRUE(counting.IsOnlyDeterminingSize());
  EXPECT_FALSE(counting.IsDeterminingSizeWithoutData());

  counting.WriteVariableSizeField(5);
  counting.WriteVariableSizeField(1 << 20);
  EXPECT_EQ(counter.GetBytesWritten(), 6u);
}

TEST(KoDataStreamTest, StreamsUseTheCallersContext) {
  const KoContext* context = reinterpret_cast<const KoContext*>(&kBigEndian);  // any address
  const PersistTDData persist(0x08208003, context, kPersistDeferIndices);
  OutputBuf out;
  InputBuf in(nullptr, 0);
  KoDataWriter writer(&persist, &out, &kBigEndian, 0);
  KoDataReader reader(&persist, &in, &kBigEndian, 7);
  EXPECT_EQ(writer.GetPersistTDData(), &persist);
  EXPECT_EQ(reader.GetPersistTDData(), &persist);
  EXPECT_EQ(writer.GetVersion(), 0x08208003u);
  EXPECT_EQ(reader.GetVersion(), 0x08208003u);
  EXPECT_EQ(writer.GetContext(), context);
  EXPECT_EQ(reader.GetContext(), context);
  EXPECT_EQ(reader.GetOptions(), 7u);

  KoDataReader plain(&in, 0x07108001, context, &kBigEndian, 0);
  EXPECT_EQ(plain.GetVersion(), 0x07108001u);
  EXPECT_EQ(plain.GetContext(), context);
}

TEST(KoDataStreamTest, NullContextMeansTheRunningVersion) {
  OutputBuf out;
  InputBuf in(nullptr, 0);
  KoDataWriter writer(static_cast<const PersistTDData*>(nullptr), &out, &kBigEndian, 0);
  KoDataReader reader(static_cast<const PersistTDData*>(nullptr), &in, &kBigEndian, 0);
  EXPECT_EQ(writer.GetVersion(), PXApp::Instance().GetVersion());
  EXPECT_EQ(reader.GetVersion(), PXApp::Instance().GetVersion());
  EXPECT_EQ(writer.GetContext(), nullptr);
  ASSERT_NE(reader.GetPersistTDData(), nullptr);
}

TEST(KoDataStreamTest, VersionOverrideNestsAndRestores) {
  const PersistTDData persist(0x21008000);
  InputBuf in(nullptr, 0);
  KoDataReader reader(&persist, &in, &kBigEndian, 0);
  {
    KoDataReader::VersionOverride outer(&reader, 0x07108001);
    EXPECT_EQ(reader.GetVersion(), 0x07108001u);
    EXPECT_EQ(reader.GetPersistTDData()->GetVersion(), 0x07108001u);
    {
      KoDataReader::VersionOverride inner(&reader, 0x08002184);
      EXPECT_EQ(reader.GetVersion(), 0x08002184u);
    }
    EXPECT_EQ(reader.GetVersion(), 0x07108001u);
    EXPECT_EQ(persist.GetVersion(), 0x21008000u) << "the caller's context is never changed";
  }
  EXPECT_EQ(reader.GetVersion(), 0x21008000u);
  EXPECT_EQ(reader.GetPersistTDData(), &persist);

  KoDataReader own(&in, 0x09008000, nullptr, &kBigEndian, 0);
  {
    KoDataReader::VersionOverride override(&own, 0x10008000);
    EXPECT_EQ(own.GetVersion(), 0x10008000u);
  }
  EXPECT_EQ(own.GetVersion(), 0x09008000u);
  KoDataReader::VersionOverride none(nullptr, 1);  // harmless
}

TEST(KoDataStreamTest, MissingBuffersAreErrorsNotCrashes) {
  DebugCapture capture;
  KoDataWriter writer(static_cast<OutputBuf*>(nullptr), kVersion, &kBigEndian, 0);
  EXPECT_NE(writer.WriteVariableSizeField(1), 0);
  EXPECT_FALSE(writer.IsOnlyDeterminingSize());
  KoDataReader reader(static_cast<InputBuf*>(nullptr), kVersion, nullptr, &kBigEndian, 0);
  int32_t value = 9;
  EXPECT_NE(reader.ReadVariableSizeField(&value), 0);
  EXPECT_EQ(value, 0);
}

}  // namespace
