#include "engine/writers.h"

#include "engine/convert_values.h"
#include "engine/report.h"
#include "engine/text_util.h"

#include "host/bytescan.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <vector>

namespace {

// ---------------------------------------------------------------------------
// CSV

// A value in double quotes, its own quotes doubled.
void PutCsvQuoted(OutBuf& out, const char* s, size_t n) {
  out.Put('"');
  const char* end = s + n;
  while (s < end) {
    const char* q = static_cast<const char*>(memchr(s, '"', size_t(end - s)));
    if (q == nullptr) {
      out.Put(s, size_t(end - s));
      break;
    }
    out.Put(s, size_t(q - s) + 1);
    out.Put('"');
    s = q + 1;
  }
  out.Put('"');
}

}  // namespace

void PutCsvText(OutBuf& out, const char* s, size_t n) {
  if (bytescan::HasCsvSpecial(s, n)) PutCsvQuoted(out, s, n);
  else out.Put(s, n);
}

namespace {

// A value held in a ZQString: its buffer always has room for 16 bytes, so
// short values are tested with a single load.
void PutCsvString(OutBuf& out, const ZQString& s) {
  size_t n = size_t(s.length());
  bool special = n > 0 && s.Capacity() >= 16 ? bytescan::HasCsvSpecialWide(s.c_str(), n)
                                               : bytescan::HasCsvSpecial(s.c_str(), n);
  if (special) PutCsvQuoted(out, s.c_str(), n);
  else out.Put(s.c_str(), n);
}

// Fields whose values are bytes, not text: G (OLE objects), B memos of the
// dBASE dialects (binary memos), and M memos that hold NUL bytes (a file
// stored as a memo). A column of a type the dialect doesn't list (a G field
// read as dBASE IV) is taken as a memo: binary when it holds a NUL byte. CSV
// and JSON carry them as base64, so that no byte is lost or taken for text in
// some encoding; one warning names them at the end.
class BinaryFields {
 public:
  void Begin(const ZQRecord& layout) {
    kind_.assign(size_t(layout.FieldCount()), kText);
    seen_.assign(size_t(layout.FieldCount()), false);
    any_ = false;
    for (int i = 0; i < layout.FieldCount(); ++i) {
      const ZQField* f = layout[i];
      char letter = char(f->DataType().Usage());
      if (letter == 'G' || (letter == 'B' && f->FieldType() != FT_FLOAT)) kind_[size_t(i)] = kBytes;
      else if (letter == 'M' || letter == 0) kind_[size_t(i)] = kMemo;
      any_ = any_ || kind_[size_t(i)] != kText;
    }
  }
  bool any() const { return any_; }
  // True when the value of field `i` is to be written as base64; counts it.
  bool IsBinary(int i, ZQField* f) {
    uint8_t k = kind_[size_t(i)];
    if (k == kText || f->held() != ZQField::Held::kText) return false;
    const ZQString& s = f->StringRef();
    if (k == kMemo && memchr(s.c_str(), 0, size_t(s.length())) == nullptr) return false;
    ++count_;
    if (!seen_[size_t(i)]) {
      seen_[size_t(i)] = true;
      names_ += std::string(names_.empty() ? "" : ", ") + f->Name();
    }
    return true;
  }
  void WarnOnce() {
    if (count_ > 0) Warn(std::to_string(count_) + " binary values (" + names_ + ") were written as base64");
    count_ = 0;
  }

