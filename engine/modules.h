// Connector modules, found the way the integration engine finds them: a
// module file ends with a descriptor trailer (connector/trailer.h), read
// from its last 16 bytes, and is loaded only when one of its definitions is
// used. The factories are found by name: "New" + "From"/"To" + class stem.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "host/zqspoke.h"

struct ConnectorDef {
  uint32_t number = 0;
  std::string key, display, option_text, extension, short_name, module_stem, class_stem, kind;
  uint64_t flags = 0;
  std::string file;  // the module that carries it
};

enum class TrailerStatus { kNone, kOk, kDamaged };

// Reads the trailer of a file of `file_size` bytes whose last bytes are
// `tail` (`tail_size` of them, at most the file). kNone when the file carries
// no trailer at all; kDamaged with `why` set when it carries a broken one.
// Never reads outside `tail`.
TrailerStatus ParseTrailer(const uint8_t* tail, size_t tail_size, uint64_t file_size,
                           std::vector<ConnectorDef>* out, std::string* why);

// The factories of one loaded module. They take and return the connector's
// own classes (ZQFromDbase, ZQToDbase for the class stem "Dbase"), and a
// function may only be called through a pointer of its own type: each call
// goes through a wrapper typed for the class stem (modules.cpp), which
// converts to and from the framework's ZQImport and ZQExport.
struct SpokeFactories {
  ZQImport* NewSource(const ZQSpokeDef& def) const { return new_source(fns[0], def); }
  ZQExport* NewTarget(const ZQSpokeDef& def) const { return new_target(fns[2], def); }

  ZQImport* (*new_source)(void* fn, const ZQSpokeDef&) = nullptr;
  void (*delete_source)(void* fn, ZQImport*) = nullptr;
  ZQExport* (*new_target)(void* fn, const ZQSpokeDef&) = nullptr;
  void (*delete_target)(void* fn, ZQExport*) = nullptr;
  void* fns[4] = {};  // the module's NewFrom, DeleteFrom, NewTo, DeleteTo
};

class ModuleRegistry {
 public:
  // The registry of this process: scans the directories on first use.
  static ModuleRegistry& Get();

  // Scans a directory (files that end with a trailer); warnings for damaged
  // ones go to `warnings`.
  void ScanDirectory(const std::string& dir, std::vector<std::string>* warnings);
  // Scans one file; false if it carries no usable trailer.
  bool ScanFile(const std::string& path, std::vector<std::string>* warnings);

  const std::vector<ConnectorDef>& Definitions() const { return defs_; }
  // By short name, case-blind; NULL if none.
  const ConnectorDef* ByShortName(const std::string& name) const;
  // The definition used when none is named: the first with an empty option
  // text (dBASE IV), else the first.
  const ConnectorDef* Default() const;
  // Loads the module of `def` (once) and finds its factories.
  bool Load(const ConnectorDef& def, SpokeFactories* out, std::string* error);
  // Warnings of the scan, for the commands to print.
  const std::vector<std::string>& Warnings() const { return warnings_; }
  // The directories searched, in order.
  static std::vector<std::string> SearchPath();

 private:
  std::vector<ConnectorDef> defs_;
  std::vector<std::string> warnings_;
  struct Loaded {
    std::string file;
    void* handle;
  };
  std::vector<Loaded> loaded_;
};

// Overrides the search path (--modules DIR); call before the first Get().
void SetModulePath(const std::string& dirs);
