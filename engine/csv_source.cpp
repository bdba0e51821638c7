#include "engine/csv_source.h"

#include <strings.h>

#include <cctype>
#include <cstdlib>
#include <cstring>

#include "engine/endpoints.h"
#include "engine/text_types.h"
#include "host/bytescan.h"
#include "host/zqdate.h"
#include "host/zqglob.h"
#include "host/zqutil.h"

namespace {

constexpr int kLongestText = 255;  // longer text becomes a memo
constexpr int kMostDigits = 15;    // longer digit strings are codes, not numbers

std::string Trim(const std::string& s) {
  size_t a = 0, b = s.size();
  while (a < b && isspace(static_cast<unsigned char>(s[a]))) ++a;
  while (b > a && isspace(static_cast<unsigned char>(s[b - 1]))) --b;
  return s.substr(a, b - a);
}

// A number as CSV writes it: optional sign, digits, optional fraction.
// Counts the digits on either side of the point.
bool ParseNumber(const char* p, size_t n, int* int_digits, int* frac_digits, bool* negative) {
  size_t i = 0;
  *negative = false;
  if (i < n && (p[i] == '-' || p[i] == '+')) *negative = p[i++] == '-';
  size_t a = i;
  while (i < n && p[i] >= '0' && p[i] <= '9') ++i;
  *int_digits = int(i - a);
  *frac_digits = 0;
  if (i < n && p[i] == '.') {
    size_t b = ++i;
    while (i < n && p[i] >= '0' && p[i] <= '9') ++i;
    *frac_digits = int(i - b);
  }
  return i == n && *int_digits + *frac_digits > 0;
}

bool ParseIsoDate(const char* p, size_t n) {
  if (n != 10 || p[4] != '-' || p[7] != '-') return false;
  int v[8], k = 0;
  for (size_t i = 0; i < 10; ++i) {
    if (i == 4 || i == 7) continue;
    if (p[i] < '0' || p[i] > '9') return false;
    v[k++] = p[i] - '0';
  }
  return IsValidDate(v[0] * 1000 + v[1] * 100 + v[2] * 10 + v[3], v[4] * 10 + v[5], v[6] * 10 + v[7]);
}

bool ParseBool(const char* p, size_t n, bool* value) {
  static const char* const kTrue[] = {"t", "true", "y", "yes"};
  static const char* const kFalse[] = {"f", "false", "n", "no"};
  for (const char* w : kTrue)
    if (strlen(w) == n && strncasecmp(p, w, n) == 0) return *value = true, true;
  for (const char* w : kFalse)
    if (strlen(w) == n && strncasecmp(p, w, n) == 0) return *value = false, true;
  return false;
}

// "YYYY-MM-DDTHH:MM:SS" (or with a blank between date and time).
bool ParseDateTime(const char* p, size_t n, ZQDateTime* out) {
  if (n != 19 || !ParseIsoDate(p, 10) || (p[10] != 'T' && p[10] != ' ') || p[13] != ':' || p[16] != ':') return false;
  auto two = [&](size_t i) { return (p[i] - '0') * 10 + (p[i + 1] - '0'); };
  for (size_t i : {11, 12, 14, 15, 17, 18})
    if (p[i] < '0' || p[i] > '9') return false;
  int h = two(11), mi = two(14), s = two(17);
  if (h > 23 || mi > 59 || s > 59) return false;
  int y = atoi(std::string(p, 4).c_str());
  int32_t jdn = JulianDayFromDate(y, two(5), two(8));
  *out = ZQDateTime(jdn - kZQEpochJulianDay, h * 3600 + mi * 60 + s, 0);
  return true;
}

}  // namespace

