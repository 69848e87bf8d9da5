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

#include "HexText.h"
#include "JsonView.h"
#include "runtime/DebugStream.h"
#include "runtime/KoExcept.h"
#include "runtime/PXApp.h"
#include "vellum.h"

namespace {

// Exit statuses: a refusal by the library (or unreadable input) is 1, a malformed command line 2.
constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;

// Type strings in daily use are a few kilobytes, and data rarely more than megabytes; the cap keeps a
// runaway pipe from filling memory.
constexpr size_t kMaxInputBytes = size_t{64} << 20;
// The default datum a data command makes, blocks included; a type that needs more is refused before
// any memory is taken for it (a fixed-size array can ask for gigabytes).
constexpr uint64_t kMaxDatumBytes = uint64_t{64} << 20;

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

  // The lines collected since the last call; the library's record of the reason of a refusal
  // starts again with them.
  std::vector<DebugMessage> Take() {
    vellum::ClearRefusal();
    std::lock_guard lock(mutex_);
    return std::exchange(messages_, {});
  }

 private:
  std::mutex mutex_;  // guards messages_
  std::vector<DebugMessage> messages_;
};

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

// A refusal by the library: what failed, its status, and the library's own reason when it gave one
// (the first error line: later lines are its consequences).
int FailWithStatus(const std::string& what, int32_t status) {
  std::string line = what + " (status " + std::to_string(status) + ")";
  if (const std::string reason = vellum::LastRefusal(); !reason.empty()) line += ": " + reason;
  return Fail(kExitFailure, std::move(line));
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
  for (size_t i = start; valid && i < text.size(); ++i) valid = HexDigitValue(text[i]) >= 0;
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
  const TDRNumeric numeric = vellum::As<TDRNumeric>(MakeDefaultTDRForTypeCode(code));
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
  vellum::OwnedHandle flat;
  if (const int32_t status = FlattenOneType(nullptr, type, flat.Out(), nullptr); status != 0)
    return FailWithStatus("cannot write the type string", status);
  char code[16] = "none";
  if (type) std::snprintf(code, sizeof code, "0x%02X", static_cast<unsigned>(type.GetTypeCode()));
  std::printf("notation: %s\n", TypeToInterpretedString(type).c_str());
  std::printf("text: %s\n", ToString(type).c_str());
  std::printf("code: %s\n", code);
  std::printf("size: %d\n", type.DataSize());
  std::printf("alignment: %d\n", type.GetAlignment());
  std::printf("typestring: %s\n", LowerHex(flat.Bytes().data(), flat.Bytes().size()).c_str());
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
      return FailWithStatus("cannot build the list of types", status);
  }
  const PersistTDData persist(version);
  vellum::OwnedHandle flat;
  // A list writer refuses an empty entry unless told to skip it; a skipped entry is stored as the
  // index of the entry before it (the first record for a first entry).
  const int32_t status = texts.size() == 1
                             ? FlattenOneType(&persist, first, flat.Out(), nullptr)
                             : FlattenListOfTypes(&persist, &list, nullptr, flat.Out(), 0, nullptr, 1);
  if (status != 0) return FailWithStatus("cannot write the type string", status);
  std::printf("%s\n", LowerHex(flat.Bytes().data(), flat.Bytes().size()).c_str());
  PrintWarnings(diagnostics.Take());
  return 0;
}

// Whether a command-line word names a file ("@FILE") or standard input ("-") to read instead.
bool NamesInput(const std::string& word) { return word == "-" || (!word.empty() && word[0] == '@'); }

// The raw bytes of the file or standard input that `word` names (see NamesInput).
int ReadNamedInput(const std::string& word, std::vector<uint8_t>* bytes) {
  const bool fromStdin = word == "-";
  const std::string path = word.substr(1);
  const std::string shown = fromStdin ? std::string("standard input") : "'" + path + "'";
  std::FILE* file = fromStdin ? stdin : std::fopen(path.c_str(), "rb");
  if (file == nullptr) return Fail(kExitFailure, "cannot open " + shown + ": " + std::strerror(errno));
  const std::string problem = ReadAll(file, bytes);
  if (!fromStdin) std::fclose(file);
  if (!problem.empty()) return Fail(kExitFailure, "cannot read " + shown + ": " + problem);
  return 0;
}

// The bytes named on the command line: hex text, "@FILE" for a file's raw bytes, or "-" for raw
// bytes on standard input. `label` names the argument in messages.
int ReadBytesArgument(const std::vector<std::string>& words, const std::string& label, std::vector<uint8_t>* bytes) {
  const std::string& first = words.front();
  if (NamesInput(first)) {
    if (words.size() > 1) return Fail(kExitUsage, "'" + first + "' must be the only " + label + " argument (try --help)");
    return ReadNamedInput(first, bytes);
  }
  std::string text;
  for (const std::string& word : words) text += word + ' ';
  if (const std::string problem = ParseHex(text, bytes); !problem.empty())
    return Fail(kExitUsage, label + ": " + problem + " (try --help)");
  return 0;
}

