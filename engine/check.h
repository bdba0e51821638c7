// check and reindex: what is damaged in a table, its memo file and its
// indexes; and the indexes built anew from the records.
#pragma once

#include <string>
#include <vector>

#include "engine/dbf_source.h"
#include "engine/endpoints.h"

struct CheckRunOptions {
  std::vector<std::string> indexes;  // .ndx/.idx files named with --index, beside the table's own tags
  bool json = false;
  int out = 1;  // where the findings go: standard output
};

// Reads everything and writes the findings, one line each (or one JSON
// document). Writes no byte of any file. The exit status: 0 clean, 1 found.
int RunCheck(const std::string& table, const SourceOptions& source, const CheckRunOptions& opts);

struct ReindexOptions {
  std::vector<std::string> names;   // --index NAME: a tag or an index file; none = the table's tags
  std::vector<IndexOption> added;   // --index NAME=EXPR, --unique-index NAME=EXPR
};

// Rebuilds the table's indexes from its live records: built in a directory
// beside the table and moved into place only when whole. The exit status.
int RunReindex(const std::string& table, const SourceOptions& source, const ReindexOptions& opts);

// The same for every tag of the table's MDX or CDX file, after an update
// run left old keys behind. False with `error` set; true when the table has
// no such file, with `summary` empty, else with `summary` saying what was
// rebuilt.
bool RebuildTags(const std::string& table, const SourceOptions& source, std::string* summary, std::string* error);
