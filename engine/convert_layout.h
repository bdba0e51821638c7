// The target's layout in a conversion: field names the target accepts, and
// the target type nearest to each source field's.
#pragma once

#include <string>
#include <unordered_map>
#include <unordered_set>
#include <vector>

#include "engine/text_util.h"

#include "host/zqspoke.h"

// The names a new layout has taken, in any case, and for each base name the
// next number to try as its suffix: making n names costs time linear in n.
struct TakenNames {
  std::unordered_set<std::string> lower;      // the names taken, lower-cased
  std::unordered_map<std::string, int> next;  // base name (lower-cased) -> next suffix
  bool Has(const std::string& name) const { return lower.count(Lower(name)) != 0; }
  void Add(const std::string& name) { lower.insert(Lower(name)); }
};

// A name the target accepts: its character sets and its longest name, and,
// with `taken`, different from the names taken there (and then taken).
std::string TargetName(ZQExport* target, const std::string& source, TakenNames* taken);

struct Planned {
  ZQDType type;
  std::string change;  // what the engine changed, for the warning; "" = nothing
};

// The target type of a source field: the same letter where the target has
// it, else the nearest type that keeps the value. False when there is none.
bool PlanType(ZQExport* target, const ZQField* src, Planned* out);
