// The formats zqdb moves records between, in one table: a format's name, the
// file name endings that choose it, and the factories of its source and
// target spokes. `convert` and `cat` ask this table which spoke reads or
// writes a file and never look at a file name themselves, so a new format
// is a file with its factories and one row of the table (endpoints.cpp).
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "engine/dbf_source.h"
#include "engine/spoke_ptr.h"
#include "host/zqspoke.h"

// What a source is opened with.
struct ReadOptions {
  SourceOptions table;  // tables: --type, --dialect, --codepage, --memo
  std::string schema;   // CSV: --schema, the column types
  std::string table_name;  // SQLite: --table, the table read ("" = the only one, or the file's base name)
  char delimiter = 0;   // CSV: --delimiter; 0: a comma, or ';' or a tab when the header has no comma
  bool no_infer = false;  // CSV: --no-infer, every column text
  int csv_codepage = 0;   // CSV: --csv-codepage, the file's own code page; 0: UTF-8
  // The layout of the existing table the records are added to (append and
  // update), for a source that types its columns by it (CSV: "y" read for a
  // text field stays "y", not a logical). Unset, or false: there is none.
  std::function<bool(ZQRecord*)> into;
};

// An index a new table is made with (--index, --unique-index): a tag name,
// or the path of an index file, and the key expression.
struct IndexOption {
  std::string name;
  std::string expression;
  bool unique = false;
};

// What a table target is made with. A new setting of table targets (index
// definitions, say) is one member here, read by MakeTableTarget
// (dbf_target.cpp) before the output is opened.
struct TableWriteOptions {
  std::string type;     // the connector definition (--type); "" = the default
  std::string dialect;  // --to; "" = the table's own when adding to one, else the source's, else dBASE IV
  int codepage = kCodePageUnset;  // --to-codepage, --codepage; unset: the table's own, else the source's
  bool strict = false;  // --strict: text the code page can't hold is an error, not a warning
  int memo_policy = 0;  // --memo: 0 never, 1 errors, 2 always ignore the memo file
  std::vector<IndexOption> indexes;  // --index, --unique-index
  bool plain_idx = false;            // --index-form plain: IDX files without compact keys
};

// What a target is made with.
struct WriteOptions {
  int mode = 0;             // 0 replace, 1 append, 2 update
  TableWriteOptions table;  // the settings of table targets
  std::string table_name;   // SQLite, pgsql: the table written
};

// A target spoke, and what its format does around the records: a table
// takes its dialect from the source, is built in a scratch directory and
// checked once written; a text file is written as it stands.
class Target {
 public:
  Target(TargetPtr spoke, const std::string& path) : spoke_(std::move(spoke)), path_(path), work_(path) {}
  virtual ~Target() = default;
  Target(const Target&) = delete;
  Target& operator=(const Target&) = delete;

  ZQExport* spoke() const { return spoke_.get(); }
  // True when the records go into a file that exists and keeps its own
  // layout (append and update into a table).
  virtual bool AddsToExisting() const { return false; }
  // Opens the output (_OpenOutput). False with `error` set.
  virtual bool Open(std::string* error);
  // After the output was closed and kept, `added` records the more: checks
  // the file and puts it in place. False with `error` set.
  virtual bool Finish(int64_t added, std::string* error) {
    (void)added, (void)error;
    return true;
  }
  // False for a target that has no blank logical (a table stores F), so
  // that the run reports how many it wrote so.
  virtual bool KeepsBlankLogicals() const { return true; }
  // The code page the target stores text in (0: as zqdb holds it, UTF-8).
  virtual int TextCodePage() const { return 0; }

 protected:
  TargetPtr spoke_;
  std::string path_;  // the file the user named
  std::string work_;  // the file written: path_, or its scratch copy
};

// Opens `path` as a source, its layout made. False with `error` set.
using OpenSourceFn = bool (*)(const std::string& path, const ReadOptions& opts, SourcePtr* out, std::string* error);
// Makes the target `path` for the records of the open `source` (a table
// takes its dialect). Null with `error` set.
using MakeTargetFn = std::unique_ptr<Target> (*)(const std::string& path, const WriteOptions& opts, ZQImport* source,
                                                 std::string* error);
// The layout of an existing file `path` that records are added to. False
// when there is none.
using ReadLayoutFn = bool (*)(const std::string& path, const WriteOptions& opts, ZQRecord* out);

struct Endpoint {
  const char* name;            // "dbf", "csv", "jsonl"
  const char* extensions;      // the name endings that choose it, blank-separated, any case
  OpenSourceFn open_source;    // nullptr: not a source
  MakeTargetFn make_target;    // nullptr: not a target
  ReadLayoutFn read_layout;    // nullptr: records are never added to an existing file
};

// The format that reads `path` (that writes it): the first row with a
// source (a target) whose extension ends the name, else the table row,
// since tables go by many names (.dbf, .db2, .dat, ...).
const Endpoint& SourceEndpoint(const std::string& path);
const Endpoint& TargetEndpoint(const std::string& path);
// The row of that name, or null.
const Endpoint* FindEndpoint(const std::string& name);
// Every row, in order.
std::vector<const Endpoint*> Endpoints();

// The factories, one file per format.
bool OpenTableSource(const std::string& path, const ReadOptions& opts, SourcePtr* out, std::string* error);
std::unique_ptr<Target> MakeTableTarget(const std::string& path, const WriteOptions& opts, ZQImport* source,
                                        std::string* error);
bool ReadTableLayout(const std::string& path, const WriteOptions& opts, ZQRecord* out);
bool OpenCsvSource(const std::string& path, const ReadOptions& opts, SourcePtr* out, std::string* error);
std::unique_ptr<Target> MakeCsvTarget(const std::string& path, const WriteOptions& opts, ZQImport* source,
                                      std::string* error);
std::unique_ptr<Target> MakePgsqlTarget(const std::string& path, const WriteOptions& opts, ZQImport* source,
                                        std::string* error);
bool OpenSqliteSource(const std::string& path, const ReadOptions& opts, SourcePtr* out, std::string* error);
std::unique_ptr<Target> MakeSqliteTarget(const std::string& path, const WriteOptions& opts, ZQImport* source,
                                         std::string* error);
bool ReadSqliteLayout(const std::string& path, const WriteOptions& opts, ZQRecord* out);
std::unique_ptr<Target> MakeJsonlTarget(const std::string& path, const WriteOptions& opts, ZQImport* source,
                                        std::string* error);
