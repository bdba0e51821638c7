#include "engine/cli.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "engine/check.h"
#include "engine/convert.h"
#include "engine/dbf_source.h"
#include "engine/indexes.h"
#include "engine/modules.h"
#include "engine/outbuf.h"
#include "engine/read_fix.h"
#include "engine/report.h"
#include "engine/target_path.h"
#include "engine/table_lock.h"
#include "engine/table_output.h"
#include "engine/writers.h"
#include "engine/field_plan.h"
#include "engine/text_util.h"
#include "host/endian.h"
#include "host/zqglob.h"
#include "host/zqutil.h"

namespace {

constexpr int kExitUsage = 2;

// Every option, with its line of help. A command's help shows the lines of
// the options it takes (Command::options).
struct OptionHelp {
  const char* name;  // without the leading "--"
  const char* text;
};
const OptionHelp kOptionHelp[] = {
    {"dialect", "  --dialect D              0-10 or a name: \"dBASE IV\", foxpro, clipper, ...\n"},
    {"type", "  --type NAME              a connector definition by short name (zqdb formats): dbase, foxpro, ...\n"},
    {"modules", "  --modules DIR[:DIR]      where to look for connector modules first (also ZQDB_MODULE_PATH)\n"},
    {"codepage", "  --codepage N             the tables' code page (437, 850, cp850, windows-1252, utf-8, ...); 0 = bytes\n"
                 "                           as they are; default: the table's language driver byte, else its .cpg file\n"},
    {"from-codepage", "  --from-codepage N        the source table's code page\n"},
    {"to-codepage", "  --to-codepage N          the target table's code page (default: the table's own when adding\n"
                    "                           to one, else the source's)\n"},
    {"memo", "  --memo never|errors|always   when to ignore the memo file (default never)\n"},
    {"format", "  --format F               info: text|json; cat: csv|jsonl|table|pgsql; convert: the target's format\n"
               "                           (dbf, csv, jsonl, sqlite, pgsql; csv or jsonl to -); keys: csv|jsonl\n"},
    {"fields", "  --fields A,B,C           only these fields, in this order\n"},
    {"table", "  --table NAME             the table of a SQLite database or PostgreSQL script (default: the file's base name)\n"},
    {"to", "  --to D                   the target's dialect (default: the source's; dBASE IV for other sources)\n"},
    {"mode", "  --mode replace|append|update   make the target anew, add to it, or update it by --key\n"},
    {"key", "  --key FIELD[,FIELD]      --mode update: the fields that identify a record\n"},
    {"schema", "  --schema \"NAME C(30), BORN D, AMOUNT N(12,2), NOTE M\"   column types of a CSV source\n"},
    {"no-infer", "  --no-infer               CSV columns the schema doesn't type are text\n"},
    {"delimiter", "  --delimiter C            the CSV source's delimiter (default: a comma, or ; or a tab when the\n"
                  "                           header has no comma); \"tab\" or \\t for a tab\n"},
    {"csv-codepage", "  --csv-codepage N         the CSV source's own code page (default UTF-8)\n"},
    {"index", "  --index NAME=EXPR        convert: make the new table with this index (repeatable); NAME is a tag\n"
              "                           of the table's MDX or CDX file, or a path ending in .ndx or .idx\n"
              "  --index NAME             keys: the index to walk (a tag or an .ndx/.idx path); check: an .ndx/.idx\n"
              "                           file to check beside the table's tags; reindex: the index to rebuild\n"
              "                           (all the table's tags when none is named), or with =EXPR one to add\n"},
    {"unique-index", "  --unique-index NAME=EXPR the same, for an index without duplicates\n"},
    {"index-form", "  --index-form plain       IDX files without compact keys (default compact)\n"},
    {"seek", "  --seek KEY               start at the first key not less than KEY\n"},
    {"reverse", "  --reverse                walk backwards (NDX, IDX, CDX)\n"},
    {"wait", "  --wait                   wait for a table another program is writing (or reading, to write it)\n"},
    {"no-progress", "  --no-progress            no progress line on a terminal\n"},
    {"quiet", "  --quiet                  no warnings\n"},
    {"strict", "  --strict                 every warning is an error, and text the target's code page can't hold\n"},
};

struct Args {
  std::string command;
  std::vector<std::string> files;
  std::vector<std::string> seen;  // the options given, without "--"
  bool help = false;              // --help: the command's usage
  bool version = false;
  SourceOptions source;
  std::string format;             // --format as given; each command takes its own
  ConvertOptions convert;
  KeysOptions keys;
  // --codepage, --from-codepage, --to-codepage; kCodePageUnset when not given
  int codepage = kCodePageUnset, from_codepage = kCodePageUnset, to_codepage = kCodePageUnset;
  std::vector<std::string> fields;  // --fields
  std::string read_table;           // --table
  std::vector<std::string> index_names;  // every --index NAME (check, reindex)
};

int Usage(const std::string& message) {
  fprintf(stderr, "zqdb: %s (zqdb --help shows the usage)\n", message.c_str());
  return kExitUsage;
}

void PrintUsage(FILE* out);

// Splits "A,B,C" into names; false when one is empty.
bool SplitNames(const std::string& v, std::vector<std::string>* out) {
  size_t start = 0;
  for (;;) {
    size_t comma = v.find(',', start);
    std::string part = v.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
    if (part.empty()) return false;
    out->push_back(part);
    if (comma == std::string::npos) return true;
    start = comma + 1;
  }
}

// Parses the command line; 0, or the exit status of a usage error.
int ParseArgs(int argc, char** argv, Args* args) {
  for (int i = 1; i < argc; ++i) {
    std::string a = argv[i];
    std::string value;
    bool has_value = false;
    size_t eq = a.find('=');
    if (a.rfind("--", 0) == 0 && eq != std::string::npos) {
      value = a.substr(eq + 1);
      a = a.substr(0, eq);
      has_value = true;
    }
    auto take = [&](std::string* v) {
      if (has_value) {
        *v = value;
        return true;
      }
      if (i + 1 >= argc) return false;
      *v = argv[++i];
      return true;
    };
    if (a.rfind("--", 0) == 0 && a.size() > 2) args->seen.push_back(a.substr(2));
    if (a == "--help" || a == "-h") {
      args->help = true;
    } else if (a == "--version") {
      args->version = true;
    } else if (a == "--dialect") {
      if (!take(&args->source.dialect) || args->source.dialect.empty()) return Usage("--dialect needs a value");
    } else if (a == "--type") {
      if (!take(&args->source.type) || args->source.type.empty()) return Usage("--type needs a value");
    } else if (a == "--modules") {
      std::string v;
      if (!take(&v) || v.empty()) return Usage("--modules needs a directory");
      SetModulePath(v);
    } else if (a == "--codepage" || a == "--from-codepage" || a == "--to-codepage") {
      std::string v;
      if (!take(&v)) return Usage(a + " needs a value");
      int cp = 0;
      if (!ParseCodePage(v, &cp)) return Usage("unknown code page: " + v + " (" + AcceptedCodePages() + ")");
      (a == "--codepage" ? args->codepage : a == "--from-codepage" ? args->from_codepage : args->to_codepage) = cp;
    } else if (a == "--strict") {
      args->convert.write.table.strict = true;
      SetWarnings(WarnMode::kStrict);
    } else if (a == "--memo") {
      std::string v;
      if (!take(&v)) return Usage("--memo needs a value");
      if (v == "never") args->source.memo_policy = 0;
      else if (v == "errors") args->source.memo_policy = 1;
      else if (v == "always") args->source.memo_policy = 2;
      else return Usage("--memo takes never, errors or always, not " + v);
    } else if (a == "--format") {
      std::string v;
      if (!take(&args->format) || args->format.empty()) return Usage("--format needs a value");
    } else if (a == "--to") {
      if (!take(&args->convert.write.table.dialect) || args->convert.write.table.dialect.empty()) return Usage("--to needs a value");
    } else if (a == "--mode") {
      std::string v;
      if (!take(&v)) return Usage("--mode needs a value");
      if (v == "replace") args->convert.write.mode = 0;
      else if (v == "append") args->convert.write.mode = 1;
      else if (v == "update") args->convert.write.mode = 2;
      else return Usage("--mode takes replace, append or update, not " + v);
    } else if (a == "--key") {
      std::string v;
      if (!take(&v)) return Usage("--key needs a value");
      if (!SplitNames(v, &args->convert.key)) return Usage("--key has an empty field name");
    } else if (a == "--no-infer") {
      args->convert.read.no_infer = true;
    } else if (a == "--delimiter") {
      std::string v;
      if (!take(&v)) return Usage("--delimiter needs a value");
      if (v == "tab" || v == "\\t") v = "\t";
      if (v.size() != 1 || v[0] == '"' || v[0] == '\n' || v[0] == '\r')
        return Usage("--delimiter takes one character (or tab), not " + v);
      args->convert.read.delimiter = v[0];
    } else if (a == "--csv-codepage") {
      std::string v;
      int cp = 0;
      if (!take(&v)) return Usage("--csv-codepage needs a value");
      if (!ParseCodePage(v, &cp)) return Usage("unknown code page: " + v + " (" + AcceptedCodePages() + ")");
      args->convert.read.csv_codepage = ModuleCodePage(cp);
    } else if (a == "--schema") {
      if (!take(&args->convert.read.schema)) return Usage("--schema needs a value");
    } else if (a == "--index" || a == "--unique-index") {
      std::string v;
      if (!take(&v) || v.empty()) return Usage(a + " needs a value");
      size_t at = v.find('=');
      if (at == std::string::npos && a == "--index") {
        args->keys.index = v;
        args->index_names.push_back(v);
      } else {
        if (at == std::string::npos || at == 0 || at + 1 == v.size())
          return Usage(a + " takes NAME=EXPR, not " + v);
        args->convert.write.table.indexes.push_back({v.substr(0, at), v.substr(at + 1), a == "--unique-index"});
      }
    } else if (a == "--index-form") {
      std::string v;
      if (!take(&v)) return Usage("--index-form needs a value");
      if (v == "plain") args->convert.write.table.plain_idx = true;
      else if (v == "compact") args->convert.write.table.plain_idx = false;
      else return Usage("--index-form takes plain or compact, not " + v);
    } else if (a == "--seek") {
      if (!take(&args->keys.seek)) return Usage("--seek needs a value");
      args->keys.has_seek = true;
    } else if (a == "--reverse") {
      args->keys.reverse = true;
    } else if (a == "--wait") {
      args->convert.wait = true;
    } else if (a == "--no-progress") {
      args->convert.progress = false;
    } else if (a == "--quiet") {
      SetWarnings(WarnMode::kQuiet);
    } else if (a == "--fields") {
      std::string v;
      if (!take(&v) || v.empty()) return Usage("--fields needs field names");
      if (!SplitNames(v, &args->fields)) return Usage("--fields has an empty field name");
    } else if (a == "--table") {
      if (!take(&args->read_table) || args->read_table.empty()) return Usage("--table needs a name");
    } else if (a.rfind("--", 0) == 0 && a.size() > 2) {
      return Usage("unknown option " + a);
    } else if (args->command.empty()) {
      args->command = a;
    } else {
      args->files.push_back(a);
    }
  }
  if (args->command.empty() && !args->help && !args->version) {
    PrintUsage(stderr);
    return kExitUsage;
  }
  args->source.codepage = args->from_codepage != kCodePageUnset ? args->from_codepage : args->codepage;
  return 0;
}

// Takes a shared lock on the table a command reads, held until the command
// ends: readers never wait for each other, only for a writer. 0, or the exit
// status.
int LockForReading(const Args& args, const std::string& path) {
  static TableLocks lock;
  std::string error;
  if (!InterruptedJournals(path).empty()) {
    // A journal left by a killed run is put back first, under an exclusive
    // lock, so that no one reads the table half-written.
    TableLocks exclusive;
    exclusive.Add(path, true);
    if (!exclusive.Take(args.convert.wait, &error) || !RecoverInterrupted(path, &error)) return Fail(error);
  }
  lock.Add(path, false);
  return lock.Take(args.convert.wait, &error) ? 0 : Fail(error);
}

// Opens the one table of `info` and `keys`.
int OpenOrFail(const Args& args, SourcePtr* spoke, CodePageChoice* chosen = nullptr) {
  std::string error;
  if (int rc = LockForReading(args, args.files[0])) return rc;
  if (OpenSource(args.files[0], args.source, spoke, &error, chosen) != 0) return Fail(error);
  return 0;
}

// The code page line of info: the code page and where it came from.
std::string CodePageLine(const CodePageChoice& c) {
  char driver[48] = "";
  if (c.driver >= 0) snprintf(driver, sizeof driver, "language driver byte 0x%02X", unsigned(c.driver));
  std::string page = c.codepage == kUtf8CodePage ? "UTF-8" : std::to_string(c.codepage);
  if (c.codepage == 0) {
    std::string why = c.origin.empty() ? (c.driver >= 0 ? std::string(driver) + ", no .cpg file" : "no .cpg file")
                                       : c.origin;
    return "none, bytes as they are (" + why + ")";
  }
  if (c.origin == "--codepage") return page + " (--codepage" + (c.driver >= 0 ? std::string("; ") + driver : "") + ")";
  if (c.origin.rfind("the language driver", 0) == 0) return page + " (" + driver + ")";
  return page + " (" + c.origin + (c.driver >= 0 ? std::string("; ") + driver : "") + ")";
}

const char* DialectName(int dialect) {
  static const char* const kNames[] = {"dBASE II", "dBASE III+", "dBASE IV", "Enable", "dBASE III", "(no name)",
                                       "FoxPro", "Enable OA (Database)", "Clipper", "Visual dBASE 5.5",
                                       "Visual FoxPro"};
  return dialect >= 0 && dialect <= 10 ? kNames[dialect] : "?";
}

std::vector<std::string> SplitTabs(const std::string& s) {
  std::vector<std::string> parts;
  size_t start = 0;
  for (size_t tab; (tab = s.find('\t', start)) != std::string::npos; start = tab + 1)
    parts.push_back(s.substr(start, tab - start));
  parts.push_back(s.substr(start));
  return parts;
}

// A JSON string literal of `s`.
std::string Json(const std::string& s) {
  std::string out = "\"";
  for (unsigned char c : s) {
    if (c == '"' || c == '\\') out += '\\';
    if (c < 0x20) {
      char esc[8];
      snprintf(esc, sizeof esc, "\\u%04x", c);
      out += esc;
    } else {
      out += char(c);
    }
  }
  return out + "\"";
}

// What info tells of a table: the facts of the module's report, the live
// count, and the header bytes the engine reads itself.
struct TableFacts {
  std::string path;
  TableHeader header;
  bool have_header = false;
  int dialect = -1;
  std::string version, records, header_len, record_len;
  int64_t live = -1;
  std::string memo, memo_file, memo_kind, memo_block;
  std::vector<std::vector<std::string>> fields;   // name, type, width, decimals
  std::vector<std::vector<std::string>> indexes;  // name, expression, type, unique, file
  CodePageChoice codepage;    // the code page the text is read in, and why
  std::string codepage_line;
};

// The facts of the header alone, for a table the module refused: dBASE
// II's header is laid out otherwise, so it gives its version byte only.
void HeaderFacts(TableFacts* t) {
  const uint8_t* h = t->header.bytes;
  char buf[16];
  snprintf(buf, sizeof buf, "0x%02X", unsigned(h[0]));
  t->version = buf;
  if (h[0] == 0x02 || t->header.size < 12) return;
  t->records = std::to_string(GetLe32(h + 4));
  t->header_len = std::to_string(GetLe16(h + 8));
  t->record_len = std::to_string(GetLe16(h + 10));
}

void PrintInfoText(const TableFacts& t) {
  printf("table:       %s\n", t.path.c_str());
  if (t.dialect >= 0) printf("dialect:     %d (%s)\n", t.dialect, DialectName(t.dialect));
  printf("version:     %s\n", t.version.c_str());
  if (!t.records.empty()) {
    if (t.live >= 0) printf("records:     %s in the header, %lld live\n", t.records.c_str(), static_cast<long long>(t.live));
    else printf("records:     %s in the header\n", t.records.c_str());
    printf("layout:      header %s bytes, record %s bytes\n", t.header_len.c_str(), t.record_len.c_str());
  }
  if (t.dialect < 0) return;
  printf("memo:        %s\n", t.memo.c_str());
  printf("code page:   %s\n", t.codepage_line.c_str());
  printf("fields:      %zu\n", t.fields.size());
  printf("  %-4s %-11s %-4s %5s %4s\n", "#", "name", "type", "width", "dec");
  for (size_t i = 0; i < t.fields.size(); ++i)
    printf("  %-4zu %-11s %-4s %5s %4s\n", i + 1, t.fields[i][0].c_str(), t.fields[i][1].c_str(),
           t.fields[i][2].c_str(), t.fields[i][3].c_str());
  printf("indexes:     %zu\n", t.indexes.size());
  if (!t.indexes.empty()) printf("  %-11s %-4s %-10s %-30s %s\n", "name", "type", "duplicates", "expression", "file");
  for (const auto& x : t.indexes)
    printf("  %-11s %-4s %-10s %-30s %s\n", x[0].c_str(), x[2].c_str(), x[3] == "unique" ? "no" : "yes",
           x[1].c_str(), x[4].c_str());
}

// The same facts as one JSON document; `error` when the table was refused.
void PrintInfoJson(const TableFacts& t, const std::string& error) {
  std::string j = "{\"table\": " + Json(t.path);
  auto num = [&](const char* key, const std::string& v) {
    if (!v.empty()) j += std::string(", \"") + key + "\": " + v;
  };
  if (t.dialect >= 0) j += ", \"dialect\": " + std::to_string(t.dialect) + ", \"dialect_name\": " + Json(DialectName(t.dialect));
  if (t.have_header) j += ", \"version_byte\": " + std::to_string(t.header.bytes[0]);
  if (t.have_header && t.header.size > 29) {
    j += ", \"codepage_byte\": " + std::to_string(t.header.bytes[29]);
    j += ", \"production_index\": " + std::string(t.header.bytes[28] & 1 ? "true" : "false");
  }
  if (t.dialect >= 0)
    j += ", \"codepage\": " + std::to_string(t.codepage.codepage) + ", \"codepage_origin\": " + Json(t.codepage_line);
  num("records_in_header", t.records);
  if (t.live >= 0) j += ", \"records_live\": " + std::to_string(t.live);
  num("header_length", t.header_len);
  num("record_length", t.record_len);
  if (t.dialect >= 0) {
    if (t.memo_file.empty()) j += ", \"memo\": null";
    else
      j += ", \"memo\": {\"file\": " + Json(t.memo_file) + ", \"kind\": " + Json(t.memo_kind) +
           ", \"block_size\": " + (t.memo_block.empty() ? "0" : t.memo_block) + "}";
    j += ", \"fields\": [";
    for (size_t i = 0; i < t.fields.size(); ++i)
      j += std::string(i ? ", " : "") + "{\"name\": " + Json(t.fields[i][0]) + ", \"type\": " + Json(t.fields[i][1]) +
           ", \"width\": " + t.fields[i][2] + ", \"decimals\": " + t.fields[i][3] + "}";
    j += "], \"indexes\": [";
    for (size_t i = 0; i < t.indexes.size(); ++i) {
      const auto& x = t.indexes[i];
      j += std::string(i ? ", " : "") + "{\"name\": " + Json(x[0]) + ", \"expression\": " + Json(x[1]) +
           ", \"key_type\": " + Json(x[2]) + ", \"unique\": " + (x[3] == "unique" ? "true" : "false") +
           ", \"file\": " + Json(x[4]) + "}";
    }
    j += "]";
  }
  if (!error.empty()) j += ", \"error\": " + Json(error);
  j += "}\n";
  fputs(j.c_str(), stdout);
}

int CmdInfo(const Args& args) {
  if (args.files.size() != 1) return Usage("info takes one table");
  bool json = args.format == "json";
  if (!json && !args.format.empty() && args.format != "text")
    return Usage("info --format takes text or json, not " + args.format);
  TableFacts t;
  t.path = args.files[0];
  if (int rc = LockForReading(args, t.path)) return rc;
  t.have_header = ReadTableHeader(t.path, &t.header) && t.header.size > 0 && KnownVersionByte(t.header.bytes[0]);
  SourcePtr spoke;
  CodePageChoice codepage;
  std::string error;
  if (OpenSource(t.path, args.source, &spoke, &error, &codepage) != 0) {
    // What could be read of a damaged table, then why it was refused.
    if (t.have_header) HeaderFacts(&t);
    if (json) PrintInfoJson(t, error);
    else if (t.have_header && t.header.size >= 12) PrintInfoText(t);
    fflush(stdout);
    return Fail(error);
  }
  t.codepage = codepage;
  t.codepage_line = CodePageLine(codepage);
  for (const auto& f : SpokeFacts(spoke.get())) {
    const std::string& k = f.first;
    if (k == "version") t.version = f.second;
    else if (k == "records") t.records = f.second;
    else if (k == "header") t.header_len = f.second;
    else if (k == "record") t.record_len = f.second;
    else if (k == "memo") t.memo = f.second;
    else if (k == "memo file") t.memo_file = f.second;
    else if (k == "memo kind") t.memo_kind = f.second;
    else if (k == "memo block") t.memo_block = f.second;
    else if (k == "field" && SplitTabs(f.second).size() == 4) t.fields.push_back(SplitTabs(f.second));
    else if (k == "index" && SplitTabs(f.second).size() == 5) t.indexes.push_back(SplitTabs(f.second));
  }
  ZQString dialect;
  spoke->GetOption("version", dialect);
  t.dialect = atoi(dialect.c_str());
  // The layout's names: the code page applied.
  ZQRecord* layout = spoke->GetLayout(0);
  for (int i = 0; i < layout->FieldCount() && size_t(i) < t.fields.size(); ++i) t.fields[size_t(i)][0] = (*layout)[i]->Name();
  int64_t live = 0;
  BATCHERR rc;
  while ((rc = spoke->GetRecord(int32_t(live))) == 0) ++live;
  if (rc != ZQ_END) {
    error = ExplainTableError(t.path, spoke->LastErrorMessage());
  } else {
    t.live = live;
  }
  spoke->ConnectionClose();
  if (json) PrintInfoJson(t, error);
  else PrintInfoText(t);
  if (fflush(stdout) != 0) return Fail(std::string("cannot write the output: ") + strerror(errno));
  return error.empty() ? 0 : Fail(error);
}

int CmdFormats(const Args& args) {
  if (!args.files.empty()) return Usage("formats takes no file");
  ModuleRegistry& r = ModuleRegistry::Get();
  for (const std::string& w : r.Warnings()) fprintf(stderr, "zqdb: warning: %s\n", w.c_str());
  if (r.Definitions().empty()) {
    std::string dirs;
    for (const std::string& d : ModuleRegistry::SearchPath()) dirs += " " + d;
    return Fail("no connector module found; looked in" + dirs);
  }
  printf("%-11s %-21s %-9s %-11s %s\n", "key", "name", "type", "options", "module");
  for (const ConnectorDef& d : r.Definitions())
    printf("%-11s %-21s %-9s %-11s %s\n", d.key.c_str(), d.display.c_str(), d.short_name.c_str(),
           d.option_text.empty() ? "-" : d.option_text.c_str(), d.file.c_str());
  return 0;
}

// The positions of the fields named by --fields in `layout`, in the order
// given. A usage error (exit status) for a name the layout doesn't hold.
int SelectFields(const Args& args, const ZQRecord& layout, std::vector<int>* out) {
  std::string error;
  if (SelectFieldsByName(layout, args.fields, out, &error)) return 0;
  return Usage(error);
}

// The name of the table a database or script holds (--table, else the base
// name of the source `path` without its extension).
std::string TableName(const Args& args, const std::string& path) {
  if (!args.read_table.empty()) return args.read_table;
  return BaseName(path);
}

int CmdCat(const Args& args) {
  if (args.files.size() != 1) return Usage("cat takes one table");
  OutputFormat format = OutputFormat::kCsv;
  if (!args.format.empty() && !ParseFormat(args.format, &format))
    return Usage("cat --format takes csv, jsonl, table or pgsql, not " + args.format);
  const std::string& path = args.files[0];
  ReadOptions read;
  read.table = args.source;
  read.table_name = args.read_table;
  SourcePtr spoke;
  std::string error;
  const Endpoint& from = SourceEndpoint(path);
  if (int rc = LockForReading(args, path)) return rc;
  if (!from.open_source(path, read, &spoke, &error)) return Fail(error);
  ZQRecord& record = *spoke->GetLayout(0);
  TableReadFix fix(spoke.get());
  std::vector<int> columns;
  if (int rc = SelectFields(args, record, &columns)) return rc;
  OutBuf out(STDOUT_FILENO);
  std::unique_ptr<RecordWriter> writer = MakeWriter(format, out, TableName(args, path));
  writer->Select(columns);
  writer->Begin(record);
  BATCHERR rc;
  int32_t n = 0;
  while ((rc = spoke->GetRecord(n)) == 0) {
    fix.Apply(record);
    writer->Row(record);
    if (++n == INT32_MAX) break;
  }
  std::string message = rc != ZQ_END ? ExplainTableError(path, spoke->LastErrorMessage()) : "";
  if (message.empty()) writer->End();  // a script cut short never commits
  bool written = out.Flush();
  spoke->ConnectionClose();
  if (!message.empty()) return Fail(message);
  if (!written) return Fail(std::string("cannot write the output: ") + strerror(out.error()));
  return 0;
}

int CmdKeys(const Args& args) {
  if (args.files.size() != 1) return Usage("keys takes one table");
  if (args.keys.index.empty()) return Usage("keys needs --index NAME");
  if (!args.convert.write.table.indexes.empty()) return Usage("keys takes --index NAME, without =EXPR");
  if (!args.format.empty() && args.format != "csv" && args.format != "jsonl")
    return Usage("keys --format takes csv or jsonl, not " + args.format);
  SourcePtr spoke;
  if (int rc = OpenOrFail(args, &spoke)) return rc;
  KeysOptions opts = args.keys;
  opts.jsonl = args.format == "jsonl";
  int rc = WriteKeys(spoke.get(), opts);
  spoke->ConnectionClose();
  return rc;
}

// True when `o` was given on the command line.
bool Given(const Args& args, const char* o) {
  return std::find(args.seen.begin(), args.seen.end(), o) != args.seen.end();
}

int CmdConvert(const Args& args) {
  if (args.files.size() != 2) return Usage("convert takes a source and a target");
  if (!args.keys.index.empty()) return Usage("--index takes NAME=EXPR, not " + args.keys.index);
  if (args.keys.has_seek || args.keys.reverse) return Usage("--seek and --reverse go with keys");
  if (args.convert.write.mode != 2 && !args.convert.key.empty()) return Usage("--key goes with --mode update");
  bool to_stdout = args.files[1] == "-";
  if (IsForeignTargetName(args.files[1]) && args.format.empty())
    return Usage("zqdb writes tables, CSV, JSON-lines, SQLite and PostgreSQL files, not " + args.files[1] +
                 " (name it .dbf, .csv, .jsonl, .sqlite or .sql, give --format, or - for standard output)");
  if (to_stdout && !args.format.empty() && args.format != "csv" && args.format != "jsonl" && args.format != "json")
    return Usage("convert writes csv or jsonl to -");
  if (args.files[1] == "-" && !args.convert.write.table.dialect.empty())
    return Usage("a table can't be written to standard output (--to goes with a table target)");
  ConvertOptions opts = args.convert;
  opts.stdout_jsonl = args.format == "jsonl" || args.format == "json";
  const Endpoint* to = to_stdout ? FindEndpoint(opts.stdout_jsonl ? "jsonl" : "csv") : &TargetEndpoint(args.files[1]);
  if (!args.format.empty() && !to_stdout) {
    to = FindEndpoint(args.format == "json" ? "jsonl" : args.format);
    if (to == nullptr || to->make_target == nullptr) {
      std::string names;
      for (const Endpoint* e : Endpoints())
        if (e->make_target != nullptr) names += std::string(names.empty() ? "" : ", ") + e->name;
      return Usage("convert --format takes " + names + ", not " + args.format);
    }
  }
  // The options of table targets mean nothing to another target.
  if (std::string(to->name) != "dbf")
    for (const char* o : {"to", "index", "unique-index", "index-form"})
      if (Given(args, o)) return Usage(std::string("--") + o + " goes with a table target, not " + to->name);
  opts.target = to_stdout ? nullptr : to;
  opts.fields = args.fields;
  opts.read.table = args.source;
  opts.read.table_name = args.read_table;
  // --table names the table of a database on either side; a new one is
  // named after the source file otherwise (customers.dbf -> customers).
  opts.write.table_name = TableName(args, args.files[0]);
  opts.write.table.type = args.source.type;
  opts.write.table.codepage = args.to_codepage != kCodePageUnset ? args.to_codepage : args.codepage;
  opts.write.table.memo_policy = args.source.memo_policy;
  return RunConvert(args.files[0], args.files[1], opts);
}

int CmdHelp(const Args& args);

int CmdCheck(const Args& args) {
  if (args.files.size() != 1) return Usage("check takes one table");
  if (!args.convert.write.table.indexes.empty()) return Usage("check takes --index FILE, without =EXPR");
  if (!args.format.empty() && args.format != "text" && args.format != "json")
    return Usage("check --format takes text or json, not " + args.format);
  CheckRunOptions opts;
  opts.indexes = args.index_names;
  opts.json = args.format == "json";
  return RunCheck(args.files[0], args.source, opts);
}

int CmdReindex(const Args& args) {
  if (args.files.size() != 1) return Usage("reindex takes one table");
  ReindexOptions opts;
  opts.names = args.index_names;
  opts.added = args.convert.write.table.indexes;
  return RunReindex(args.files[0], args.source, opts);
}

// The commands. A new one is a function and a row.
struct Command {
  const char* name;
  const char* synopsis;  // its line in the usage: synopsis, then summary
  const char* summary;
  int (*run)(const Args& args);
  bool reads_tables;     // the module scan's warnings, and the dialect names, first
  const char* options;   // the options it takes, blank-separated, without "--"
  const char* examples;  // its help's examples, one a line
};

// The options of every command that opens a table.
#define ZQ_TABLE_OPTIONS "dialect type modules codepage memo quiet strict wait "

const Command kCommands[] = {
    {"info", "info TABLE", "dialect, version byte, record counts, memo file, fields and indexes", CmdInfo, true,
     ZQ_TABLE_OPTIONS "format",
     "zqdb info customers.dbf\n"
     "zqdb info customers.dbf --format json | python3 -m json.tool\n"},
    {"cat", "cat TABLE", "the live records (--format csv|jsonl|table|pgsql)", CmdCat, true,
     ZQ_TABLE_OPTIONS "format fields table",
     "zqdb cat customers.dbf --format table\n"
     "zqdb cat customers.dbf --fields NAME,CITY --format jsonl\n"
     "zqdb cat customers.dbf --format pgsql | psql -d shop\n"},
    {"convert", "convert SRC DST", "records from a table, CSV file or SQLite database to a table, CSV, JSON-lines, "
     "SQLite or PostgreSQL file", CmdConvert, true,
     ZQ_TABLE_OPTIONS "format fields table to mode key schema index unique-index index-form no-progress from-codepage "
                      "to-codepage no-infer delimiter csv-codepage",
     "zqdb convert customers.dbf customers.csv\n"
     "zqdb convert customers.dbf shop.sqlite --table customers\n"
     "zqdb convert customers.dbf customers.sql --format pgsql\n"
     "zqdb convert new.csv customers.dbf --mode update --key ID\n"},
    {"keys", "keys TABLE --index NAME", "the keys of an index in key order, with their record numbers", CmdKeys,
     true, ZQ_TABLE_OPTIONS "format index seek reverse",
     "zqdb keys customers.dbf --index NAME\n"
     "zqdb keys customers.dbf --index NAME --seek M --reverse\n"},
    {"formats", "formats", "the connector definitions of the modules found", CmdFormats, false, "modules",
     "zqdb formats\n"},
    {"help", "help [COMMAND]", "this text, or a command's usage with examples", CmdHelp, false, "", "zqdb help convert\n"},
    {"check", "check TABLE", "what is damaged in a table, its memo file and its indexes", CmdCheck, true,
     ZQ_TABLE_OPTIONS "format index",
     "zqdb check customers.dbf\n"
     "zqdb check customers.dbf --index byname.ndx --format json\n"},
    {"reindex", "reindex TABLE", "the table's indexes built anew from its records", CmdReindex, true,
     ZQ_TABLE_OPTIONS "index unique-index",
     "zqdb reindex customers.dbf\n"
     "zqdb reindex customers.dbf --index CITY=CITY+NAME\n"},
};

#undef ZQ_TABLE_OPTIONS

const Command* FindCommand(const std::string& name) {
  for (const Command& c : kCommands)
    if (name == c.name) return &c;
  return nullptr;
}

// True when the blank-separated `list` holds `word`.
bool ListHas(const char* list, const std::string& word) {
  std::string padded = std::string(" ") + list + " ";
  return padded.find(" " + word + " ") != std::string::npos;
}

void PrintUsage(FILE* out) {
  fputs("usage: zqdb COMMAND [options] FILE...\n\ncommands:\n", out);
  for (const Command& c : kCommands) fprintf(out, "  %-25s%s\n", c.synopsis, c.summary);
  fputs("\n\"zqdb help COMMAND\" or \"zqdb COMMAND --help\" shows a command's options and examples;\n"
        "\"zqdb --version\" the versions of zqdb and of the connector modules found.\n", out);
}

void PrintCommandUsage(const Command& c, FILE* out) {
  fprintf(out, "usage: zqdb %s [options]\n\n%s.\n\noptions (before or after the file names):\n", c.synopsis,
          c.summary);
  for (const OptionHelp& o : kOptionHelp)
    if (ListHas(c.options, o.name)) fputs(o.text, out);
  fputs("  --help                   this text\n\nexamples:\n", out);
  for (const char* p = c.examples; *p;) {
    const char* nl = strchr(p, '\n');
    fprintf(out, "  %.*s\n", int(nl - p), p);
    p = nl + 1;
  }
}

int CmdHelp(const Args& args) {
  if (args.files.empty()) {
    PrintUsage(stdout);
    return 0;
  }
  const Command* c = args.files.size() == 1 ? FindCommand(args.files[0]) : nullptr;
  if (c == nullptr) return Usage("help takes one command name, not " + args.files[0]);
  PrintCommandUsage(*c, stdout);
  return 0;
}

// The version of zqdb, and of each connector module found: its file and
// the definitions it carries.
int PrintVersion() {
  printf("zqdb %s\n", ZQ_VERSION);
  ModuleRegistry& r = ModuleRegistry::Get();
  std::vector<std::string> files;
  for (const ConnectorDef& d : r.Definitions())
    if (std::find(files.begin(), files.end(), d.file) == files.end()) files.push_back(d.file);
  for (const std::string& f : files) {
    int n = 0;
    for (const ConnectorDef& d : r.Definitions()) n += d.file == f;
    printf("module %s: %d connector definitions\n", f.c_str(), n);
  }
  if (files.empty()) printf("no connector module found\n");
  return 0;
}

// A usage error for the first option `c` doesn't take.
int CheckOptions(const Command& c, const Args& args) {
  for (const std::string& o : args.seen)
    if (o != "help" && o != "version" && !ListHas(c.options, o))
      return Usage(std::string(c.name) + " takes no option --" + o);
  return 0;
}

// What every command that reads tables checks first: the warnings of the
// module scan, once, and the dialect names, before any file is touched (a
// wrong one is a usage error). 0, or the exit status.
int CheckTableOptions(const Args& args) {
  for (const std::string& w : ModuleRegistry::Get().Warnings()) fprintf(stderr, "zqdb: warning: %s\n", w.c_str());
  const std::string& to = args.convert.write.table.dialect;
  if (!args.source.dialect.empty() || !to.empty()) {
    TableConnector c;
    std::string error;
    if (!ResolveConnector(args.source.type, &c, &error)) return Fail(error);
    for (const std::string* v : {&args.source.dialect, &to}) {
      SourcePtr probe = NewTableSource(c);
      if (!v->empty() && (!probe || !ApplyDialect(probe.get(), *v))) return Usage("unknown dialect: " + *v);
    }
  } else if (!args.source.type.empty()) {
    TableConnector c;
    std::string error;
    if (!ResolveConnector(args.source.type, &c, &error)) return Usage(error);
  }
  return 0;
}

void QuietSink(void*, int, BATCHERR, const char*) {
  // Messages come back through the spokes' last error and are reported once
  // by the command that failed.
}

// The module's few console lines go to standard error, so that they never mix
// with the data a command writes on standard output.
void ConsoleToStderr(const char* text) {
  fprintf(stderr, "zqdb: %s", text);
}

}  // namespace

int ZqdbMain(int argc, char** argv) {
  SetLogSink(QuietSink, nullptr);
  SetConsoleSink(ConsoleToStderr);
  Args args;
  if (int rc = ParseArgs(argc, argv, &args)) return rc;
  if (args.version && args.command.empty()) return PrintVersion();
  const Command* command = FindCommand(args.command);
  if (args.help) {
    if (command == nullptr && !args.command.empty()) return Usage("unknown command " + args.command);
    if (command == nullptr) PrintUsage(stdout);
    else PrintCommandUsage(*command, stdout);
    return 0;
  }
  if (command != nullptr)
    if (int rc = CheckOptions(*command, args)) return rc;
  // An unknown command is told after those checks, as it always was.
  if (command == nullptr || command->reads_tables)
    if (int rc = CheckTableOptions(args)) return rc;
  if (command == nullptr) return Usage("unknown command " + args.command);
  int rc = command->run(args);
  FlushWarnings();
  if (rc == 0 && WarningsFail()) rc = 1;
  return rc;
}
