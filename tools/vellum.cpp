// The vellum command-line tool: reads and writes what hosts store (type strings and flattened
// data) and shows the type system's own tables.
#include <cstdio>
#include <string>

#include <CLI/CLI.hpp>

#include "vellum.h"

namespace {

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

}  // namespace

int main(int argc, char** argv) {
  CLI::App app{
      "vellum: the run-time type system's own tool.\n"
      "It shows the table of type codes, and decodes and encodes stored type strings and data."};
  app.require_subcommand(1);
  CLI::App* codes = app.add_subcommand(
      "codes",
      "Print the type-code table: code, name, short text, whether a factory and a default exist, and for "
      "the numeric kinds their data size, natural alignment and representation index");
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError& e) {
    return app.exit(e) == 0 ? 0 : 2;
  }
  LibrarySession session;
  if (session.Status() != 0) {
    std::fprintf(stderr, "vellum: the type manager did not start (status %d)\n", session.Status());
    return 1;
  }
  if (codes->parsed()) return PrintCodes();
  return 2;
}
