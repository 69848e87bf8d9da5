// What a caller supplies to ask for the data layout of another platform, and the shape classes
// of data.
#pragma once

#include <cstdint>

// A target platform's layout rules. No implementation lives in this library; a null pointer
// everywhere means the running process.
class ITargetPlatformAlignment {
 public:
  virtual ~ITargetPlatformAlignment() = default;
  // The platform's largest alignment; below 2 means packed.
  virtual int32_t MaxAlignment() const = 0;
  // 1: clusters and repeated blocks take the largest alignment instead of their elements'.
  virtual int32_t AggregateAlignmentMode() const = 0;
  // Size and alignment of every handle, pointer and pointer-sized field.
  virtual int32_t PointerSize() const = 0;
  virtual int32_t IsBigEndian() const = 0;
  // In-place size of a numeric of that type code on the target.
  virtual int32_t NumericSize(int32_t typeCode) const = 0;
  // The platform's four-character identifier; 0 when the platform has none.
  virtual uint32_t PlatformIdentifier() const { return 0; }
};

// 0: no handles inside; 1: handles to variable-size blocks; 2: string-like.
enum DataShapes : int32_t {
  kDataShapePlain = 0,
  kDataShapeHandles = 1,
  kDataShapeStringLike = 2,
};
