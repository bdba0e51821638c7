#include "engine/dbf_source.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <climits>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "engine/endpoints.h"
#include "engine/raw_table.h"
#include "engine/report.h"
#include "engine/text_types.h"
#include "host/zqutil.h"

namespace {

std::string Lower(const std::string& s) {
  std::string out = s;
  for (char& c : out) c = char(tolower(static_cast<unsigned char>(c)));
  return out;
}

std::string Utf8(const wchar* w) {
  ZQString s;
  FormatMessage(s, u"%s", w);
  return std::string(s.c_str(), size_t(s.length()));
}

// A memo column of a type the dialect doesn't list (a FoxPro G field of a
// table read as dBASE IV, a dBASE B field) reads as plain text, which would
// lose what it is on the way out. Such columns get the engine's own memo or
// binary type, by the letter of their descriptor.
void TypeMemoColumns(ZQImport* spoke) {
  ZQRecord& layout = *spoke->GetLayout(0);
  bool any = false;
  for (int i = 0; i < layout.FieldCount(); ++i) any = any || layout[i]->DataType().Usage() == 0;
  if (!any) return;
  ZQString facts;
  spoke->ReportFacts(facts);
  std::string all(facts.c_str(), size_t(facts.length()));
  int i = 0;
  for (size_t at = 0; (at = all.find("field: ", at)) != std::string::npos && i < layout.FieldCount(); ++i) {
    size_t tab = all.find('\t', at);
    char letter = tab != std::string::npos && tab + 1 < all.size() ? all[tab + 1] : 0;
    at = tab;
    ZQField* f = layout[i];
    if (f->DataType().Usage() != 0 || (letter != 'G' && letter != 'B' && letter != 'M')) continue;
    ZQDType t = letter == 'M' ? TextTypes::Get().memo : TextTypes::Get().binary;
    t.Length(f->Length());
    f->DataType(t);
  }
}

}  // namespace

bool ApplyDialect(ZQSpoke* spoke, const std::string& value) {
  const ZQOptionDef* def = spoke->FindOptionDef("version");
  if (def == nullptr) return false;
  bool digits = !value.empty();
  for (char c : value) digits = digits && isdigit(static_cast<unsigned char>(c));
  if (digits) {
    int n = atoi(value.c_str());
    if (value.size() > 2 || n > 10) return false;
    return spoke->SetOption("version", value.c_str()) == 0;
  }
  // The option's own value table: display names, case-blind.
  std::string want = Lower(value);
  for (int i = 0; i < def->ValueCount(); ++i) {
    const OptionValueDef& v = def->Values()[i];
    if (Lower(Utf8(v.display)) == want) return spoke->SetOption("version", v.value) == 0;
  }
  // Other products' names are accepted by the saved text form. Dialect 5 has
  // no name, so it marks "nothing matched".
  spoke->SetOption("version", "5");
  ZQString text;
  text += "version= ";
  text += value.c_str();
  text += "\n";
  spoke->LoadOptions(text);
  ZQString now;
  spoke->GetOption("version", now);
  if (atoi(now.c_str()) == 5) {
    spoke->SetOption("version", "2");
    return false;
  }
  return true;
}

bool HasSibling(const std::string& path, const std::string& ext) {
  std::string base = path;
  size_t dot = base.rfind('.');
  if (dot != std::string::npos && base.find('/', dot) == std::string::npos) base.resize(dot);
  std::string upper = ext;
  for (char& c : upper) c = char(toupper(static_cast<unsigned char>(c)));
  return access((base + "." + ext).c_str(), F_OK) == 0 || access((base + "." + upper).c_str(), F_OK) == 0;
}

