// Tables as spokes: the connector definition is picked (--type, or the
// default one), its module loaded, and the spoke made by its factories; the
// definition's option text and the options are applied through the option
// definitions, as the integration engine applies them.
#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "engine/codepages.h"
#include "engine/modules.h"
#include "engine/spoke_ptr.h"
#include "host/zqspoke.h"

struct SourceOptions {
  std::string type;     // a definition's short name; "" for the default
  std::string dialect;  // number 0-10 or a name the version option accepts; "" = by the file
  int codepage = kCodePageUnset;  // --codepage; unset: by the language driver byte or a .cpg file
  int memo_policy = 0;  // 0 never, 1 errors, 2 always ignore the memo file
};

// A definition and its loaded factories.
struct TableConnector {
  const ConnectorDef* def = nullptr;
  SpokeFactories factories;
  ZQSpokeDef spoke_def;
};

// Finds the definition by short name (or the default) and loads its module.
bool ResolveConnector(const std::string& type, TableConnector* out, std::string* error);
SourcePtr NewTableSource(const TableConnector& c);
TargetPtr NewTableTarget(const TableConnector& c);
// Applies a definition's option text ("name=value", or empty) to a spoke.
void ApplyOptionText(ZQSpoke* spoke, const std::string& text);

// Resolves a --dialect value against the version option of `spoke` and sets
// it. False when the value names no dialect.
bool ApplyDialect(ZQSpoke* spoke, const std::string& value);

// The dialect that a table's version byte points to, for tables opened
// without --dialect.
int GuessDialect(const std::string& path);
// The dialect to add records to an existing table in: GuessDialect's, or
// Visual dBASE 5.5 for a table with more fields than that dialect reads.
int TableDialect(const std::string& path);
// The name of a dialect number ("dBASE IV"), "?" for none.
const char* DialectName(int dialect);
// True when a file of the table's base name with the extension `ext` (in
// lower or upper case) lies beside it.
bool HasSibling(const std::string& path, const std::string& ext);

// The first bytes of a table file, read by the engine itself: for the facts
// of a table the module refuses, and for the reason it was refused.
struct TableHeader {
  uint8_t bytes[32] = {};
  int64_t size = 0;       // bytes read (fewer than 32 in a short file)
  int64_t file_size = 0;
};
// Version bytes of the tables the module reads (the low bits name the
// format; the high ones memo and SQL flags).
bool KnownVersionByte(uint8_t v);
// False when `path` is no regular file that can be read.
bool ReadTableHeader(const std::string& path, TableHeader* out);

// The module's message about the table `path`, with what the operating
// system said or what was found instead of a table ("No such file or
// directory", "is a directory", "empty file", "not a table (version byte
// 0x50)"), and the memo file's name in memo errors.
std::string ExplainTableError(const std::string& path, const std::string& message);

// One warning line when records of the open table `spoke` lie past 2 GiB.
void WarnOutOfReach(const std::string& path, const ZQSpoke* spoke);
// The number of a "name: value" line of a spoke's facts, or -1.
int64_t FactNumber(const std::string& facts, const char* name);
// The "name: value" facts a spoke reports (ReportFacts), in their order.
std::vector<std::pair<std::string, std::string>> SpokeFacts(const ZQSpoke* spoke);
// The value of the first fact `name`, or "".
std::string SpokeFact(const std::vector<std::pair<std::string, std::string>>& facts, const char* name);

// Opens `path`; on failure `error` holds the spoke's message and the result
// is the spoke's code (non-zero). `chosen`, when given, tells how the code
// page was chosen.
BATCHERR OpenSource(const std::string& path, const SourceOptions& opts, SourcePtr* out, std::string* error,
                    CodePageChoice* chosen = nullptr);
