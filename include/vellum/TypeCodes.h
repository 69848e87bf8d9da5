// The kinds of type descriptor, each once: its code, its names, its notation token, what its data
// is and since when it can be saved. Every switch over kinds, the factory checks, the tool, the
// notation and the exhaustiveness tests read this table, so that a new kind is one row here.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

enum class TypeCode : int16_t {
  Void = 0x00,
  Int8 = 0x01,
  Int16 = 0x02,
  Int32 = 0x03,
  Int64 = 0x04,
  UInt8 = 0x05,
  UInt16 = 0x06,
  UInt32 = 0x07,
  UInt64 = 0x08,
  Float32 = 0x09,
  Float64 = 0x0A,
  FloatExt = 0x0B,
  Complex64 = 0x0C,
  Complex128 = 0x0D,
  ComplexExt = 0x0E,
  EnumUInt8 = 0x15,
  EnumUInt16 = 0x16,
  EnumUInt32 = 0x17,
  Float32Units = 0x19,
  Float64Units = 0x1A,
  FloatExtUnits = 0x1B,
  Complex64Units = 0x1C,
  Complex128Units = 0x1D,
  ComplexExtUnits = 0x1E,
  BooleanU16 = 0x20,
  Boolean = 0x21,
  String = 0x30,
  Path = 0x32,
  Pict = 0x33,
  CStr = 0x34,
  PStr = 0x35,
  Tag = 0x37,
  SubString = 0x3F,
  Array = 0x40,
  ArrayDataPtr = 0x41,
  SubArray = 0x4F,
  Cluster = 0x50,
  KoVariant = 0x53,
  MeasureData = 0x54,
  ComplexFixedPoint = 0x5E,
  FixedPoint = 0x5F,
  Block = 0x60,
  TypeBlock = 0x61,
  VoidBlock = 0x62,
  AlignedBlock = 0x63,
  RepeatedBlock = 0x64,
  AlignmentMarker = 0x65,
  Refnum = 0x70,
  SetCollection = 0x73,
  MapCollection = 0x74,
  Ptr = 0x80,
  PtrTo = 0x83,
  Function = 0xF0,
  PolyVI = 0xF2,
};

// What one datum of a kind is, for code that shows or reads data of any type without a slot of
// the kind's own (the tool's JSON view and its default-data accounting).
enum class ValueForm : uint8_t {
  Nothing,          // nothing that travels: void, raw pointers, C and Pascal strings, array data
                    // pointers, alignment markers
  SignedInteger,    // two's complement in partBytes bytes
  UnsignedInteger,  // partBytes bytes
  Float,            // IEEE binary of 4 or 8 bytes, or the 10-byte extended form
  Complex,          // two Float parts of partBytes bytes each, the real part first
  Boolean,          // one byte, nonzero for true
  StringHandle,     // a handle to a counted string of bytes
  Path,             // a path reference
  Array,            // a handle to the dimension sizes and the elements
  Cluster,          // the elements in place, each at its offset
  ByteBlock,        // the descriptor's data size in bytes, of no meaning here
  RepeatedBlock,    // the element again and again, each copy at the next multiple of its size
  NoGenericView,    // only the kind's own code reads it: variants, refnums, measure data, sets,
                    // maps, functions, fixed point, 16-bit Booleans, substrings and subarrays
};

struct TypeCodeInfo {
  TypeCode code;
  std::string_view name;  // the name every diagnostic and document uses
  std::string_view text;  // what ToString prints; "?" where the kind has no short text
  // The kind's token in the type notation; empty where the writer puts '?' or spells the kind
  // out itself (arrays, subarrays, clusters, pointers to a type).
  std::string_view notation;
  ValueForm form = ValueForm::NoGenericView;
  uint8_t partBytes = 0;  // the bytes of one number, or of each part of a complex one; else 0
  // The first version whose type strings can hold the kind; 0 for kinds as old as the format.
  uint32_t firstVersion = 0;
};

