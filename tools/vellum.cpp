// The vellum command-line tool: reads and writes what hosts store (type strings and flattened
// data) and shows the type system's own tables.
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <exception>
#include <functional>
#include <mutex>
#include <new>
#include <string>
#include <utility>
#include <vector>

#include <CLI/CLI.hpp>

#include "runtime/DSMemory.h"
#include "runtime/DebugStream.h"
#include "runtime/KoExcept.h"
#include "runtime/PXApp.h"
#include "vellum.h"

namespace {

// Exit statuses: a refusal by the library (or unreadable input) is 1, a malformed command line 2.
constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;

// Type strings in daily use are a few kilobytes; the cap keeps a runaway pipe from filling memory.
constexpr size_t kMaxInputBytes = size_t{64} << 20;

// Starts the library the way a host does, and stops it when the command is done.
class LibrarySession {
 public:
  LibrarySession() : status_(services_.Start(TypeManagerService())) {}
  ~LibrarySession() { services_.StopAll(); }
  LibrarySession(const LibrarySession&) = delete;
  LibrarySession& operator=(const LibrarySession&) = delete;
  int32_t Status() const { return status_; }

 private:
  ServiceManager services_;
  int32_t status_;
};

// Holds the library's diagnostic lines while a command runs, so that the command decides what
// reaches the terminal: a dump goes to standard output, and a refusal's reason joins the one
// error line instead of adding lines of its own.
class DiagnosticCapture {
 public:
  DiagnosticCapture() {
    SetDebugSink([this](const DebugMessage& m) {
      std::lock_guard lock(mutex_);
      messages_.push_back(m);
    });
  }
  ~DiagnosticCapture() { SetDebugSink(DebugSink()); }
  DiagnosticCapture(const DiagnosticCapture&) = delete;
  DiagnosticCapture& operator=(const DiagnosticCapture&) = delete;

  // The lines collected since the last call.
  std::vector<DebugMessage> Take() {
    std::lock_guard lock(mutex_);
    return std::exchange(messages_, {});
  }

 private:
  std::mutex mutex_;  // guards messages_
  std::vector<DebugMessage> messages_;
};

// The first error-level line of `messages` (the cause; later lines are its consequences), or "".
std::string FirstErrorText(const std::vector<DebugMessage>& messages) {
  for (const DebugMessage& m : messages) {
    if (m.level >= 2) return m.text;
  }
  return std::string();
}

// Error-level lines of a command that still succeeded are worth seeing, but never on stdout.
void PrintWarnings(const std::vector<DebugMessage>& messages) {
  for (const DebugMessage& m : messages) {
    if (m.level >= 2) std::fprintf(stderr, "vellum: warning: %s\n", m.text.c_str());
  }
}

// Writes the command's one error line. Control characters would break the promise of one line,
// so they are shown as blanks.
int Fail(int exitStatus, std::string line) {
  for (char& c : line) {
    if (static_cast<unsigned char>(c) < 0x20) c = ' ';
  }
  std::fprintf(stderr, "vellum: %s\n", line.c_str());
  return exitStatus;
}

// A refusal by the library: what failed, its status, and the library's own reason when it gave one.
int FailWithStatus(const std::string& what, int32_t status, const std::vector<DebugMessage>& messages) {
  std::string line = what + " (status " + std::to_string(status) + ")";
  if (const std::string reason = FirstErrorText(messages); !reason.empty()) line += ": " + reason;
  return Fail(kExitFailure, std::move(line));
}

// A handle the library hands out, disposed of when the command is done with it.
class OwnedHandle {
 public:
  OwnedHandle() = default;
  ~OwnedHandle() { DSDisposeHandle(handle_); }
  OwnedHandle(const OwnedHandle&) = delete;
  OwnedHandle& operator=(const OwnedHandle&) = delete;
  UHandle* Out() { return &handle_; }
  const uint8_t* Data() const { return handle_ != nullptr ? *handle_ : nullptr; }
  size_t Size() const { return DSGetHandleSize(handle_); }

