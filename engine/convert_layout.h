// The target's layout in a conversion: field names the target accepts, and
// the target type nearest to each source field's.
#pragma once

#include <string>
#include <vector>

#include "host/zqspoke.h"

// A name the target accepts: its character sets and its longest name, and
// different from the names already taken.
std::string TargetName(ZQExport* target, const std::string& source, const std::vector<std::string>& taken);

struct Planned {
  ZQDType type;
  std::string change;  // what the engine changed, for the warning; "" = nothing
};

// The target type of a source field: the same letter where the target has
// it, else the nearest type that keeps the value. False when there is none.
bool PlanType(ZQExport* target, const ZQField* src, Planned* out);