 private:
  enum : uint8_t { kText, kBytes, kMemo };
  std::vector<uint8_t> kind_;
  std::vector<bool> seen_;  // fields named in names_
  bool any_ = false;
  int64_t count_ = 0;
  std::string names_;
};

void PutBase64(OutBuf& out, const ZQString& s) {
  static const char kDigits[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  const auto* p = reinterpret_cast<const uint8_t*>(s.c_str());
  size_t n = size_t(s.length());
  for (size_t i = 0; i < n; i += 3) {
    uint32_t v = uint32_t(p[i]) << 16 | (i + 1 < n ? uint32_t(p[i + 1]) << 8 : 0) | (i + 2 < n ? p[i + 2] : 0);
    char q[4] = {kDigits[v >> 18], kDigits[v >> 12 & 63], i + 1 < n ? kDigits[v >> 6 & 63] : '=',
                 i + 2 < n ? kDigits[v & 63] : '='};
    out.Put(q, 4);
  }
}

class CsvWriter : public RecordWriter {
 public:
  explicit CsvWriter(OutBuf& out) : out_(out) {}
  void End() override { binary_.WarnOnce(); }
  void Begin(const ZQRecord& layout) override {
    RecordWriter::Columns(layout);
    binary_.Begin(layout);
    for (size_t k = 0; k < cols_.size(); ++k) {
      if (k) out_.Put(',');
      const char* name = layout[cols_[k]]->Name();
      PutCsvText(out_, name, strlen(name));
    }
    out_.Put("\r\n", 2);
  }
  void Row(ZQRecord& record) override {
    for (size_t k = 0; k < cols_.size(); ++k) {
      if (k) out_.Put(',');
      ZQField* f = record.GetFieldbyPos(cols_[k]);
      if (binary_.any() && binary_.IsBinary(cols_[k], f)) {
        PutBase64(out_, f->StringRef());
        continue;
      }
      // Text, the usual case, is tested first: one predictable branch.
      if (f->held() == ZQField::Held::kText) {
        PutCsvString(out_, f->StringRef());
        continue;
      }
      switch (f->held()) {
        case ZQField::Held::kBlank: break;
        case ZQField::Held::kText: PutCsvString(out_, f->StringRef()); break;
        case ZQField::Held::kLong: out_.PutInt(f->LongVal()); break;
        case ZQField::Held::kDouble: out_.PutDouble(f->DoubleVal()); break;
        case ZQField::Held::kDate: {
          const ZQDate& d = f->DateRef();
          out_.PutDate(d.Year(), d.Month(), d.Day());
          break;
        }
        case ZQField::Held::kDateTime: out_.PutDateTime(f->DateTimeRef()); break;
        case ZQField::Held::kBool: out_.Put(f->BoolVal() ? "true" : "false"); break;
      }
    }
    out_.Put("\r\n", 2);
  }

 private:
  OutBuf& out_;
  BinaryFields binary_;
};

// ---------------------------------------------------------------------------
// JSON lines

class JsonlWriter : public RecordWriter {
 public:
  explicit JsonlWriter(OutBuf& out) : out_(out) {}
  void End() override { binary_.WarnOnce(); }
  void Begin(const ZQRecord& layout) override {
    binary_.Begin(layout);
    keys_.clear();
    RecordWriter::Columns(layout);
    for (size_t k = 0; k < cols_.size(); ++k) {
      std::string key;
      const char* name = layout[cols_[k]]->Name();
      key += k ? ",\"" : "{\"";
      for (const char* p = name; *p; ++p) {
        unsigned char c = static_cast<unsigned char>(*p);
        if (c == '"' || c == '\\') key += '\\';
        if (c < 0x20) {
          char esc[8];
          snprintf(esc, sizeof esc, "\\u%04x", c);
          key += esc;
          continue;
        }
        key += char(c);
      }
      key += "\":";
      keys_.push_back(key);
    }
  }
  void Row(ZQRecord& record) override {
    if (cols_.empty()) out_.Put('{');
    for (size_t k = 0; k < cols_.size(); ++k) {
      out_.Put(keys_[k].data(), keys_[k].size());
      ZQField* f = record.GetFieldbyPos(cols_[k]);
      if (binary_.any() && binary_.IsBinary(cols_[k], f)) {
        out_.Put('"');
        PutBase64(out_, f->StringRef());
        out_.Put('"');
        continue;
      }
      switch (f->held()) {
        case ZQField::Held::kBlank: out_.Put("null", 4); break;
        case ZQField::Held::kText: {
          const ZQString& s = f->StringRef();
          if (IsNumericType(f->FieldType())) {
            PutNumberText(s);
          } else {
            PutJsonString(out_, s.c_str(), size_t(s.length()));
          }
          break;
        }
        case ZQField::Held::kLong: out_.PutInt(f->LongVal()); break;
        case ZQField::Held::kDouble: out_.PutDouble(f->DoubleVal()); break;
        case ZQField::Held::kDate: {
          const ZQDate& d = f->DateRef();
          out_.Put('"');
          out_.PutDate(d.Year(), d.Month(), d.Day());
          out_.Put('"');
          break;
        }
        case ZQField::Held::kDateTime:
          out_.Put('"');
          out_.PutDateTime(f->DateTimeRef());
          out_.Put('"');
          break;
        case ZQField::Held::kBool: out_.Put(f->BoolVal() ? "true" : "false"); break;
      }
    }
    out_.Put("}\n", 2);
  }

 private:
  // A number held as the table's text: as it stands when JSON accepts it,
  // else normalised through a double; text that is no number at all stays a
  // string, so that nothing is lost.
  void PutNumberText(const ZQString& s) {
    const char* p = s.c_str();
    size_t n = size_t(s.length());
    if (IsJsonNumber(p, n)) {
      out_.Put(p, n);
      return;
    }
    char* end = nullptr;
    double d = strtod(p, &end);
    if (end == p + n && n > 0) {
      out_.PutDouble(d);
      return;
    }
    PutJsonString(out_, p, n);
  }

  OutBuf& out_;
  std::vector<std::string> keys_;
  BinaryFields binary_;
};

// ---------------------------------------------------------------------------
// Aligned table

class TableWriter : public RecordWriter {
 public:
  explicit TableWriter(OutBuf& out) : out_(out) {}
  void Begin(const ZQRecord& layout) override {
    widths_.clear();
    RecordWriter::Columns(layout);
    for (int c : cols_) {
      const ZQField* f = layout[c];
      size_t w;
      switch (f->FieldType()) {
        case FT_DATE: w = 10; break;
        case FT_DATETIME: w = 19; break;
        case FT_BOOLEAN: w = 5; break;
        case FT_INTEGER: w = 11; break;
        case FT_FLOAT:
        case FT_CURRENCY: w = 20; break;
        default: w = size_t(f->Length()); break;
      }
      if (w > kMaxWidth) w = kMaxWidth;
      size_t name_len = strlen(f->Name());
      if (w < name_len) w = name_len;
      widths_.push_back(w);
    }
    for (size_t k = 0; k < cols_.size(); ++k) Cell(k, layout[cols_[k]]->Name(), strlen(layout[cols_[k]]->Name()));
    out_.Put('\n');
    for (size_t k = 0; k < cols_.size(); ++k) {
      if (k) out_.Put("  ", 2);
      for (size_t w = 0; w < widths_[k]; ++w) out_.Put('-');
    }
    out_.Put('\n');
  }
  void Row(ZQRecord& record) override {
    for (size_t i = 0; i < cols_.size(); ++i) {
      ZQField* f = record.GetFieldbyPos(cols_[i]);
      ZQString text;
      switch (f->held()) {
        case ZQField::Held::kBlank: break;
        case ZQField::Held::kDate: {
          const ZQDate& d = f->DateRef();
          char buf[16];
          snprintf(buf, sizeof buf, "%04d-%02d-%02d", d.Year(), d.Month(), d.Day());
          text = buf;
          break;
        }
        case ZQField::Held::kBool: text = f->BoolVal() ? "true" : "false"; break;
        case ZQField::Held::kDateTime: f->DateTimeRef().PrintIso(text); break;
        case ZQField::Held::kDouble: {
          char buf[40];
          snprintf(buf, sizeof buf, "%.15g", f->DoubleVal());
          text = buf;
          break;
        }
        default: f->RenderText(text, 0); break;
      }
      // One line per record: line breaks inside a value are shown as spaces.
      std::string shown(text.c_str(), size_t(text.length()));
      for (char& c : shown)
        if (c == '\n' || c == '\r' || c == '\t') c = ' ';
      Cell(i, shown.data(), shown.size());
    }
    out_.Put('\n');
  }

 private:
  static constexpr size_t kMaxWidth = 40;

  // Widths count characters, not bytes: a UTF-8 sequence is one column.
  static size_t Columns(const char* s, size_t n) {
    size_t c = 0;
    for (size_t k = 0; k < n; ++k) c += (uint8_t(s[k]) & 0xC0) != 0x80;
    return c;
  }
  // Bytes of the first `cols` characters of `s`.
  static size_t PrefixBytes(const char* s, size_t n, size_t cols) {
    size_t k = 0, c = 0;
    while (k < n) {
      if ((uint8_t(s[k]) & 0xC0) != 0x80) {
        if (c == cols) break;
        ++c;
      }
      ++k;
    }
    return k;
  }

  void Cell(size_t i, const char* s, size_t n) {
    size_t w = widths_[i];
    if (i) out_.Put("  ", 2);
    size_t cols = Columns(s, n);
    if (cols > w) {
      size_t keep = w > 3 ? w - 3 : w;
      out_.Put(s, PrefixBytes(s, n, keep));
      if (w > 3) out_.Put("...", 3);
      return;
    }
    out_.Put(s, n);
    if (i + 1 < widths_.size())
      for (size_t k = cols; k < w; ++k) out_.Put(' ');
  }

  OutBuf& out_;
  std::vector<size_t> widths_;
};

}  // namespace

bool ParseFormat(const std::string& name, OutputFormat* out) {
  if (name == "csv") *out = OutputFormat::kCsv;
  else if (name == "jsonl" || name == "json") *out = OutputFormat::kJsonl;
  else if (name == "table") *out = OutputFormat::kTable;
  else if (name == "pgsql") *out = OutputFormat::kPgsql;
  else return false;
  return true;
}

std::unique_ptr<RecordWriter> MakeWriter(OutputFormat format, OutBuf& out, const std::string& table) {
  switch (format) {
    case OutputFormat::kPgsql: return MakePgsqlWriter(out, table);
    case OutputFormat::kJsonl: return std::make_unique<JsonlWriter>(out);
    case OutputFormat::kTable: return std::make_unique<TableWriter>(out);
    default: return std::make_unique<CsvWriter>(out);
  }
}

void PutJsonString(OutBuf& out, const char* s, size_t n) {
  auto escape = [](OutBuf& o, unsigned char c) {
    switch (c) {
      case '"': o.Put("\\\"", 2); break;
      case '\\': o.Put("\\\\", 2); break;
      case '\n': o.Put("\\n", 2); break;
      case '\r': o.Put("\\r", 2); break;
      case '\t': o.Put("\\t", 2); break;
      default: {
        char esc[8];
        snprintf(esc, sizeof esc, "\\u%04x", c);
        o.Put(esc, 6);
      }
    }
  };
  out.Put('"');
  PutEscaped(
      out, s, n, [](unsigned char c) { return c >= 0x20 && c != '"' && c != '\\'; }, escape,
      [&](OutBuf& o, unsigned char c) { escape(o, c); });  // not UTF-8: the byte as Latin-1, \u00XX
  out.Put('"');
}

bool IsJsonNumber(const char* s, size_t n) {
  size_t i = 0;
  if (i < n && s[i] == '-') ++i;
  if (i >= n) return false;
  if (s[i] == '0') {
    ++i;
  } else if (s[i] >= '1' && s[i] <= '9') {
    while (i < n && s[i] >= '0' && s[i] <= '9') ++i;
  } else {
    return false;
  }
  if (i < n && s[i] == '.') {
    ++i;
    size_t d = i;
    while (i < n && s[i] >= '0' && s[i] <= '9') ++i;
    if (i == d) return false;
  }
  if (i < n && (s[i] == 'e' || s[i] == 'E')) {
    ++i;
    if (i < n && (s[i] == '+' || s[i] == '-')) ++i;
    size_t d = i;
    while (i < n && s[i] >= '0' && s[i] <= '9') ++i;
    if (i == d) return false;
  }
  return i == n;
}
