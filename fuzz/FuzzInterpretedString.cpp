// Reads arbitrary bytes as the textual type notation, with and without a linker. Whatever is
// accepted must write a text that parses back to the identical interned descriptor, write that
// same text again, and nothing may leak once the type manager has stopped.
#include <cstdint>
#include <cstdlib>
#include <string>

#include "runtime/DSMemory.h"
#include "support/FreshLibrary.h"
#include "vellum.h"

namespace {

// Answers every request with a fixed descriptor, so that linked tokens get exercised too.
class FixedLinker final : public IVILinkMediator {
 public:
  TDR LinkRefnum(int32_t, const std::string&, char, const std::string&) override { return TDR(); }
  TDR LinkClass(const std::string& className) override { return className.empty() ? TDR() : GetfD(); }
  TDR LinkCharacter(char code) override { return code == 's' ? GetStringTD() : TDR(); }
};

// Whether the written form says everything about `type`: no names, typedef links, enum items,
// pointer-sized marks or fixed dimensions anywhere in the tree.
TDTraverseValue FindUnwritten(const TDR& node, void* found) {
  bool unwritten = node.HasName() != 0 || node.HasTypedef() != 0;
  const TDRBasicNumeric numeric = vellum::As<TDRBasicNumeric>(node);
  if (numeric && (numeric.GetEnum().GetNumStrings() != 0 || numeric.IsIntPtrT() != 0)) unwritten = true;
  const TDRArrayBase array = vellum::As<TDRArrayBase>(node);
  for (int32_t i = 0; array && i < array.GetNumDims(); ++i) {
    if (array.GetDimSize(i) != -1) unwritten = true;
  }
  if (!unwritten) return kTraverseContinue;
  *static_cast<bool*>(found) = true;
  return 1;
}

bool WrittenFormIsComplete(const TDR& type) {
  bool found = false;
  type.TraverseTDR(&FindUnwritten, &found, nullptr);
  return !found;
}

void CheckRoundTrip(const std::string& text, IVILinkMediator* linker) {
  const TDR type = InterpretedStringToType(text, linker);
  if (type.IsNull()) return;
  const std::string written = TypeToInterpretedString(type);
  // Kinds without a token write "?", which cannot be read back.
  if (written.find('?') != std::string::npos) return;
  const TDR back = InterpretedStringToType(written);
  if (back.IsNull()) std::abort();
  if (TypeToInterpretedString(back) != written) std::abort();
  if (!WrittenFormIsComplete(back)) std::abort();
  if (WrittenFormIsComplete(type) && !(back == type)) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  const std::string text(reinterpret_cast<const char*>(data), size);
  vellum::fuzz::WithFreshLibrary([&] {
    FixedLinker linker;
    CheckRoundTrip(text, nullptr);
    CheckRoundTrip(text, &linker);
  });
  return 0;
}