bool ParseSchema(const std::string& text, std::vector<SchemaField>* out, std::string* error) {
  out->clear();
  size_t start = 0;
  while (start <= text.size()) {
    // Split on commas outside parentheses.
    size_t end = start;
    int depth = 0;
    while (end < text.size() && (text[end] != ',' || depth > 0)) {
      if (text[end] == '(') ++depth;
      if (text[end] == ')') --depth;
      ++end;
    }
    std::string item = Trim(text.substr(start, end - start));
    start = end + 1;
    if (item.empty()) {
      if (end >= text.size()) break;
      *error = "empty entry in the schema";
      return false;
    }
    size_t sp = item.find_first_of(" \t");
    if (sp == std::string::npos) {
      *error = "schema entry without a type: " + item;
      return false;
    }
    SchemaField f;
    f.name = item.substr(0, sp);
    std::string type = Trim(item.substr(sp));
    f.letter = char(toupper(static_cast<unsigned char>(type.empty() ? '?' : type[0])));
    f.length = 0;
    f.decimals = 0;
    std::string args = Trim(type.substr(1));
    if (!args.empty()) {
      int len = 0, dec = 0;
      char close = 0;
      int got = sscanf(args.c_str(), "(%d,%d%c", &len, &dec, &close);
      if (got != 3 || close != ')') {
        dec = 0;
        got = sscanf(args.c_str(), "(%d%c", &len, &close);
        if (got != 2 || close != ')') {
          *error = "bad width in the schema: " + item;
          return false;
        }
      }
      f.length = len;
      f.decimals = dec;
    }
    static const char kLetters[] = "CNFDLMIYBT";
    if (strchr(kLetters, f.letter) == nullptr) {
      *error = "unknown type in the schema: " + item + " (types: C N F D L M I Y B T)";
      return false;
    }
    if (f.letter == 'C' || f.letter == 'N' || f.letter == 'F') {
      if (args.empty()) {
        f.length = f.letter == 'C' ? kLongestText : 20;  // no width given
      } else if (f.length < 1 || f.length > 255) {
        *error = "width outside 1 to 255 in the schema: " + item;
        return false;
      }
    }
    if (f.decimals < 0 || (f.decimals > 0 && f.decimals >= f.length)) {
      *error = "decimals must be below the width: " + item;
      return false;
    }
    out->push_back(f);
  }
  if (out->empty()) {
    *error = "the schema names no field";
    return false;
  }
  return true;
}

ZQFromCsv::ZQFromCsv() : ZQImport(ZQSpokeDef{}, nullptr, false) {
  const TextTypes& t = TextTypes::Get();
  ReplaceValidTypes(const_cast<const ZQDType**>(t.list));
}

ZQFromCsv::~ZQFromCsv() = default;

BATCHERR ZQFromCsv::SetUserInfo(const ZQConnTarget& target) {
  target_.path = target.path;
  open_ = false;
  return 0;
}

BATCHERR ZQFromCsv::ConnectionClose() {
  open_ = false;
  return 0;
}

BATCHERR ZQFromCsv::Infer(std::vector<SchemaField>* columns) {
  struct Stats {
    bool any = false, is_num = true, is_date = true, is_bool = true;
    int int_digits = 0, frac_digits = 0;
    bool negative = false;
    size_t longest = 0;
  };
  std::vector<Stats> stats(header_.size());
  rows_ = 0;
  while (reader_.Next()) {
    if (reader_.FieldCount() != header_.size())
      return LogError(4, ZQ_READ_ERROR, "line %lld has %d fields, the header has %d",
                      static_cast<long long>(reader_.Line()), int(reader_.FieldCount()), int(header_.size()));
    ++rows_;
    for (size_t i = 0; i < header_.size(); ++i) {
      const char* p = reader_.Field(i);
      size_t n = reader_.FieldLength(i);
      if (n == 0) continue;
      Stats& s = stats[i];
      s.any = true;
      if (codepage_ != 0) p = FieldText(i, &n);
      if (n > s.longest) s.longest = n;
      if (no_infer_) {
        s.is_num = s.is_date = s.is_bool = false;
        continue;
      }
      if (s.is_num) {
        int id, fd;
        bool neg;
        // A leading zero before a digit (01234, -007) is a code: a number
        // would lose it. So is a string of more digits than a double keeps.
        const char* digits = p + (p[0] == '-' || p[0] == '+');
        if (ParseNumber(p, n, &id, &fd, &neg) && !(id > 1 && digits[0] == '0') && id + fd <= kMostDigits) {
          if (id > s.int_digits) s.int_digits = id;
          if (fd > s.frac_digits) s.frac_digits = fd;
          s.negative = s.negative || neg;
        } else {
          s.is_num = false;
        }
      }
      if (s.is_date) s.is_date = ParseIsoDate(p, n);
      bool b;
      if (s.is_bool) s.is_bool = ParseBool(p, n, &b);
    }
  }
  if (!reader_.error().empty())
    return LogError(4, ZQ_READ_ERROR, "line %lld: %s", static_cast<long long>(reader_.Line()),
                    reader_.error().c_str());
  rows_known_ = true;
  columns->clear();
  for (size_t i = 0; i < header_.size(); ++i) {
    const Stats& s = stats[i];
    SchemaField f{header_[i], 'C', 1, 0};
    if (!s.any) {
      f.length = 1;
    } else if (s.is_num) {
      f.letter = 'N';
      f.decimals = s.frac_digits;
      f.length = (s.negative ? 1 : 0) + (s.int_digits ? s.int_digits : 1) + (s.frac_digits ? 1 + s.frac_digits : 0);
      if (f.length > 255) f.letter = 'C', f.length = int(s.longest), f.decimals = 0;
    } else if (s.is_date) {
      f.letter = 'D';
      f.length = 8;
    } else if (s.is_bool) {
      f.letter = 'L';
      f.length = 1;
    } else {
      f.length = int(s.longest);
      if (f.length > kLongestText) f.letter = 'M', f.length = 10;
    }
    columns->push_back(f);
  }
  return 0;
}

