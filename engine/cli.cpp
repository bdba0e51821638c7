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
#include "engine/dbfpeek.h"
#include "engine/outbuf.h"
#include "engine/writers.h"
#include "host/zqglob.h"
#include "host/zqutil.h"
#include "table/memo.h"

namespace {

constexpr int kExitError = 1;
constexpr int kExitUsage = 2;

const char kUsage[] =
    "usage: zqdb COMMAND [options] FILE...\n"
    "\n"
    "commands:\n"
    "  info TABLE               dialect, version byte, record counts and fields\n"
    "  cat TABLE                the live records (--format csv|jsonl|table)\n"
    "  convert SRC DST          records from a table or CSV file to a table, CSV or JSON-lines file\n"
    "\n"
    "options (before or after the file names):\n"
    "  --dialect D              0-10 or a name: \"dBASE IV\", foxpro, clipper, ...\n"
    "  --codepage N             the table's code page (437, 850, 1252, ...); 0 = bytes as they are\n"
    "  --memo never|errors|always   when to ignore the memo file (default never)\n"
    "  --format csv|jsonl|table output of cat (default csv)\n"
    "  --to D                   convert: the target's dialect (default: the source's; dBASE IV for CSV)\n"
    "  --mode replace|append|update   convert: make the target anew, add to it, or update it by --key\n"
    "  --key FIELD[,FIELD]      convert --mode update: the fields that identify a record\n"
    "  --schema \"NAME C(30), BORN D, AMOUNT N(12,2), NOTE M\"   convert: column types of a CSV source\n"
    "  --no-progress            convert: no progress line on a terminal\n"
    "  --help                   this text\n";

struct Args {
  std::string command;
  std::vector<std::string> files;
  SourceOptions source;
  OutputFormat format = OutputFormat::kCsv;
  ConvertOptions convert;
};

int Usage(const std::string& message) {
  fprintf(stderr, "zqdb: %s (zqdb --help shows the usage)\n", message.c_str());
  return kExitUsage;
}

int Fail(const std::string& message) {
  fprintf(stderr, "zqdb: %s\n", message.c_str());
  return kExitError;
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
    if (a == "--help" || a == "-h") {
      fputs(kUsage, stdout);
      exit(0);
    } else if (a == "--dialect") {
      if (!take(&args->source.dialect) || args->source.dialect.empty()) return Usage("--dialect needs a value");
      SourcePtr probe(NewFromDbase(ZQSpokeDef{}));
      if (!probe || !ApplyDialect(probe.get(), args->source.dialect))
        return Usage("unknown dialect: " + args->source.dialect);
    } else if (a == "--codepage") {
      std::string v;
      if (!take(&v)) return Usage("--codepage needs a value");
      char* end = nullptr;
      long cp = strtol(v.c_str(), &end, 10);
      if (v.empty() || *end != '\0' || cp < 0 || cp > 99999 || !ZQGlob::CodePageSupported(int(cp)))
        return Usage("unknown code page: " + v);
      args->source.codepage = int(cp);
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
      if (!take(&args->convert.to) || args->convert.to.empty()) return Usage("--to needs a value");
      SourcePtr probe(NewFromDbase(ZQSpokeDef{}));
      if (!probe || !ApplyDialect(probe.get(), args->convert.to)) return Usage("unknown dialect: " + args->convert.to);
    } else if (a == "--mode") {
      std::string v;
      if (!take(&v)) return Usage("--mode needs a value");
      if (v == "replace") args->convert.mode = 0;
      else if (v == "append") args->convert.mode = 1;
      else if (v == "update") args->convert.mode = 2;
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
      if (!take(&args->convert.schema)) return Usage("--schema needs a value");
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
    fputs(kUsage, stderr);
    return kExitUsage;
  }
  return 0;
}

int OpenOrFail(const Args& args, SourcePtr* spoke) {
  std::string error;
  if (OpenSource(args.files[0], args.source, spoke, &error) != 0) return Fail(error);
  return 0;
}

const char* DialectName(int dialect) {
  static const char* const kNames[] = {"dBASE II", "dBASE III+", "dBASE IV", "Enable", "dBASE III", "(no name)",
                                       "FoxPro", "Enable OA (Database)", "Clipper", "Visual dBASE 5.5",
                                       "Visual FoxPro"};
  return dialect >= 0 && dialect <= 10 ? kNames[dialect] : "?";
}

// The memo file line of `info`: its name, kind and block size.
void PrintMemo(const std::string& path, ZQFromDbase* spoke) {
  const ZQDBFILE* t = spoke->TableHandle();
  if (t == nullptr || !t->hasmemo) {
    printf("memo:        none\n");
    return;
  }
  const char* kind = "?";
  const char* ext = "dbt";
  switch (t->memokind) {
    case MEMO_DB3: kind = "dBASE III"; break;
    case MEMO_DB4: kind = "dBASE IV"; break;
    case MEMO_DB4FREE: kind = "dBASE IV, with a free-block chain"; break;
    case MEMO_FPT: kind = "FoxPro", ext = "fpt"; break;
    case MEMO_SMT: kind = "Clipper SMT", ext = "smt"; break;
  }
  char name[4200];
  std::string upper = ext;
  for (char& c : upper) c = char(toupper(static_cast<unsigned char>(c)));
  if (!memopath(path.c_str(), ext, name, sizeof name) || access(name, F_OK) != 0)
    memopath(path.c_str(), upper.c_str(), name, sizeof name);
  if (t->memofailed)
    printf("memo:        %s (%s) could not be opened or was refused\n", name, kind);
  else
    printf("memo:        %s (%s, blocks of %u bytes%s)\n", name, kind, unsigned(t->memoblksize),
           t->memooff ? ", memos switched off in its header" : "");
}

int CmdInfo(const Args& args) {
  if (args.files.size() != 1) return Usage("info takes one table");
  SourcePtr spoke;
  if (int rc = OpenOrFail(args, &spoke)) return rc;
  TableFacts facts;
  PeekTable(args.files[0], &facts);
  ZQString dialect;
  spoke->GetOption("version", dialect);
  int d = atoi(dialect.c_str());
  int64_t header_count = spoke->EstimateRecordCount();
  int64_t live = 0;
  BATCHERR rc;
  while ((rc = spoke->GetRecord(int32_t(live))) == 0) ++live;
  if (rc != ZQ_END) return Fail(spoke->LastErrorMessage());
  printf("table:       %s\n", args.files[0].c_str());
  printf("dialect:     %d (%s)\n", d, DialectName(d));
  printf("version:     0x%02X\n", facts.version);
  printf("records:     %lld in the header, %lld live\n", static_cast<long long>(header_count),
         static_cast<long long>(live));
  printf("layout:      header %u bytes, record %u bytes\n", facts.header_length, facts.record_length);
  PrintMemo(args.files[0], spoke.get());
  ZQRecord* layout = spoke->GetLayout(0);
  printf("fields:      %d\n", layout->FieldCount());
  printf("  %-4s %-11s %-4s %5s %4s\n", "#", "name", "type", "width", "dec");
  for (int i = 0; i < layout->FieldCount(); ++i) {
    const ZQField* f = (*layout)[i];
    char type = '?';
    int width = f->Length(), dec = f->DecLen();
    if (size_t(i) < facts.fields.size()) {
      type = facts.fields[size_t(i)].type;
      width = facts.fields[size_t(i)].length;
      dec = facts.fields[size_t(i)].decimals;
    }
    printf("  %-4d %-11s %-4c %5d %4d\n", i + 1, f->Name(), type, width, dec);
  }
  spoke->ConnectionClose();
  return 0;
}

int CmdCat(const Args& args) {
  if (args.files.size() != 1) return Usage("cat takes one table");
  SourcePtr spoke;
  if (int rc = OpenOrFail(args, &spoke)) return rc;
  OutBuf out(STDOUT_FILENO);
  std::unique_ptr<RecordWriter> writer = MakeWriter(args.format, out);
  ZQRecord& record = *spoke->GetLayout(0);
  writer->Begin(record);
  BATCHERR rc;
  int32_t n = 0;
  while ((rc = spoke->GetRecord(n)) == 0) {
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

int CmdConvert(Args& args) {
  if (args.files.size() != 2) return Usage("convert takes a source and a target");
  if (args.convert.mode != 2 && !args.convert.key.empty()) return Usage("--key goes with --mode update");
  args.convert.source = args.source;
  return RunConvert(args.files[0], args.files[1], args.convert);
}

void QuietSink(void*, int, BATCHERR, const char*) {
  // Messages come back through the spokes' last error and are reported once
  // by the command that failed.
}

}  // namespace

int ZqdbMain(int argc, char** argv) {
  SetLogSink(QuietSink, nullptr);
  Args args;
  if (int rc = ParseArgs(argc, argv, &args)) return rc;
  if (args.command == "info") return CmdInfo(args);
  if (args.command == "cat") return CmdCat(args);
  if (args.command == "convert") return CmdConvert(args);
  return Usage("unknown command " + args.command);
}