int GuessDialect(const std::string& path) {
  FILE* f = fopen(path.c_str(), "rb");
  int v = f ? fgetc(f) : EOF;
  if (f) fclose(f);
  if (v >= 0 && (v & 0x8F) == 0x8B) {
    // dBASE IV's byte with a memo file: Enable OA writes the same byte with
    // a dBASE III memo file, whose header has no dBASE IV version word.
    std::string base = path;
    size_t dot = base.rfind('.');
    if (dot != std::string::npos && base.find('/', dot) == std::string::npos) base.resize(dot);
    for (const char* ext : {".dbt", ".DBT"}) {
      FILE* m = fopen((base + ext).c_str(), "rb");
      if (m == nullptr) continue;
      unsigned char h[20], b[4];
      bool dbase4 = fread(h, 1, sizeof h, m) == sizeof h && h[19] == 0x01 && (h[18] == 0x01 || h[18] == 0x02);
      // Some writers leave the version word out; their memo blocks still
      // start as dBASE IV's do (FF FF, then the text offset 8).
      if (!dbase4 && fseek(m, 512, SEEK_SET) == 0 && fread(b, 1, 4, m) == 4)
        dbase4 = b[0] == 0xFF && b[1] == 0xFF && b[2] == 0x08 && b[3] == 0x00;
      fclose(m);
      return dbase4 ? 2 : 7;
    }
  }
  if (v == 0x03 && HasSibling(path, "cdx") && !HasSibling(path, "mdx")) {
    // FoxPro writes 0x03 too when a table has no memo field; its CDX of the
    // same name beside it tells it from a dBASE table.
    return 6;
  }
  switch (v) {
    case 0x02: return 0;  // dBASE II (Enable's narrow tables read the same)
    case 0xFE: return 3;  // Enable with more than 32 fields
    case 0x30: return 10; // Visual FoxPro
    default: return 2;    // dBASE IV reads III, III+, IV and, by their bytes, FoxPro and Clipper
  }
}

bool ReadTableHeader(const std::string& path, TableHeader* out) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return false;
  struct stat st;
  ssize_t n = fstat(fd, &st) == 0 && S_ISREG(st.st_mode) ? read(fd, out->bytes, sizeof out->bytes) : -1;
  close(fd);
  if (n < 0) return false;
  out->size = n;
  out->file_size = int64_t(st.st_size);
  return true;
}

namespace {

}  // namespace

bool KnownVersionByte(uint8_t v) {
  switch (v) {
    case 0x02: case 0x03: case 0x04: case 0x05: case 0x30: case 0x31: case 0x32: case 0x43: case 0x63:
    case 0x7B: case 0x83: case 0x8B: case 0x8E: case 0xB3: case 0xCB: case 0xE5: case 0xF5: case 0xFB:
    case 0xFE:
      return true;
    default:
      return false;
  }
}

namespace {

// Why a table could not be opened, as the operating system or the first
// bytes tell it; "" when neither tells anything.
std::string WhyNotOpened(const std::string& path) {
  struct stat st;
  if (stat(path.c_str(), &st) != 0) return strerror(errno);
  if (S_ISDIR(st.st_mode)) return "is a directory";
  if (!S_ISREG(st.st_mode)) return "not a regular file";
  if (access(path.c_str(), R_OK) != 0) return strerror(errno);
  if (st.st_size == 0) return "empty file";
  TableHeader h;
  if (!ReadTableHeader(path, &h)) return strerror(errno);
  char buf[96];
  if (!KnownVersionByte(h.bytes[0])) {
    snprintf(buf, sizeof buf, "not a table (version byte 0x%02X)", unsigned(h.bytes[0]));
    return buf;
  }
  if (h.size < int64_t(sizeof h.bytes)) {
    snprintf(buf, sizeof buf, "too short for a table header (%lld bytes)", static_cast<long long>(h.size));
    return buf;
  }
  uint32_t header_len = uint32_t(h.bytes[8] | h.bytes[9] << 8);
  if (h.bytes[0] != 0x02 && header_len > h.file_size) {
    snprintf(buf, sizeof buf, "cut short: the header says %u bytes, the file has %lld", unsigned(header_len),
             static_cast<long long>(h.file_size));
    return buf;
  }
  return "";
}

// The memo file of a table: the first of its base name with a memo
// extension that exists, else the .dbt name.
std::string MemoFileOf(const std::string& path) {
  std::string base = path;
  size_t dot = base.rfind('.');
  if (dot != std::string::npos && base.find('/', dot) == std::string::npos) base.resize(dot);
  for (const char* ext : {".dbt", ".DBT", ".fpt", ".FPT", ".smt", ".SMT"})
    if (access((base + ext).c_str(), F_OK) == 0) return base + ext;
  return base + ".dbt";
}

bool StartsWith(const std::string& s, const char* prefix) { return s.rfind(prefix, 0) == 0; }

}  // namespace