BATCHERR ZQFromCsv::MakeFields() {
  open_ = false;
  std::string error;
  if (target_.path.length() == 0) return ZQ_NO_FILENAME;
  reader_.SetDelimiter(delimiter_ != 0 ? delimiter_ : DetectDelimiter());
  if (!reader_.Open(target_.path.c_str(), &error)) return LogError(4, ZQ_OPEN_ERROR, "%s", error.c_str());
  if (!reader_.Next()) return LogError(4, ZQ_OPEN_ERROR, "%s has no header row", target_.path.c_str());
  header_.clear();
  for (size_t i = 0; i < reader_.FieldCount(); ++i) {
    size_t n;
    const char* p = FieldText(i, &n);
    header_.push_back(Trim(std::string(p, n)));
  }
  // Types: the schema's where it names a column, inferred for the rest.
  std::vector<SchemaField> columns(header_.size());
  std::vector<bool> given(header_.size(), false);
  for (const SchemaField& sf : schema_) {
    bool found = false;
    for (size_t i = 0; i < header_.size(); ++i) {
      if (strcasecmp(header_[i].c_str(), sf.name.c_str()) == 0) {
        columns[i] = sf;
        columns[i].name = header_[i];
        given[i] = found = true;
      }
    }
    if (!found) return LogError(4, ZQ_OPEN_ERROR, "the schema names %s, which the CSV file has no column of", sf.name.c_str());
  }
  for (const SchemaField& h : hints_) {
    for (size_t i = 0; i < header_.size(); ++i) {
      if (!given[i] && strcasecmp(header_[i].c_str(), h.name.c_str()) == 0) {
        columns[i] = h;
        columns[i].name = header_[i];
        given[i] = true;
      }
    }
  }
  bool all_given = true;
  for (bool g : given) all_given = all_given && g;
  if (!all_given) {
    std::vector<SchemaField> inferred;
    if (BATCHERR rc = Infer(&inferred); rc != 0) return rc;
    for (size_t i = 0; i < header_.size(); ++i)
      if (!given[i]) columns[i] = inferred[i];
  }
  ZQRecord* layout = GetLayout(0);
  layout->ClearFields();
  const TextTypes& types = TextTypes::Get();
  for (const SchemaField& c : columns) {
    const ZQDType* base = types.ByLetter(c.letter);
    ZQDType t = base ? *base : types.text;
    if (c.letter == 'C' || c.letter == 'N' || c.letter == 'F') t.Length(c.length);
    else if (c.letter == 'M' || c.letter == 'B') t.Length(255);
    else if (c.letter == 'D') t.Length(8);
    else if (c.letter == 'L') t.Length(1);
    t.DecimalPlaces(int16_t(c.decimals));
    if (layout->NewField(t, c.name.c_str()) == nullptr) return ZQ_NO_MEMORY;
  }
  reader_.Rewind();
  reader_.Next();  // the header
  next_ = 0;
  open_ = true;
  return 0;
}

char ZQFromCsv::DetectDelimiter() const {
  // The header line, up to 64 KiB of it: a comma anywhere keeps the comma;
  // else the more frequent of ';' and a tab, if either is there.
  char buf[65536];
  FILE* f = fopen(target_.path.c_str(), "rb");
  size_t n = f ? fread(buf, 1, sizeof buf, f) : 0;
  if (f) fclose(f);
  const char* nl = static_cast<const char*>(memchr(buf, '\n', n));
  size_t line = nl ? size_t(nl - buf) : n;
  size_t semicolons = 0, tabs = 0;
  for (size_t i = 0; i < line; ++i) {
    if (buf[i] == ',') return ',';
    semicolons += buf[i] == ';';
    tabs += buf[i] == '\t';
  }
  if (semicolons == 0 && tabs == 0) return ',';
  return semicolons >= tabs ? ';' : '\t';
}

const char* ZQFromCsv::FieldText(size_t i, size_t* n) {
  const char* p = reader_.Field(i);
  *n = reader_.FieldLength(i);
  if (codepage_ == 0 || !bytescan::HasHighBit(p, *n)) return p;
  text_.CopyN(p, int32_t(*n), 0);
  ZQGlob::ExternalToInternal(codepage_, text_);
  *n = size_t(text_.length());
  return text_.c_str();
}

