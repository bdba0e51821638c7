// `zqdb convert SRC DST`: records from a source spoke to a target spoke, the
// way the integration engine moves them: the formats are the endpoints'
// (endpoints.h), the target's layout and the checks of each value the field
// plan's (field_plan.h), and the records go through the transfer loop
// (transfer.h).
#pragma once

#include <string>
#include <vector>

#include "engine/endpoints.h"

struct ConvertOptions {
  ReadOptions read;              // the source's: a table's dialect, code page, memo policy; a CSV schema
  WriteOptions write;            // the target's: the mode, and a table's dialect (--to), ...
  std::vector<std::string> key;  // update mode: the fields that find a record
  bool progress = true;          // on a terminal, for runs over a second
  bool stdout_jsonl = false;     // the target "-": JSON lines, not CSV
  const Endpoint* target = nullptr;  // --format; null: by the target's name
  std::vector<std::string> fields;   // --fields: the source fields that go, in order
  bool wait = false;             // --wait: wait for tables other programs hold locked
};

// Runs the conversion; the exit status (0, or 1 with the message printed).
int RunConvert(const std::string& src, const std::string& dst, const ConvertOptions& opts);