// Complex128Units has no text of its own in older hosts; "complex64Units" follows the pattern
// of Complex64Units, so that every unit-carrying numeric still reads back as what it is.
// Alignment markers entered the type strings in version 0x08602000.
inline constexpr TypeCodeInfo kTypeCodes[] = {
    {TypeCode::Void, "Void", "void", "v", ValueForm::Nothing, 0},
    {TypeCode::Int8, "Int8", "i8", "iB", ValueForm::SignedInteger, 1},
    {TypeCode::Int16, "Int16", "i16", "iW", ValueForm::SignedInteger, 2},
    {TypeCode::Int32, "Int32", "i32", "iL", ValueForm::SignedInteger, 4},
    {TypeCode::Int64, "Int64", "i64", "iQ", ValueForm::SignedInteger, 8},
    {TypeCode::UInt8, "UInt8", "u8", "uB", ValueForm::UnsignedInteger, 1},
    {TypeCode::UInt16, "UInt16", "u16", "uW", ValueForm::UnsignedInteger, 2},
    {TypeCode::UInt32, "UInt32", "u32", "uL", ValueForm::UnsignedInteger, 4},
    {TypeCode::UInt64, "UInt64", "u64", "uQ", ValueForm::UnsignedInteger, 8},
    {TypeCode::Float32, "Float32", "f32", "fS", ValueForm::Float, 4},
    {TypeCode::Float64, "Float64", "f64", "fD", ValueForm::Float, 8},
    {TypeCode::FloatExt, "FloatExt", "f80", "fX", ValueForm::Float, 10},
    {TypeCode::Complex64, "Complex64", "complex32", "cS", ValueForm::Complex, 4},
    {TypeCode::Complex128, "Complex128", "complex64", "cD", ValueForm::Complex, 8},
    {TypeCode::ComplexExt, "ComplexExt", "?", "cX", ValueForm::Complex, 10},
    {TypeCode::EnumUInt8, "EnumUInt8", "enum8", "eB", ValueForm::UnsignedInteger, 1},
    {TypeCode::EnumUInt16, "EnumUInt16", "enum16", "eW", ValueForm::UnsignedInteger, 2},
    {TypeCode::EnumUInt32, "EnumUInt32", "enum32", "eL", ValueForm::UnsignedInteger, 4},
    {TypeCode::Float32Units, "Float32Units", "f32Units", "pfS", ValueForm::Float, 4},
    {TypeCode::Float64Units, "Float64Units", "f64Units", "pfD", ValueForm::Float, 8},
    {TypeCode::FloatExtUnits, "FloatExtUnits", "?", "pfX", ValueForm::Float, 10},
    {TypeCode::Complex64Units, "Complex64Units", "complex32Units", "pcS", ValueForm::Complex, 4},
    {TypeCode::Complex128Units, "Complex128Units", "complex64Units", "pcD", ValueForm::Complex, 8},
    {TypeCode::ComplexExtUnits, "ComplexExtUnits", "?", "pcX", ValueForm::Complex, 10},
    {TypeCode::BooleanU16, "BooleanU16", "?", "b", ValueForm::NoGenericView, 0},
    {TypeCode::Boolean, "Boolean", "bool", "B", ValueForm::Boolean, 0},
    {TypeCode::String, "String", "string", "S", ValueForm::StringHandle, 0},
    {TypeCode::Path, "Path", "path", "P", ValueForm::Path, 0},
    {TypeCode::Pict, "Pict", "?", "", ValueForm::StringHandle, 0},
    {TypeCode::CStr, "CStr", "?", "", ValueForm::Nothing, 0},
    {TypeCode::PStr, "PStr", "?", "", ValueForm::Nothing, 0},
    {TypeCode::Tag, "Tag", "?", "", ValueForm::StringHandle, 0},
    {TypeCode::SubString, "SubString", "?", "s", ValueForm::NoGenericView, 0},
    {TypeCode::Array, "Array", "array", "", ValueForm::Array, 0},
    {TypeCode::ArrayDataPtr, "ArrayDataPtr", "?", "", ValueForm::Nothing, 0},
    {TypeCode::SubArray, "SubArray", "?", "", ValueForm::NoGenericView, 0},
    {TypeCode::Cluster, "Cluster", "cluster", "", ValueForm::Cluster, 0},
    {TypeCode::KoVariant, "KoVariant", "variant", "V", ValueForm::NoGenericView, 0},
    {TypeCode::MeasureData, "MeasureData", "WFMDT", "", ValueForm::NoGenericView, 0},
    {TypeCode::ComplexFixedPoint, "ComplexFixedPoint", "?", "", ValueForm::NoGenericView, 0},
    {TypeCode::FixedPoint, "FixedPoint", "?", "fxp", ValueForm::NoGenericView, 0},
    {TypeCode::Block, "Block", "?", "", ValueForm::ByteBlock, 0},
    {TypeCode::TypeBlock, "TypeBlock", "?", "", ValueForm::ByteBlock, 0},
    {TypeCode::VoidBlock, "VoidBlock", "?", "", ValueForm::ByteBlock, 0},
    {TypeCode::AlignedBlock, "AlignedBlock", "?", "", ValueForm::ByteBlock, 0},
    {TypeCode::RepeatedBlock, "RepeatedBlock", "?", "", ValueForm::RepeatedBlock, 0},
    {TypeCode::AlignmentMarker, "AlignmentMarker", "?", "", ValueForm::Nothing, 0, 0x08602000},
    {TypeCode::Refnum, "Refnum", "refnum", "", ValueForm::NoGenericView, 0},
    {TypeCode::SetCollection, "SetCollection", "?", "", ValueForm::NoGenericView, 0},
    {TypeCode::MapCollection, "MapCollection", "?", "", ValueForm::NoGenericView, 0},
    {TypeCode::Ptr, "Ptr", "?", "*", ValueForm::Nothing, 0},
    {TypeCode::PtrTo, "PtrTo", "?", "", ValueForm::Nothing, 0},
    {TypeCode::Function, "Function", "?", "", ValueForm::NoGenericView, 0},
    {TypeCode::PolyVI, "PolyVI", "?", "", ValueForm::NoGenericView, 0},
};

