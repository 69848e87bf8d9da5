// The interning dictionaries seen from outside: the registry that garbage collection walks (each
// dictionary's name, size and purge), and the table of recursive types.
#pragma once

#include <cstdint>

#include "vellum/TDHandles.h"

// One dictionary of interned objects ("TD", "Name", "Typedef", "Enum", "Units",
// "EventRegOMIdInfo", "IVISubType", "OMId"). Every member may be called from any thread.
class ITDDictionary {
 public:
  virtual uint32_t Size() const = 0;
  // Removes every object that only the dictionary still references.
  virtual void Purge() = 0;
  virtual const char* Name() const = 0;
  // Removes every object.
  virtual void Empty() = 0;
  virtual ~ITDDictionary();
};

// The registry the collection walks; the service fills it at start, in the order above, and
// clears it at stop. A dictionary already registered is not added again; past kMaxDictionaries
// a registration is refused with a message.
constexpr int32_t kMaxDictionaries = 10;
void RegisterDictionary(ITDDictionary* dictionary);
ITDDictionary* const* GetTDDictionaries();
int32_t GetNumDictionaries();

// The table of recursive types (functions and object references that can contain themselves),
// which exists while the service runs.
bool HasRecursiveTypesTable();
// 0; 42 without a table; 1 for a null descriptor; 2 when memory runs out.
[[nodiscard]] int32_t InsertRecursiveTypeIntoTable(const TDR& type);
int32_t RecursiveTypesTableSize();

// The first collection reads the logging key and keeps it; this makes the next one read it again
// (for a host, or a test, that changed the configuration).
void ResetCollectionLoggingSetting();
