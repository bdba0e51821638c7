// Owning pointers to spokes. A spoke made by a module's factory is deleted
// by that module's own delete function; a spoke of the engine's own by a
// plain delete wrapped in one.
#pragma once

#include <memory>

#include "host/zqspoke.h"

struct SourceDeleter {
  void (*del)(ZQImport*) = nullptr;
  void operator()(ZQImport* s) const {
    if (s != nullptr) del(s);
  }
};
struct TargetDeleter {
  void (*del)(ZQExport*) = nullptr;
  void operator()(ZQExport* s) const {
    if (s != nullptr) del(s);
  }
};
using SourcePtr = std::unique_ptr<ZQImport, SourceDeleter>;
using TargetPtr = std::unique_ptr<ZQExport, TargetDeleter>;