// The entry of a raw code read from outside, or nothing when no kind has that code.
constexpr const TypeCodeInfo* FindTypeCode(int32_t raw) {
  for (const TypeCodeInfo& info : kTypeCodes) {
    if (static_cast<int32_t>(info.code) == raw) return &info;
  }
  return nullptr;
}

// Readers of a number choose its C type by form and width: each number names a width they know,
// and every other kind none.
static_assert([] {
  for (const TypeCodeInfo& info : kTypeCodes) {
    const uint8_t n = info.partBytes;
    switch (info.form) {
      case ValueForm::SignedInteger:
      case ValueForm::UnsignedInteger:
        if (n != 1 && n != 2 && n != 4 && n != 8) return false;
        break;
      case ValueForm::Float:
      case ValueForm::Complex:
        if (n != 4 && n != 8 && n != 10) return false;
        break;
      case ValueForm::Nothing:
      case ValueForm::Boolean:
      case ValueForm::StringHandle:
      case ValueForm::Path:
      case ValueForm::Array:
      case ValueForm::Cluster:
      case ValueForm::ByteBlock:
      case ValueForm::RepeatedBlock:
      case ValueForm::NoGenericView:
        if (n != 0) return false;
        break;
    }
  }
  return true;
}());

// Codes 1 to 30 use bit 0x10 to mark an attached enumeration or unit; this removes it.
constexpr int32_t StripTypeCodeModifier(int32_t code) {
  return static_cast<uint8_t>(code - 1) < 30 ? (code & ~0x10) : code;
}
