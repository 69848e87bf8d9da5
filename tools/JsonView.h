// The JSON view of typed values: how the vellum tool shows a datum of any type and reads one
// back. It lives with the tool, not the library: JSON is a way of showing data, not a stored form.
#pragma once

#include <cstddef>
#include <cstdint>
#include <stdexcept>
#include <string>
#include <vector>

#include <nlohmann/json.hpp>

#include "vellum/TDHandles.h"

// Objects keep their keys in the order written, so that a cluster shown by name lists its
// elements in element order.
using JsonValue = nlohmann::ordered_json;

// The view, kind by kind (names as in the type-code table):
//   Int8 ... UInt64, EnumUInt8/16/32    a JSON integer, all 64 bits exact
//   Float32, Float64 (and with units)   a number in its shortest round-trip form; the strings
//                                       "NaN", "Infinity" and "-Infinity" (NaN payloads are lost)
//   FloatExt (and with units)           a string holding a decimal that reads back to the same
//                                       80-bit value, or one of the three strings above; a number
//                                       is accepted on input
//   Complex64/128/Ext                   [re, im], each part as its floating kind
//   Boolean                             true or false
//   String, Pict, Tag                   a string when the bytes are valid UTF-8, otherwise
//                                       {"bytes": "<hex>"}; either form on input
//   Path                                {"path": [component, ...], "type": T}, T one of
//                                       "absolute", "relative", "unc", "not a path" (on input
//                                       "type" may be left out for "absolute"); each component as
//                                       a string's bytes. A missing path shows as "not a path",
//                                       which is how it is flattened.
//   Array of 1 dimension                [element, ...]
//   Array of 0 or 2+ dimensions         {"dims": [size, ...], "elements": [... row-major ...]}
//                                       (a one-dimensional array takes this form on input too)
//   Cluster                             [element, ...] in element order; with `named` on output,
//                                       {"name": element, ...} when every element has a
//                                       distinct, non-empty name. Input takes either form; the
//                                       object form must give every element once.
//   Block, AlignedBlock, TypeBlock,     {"bytes": "<hex>"} of exactly the type's data size
//   VoidBlock
//   RepeatedBlock                       [element, ...], one per repetition
//   Void, AlignmentMarker, Ptr, PtrTo,  null: these carry no value across a flattening
//   CStr, PStr, ArrayDataPtr
// Kinds not listed (the old 16-bit Boolean, substrings, subarrays and the kinds this library
// cannot build yet) have no view.
//
// A value must fit its type on input: an integer out of range, a finite number beyond Float32's
// range, or more bytes or elements than a bounded or fixed size allows is refused. A fixed-size
// string given fewer bytes is padded with zero bytes, as a read of shorter data pads it; a
// fixed-size array dimension must be given exactly.

// A JSON value that does not fit its type, or a type without a view. what() says why and, for a
// part of a larger value, where, as a JSON pointer ("at /samples/2: ...").
class JsonViewError : public std::runtime_error {
 public:
  explicit JsonViewError(const std::string& reason);
  const char* what() const noexcept override { return text_.c_str(); }
  // Places the failure one level deeper: `step` is an array index or an object key.
  void Within(const std::string& step);

 private:
  std::string reason_;
  std::string where_;  // a JSON pointer, "" for the whole value
  std::string text_;
};

// "" when every value of `type` has a view; otherwise which kind inside it has none. The null
// type has none.
std::string JsonViewRefusal(const TDR& type);

// The bytes that default data of `type` takes: its DataSize and the blocks made with it (bounded
// and fixed strings and arrays are preallocated, paths made), counted generously, so that a caller
// can refuse a type whose default alone would exhaust memory. Saturates instead of wrapping.
uint64_t DefaultDataBytes(const TDR& type);

// The JSON of the datum of `type` at `data`, a valid datum (default data or data read back).
// Throws JsonViewError for a kind without a view.
JsonValue DataToJson(const TDR& type, const void* data, bool named);

// Stores `value` into `data`, a valid datum of `type` (default data: fixed and bounded strings and
// arrays preallocated). Throws JsonViewError when the value does not fit the type, or memory runs
// out; `data` is then still a valid datum, partly filled, that its owner disposes of as usual.
void JsonToData(const TDR& type, const JsonValue& value, void* data);