std::string ExplainTableError(const std::string& path, const std::string& message) {
  if (StartsWith(message, "Error opening data file")) {
    std::string why = WhyNotOpened(path);
    return why.empty() ? message : message + ": " + why;
  }
  if (StartsWith(message, "Could not open memo file") || StartsWith(message, "Memo problem")) {
    std::string memo, kind;
    std::string why = MemoFileTrouble(path, &memo, &kind);
    if (memo.empty()) memo = MemoFileOf(path);
    return message + " (" + memo + (kind.empty() ? "" : ", a " + kind + " memo file") + (why.empty() ? "" : ": " + why) +
           ")";
  }
  return message;
}

const char* DialectName(int dialect) {
  static const char* const kNames[] = {"dBASE II", "dBASE III+", "dBASE IV", "Enable", "dBASE III", "(no name)",
                                       "FoxPro", "Enable OA (Database)", "Clipper", "Visual dBASE 5.5",
                                       "Visual FoxPro"};
  return dialect >= 0 && dialect <= 10 ? kNames[dialect] : "?";
}

namespace {

// How many field descriptors a dialect reads at most; 0 for the narrow
// headers, whose room holds no more than the dialect reads.
int FieldsAtOpen(int dialect) {
  switch (dialect) {
    case 0: case 3: return 0;
    case 2: case 6: case 10: return 256;
    case 8: return 1000;
    case 9: return 1024;
    default: return 128;
  }
}

// The field descriptors of a wide header: 32 bytes each from offset 32 up to
// the 0x0D that ends them, within the header length and the file. The
// version byte goes to `version`. -1 for a file too short to tell.
int CountDescriptors(const std::string& path, int* version) {
  FILE* f = fopen(path.c_str(), "rb");
  if (f == nullptr) return -1;
  unsigned char h[32];
  int count = -1;
  if (fread(h, 1, sizeof h, f) == sizeof h) {
    *version = h[0];
    size_t header = size_t(h[8]) | size_t(h[9]) << 8;
    count = 0;
    unsigned char d[32];
    for (size_t at = 32; at + 32 <= header && fread(d, 1, 32, f) == 32 && d[0] != 0x0D; at += 32) ++count;
  }
  fclose(f);
  return count;
}

// Visual dBASE 5.5 reads the version bytes of dBASE III and IV with up to
// 1024 fields.
bool ReadsAllFields(int version, int count) { return (version & 7) == 3 && count <= FieldsAtOpen(9); }

// A table with more field descriptors than its dialect reads would lose the
// fields behind the limit. Without a dialect named by the user, the table
// is read as Visual dBASE 5.5 (1024 fields, the same version bytes and
// memo files as dBASE III and IV); with one, a warning counts what is left
// out.
void HoldAllFields(ZQSpoke* spoke, const std::string& path, bool chosen_by_user) {
  int version = 0, count = CountDescriptors(path, &version);
  ZQString v;
  spoke->GetOption("version", v);
  int dialect = atoi(v.c_str());
  if (version == 0xF5 && dialect != 10) dialect = 6;  // the byte decides these two
  if (version == 0xE5 && dialect != 10) dialect = 8;
  int limit = FieldsAtOpen(dialect);
  if (count < 0 || limit == 0 || count <= limit) return;
  std::string has = path + " has " + std::to_string(count) + " fields, more than " + DialectName(dialect) +
                    " reads (" + std::to_string(limit) + ")";
  if (!chosen_by_user && ReadsAllFields(version, count)) {
    spoke->SetOption("version", "9");
    Warn(has + ": read as Visual dBASE 5.5");
    return;
  }
  Warn(has + ": the last " + std::to_string(count - limit) + " are left out");
}

// Under --memo errors the module leaves a memo it can't read blank without
// a word: when the memo file was refused, every memo of the table; when it
// opened, a memo whose block lies beyond the 32-bit offsets the file is
// read by. zqdb reads the pointers itself and says once how many memos are
// left blank and why. A table is read more than once by some runs: one line
// for each table.
void WarnBlankMemos(const std::string& path, const ZQSpoke* spoke) {
  static std::vector<std::string> told;
  for (const std::string& t : told)
    if (t == path) return;
  auto facts = SpokeFacts(spoke);
  const std::string memo_fact = SpokeFact(facts, "memo");
  if (memo_fact.empty() || memo_fact == "none") return;
  const bool refused = atoi(SpokeFact(facts, "memo block").c_str()) == 0;
  const int64_t block_size = refused ? 0 : atoll(SpokeFact(facts, "memo block").c_str());
  const bool smt = SpokeFact(facts, "memo kind") == "Clipper SMT";
  const bool vfp = SpokeFact(facts, "version") == "0x30" || SpokeFact(facts, "version") == "0x31" ||
                   SpokeFact(facts, "version") == "0xB0";
  const int64_t hdrlen = atoll(SpokeFact(facts, "header").c_str());
  const int64_t reclen = atoll(SpokeFact(facts, "record").c_str());
  const int64_t count = atoll(SpokeFact(facts, "records").c_str());
  std::vector<RawField> memos;
  for (const RawField& f : RawFieldsOf(facts))
    if ((f.type == 'M' || f.type == 'G' || (f.type == 'B' && !vfp)) && f.offset + f.width < reclen) memos.push_back(f);
  if (memos.empty() || reclen <= 0) return;
  FILE* table = fopen(path.c_str(), "rb");
  if (table == nullptr) return;
  std::vector<char> rec(static_cast<size_t>(reclen));
  int64_t blank = 0, first_record = 0;
  std::string first_field;
  if (fseeko(table, hdrlen, SEEK_SET) == 0) {
    for (int64_t r = 0; r < count && fread(rec.data(), 1, rec.size(), table) == rec.size(); ++r) {
      if (rec[0] != ' ') continue;  // deleted records are not read
      for (const RawField& f : memos) {
        int64_t length, block = MemoBlockOf(rec.data() + 1 + f.offset, f.width, vfp, smt, &length);
        if (block <= 0 || (smt && length == 0)) continue;
        if (!refused && block * block_size <= INT32_MAX) continue;
        if (blank++ == 0) first_record = r + 1, first_field = f.name;
      }
    }
  }
  fclose(table);
  told.push_back(path);
  if (blank == 0) return;
  std::string memo, kind, why = MemoFileTrouble(path, &memo, &kind);
  std::string line = std::to_string(blank) + (blank == 1 ? " memo was" : " memos were") +
                     " left blank under --memo errors (the first: record " + std::to_string(first_record) + ", " +
                     first_field + "): ";
  if (refused)
    line += memo + ", a " + kind + " memo file, could not be read" + (why.empty() ? "" : ": " + why);
  else
    line += "their blocks lie beyond the 2 GiB that " + SpokeFact(facts, "memo file") + " can be read to";
  Warn(line);
}

}  // namespace