 private:
  UHandle handle_ = nullptr;
};

std::string LowerHex(const uint8_t* data, size_t size) {
  static constexpr char kDigits[] = "0123456789abcdef";
  std::string text;
  text.reserve(2 * size);
  for (size_t i = 0; i < size; ++i) {
    text += kDigits[data[i] >> 4];
    text += kDigits[data[i] & 0x0F];
  }
  return text;
}

int HexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

// Two hex digits per byte in either case; blanks may stand anywhere between them. "" on success,
// otherwise what is wrong with the text.
std::string ParseHex(const std::string& text, std::vector<uint8_t>* bytes) {
  int high = -1;
  for (size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (c == ' ' || c == '\t' || c == '\n' || c == '\r') continue;
    const int digit = HexDigit(c);
    if (digit < 0) {
      char shown[16];
      std::snprintf(shown, sizeof shown, c > ' ' && c < 0x7F ? "'%c'" : "byte 0x%02x", static_cast<unsigned char>(c));
      return std::string(shown) + " at offset " + std::to_string(i) + " is not a hex digit";
    }
    if (high < 0) {
      high = digit;
    } else {
      bytes->push_back(static_cast<uint8_t>(high << 4 | digit));
      high = -1;
    }
  }
  if (high >= 0) return "an odd number of hex digits";
  return std::string();
}

// Reads all of `file` (opened by the caller) up to the cap. "" on success, otherwise the reason.
std::string ReadAll(std::FILE* file, std::vector<uint8_t>* bytes) {
  uint8_t chunk[65536];
  for (;;) {
    const size_t got = std::fread(chunk, 1, sizeof chunk, file);
    if (bytes->size() + got > kMaxInputBytes)
      return "more than " + std::to_string(kMaxInputBytes) + " bytes";
    bytes->insert(bytes->end(), chunk, chunk + got);
    if (got < sizeof chunk) break;
  }
  if (std::ferror(file)) return std::strerror(errno);
  return std::string();
}

// A version word written in hex, with or without 0x.
std::string CheckVersionWord(const std::string& text) {
  const size_t start = text.rfind("0x", 0) == 0 || text.rfind("0X", 0) == 0 ? 2 : 0;
  const size_t digits = text.size() - start;
  bool valid = digits >= 1 && digits <= 8;
  for (size_t i = start; valid && i < text.size(); ++i) valid = HexDigit(text[i]) >= 0;
  return valid ? std::string() : "'" + text + "' is not a 32-bit version word in hex, such as 0x22308000";
}

uint32_t VersionWord(const std::string& text) {
  return text.empty() ? PXApp::Instance().GetVersion() : static_cast<uint32_t>(std::stoul(text, nullptr, 16));
}

// Parses one notation text; "N" is the null descriptor. False, after the error line, when the
// text does not parse.
bool ParseNotation(const std::string& text, TDR* type, int* exitStatus) {
  try {
    *type = ParseInterpretedString(text, nullptr);
    return true;
  } catch (const ParseException& e) {
    *exitStatus = Fail(kExitFailure, std::string("cannot parse the type notation: ") + e.what());
    return false;
  }
}

// --- vellum codes ----------------------------------------------------------------------------------

// Size, natural alignment and representation index of a numeric kind (its shared default, which
// an enumeration or units do not change); "-" for the other kinds.
std::string NumericColumns(int32_t code) {
  if (static_cast<uint8_t>(code - 1) >= 30) return "-      -     -";
  const TDRNumeric numeric(MakeDefaultTDRForTypeCode(code).GetImpPtr(), 1);
  if (!numeric) return "-      -     -";
  char columns[64];
  std::snprintf(columns, sizeof columns, "%-6d %-5d %d", numeric.DataSize(), numeric.GetAlignment(),
                numeric.GetNumericRepEnumIndex());
  return columns;
}

int PrintCodes() {
  std::printf("%-6s %-18s %-16s %-8s %-8s %-6s %-5s %s\n", "code", "name", "text", "factory", "default", "size",
              "align", "rep");
  for (const TypeCodeInfo& info : kTypeCodes) {
    const int32_t code = static_cast<int32_t>(info.code);
    std::printf("0x%02X   %-18.*s %-16.*s %-8s %-8s %s\n", static_cast<unsigned>(code),
                static_cast<int>(info.name.size()), info.name.data(), static_cast<int>(info.text.size()),
                info.text.data(), HasTypeFactory(code) ? "yes" : "no", HasDefaultType(code) ? "yes" : "no",
                NumericColumns(code).c_str());
  }
  return 0;
}

// --- vellum type -----------------------------------------------------------------------------------

int DescribeType(const std::string& text, int32_t align, bool alignGiven, DiagnosticCapture& diagnostics) {
  if (alignGiven) SetDSAlign(align);
  TDR type;
  if (int exitStatus = 0; !ParseNotation(text, &type, &exitStatus)) return exitStatus;
  OwnedHandle flat;
  if (const int32_t status = FlattenOneType(nullptr, type, flat.Out(), nullptr); status != 0)
    return FailWithStatus("cannot write the type string", status, diagnostics.Take());
  char code[16] = "none";
  if (type) std::snprintf(code, sizeof code, "0x%02X", static_cast<unsigned>(type.GetTypeCode()));
  std::printf("notation: %s\n", TypeToInterpretedString(type).c_str());
  std::printf("text: %s\n", ToString(type).c_str());
  std::printf("code: %s\n", code);
  std::printf("size: %d\n", type.DataSize());
  std::printf("alignment: %d\n", type.GetAlignment());
  std::printf("typestring: %s\n", LowerHex(flat.Data(), flat.Size()).c_str());
  PrintWarnings(diagnostics.Take());
  return 0;
}

// --- vellum typestring -----------------------------------------------------------------------------

int EncodeTypes(const std::vector<std::string>& texts, uint32_t version, DiagnosticCapture& diagnostics) {
  TMTypeList list;
  TDR first;
  for (const std::string& text : texts) {
    TDR type;
    if (int exitStatus = 0; !ParseNotation(text, &type, &exitStatus)) return exitStatus;
    if (list.GetNumTypes() == 0) first = type;
    if (const int32_t status = list.AppendType(type, nullptr); status != 0)
      return FailWithStatus("cannot build the list of types", status, diagnostics.Take());
  }
  const PersistTDData persist(version);
  OwnedHandle flat;
  // A list writer refuses an empty entry unless told to skip it; a skipped entry is stored as the
  // index of the entry before it (the first record for a first entry).
  const int32_t status = texts.size() == 1
                             ? FlattenOneType(&persist, first, flat.Out(), nullptr)
                             : FlattenListOfTypes(&persist, &list, nullptr, flat.Out(), 0, nullptr, 1);
  if (status != 0) return FailWithStatus("cannot write the type string", status, diagnostics.Take());
  std::printf("%s\n", LowerHex(flat.Data(), flat.Size()).c_str());
  PrintWarnings(diagnostics.Take());
  return 0;
}

// The bytes named on the command line: hex text, "@FILE" for a file's raw bytes, or "-" for raw
// bytes on standard input.
int ReadTypeString(const std::vector<std::string>& words, std::vector<uint8_t>* bytes) {
  const std::string& first = words.front();
  if (first == "-" || (!first.empty() && first[0] == '@')) {
    if (words.size() > 1) return Fail(kExitUsage, "'" + first + "' must be the only BYTES argument (try --help)");
    const bool fromStdin = first == "-";
    const std::string path = first.substr(1);
    const std::string shown = fromStdin ? std::string("standard input") : "'" + path + "'";
    std::FILE* file = fromStdin ? stdin : std::fopen(path.c_str(), "rb");
    if (file == nullptr) return Fail(kExitFailure, "cannot open " + shown + ": " + std::strerror(errno));
    const std::string problem = ReadAll(file, bytes);
    if (!fromStdin) std::fclose(file);
    if (!problem.empty()) return Fail(kExitFailure, "cannot read " + shown + ": " + problem);
    return 0;
  }
  std::string text;
  for (const std::string& word : words) text += word + ' ';
  if (const std::string problem = ParseHex(text, bytes); !problem.empty())
    return Fail(kExitUsage, "BYTES: " + problem + " (try --help)");
  return 0;
}

int DecodeTypes(const std::vector<std::string>& words, uint32_t version, bool dump, DiagnosticCapture& diagnostics) {
  std::vector<uint8_t> bytes;
  if (const int exitStatus = ReadTypeString(words, &bytes); exitStatus != 0) return exitStatus;
  const PersistTDData persist(version);
  TMTypeList list;
  const int32_t status = UnFlattenListOfTypes(&persist, bytes.data(), static_cast<uint32_t>(bytes.size()), &list,
                                              nullptr, 0, nullptr);
  if (status != 0) return FailWithStatus("cannot decode the type string", status, diagnostics.Take());
  PrintWarnings(diagnostics.Take());
  static const uint8_t kDumpPrefix[] = "  ";
  for (int32_t i = 0; i < list.GetNumTypes(); ++i) {
    const TDR& type = list.GetType(static_cast<uint32_t>(i));
    std::printf("%s\n", TypeToInterpretedString(type).c_str());
    if (!dump) continue;
    type.PrintDebugStr(kDumpPrefix);
    for (const DebugMessage& m : diagnostics.Take()) {
      if (m.level == 0) {
        std::printf("%s\n", m.text.c_str());
      } else if (m.level >= 2) {
        std::fprintf(stderr, "vellum: warning: %s\n", m.text.c_str());
      }
    }
  }
  return 0;
}

// A largest alignment the layout code can use: 0 (packed) or a power of two up to 4096.
std::string CheckAlignment(const std::string& text) {
  const std::string problem = "'" + text + "' is not 0 or a power of two up to 4096";
  if (text.empty() || text.size() > 4) return problem;
  int value = 0;
  for (const char c : text) {
    if (c < '0' || c > '9') return problem;
    value = value * 10 + (c - '0');
  }
  return value <= 4096 && (value & (value - 1)) == 0 ? std::string() : problem;
}

// A command that takes one or more words. The first is an ordinary positional (so that help shows
// it); the others are taken as they are, because a positional list would split a bracketed word
// such as the array type "[1,fD]" at its commas.
void AddWords(CLI::App* command, const std::string& name, std::string* first, const std::string& description) {
  command->add_option(name, *first, description + " (one or more)")->required();
  command->allow_extras();
}

// All the words; an unknown option among them is a usage error.
std::vector<std::string> Words(const CLI::App& command, const std::string& first) {
  std::vector<std::string> words{first};
  for (const std::string& word : command.remaining()) {
    if (word.size() > 1 && word[0] == '-') throw CLI::ExtrasError({word});
    words.push_back(word);
  }
  return words;
}

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{
      "vellum: the run-time type system's own tool.\n"
      "It shows the table of type codes, and decodes and encodes stored type strings and data."};
  // One line for a malformed command line, as for every other failure.
  app.failure_message([](const CLI::App*, const CLI::Error& e) {
    return std::string("vellum: ") + e.what() + " (try --help)\n";
  });
  app.require_subcommand(1);
  const CLI::Validator versionWord(CheckVersionWord, "VERSION");
  const CLI::Validator alignment(CheckAlignment, "N");

