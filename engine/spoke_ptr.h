// Owning pointers to spokes. A spoke made by a module's factory is deleted
// by that module's own delete function `fn`, called through `del` (a wrapper
// of the function's own type); a spoke of the engine's own by a plain delete
// wrapped in one, with no `fn`.
#pragma once

#include <memory>

#include "host/zqspoke.h"

struct SourceDeleter {
  void (*del)(void* fn, ZQImport*) = nullptr;
  void* fn = nullptr;
  void operator()(ZQImport* s) const {
    if (s != nullptr) del(fn, s);
  }
};
struct TargetDeleter {
  void (*del)(void* fn, ZQExport*) = nullptr;
  void* fn = nullptr;
  void operator()(ZQExport* s) const {
    if (s != nullptr) del(fn, s);
  }
};
using SourcePtr = std::unique_ptr<ZQImport, SourceDeleter>;
using TargetPtr = std::unique_ptr<ZQExport, TargetDeleter>;