int DecodeTypes(const std::vector<std::string>& words, uint32_t version, bool dump, DiagnosticCapture& diagnostics) {
  std::vector<uint8_t> bytes;
  if (const int exitStatus = ReadBytesArgument(words, "BYTES", &bytes); exitStatus != 0) return exitStatus;
  const PersistTDData persist(version);
  TMTypeList list;
  const int32_t status = UnFlattenListOfTypes(&persist, bytes.data(), static_cast<uint32_t>(bytes.size()), &list,
                                              nullptr, 0, nullptr);
  if (status != 0) return FailWithStatus("cannot decode the type string", status);
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

// --- vellum data ------------------------------------------------------------------------------------

// Whether the data commands can hold and show values of `type`; false after the error line.
bool CheckDataType(const TDR& type, int* exitStatus) {
  if (const std::string refusal = JsonViewRefusal(type); !refusal.empty()) {
    *exitStatus = Fail(kExitFailure, "cannot show values of this type: " + refusal);
    return false;
  }
  if (const uint64_t bytes = DefaultDataBytes(type); bytes > kMaxDatumBytes) {
    *exitStatus = Fail(kExitFailure, "a value of this type takes " +
                                         (bytes >> 40 != 0 ? std::string("over 2^40") : std::to_string(bytes)) +
                                         " bytes in memory, more than the tool holds (" +
                                         std::to_string(kMaxDatumBytes) + ")");
    return false;
  }
  return true;
}

// The JSON value on the command line: the text itself, "@FILE" for a file holding it, or "-" for
// standard input.
int ReadJsonArgument(const std::string& word, JsonValue* value) {
  std::string text = word;
  if (NamesInput(word)) {
    std::vector<uint8_t> bytes;
    if (const int exitStatus = ReadNamedInput(word, &bytes); exitStatus != 0) return exitStatus;
    text.assign(bytes.begin(), bytes.end());
  }
  try {
    *value = JsonValue::parse(text);
  } catch (const JsonValue::parse_error& e) {
    // The library's "[json.exception.parse_error.101] " prefix says nothing to a reader.
    std::string reason = e.what();
    if (const size_t end = reason.find("] "); reason.rfind("[json.exception.", 0) == 0 && end != std::string::npos)
      reason.erase(0, end + 2);
    return Fail(kExitFailure, "cannot parse the JSON value: " + reason);
  }
  return 0;
}

int EncodeData(const std::string& text, const std::string& json, uint32_t version, DiagnosticCapture& diagnostics) {
  TDR type;
  if (int exitStatus = 0; !ParseNotation(text, &type, &exitStatus) || !CheckDataType(type, &exitStatus))
    return exitStatus;
  JsonValue value;
  if (const int exitStatus = ReadJsonArgument(json, &value); exitStatus != 0) return exitStatus;
  vellum::Value datum(type);
  if (datum.Status() != 0) return FailWithStatus("cannot make a value of the type", datum.Status());
  try {
    JsonToData(type, value, datum.Data());
  } catch (const JsonViewError& e) {
    return Fail(kExitFailure, std::string("the JSON value does not fit the type: ") + e.what());
  }
  std::vector<uint8_t> flat;
  if (const int32_t status = vellum::FlattenData(datum, &flat, version); status != 0)
    return FailWithStatus("cannot flatten the value", status);
  std::printf("%s\n", LowerHex(flat.data(), flat.size()).c_str());
  PrintWarnings(diagnostics.Take());
  return 0;
}

// The type of a data command: the notation, or the one entry of a type string.
int DataType(const std::string* text, const std::string* typeString, uint32_t version, TDR* type) {
  if (text != nullptr) {
    int exitStatus = 0;
    return ParseNotation(*text, type, &exitStatus) ? 0 : exitStatus;
  }
  std::vector<uint8_t> bytes;
  if (const int exitStatus = ReadBytesArgument({*typeString}, "TYPEBYTES", &bytes); exitStatus != 0) return exitStatus;
  const PersistTDData persist(version);
  const int32_t status = UnFlattenOneType(&persist, bytes.data(), static_cast<uint32_t>(bytes.size()), type, nullptr);
  if (status != 0) return FailWithStatus("cannot decode the type string", status);
  return 0;
}

// `words` are TEXT and then BYTES, or BYTES alone when the type comes from `typeString`.
int DecodeData(const std::vector<std::string>& words, const std::string* typeString, uint32_t version, bool named,
               DiagnosticCapture& diagnostics) {
  const std::vector<std::string> byteWords(words.begin() + (typeString != nullptr ? 0 : 1), words.end());
  if (byteWords.empty()) return Fail(kExitUsage, "BYTES is required (try --help)");
  if (typeString != nullptr && *typeString == "-" && byteWords.front() == "-")
    return Fail(kExitUsage, "standard input can give TYPEBYTES or BYTES, not both (try --help)");
  TDR type;
  if (const int exitStatus = DataType(typeString != nullptr ? nullptr : &words.front(), typeString, version, &type);
      exitStatus != 0)
    return exitStatus;
  if (int exitStatus = 0; !CheckDataType(type, &exitStatus)) return exitStatus;
  std::vector<uint8_t> bytes;
  if (const int exitStatus = ReadBytesArgument(byteWords, "BYTES", &bytes); exitStatus != 0) return exitStatus;
  vellum::Value datum(type);
  if (datum.Status() != 0) return FailWithStatus("cannot make a value of the type", datum.Status());
  size_t used = 0;
  if (const int32_t status = vellum::UnflattenData(bytes, &datum, version, &used); status != 0)
    return FailWithStatus("cannot read the data", status);
  if (used != bytes.size()) {
    return Fail(kExitFailure, std::to_string(bytes.size() - used) + " byte(s) follow the value, which ends at byte " +
                                  std::to_string(used));
  }
  JsonValue value;
  try {
    value = DataToJson(type, datum.Data(), named);
  } catch (const JsonViewError& e) {
    return Fail(kExitFailure, std::string("cannot show the value: ") + e.what());
  }
  std::printf("%s\n", value.dump().c_str());
  PrintWarnings(diagnostics.Take());
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
      "It shows the table of type codes, decodes and encodes stored type strings, and shows flattened data as JSON."};
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

  CLI::App* data = app.add_subcommand("data", "Encode and decode flattened data, the values shown as JSON");
  data->require_subcommand(1);
  CLI::App* dataEncode = data->add_subcommand(
      "encode",
      "Print, in lowercase hex, the flattened data of a value of the type given in the textual notation; "
      "the value is written as JSON (the README's JSON view)");
  std::string dataEncodeText;
  std::string dataEncodeJson;
  std::string dataEncodeVersion;
  dataEncode->add_option("TEXT", dataEncodeText, "The type in the textual notation")->required();
  dataEncode->add_option("JSON", dataEncodeJson, "The value as JSON, @FILE for a file holding it, or - for standard input")
      ->required();
  dataEncode->add_option("--version", dataEncodeVersion, "The version word to write, in hex (default: the running version)")
      ->check(versionWord);

  CLI::App* dataDecode = data->add_subcommand(
      "decode",
      "Read the flattened data of one value and print the value as JSON on one line; bytes left after the value "
      "are an error. The type is TEXT in the textual notation, or with --typestring the one entry of a type string");
  std::string dataDecodeFirst;
  std::string dataDecodeVersion;
  std::string dataTypeString;
  bool named = false;
  dataDecode
      ->add_option("TEXT", dataDecodeFirst,
                   "The type in the textual notation, then BYTES: the data in hex (either case, blanks allowed, also "
                   "over several words), @FILE for a file's raw bytes, or - for raw bytes on standard input. With "
                   "--typestring, BYTES alone")
      ->required();
  dataDecode->allow_extras();
  CLI::Option* typeStringOption = dataDecode->add_option(
      "--typestring", dataTypeString,
      "Take the type from this type string instead: hex (one word), @FILE for a file's raw bytes, or - for standard input")
      ->type_name("TYPEBYTES");
  dataDecode->add_option("--version", dataDecodeVersion, "The version word to read, in hex (default: the running version)")
      ->check(versionWord);
  dataDecode->add_flag("--named", named,
                       "Show a cluster whose elements all have distinct, non-empty names as an object keyed by name");

  std::vector<std::string> encodeTexts;
  std::vector<std::string> decodeWords;
  std::vector<std::string> dataDecodeWords;
  try {
    app.parse(argc, argv);
    if (encode->parsed()) encodeTexts = Words(*encode, encodeFirst);
    if (decode->parsed()) decodeWords = Words(*decode, decodeFirst);
    if (dataDecode->parsed()) dataDecodeWords = Words(*dataDecode, dataDecodeFirst);
  } catch (const CLI::ParseError& e) {
    return app.exit(e) == 0 ? 0 : kExitUsage;
  }

  // Nothing the library raises may end the tool without its one line.
  try {
    DiagnosticCapture diagnostics;
    vellum::Session session;
    if (session.Status() != 0)
      return FailWithStatus("the type manager did not start", session.Status());
    if (codes->parsed()) return PrintCodes();
    if (type->parsed()) {
      const int32_t align = alignText.empty() ? 0 : std::stoi(alignText);
      return DescribeType(typeText, align, !alignText.empty(), diagnostics);
    }
    if (encode->parsed()) return EncodeTypes(encodeTexts, VersionWord(encodeVersion), diagnostics);
    if (decode->parsed()) return DecodeTypes(decodeWords, VersionWord(decodeVersion), dump, diagnostics);
    if (dataEncode->parsed()) return EncodeData(dataEncodeText, dataEncodeJson, VersionWord(dataEncodeVersion), diagnostics);
    if (dataDecode->parsed()) {
      return DecodeData(dataDecodeWords, typeStringOption->count() > 0 ? &dataTypeString : nullptr,
                        VersionWord(dataDecodeVersion), named, diagnostics);
    }
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
