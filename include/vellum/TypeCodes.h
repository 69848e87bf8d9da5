// The kinds of type descriptor, each once: its code, its name and its short text.
// Every switch over kinds, the factory checks, the tool and the exhaustiveness tests read this table.
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

struct TypeCodeInfo {
  TypeCode code;
  std::string_view name;  // the name every diagnostic and document uses
  std::string_view text;  // what ToString prints; "?" where the kind has no short text
};

// Complex128Units has no text of its own in older hosts; "complex64Units" follows the pattern
// of Complex64Units, so that every unit-carrying numeric still reads back as what it is.
inline constexpr TypeCodeInfo kTypeCodes[] = {
    {TypeCode::Void, "Void", "void"},
    {TypeCode::Int8, "Int8", "i8"},
    {TypeCode::Int16, "Int16", "i16"},
    {TypeCode::Int32, "Int32", "i32"},
    {TypeCode::Int64, "Int64", "i64"},
    {TypeCode::UInt8, "UInt8", "u8"},
    {TypeCode::UInt16, "UInt16", "u16"},
    {TypeCode::UInt32, "UInt32", "u32"},
    {TypeCode::UInt64, "UInt64", "u64"},
    {TypeCode::Float32, "Float32", "f32"},
    {TypeCode::Float64, "Float64", "f64"},
    {TypeCode::FloatExt, "FloatExt", "f80"},
    {TypeCode::Complex64, "Complex64", "complex32"},
    {TypeCode::Complex128, "Complex128", "complex64"},
    {TypeCode::ComplexExt, "ComplexExt", "?"},
    {TypeCode::EnumUInt8, "EnumUInt8", "enum8"},
    {TypeCode::EnumUInt16, "EnumUInt16", "enum16"},
    {TypeCode::EnumUInt32, "EnumUInt32", "enum32"},
    {TypeCode::Float32Units, "Float32Units", "f32Units"},
    {TypeCode::Float64Units, "Float64Units", "f64Units"},
    {TypeCode::FloatExtUnits, "FloatExtUnits", "?"},
    {TypeCode::Complex64Units, "Complex64Units", "complex32Units"},
    {TypeCode::Complex128Units, "Complex128Units", "complex64Units"},
    {TypeCode::ComplexExtUnits, "ComplexExtUnits", "?"},
    {TypeCode::BooleanU16, "BooleanU16", "?"},
    {TypeCode::Boolean, "Boolean", "bool"},
    {TypeCode::String, "String", "string"},
    {TypeCode::Path, "Path", "path"},
    {TypeCode::Pict, "Pict", "?"},
    {TypeCode::CStr, "CStr", "?"},
    {TypeCode::PStr, "PStr", "?"},
    {TypeCode::Tag, "Tag", "?"},
    {TypeCode::SubString, "SubString", "?"},
    {TypeCode::Array, "Array", "array"},
    {TypeCode::ArrayDataPtr, "ArrayDataPtr", "?"},
    {TypeCode::SubArray, "SubArray", "?"},
    {TypeCode::Cluster, "Cluster", "cluster"},
    {TypeCode::KoVariant, "KoVariant", "variant"},
    {TypeCode::MeasureData, "MeasureData", "WFMDT"},
    {TypeCode::ComplexFixedPoint, "ComplexFixedPoint", "?"},
    {TypeCode::FixedPoint, "FixedPoint", "?"},
    {TypeCode::Block, "Block", "?"},
    {TypeCode::TypeBlock, "TypeBlock", "?"},
    {TypeCode::VoidBlock, "VoidBlock", "?"},
    {TypeCode::AlignedBlock, "AlignedBlock", "?"},
    {TypeCode::RepeatedBlock, "RepeatedBlock", "?"},
    {TypeCode::AlignmentMarker, "AlignmentMarker", "?"},
    {TypeCode::Refnum, "Refnum", "refnum"},
    {TypeCode::SetCollection, "SetCollection", "?"},
    {TypeCode::MapCollection, "MapCollection", "?"},
    {TypeCode::Ptr, "Ptr", "?"},
    {TypeCode::PtrTo, "PtrTo", "?"},
    {TypeCode::Function, "Function", "?"},
    {TypeCode::PolyVI, "PolyVI", "?"},
};

// The entry of a raw code read from outside, or nothing when no kind has that code.
const TypeCodeInfo* FindTypeCode(int32_t raw);

// Codes 1 to 30 use bit 0x10 to mark an attached enumeration or unit; this removes it.
constexpr int32_t StripTypeCodeModifier(int32_t code) {
  return static_cast<uint8_t>(code - 1) < 30 ? (code & ~0x10) : code;
}