  CLI::App* codes = app.add_subcommand(
      "codes",
      "Print the type-code table: code, name, short text, whether a factory and a default exist, and for "
      "the numeric kinds their data size, natural alignment and representation index");

  CLI::App* type = app.add_subcommand(
      "type",
      "Describe the type written in the textual notation (for instance '{\"count\":iL,[1,fD],S}'): its "
      "notation as written back, its text, type code, data size and alignment in this process, and its type "
      "string in hex for the running version");
  std::string typeText;
  std::string alignText;
  type->add_option("TEXT", typeText, "The type in the textual notation")->required();
  type->add_option("--align", alignText, "Set the largest alignment (0 packed, else a power of two) first")
      ->check(alignment);

  CLI::App* typestring = app.add_subcommand("typestring", "Encode and decode type strings");
  typestring->require_subcommand(1);
  CLI::App* encode = typestring->add_subcommand(
      "encode",
      "Print, in lowercase hex, the type string of the types given in the textual notation, in order. The word "
      "N is an empty entry: alone it gives the empty list; in a list it is stored as the entry before it");
  std::string encodeFirst;
  std::string encodeVersion;
  AddWords(encode, "TEXT", &encodeFirst, "The types in the textual notation");
  encode->add_option("--version", encodeVersion, "The version word to write, in hex (default: the running version)")
      ->check(versionWord);