int TableDialect(const std::string& path) {
  int dialect = GuessDialect(path), version = 0, count = CountDescriptors(path, &version);
  int limit = FieldsAtOpen(dialect);
  return limit > 0 && count > limit && ReadsAllFields(version, count) ? 9 : dialect;
}

bool ResolveConnector(const std::string& type, TableConnector* out, std::string* error) {
  ModuleRegistry& r = ModuleRegistry::Get();
  const ConnectorDef* def = type.empty() ? r.Default() : r.ByShortName(type);
  if (def == nullptr) {
    if (!type.empty() && !r.Definitions().empty()) {
      *error = "no connector definition named " + type + " (zqdb formats lists them)";
    } else {
      *error = "no connector module found; looked in";
      for (const std::string& d : ModuleRegistry::SearchPath()) *error += " " + d;
    }
    return false;
  }
  if (!r.Load(*def, &out->factories, error)) return false;
  out->def = def;
  out->spoke_def.key = def->key.c_str();
  out->spoke_def.display_name = def->display.c_str();
  out->spoke_def.short_name = def->short_name.c_str();
  out->spoke_def.option_text = def->option_text.c_str();
  return true;
}

SourcePtr NewTableSource(const TableConnector& c) {
  SourcePtr p(c.factories.NewSource(c.spoke_def), SourceDeleter{c.factories.delete_source, c.factories.fns[1]});
  if (p) ApplyOptionText(p.get(), c.def->option_text);
  return p;
}

TargetPtr NewTableTarget(const TableConnector& c) {
  TargetPtr p(c.factories.NewTarget(c.spoke_def), TargetDeleter{c.factories.delete_target, c.factories.fns[3]});
  if (p) ApplyOptionText(p.get(), c.def->option_text);
  return p;
}

