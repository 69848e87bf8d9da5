// Reads arbitrary bytes as a flattened path (big-endian). Whatever is accepted must flatten to
// bytes that read back as an exactly equal path, and nothing may leak either way.
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "runtime/BinData.h"
#include "runtime/DSMemory.h"
#include "runtime/PXPath.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const int64_t liveBefore = DSLiveBlockCount();
  BigEndianizer big;
  {
    InputBuf in(data, size);
    BinDataReader reader(&in, &big);
    Path first = nullptr;
    if (FUnFlattenPath2(reader, &first) == 0) {
      if (!first || !FIsSanePath(first)) std::abort();
      OutputBuf out;
      BinDataWriter writer(&out, &big);
      if (FFlattenPath2(first, writer) != 0) std::abort();
      if (out.GetBytesWritten() != FFlattenedPath2Size(first)) std::abort();
      // The accepted bytes are exactly the canonical form.
      const std::vector<uint8_t> bytes = out.Bytes();
      if (bytes.size() != reader.Position() ||
          !std::equal(bytes.begin(), bytes.end(), data))
        std::abort();
      InputBuf again(bytes.data(), bytes.size());
      BinDataReader rereader(&again, &big);
      Path second = nullptr;
      if (FUnFlattenPath2(rereader, &second) != 0 || FPathCmpExact(first, second) != 0) std::abort();
      FDestroyPath(&second);
    } else if (first) {
      std::abort();
    }
    FDestroyPath(&first);
  }
  if (DSLiveBlockCount() != liveBefore) std::abort();
  return 0;
}
