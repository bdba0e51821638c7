// Indexes in zqdb: the definitions `convert` makes a new table with, and the
// walk of `keys`.
#pragma once

#include <string>

#include "engine/endpoints.h"
#include "host/zqspoke.h"

// Which index files a dialect keeps: MDX tags and NDX files (dBASE IV, the
// unnamed dialect, Visual dBASE 5.5), CDX tags and IDX files (FoxPro, Visual
// FoxPro), or none.
enum class IndexKind { kNone, kDbase, kFox };
IndexKind IndexKindOf(int dialect);

// Checks the index definitions of a new table and hands them to the target
// spoke, whose layout is made. Tag names are upper-cased, since other
// programs look tags up in upper case. A dialect without index files gets one
// warning and no definition. False with `error` set.
bool AddIndexDefinitions(ZQExport* spoke, const TableWriteOptions& opts, bool existing, std::string* error);

struct KeysOptions {
  std::string index;    // a tag name or an index file's path
  std::string seek;     // start at the first key not less than this
  bool has_seek = false;
  bool reverse = false;
  bool jsonl = false;   // else CSV with the header key,recno
};

// Writes the keys of an index of the open table in key order. The exit status.
int WriteKeys(ZQImport* spoke, const KeysOptions& opts);
