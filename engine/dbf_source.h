// Opens a table as a source spoke, the way the integration engine does: the
// factory, the options through their definitions, SetUserInfo, MakeFields;
// then records by number until the spoke says 1.
#pragma once

#include <memory>
#include <string>

#include "connector/frdbase.h"

struct SourceOptions {
  std::string dialect;  // number 0-10 or a name the version option accepts; "" keeps 2
  int codepage = 0;
  int memo_policy = 0;  // 0 never, 1 errors, 2 always ignore the memo file
};

struct SpokeDeleter {
  void operator()(ZQFromDbase* s) const { DeleteFromDbase(s); }
};
using SourcePtr = std::unique_ptr<ZQFromDbase, SpokeDeleter>;

// Resolves a --dialect value against the version option of `spoke` and sets
// it. False when the value names no dialect.
bool ApplyDialect(ZQSpoke* spoke, const std::string& value);

// The dialect that a table's version byte points to, for tables opened
// without --dialect.
int GuessDialect(const std::string& path);

// Opens `path`; on failure `error` holds the spoke's message and the result
// is the spoke's code (non-zero).
BATCHERR OpenSource(const std::string& path, const SourceOptions& opts, SourcePtr* out, std::string* error);
