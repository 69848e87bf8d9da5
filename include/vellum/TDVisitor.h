// The visitor a caller passes to `TD::Accept`: one general entry for read-only and one for
// writable descriptors, and an entry per kind that by default forwards to the general one.
#pragma once

#include "vellum/TDHandles.h"

class TDRVoid;
class TDWVoid;
class TDRBoolean;
class TDWBoolean;
class TDRBooleanU16;
class TDWBooleanU16;

class ITDVisitor {
 public:
  virtual ~ITDVisitor() = default;
  virtual void Visit(const TDR& type) = 0;
  virtual void Visit(TDW& type) = 0;

  virtual void VisitVoid(const TDRVoid& type);
  virtual void VisitVoid(TDWVoid& type);
  virtual void VisitBoolean(const TDRBoolean& type);
  virtual void VisitBoolean(TDWBoolean& type);
  virtual void VisitBooleanU16(const TDRBooleanU16& type);
  virtual void VisitBooleanU16(TDWBooleanU16& type);
};