BATCHERR ZQFromCsv::AssignRow() {
  ZQRecord* layout = GetLayout(0);
  if (reader_.FieldCount() != size_t(layout->FieldCount()))
    return LogError(4, ZQ_READ_ERROR, "line %lld has %d fields, the header has %d",
                    static_cast<long long>(reader_.Line()), int(reader_.FieldCount()), layout->FieldCount());
  for (int i = 0; i < layout->FieldCount(); ++i) {
    ZQField* f = (*layout)[i];
    size_t n;
    const char* p = FieldText(size_t(i), &n);
    if (n == 0) {
      f->Blank();
      continue;
    }
    char letter = char(f->DataType().Usage());
    bool ok = true;
    const char* what = "";
    switch (letter) {
      case 'N':
      case 'F':
      case 'Y':
      case 'B':
      case 'I': {
        int id, fd;
        bool neg;
        ok = ParseNumber(p, n, &id, &fd, &neg) && (letter != 'I' || fd == 0);
        what = letter == 'I' ? "an integer" : "a number";
        if (!ok) break;
        // Currency keeps its digits as text: a double holds no more than
        // about 9 * 10^11 exactly in ten-thousandths.
        if (letter == 'I') f->SetLong(strtoll(std::string(p, n).c_str(), nullptr, 10));
        else if (letter == 'B') *f = strtod(std::string(p, n).c_str(), nullptr);
        else f->AssignText(p, int32_t(n));
        break;
      }
      case 'D':
        ok = ParseIsoDate(p, n) || (n == 8 && strspn(p, "0123456789") == 8);
        what = "a date (YYYY-MM-DD)";
        if (ok) f->AssignText(p, int32_t(n));
        ok = ok && f->held() == ZQField::Held::kDate;
        break;
      case 'L': {
        bool b;
        ok = ParseBool(p, n, &b);
        what = "a logical (true/false, T/F, Y/N)";
        if (ok) f->SetBool(b);
        break;
      }
      case 'T': {
        ZQDateTime dt;
        ok = ParseDateTime(p, n, &dt);
        what = "a date-time (YYYY-MM-DDTHH:MM:SS)";
        if (ok) *f = dt;
        break;
      }
      default: f->AssignText(p, int32_t(n)); break;
    }
    if (!ok) {
      std::string value(p, n < 40 ? n : 40);
      return LogError(4, ZQ_READ_ERROR, "line %lld, field %s: \"%s\" is not %s",
                      static_cast<long long>(reader_.Line()), f->Name(), value.c_str(), what);
    }
  }
  return 0;
}

BATCHERR ZQFromCsv::GetRecord(int32_t n) {
  if (!open_) return ZQ_NOT_OPEN;
  if (n < next_) {  // going back: read again from the top
    reader_.Rewind();
    reader_.Next();
    next_ = 0;
  }
  while (next_ <= n) {
    if (!reader_.Next()) {
      if (!reader_.error().empty())
        return LogError(4, ZQ_READ_ERROR, "line %lld: %s", static_cast<long long>(reader_.Line()),
                        reader_.error().c_str());
      GetLayout(0)->BlankFields();
      return ZQ_END;
    }
    ++next_;
  }
  return AssignRow();
}

namespace {

void DeleteCsv(void*, ZQImport* s) { delete s; }

// Column types from the fields of the table the records go to.
std::vector<SchemaField> HintsOf(ZQRecord& layout) {
  std::vector<SchemaField> hints;
  for (int i = 0; i < layout.FieldCount(); ++i) {
    ZQField* f = layout[i];
    char letter = char(f->DataType().Usage());
    if (letter == 'G' || (letter == 'B' && f->FieldType() != FT_FLOAT)) letter = 'M';
    if (strchr("CNFDLMIYBT", letter) == nullptr || letter == 0) letter = 'C';
    int length = letter == 'C' || letter == 'N' || letter == 'F' ? f->Length() : 0;
    hints.push_back(SchemaField{f->Name(), letter, length, f->DecLen()});
  }
  return hints;
}

}  // namespace

bool OpenCsvSource(const std::string& path, const ReadOptions& opts, SourcePtr* out, std::string* error) {
  SourcePtr csv(new ZQFromCsv(), SourceDeleter{DeleteCsv});
  auto* source = static_cast<ZQFromCsv*>(csv.get());
  if (!opts.schema.empty()) {
    std::vector<SchemaField> schema;
    if (!ParseSchema(opts.schema, &schema, error)) return false;
    source->SetSchema(schema);
  }
  source->SetDelimiter(opts.delimiter);
  source->SetNoInfer(opts.no_infer);
  source->SetCodePage(opts.csv_codepage);
  ZQRecord layout;
  if (opts.into && opts.into(&layout)) source->SetTypeHints(HintsOf(layout));
  ZQConnTarget t;
  t.path = path.c_str();
  source->SetUserInfo(t);
  if (source->MakeFields() != 0) return *error = source->LastErrorMessage(), false;
  *out = std::move(csv);
  return true;
}
