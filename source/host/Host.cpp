// The host API over the library's own entry points: what the tool, the tests and every host
// would otherwise each write again.
#include "source/host/Host.h"

#include <algorithm>
#include <cstring>
#include <new>
#include <utility>

#include "runtime/BinData.h"
#include "runtime/DebugStream.h"
#include "runtime/HandleAllocation.h"
#include "runtime/PXApp.h"
#include "vellum/DataStreams.h"
#include "vellum/TypeManagerHooks.h"

VELLUM_DIAGNOSTIC_MODULE("Host");

namespace vellum {

Session::Session() {
  ClearRefusal();
  status_ = services_.Start(TypeManagerService());
  if (status_ != 0) services_.StopAll();
}

Session::~Session() { services_.StopAll(); }

OwnedHandle::~OwnedHandle() { DSDisposeHandle(handle_); }

OwnedHandle::OwnedHandle(OwnedHandle&& other) noexcept : handle_(std::exchange(other.handle_, nullptr)) {}

OwnedHandle& OwnedHandle::operator=(OwnedHandle&& other) noexcept {
  if (this != &other) {
    DSDisposeHandle(handle_);
    handle_ = std::exchange(other.handle_, nullptr);
  }
  return *this;
}

UHandle* OwnedHandle::Out() {
  DSDisposeHandle(handle_);
  handle_ = nullptr;
  return &handle_;
}

UHandle OwnedHandle::Release() noexcept { return std::exchange(handle_, nullptr); }

std::span<const uint8_t> OwnedHandle::Bytes() const {
  if (handle_ == nullptr || *handle_ == nullptr) return {};
  return {*handle_, DSGetHandleSize(handle_)};
}

Value::Value(const TDR& type) : type_(type) {
  ClearRefusal();
  if (!type_) return;
  const int32_t size = type_.DataSize();
  // At least one word, so that even a value of no size has an address to pass.
  words_ = std::max<size_t>(1, (static_cast<size_t>(std::max(size, 0)) + sizeof(uint64_t) - 1) / sizeof(uint64_t));
  try {
    storage_ = std::make_unique<uint64_t[]>(words_);
  } catch (const std::bad_alloc&) {
    status_ = kStatusOutOfMemory;
    words_ = 0;
    return;
  }
  status_ = type_.InflateDefData(storage_.get(), 0, 1, 0);
  if (status_ != 0) {
    storage_.reset();
    words_ = 0;
  }
}

Value::~Value() { Release(); }

Value::Value(Value&& other) noexcept
    : type_(std::move(other.type_)),
      storage_(std::move(other.storage_)),
      words_(std::exchange(other.words_, 0)),
      status_(std::exchange(other.status_, 0)) {}

Value& Value::operator=(Value&& other) noexcept {
  if (this != &other) {
    Release();
    type_ = std::move(other.type_);
    storage_ = std::move(other.storage_);
    words_ = std::exchange(other.words_, 0);
    status_ = std::exchange(other.status_, 0);
  }
  return *this;
}

void Value::Release() noexcept {
  if (storage_ && type_) {
    auto* begin = reinterpret_cast<uint8_t*>(storage_.get());
    type_.DeflateData(begin, begin + words_ * sizeof(uint64_t), 1, NormalHandleAllocator());
  }
  storage_.reset();
  words_ = 0;
}

uint32_t CurrentVersion() { return PXApp::Instance().GetVersion(); }

int32_t FlattenData(const TDR& type, const void* data, std::vector<uint8_t>* bytes, uint32_t version) {
  ClearRefusal();
  if (!type) return kStatusNullHandle;
  if (data == nullptr || bytes == nullptr) return kStatusBadArgument;
  OutputBuf out;
  KoDataWriter writer(&out, version != 0 ? version : CurrentVersion(), nullptr, 0);
  if (const int32_t status = writer.WriteData(type, data, 1); status != 0) return status;
  try {
    bytes->insert(bytes->end(), out.Data(), out.Data() + out.GetBytesWritten());
  } catch (const std::bad_alloc&) {
    return kStatusOutOfMemory;
  }
  return kStatusNoError;
}

int32_t FlattenData(const Value& value, std::vector<uint8_t>* bytes, uint32_t version) {
  return FlattenData(value.Type(), value.Data(), bytes, version);
}

int32_t UnflattenData(const TDR& type, std::span<const uint8_t> bytes, void* data, uint32_t version,
                      size_t* used) {
  ClearRefusal();
  if (used != nullptr) *used = 0;
  if (!type) return kStatusNullHandle;
  if (data == nullptr) return kStatusBadArgument;
  InputBuf in(bytes.data(), bytes.size());
  KoDataReader reader(&in, version != 0 ? version : CurrentVersion(), nullptr, nullptr, 0);
  if (const int32_t status = reader.ReadData(type, data, 1); status != 0) return status;
  if (used != nullptr) {
    *used = in.Position();
  } else if (in.BytesLeft() != 0) {
    (VELLUM_DEBUG(2) << in.BytesLeft() << " byte(s) follow the value, which ends at byte " << in.Position())
        .Process();
    // The caller asked for exactly one value: what it holds now is not what the bytes say.
    static_cast<void>(type.ResetToDefaultData(data));  // the refusal's status says more
    return kStatusCorruptData;
  }
  return kStatusNoError;
}

int32_t UnflattenData(std::span<const uint8_t> bytes, Value* value, uint32_t version, size_t* used) {
  if (value == nullptr) return kStatusBadArgument;
  return UnflattenData(value->Type(), bytes, value->Data(), version, used);
}

std::string LastRefusal() {
  const DebugMessage* first = FirstDebugError();
  return first != nullptr ? first->text : std::string();
}

void ClearRefusal() { ClearFirstDebugError(); }

}  // namespace vellum