void ApplyOptionText(ZQSpoke* spoke, const std::string& text) {
  size_t eq = text.find('=');
  if (eq == std::string::npos) return;
  spoke->SetOption(text.substr(0, eq).c_str(), text.substr(eq + 1).c_str());
}

int64_t FactNumber(const std::string& all, const char* name) {
  std::string key = std::string(name) + ": ";
  for (size_t at = 0; at < all.size();) {
    if (all.compare(at, key.size(), key) == 0) return strtoll(all.c_str() + at + key.size(), nullptr, 10);
    size_t nl = all.find('\n', at);
    if (nl == std::string::npos) break;
    at = nl + 1;
  }
  return -1;
}

void WarnOutOfReach(const std::string& path, const ZQSpoke* spoke) {
  // Record positions are 32-bit offsets, the file format's own limit: a
  // record that ends past 2 GiB can't be read.
  ZQString text;
  spoke->ReportFacts(text);
  std::string facts(text.c_str(), size_t(text.length()));
  int64_t count = FactNumber(facts, "records"), header = FactNumber(facts, "header"),
          record = FactNumber(facts, "record");
  if (count <= 0 || header < 0 || record <= 0 || header + count * record <= INT32_MAX) return;
  int64_t reachable = header > INT32_MAX ? 0 : (int64_t{INT32_MAX} - header) / record;
  Warn(path + ": " + std::to_string(count - reachable) + " of its " + std::to_string(count) +
       " records lie past 2 GiB, beyond the 32-bit record positions of the format, and can't be read");
}

BATCHERR OpenSource(const std::string& path, const SourceOptions& opts, SourcePtr* out, std::string* error,
                    CodePageChoice* chosen) {
  TableConnector c;
  if (!ResolveConnector(opts.type, &c, error)) return ZQ_OPEN_ERROR;
  SourcePtr spoke = NewTableSource(c);
  if (!spoke) {
    *error = "out of memory";
    return ZQ_NO_MEMORY;
  }
  if (!opts.dialect.empty()) {
    if (!ApplyDialect(spoke.get(), opts.dialect)) {
      *error = "unknown dialect: " + opts.dialect;
      return ZQ_BAD_OPTIONS;
    }
  } else if (c.def->option_text.empty()) {
    // Neither a dialect nor a definition that names one: take the dialect
    // the version byte points to, so that any table reads without the user
    // knowing its dialect.
    char guess[4];
    snprintf(guess, sizeof guess, "%d", GuessDialect(path));
    spoke->SetOption("version", guess);
  }
  HoldAllFields(spoke.get(), path, !opts.dialect.empty() || !c.def->option_text.empty());
  char buf[16];
  CodePageChoice choice = ChooseCodePage(path, opts.codepage);
  if (chosen != nullptr) *chosen = choice;
  snprintf(buf, sizeof buf, "%d", ModuleCodePage(choice.codepage));
  spoke->SetOption("codepage", buf);
  snprintf(buf, sizeof buf, "%d", opts.memo_policy);
  spoke->SetOption("ignorememoerr", buf);
  ZQConnTarget target;
  target.path = path.c_str();
  BATCHERR rc = spoke->SetUserInfo(target);
  if (rc == 0) rc = spoke->MakeFields();
  if (rc != 0) {
    const char* message = spoke->LastErrorMessage();
    *error = message[0] ? ExplainTableError(path, message) : "cannot open " + path;
    spoke->ConnectionClose();
    return rc;
  }
  TypeMemoColumns(spoke.get());
  WarnOutOfReach(path, spoke.get());
  if (opts.memo_policy == 1) WarnBlankMemos(path, spoke.get());
  *out = std::move(spoke);
  return 0;
}

bool OpenTableSource(const std::string& path, const ReadOptions& opts, SourcePtr* out, std::string* error) {
  return OpenSource(path, opts.table, out, error) == 0;
}

std::vector<std::pair<std::string, std::string>> SpokeFacts(const ZQSpoke* spoke) {
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

std::string SpokeFact(const std::vector<std::pair<std::string, std::string>>& facts, const char* name) {
  for (const auto& f : facts)
    if (f.first == name) return f.second;
  return "";
}
