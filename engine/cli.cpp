#include "engine/cli.h"

#include <fcntl.h>
#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "engine/convert.h"
#include "engine/dbf_source.h"
#include "engine/indexes.h"
#include "engine/modules.h"
#include "engine/outbuf.h"
#include "engine/read_fix.h"
#include "engine/report.h"
#include "engine/target_path.h"
#include "engine/writers.h"
#include "host/zqglob.h"
#include "host/zqutil.h"

namespace {

constexpr int kExitUsage = 2;

// The usage after the list of commands.
const char kOptionsUsage[] =
    "\n"
    "options (before or after the file names):\n"
    "  --dialect D              0-10 or a name: \"dBASE IV\", foxpro, clipper, ...\n"
    "  --type NAME              a connector definition by short name (zqdb formats): dbase, foxpro, clipper, ...\n"
    "  --modules DIR[:DIR]      where to look for connector modules first (also ZQDB_MODULE_PATH)\n"
    "  --codepage N             the tables' code page (437, 850, cp850, windows-1252, utf-8, ...); 0 = bytes\n"
    "                           as they are; default: the table's language driver byte, else its .cpg file\n"
    "  --from-codepage N        convert: the source table's code page\n"
    "  --to-codepage N          convert: the target table's code page (default: the table's own when adding\n"
    "                           to one, else the source's)\n"
    "  --strict                 convert: text that the target's code page can't hold is an error\n"
    "  --memo never|errors|always   when to ignore the memo file (default never)\n"
    "  --format csv|jsonl|table output of cat, and of convert to - (default csv)\n"
    "  --to D                   convert: the target's dialect (default: the source's; dBASE IV for CSV)\n"
    "  --mode replace|append|update   convert: make the target anew, add to it, or update it by --key\n"
    "  --key FIELD[,FIELD]      convert --mode update: the fields that identify a record\n"
    "  --schema \"NAME C(30), BORN D, AMOUNT N(12,2), NOTE M\"   convert: column types of a CSV source\n"
    "  --index NAME=EXPR        convert: make the new table with this index (repeatable); NAME is a tag\n"
    "                           of the table's MDX or CDX file, or a path ending in .ndx or .idx\n"
    "  --unique-index NAME=EXPR convert: the same, for an index without duplicates\n"
    "  --index-form plain       convert: IDX files without compact keys (default compact)\n"
    "  --index NAME             keys: the index to walk (a tag or an .ndx/.idx path)\n"
    "  --seek KEY               keys: start at the first key not less than KEY\n"
    "  --reverse                keys: walk backwards (NDX, IDX, CDX)\n"
    "  --no-progress            convert: no progress line on a terminal\n"
    "  --help                   this text\n";

struct Args {
  std::string command;
  std::vector<std::string> files;
  SourceOptions source;
  OutputFormat format = OutputFormat::kCsv;
  ConvertOptions convert;
  KeysOptions keys;
  // --codepage, --from-codepage, --to-codepage; kCodePageUnset when not given
  int codepage = kCodePageUnset, from_codepage = kCodePageUnset, to_codepage = kCodePageUnset;
};

int Usage(const std::string& message) {
  fprintf(stderr, "zqdb: %s (zqdb --help shows the usage)\n", message.c_str());
  return kExitUsage;
}

void PrintUsage(FILE* out);

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
    if (a == "--help" || a == "-h") {
      PrintUsage(stdout);
      exit(0);
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
    } else if (a == "--memo") {
      std::string v;
      if (!take(&v)) return Usage("--memo needs a value");
      if (v == "never") args->source.memo_policy = 0;
      else if (v == "errors") args->source.memo_policy = 1;
      else if (v == "always") args->source.memo_policy = 2;
      else return Usage("--memo takes never, errors or always, not " + v);
    } else if (a == "--format") {
      std::string v;
      if (!take(&v)) return Usage("--format needs a value");
      if (!ParseFormat(v, &args->format)) return Usage("--format takes csv, jsonl or table, not " + v);
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
      size_t start = 0;
      while (start <= v.size()) {
        size_t comma = v.find(',', start);
        std::string part = v.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
        if (part.empty()) return Usage("--key has an empty field name");
        args->convert.key.push_back(part);
        if (comma == std::string::npos) break;
        start = comma + 1;
      }
    } else if (a == "--schema") {
      if (!take(&args->convert.read.schema)) return Usage("--schema needs a value");
    } else if (a == "--index" || a == "--unique-index") {
      std::string v;
      if (!take(&v) || v.empty()) return Usage(a + " needs a value");
      size_t at = v.find('=');
      if (at == std::string::npos && a == "--index") {
        args->keys.index = v;
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
    } else if (a == "--no-progress") {
      args->convert.progress = false;
    } else if (a.rfind("--", 0) == 0 && a.size() > 2) {
      return Usage("unknown option " + a);
    } else if (args->command.empty()) {
      args->command = a;
    } else {
      args->files.push_back(a);
    }
  }
  if (args->command.empty()) {
    PrintUsage(stderr);
    return kExitUsage;
  }
  args->source.codepage = args->from_codepage != kCodePageUnset ? args->from_codepage : args->codepage;
  return 0;
}

