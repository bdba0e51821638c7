// `zqdb convert SRC DST`: records from a source spoke to a target spoke, the
// way the integration engine moves them: the target's layout is built from
// the source's, checked, opened by mode, filled record by record.
#pragma once

#include <string>
#include <vector>

#include "engine/dbf_source.h"

struct ConvertOptions {
  SourceOptions source;         // dialect of a DBF source, code page, memo policy
  std::string to;               // target dialect; "" = the source's, or dBASE IV for CSV
  int mode = 0;                 // 0 replace, 1 append, 2 update
  std::vector<std::string> key; // update mode: the fields that find a record
  std::string schema;           // CSV source: the column types
  bool progress = true;         // on a terminal, for runs over a second
};

// Runs the conversion; the exit status (0, or 1 with the message printed).
int RunConvert(const std::string& src, const std::string& dst, const ConvertOptions& opts);