  CLI::App* decode = typestring->add_subcommand(
      "decode", "Read a type string and print each entry's notation on a line of its own (N for an empty entry)");
  std::string decodeFirst;
  std::string decodeVersion;
  bool dump = false;
  AddWords(decode, "BYTES", &decodeFirst,
           "The type string in hex (either case, blanks allowed), @FILE for a file's raw bytes, or - for raw "
           "bytes on standard input");
  decode->add_option("--version", decodeVersion, "The version word to read, in hex (default: the running version)")
      ->check(versionWord);
  decode->add_flag("--dump", dump, "Print each entry's descriptor dump after its line");

  std::vector<std::string> encodeTexts;
  std::vector<std::string> decodeWords;
  try {
    app.parse(argc, argv);
    if (encode->parsed()) encodeTexts = Words(*encode, encodeFirst);
    if (decode->parsed()) decodeWords = Words(*decode, decodeFirst);
  } catch (const CLI::ParseError& e) {
    return app.exit(e) == 0 ? 0 : kExitUsage;
  }

  // Nothing the library raises may end the tool without its one line.
  try {
    DiagnosticCapture diagnostics;
    LibrarySession session;
    if (session.Status() != 0)
      return FailWithStatus("the type manager did not start", session.Status(), diagnostics.Take());
    if (codes->parsed()) return PrintCodes();
    if (type->parsed()) {
      const int32_t align = alignText.empty() ? 0 : std::stoi(alignText);
      return DescribeType(typeText, align, !alignText.empty(), diagnostics);
    }
    if (encode->parsed()) return EncodeTypes(encodeTexts, VersionWord(encodeVersion), diagnostics);
    if (decode->parsed()) return DecodeTypes(decodeWords, VersionWord(decodeVersion), dump, diagnostics);
    return kExitUsage;
  } catch (const KoExcept& e) {
    return Fail(kExitFailure, "the library failed (status " + std::to_string(e.Status()) + "): " + e.Message());
  } catch (const std::bad_alloc&) {
    return Fail(kExitFailure, "out of memory (status 2)");
  } catch (const std::exception& e) {
    return Fail(kExitFailure, std::string("unexpected failure: ") + e.what());
  } catch (...) {
    return Fail(kExitFailure, "unexpected failure");
  }
}