// Opens the one table of `info` and `cat`.
int OpenOrFail(const Args& args, SourcePtr* spoke, CodePageChoice* chosen = nullptr) {
  std::string error;
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

// The facts a spoke reports, as name and value.
std::vector<std::pair<std::string, std::string>> Facts(const ZQSpoke* spoke) {
  ZQString text;
  spoke->ReportFacts(text);
  std::vector<std::pair<std::string, std::string>> facts;
  std::string all(text.c_str(), size_t(text.length()));
  size_t start = 0;
  while (start < all.size()) {
    size_t nl = all.find('\n', start);
    std::string line = all.substr(start, nl == std::string::npos ? std::string::npos : nl - start);
    size_t colon = line.find(": ");
    if (colon != std::string::npos) facts.emplace_back(line.substr(0, colon), line.substr(colon + 2));
    if (nl == std::string::npos) break;
    start = nl + 1;
  }
  return facts;
}

int CmdInfo(const Args& args) {
  if (args.files.size() != 1) return Usage("info takes one table");
  SourcePtr spoke;
  CodePageChoice codepage;
  if (int rc = OpenOrFail(args, &spoke, &codepage)) return rc;
  auto facts = Facts(spoke.get());
  auto fact = [&](const char* name) {
    for (const auto& f : facts)
      if (f.first == name) return f.second;
    return std::string("?");
  };
  std::vector<std::string> descriptors;
  for (const auto& f : facts)
    if (f.first == "field") descriptors.push_back(f.second);
  ZQString dialect;
  spoke->GetOption("version", dialect);
  int d = atoi(dialect.c_str());
  int64_t live = 0;
  BATCHERR rc;
  while ((rc = spoke->GetRecord(int32_t(live))) == 0) ++live;
  if (rc != ZQ_END) return Fail(spoke->LastErrorMessage());
  printf("table:       %s\n", args.files[0].c_str());
  printf("dialect:     %d (%s)\n", d, DialectName(d));
  printf("version:     %s\n", fact("version").c_str());
  printf("records:     %s in the header, %lld live\n", fact("records").c_str(), static_cast<long long>(live));
  printf("layout:      header %s bytes, record %s bytes\n", fact("header").c_str(), fact("record").c_str());
  printf("memo:        %s\n", fact("memo").c_str());
  printf("code page:   %s\n", CodePageLine(codepage).c_str());
  ZQRecord* layout = spoke->GetLayout(0);
  printf("fields:      %d\n", layout->FieldCount());
  printf("  %-4s %-11s %-4s %5s %4s\n", "#", "name", "type", "width", "dec");
  for (int i = 0; i < layout->FieldCount(); ++i) {
    const ZQField* f = (*layout)[i];
    std::string type = "?", width = std::to_string(f->Length()), dec = std::to_string(f->DecLen());
    if (size_t(i) < descriptors.size()) {
      // name, letter, width, decimals, separated by tabs
      const std::string& x = descriptors[size_t(i)];
      size_t a = x.rfind('\t');
      size_t b = a == std::string::npos ? a : x.rfind('\t', a - 1);
      size_t c = b == std::string::npos || b == 0 ? std::string::npos : x.rfind('\t', b - 1);
      if (c != std::string::npos) {
        type = x.substr(c + 1, b - c - 1);
        width = x.substr(b + 1, a - b - 1);
        dec = x.substr(a + 1);
      }
    }
    printf("  %-4d %-11s %-4s %5s %4s\n", i + 1, f->Name(), type.c_str(), width.c_str(), dec.c_str());
  }
  // name, expression, key type, unique or not, file; separated by tabs
  std::vector<std::vector<std::string>> indexes;
  for (const auto& f : facts) {
    if (f.first != "index") continue;
    std::vector<std::string> parts;
    size_t start = 0;
    for (size_t tab; (tab = f.second.find('\t', start)) != std::string::npos; start = tab + 1)
      parts.push_back(f.second.substr(start, tab - start));
    parts.push_back(f.second.substr(start));
    if (parts.size() == 5) indexes.push_back(parts);
  }
  printf("indexes:     %zu\n", indexes.size());
  if (!indexes.empty()) printf("  %-11s %-4s %-10s %-30s %s\n", "name", "type", "duplicates", "expression", "file");
  for (const auto& x : indexes)
    printf("  %-11s %-4s %-10s %-30s %s\n", x[0].c_str(), x[2].c_str(), x[3] == "unique" ? "no" : "yes",
           x[1].c_str(), x[4].c_str());
  spoke->ConnectionClose();
  return 0;
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

int CmdCat(const Args& args) {
  if (args.files.size() != 1) return Usage("cat takes one table");
  SourcePtr spoke;
  if (int rc = OpenOrFail(args, &spoke)) return rc;
  OutBuf out(STDOUT_FILENO);
  std::unique_ptr<RecordWriter> writer = MakeWriter(args.format, out);
  ZQRecord& record = *spoke->GetLayout(0);
  TableReadFix fix(spoke.get());
  writer->Begin(record);
  BATCHERR rc;
  int32_t n = 0;
  while ((rc = spoke->GetRecord(n)) == 0) {
    fix.Apply(record);
    writer->Row(record);
    if (++n == INT32_MAX) break;
  }
  writer->End();
  bool written = out.Flush();
  std::string message = rc != ZQ_END ? spoke->LastErrorMessage() : "";
  spoke->ConnectionClose();
  if (!message.empty()) return Fail(message);
  if (!written) return Fail("cannot write the output");
  return 0;
}

int CmdKeys(const Args& args) {
  if (args.files.size() != 1) return Usage("keys takes one table");
  if (args.keys.index.empty()) return Usage("keys needs --index NAME");
  if (!args.convert.write.table.indexes.empty()) return Usage("keys takes --index NAME, without =EXPR");
  if (args.format == OutputFormat::kTable) return Usage("keys writes csv or jsonl");
  SourcePtr spoke;
  if (int rc = OpenOrFail(args, &spoke)) return rc;
  KeysOptions opts = args.keys;
  opts.jsonl = args.format == OutputFormat::kJsonl;
  int rc = WriteKeys(spoke.get(), opts);
  spoke->ConnectionClose();
  return rc;
}

int CmdConvert(const Args& args) {
  if (args.files.size() != 2) return Usage("convert takes a source and a target");
  if (!args.keys.index.empty()) return Usage("--index takes NAME=EXPR, not " + args.keys.index);
  if (args.keys.has_seek || args.keys.reverse) return Usage("--seek and --reverse go with keys");
  if (args.convert.write.mode != 2 && !args.convert.key.empty()) return Usage("--key goes with --mode update");
  if (IsForeignTargetName(args.files[1]))
    return Usage("zqdb writes tables, CSV and JSON-lines files, not " + args.files[1] +
                 " (name it .dbf, .csv or .jsonl, or - for standard output)");
  if (args.files[1] == "-" && args.format == OutputFormat::kTable) return Usage("convert writes csv or jsonl to -");
  if (args.files[1] == "-" && !args.convert.write.table.dialect.empty())
    return Usage("a table can't be written to standard output (--to goes with a table target)");
  ConvertOptions opts = args.convert;
  opts.stdout_jsonl = args.format == OutputFormat::kJsonl;
  opts.read.table = args.source;
  opts.write.table.type = args.source.type;
  opts.write.table.codepage = args.to_codepage != kCodePageUnset ? args.to_codepage : args.codepage;
  opts.write.table.memo_policy = args.source.memo_policy;
  return RunConvert(args.files[0], args.files[1], opts);
}

// The commands. A new one is a function and a row.
struct Command {
  const char* name;
  const char* synopsis;  // its line in the usage: synopsis, then summary
  const char* summary;
  int (*run)(const Args& args);
  bool reads_tables;     // the module scan's warnings, and the dialect names, first
};

const Command kCommands[] = {
    {"info", "info TABLE", "dialect, version byte, record counts and fields", CmdInfo, true},
    {"cat", "cat TABLE", "the live records (--format csv|jsonl|table)", CmdCat, true},
    {"convert", "convert SRC DST", "records from a table or CSV file to a table, CSV or JSON-lines file", CmdConvert,
     true},
    {"keys", "keys TABLE --index NAME", "the keys of an index in key order, with their record numbers", CmdKeys,
     true},
    {"formats", "formats", "the connector definitions of the modules found", CmdFormats, false},
};

const Command* FindCommand(const std::string& name) {
  for (const Command& c : kCommands)
    if (name == c.name) return &c;
  return nullptr;
}

void PrintUsage(FILE* out) {
  fputs("usage: zqdb COMMAND [options] FILE...\n\ncommands:\n", out);
  for (const Command& c : kCommands) fprintf(out, "  %-25s%s\n", c.synopsis, c.summary);
  fputs(kOptionsUsage, out);
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
  const Command* command = FindCommand(args.command);
  // An unknown command is told after those checks, as it always was.
  if (command == nullptr || command->reads_tables)
    if (int rc = CheckTableOptions(args)) return rc;
  if (command == nullptr) return Usage("unknown command " + args.command);
  return command->run(args);
}
