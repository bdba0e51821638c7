// A PostgreSQL script of a table's records, for `psql -f`: the table made
// anew (CREATE TABLE with the nearest PostgreSQL types), then its rows as
// COPY data in PostgreSQL's text form, all in one transaction.
//
// COPY's text form: one line a row, columns split by tabs, \N for NULL, and
// a backslash before the bytes that would break a line or a column.
// PostgreSQL takes text as UTF-8 here (the script sets client_encoding), so
// bytes that are no UTF-8 are written as the Latin-1 characters they would
// be, and NUL bytes, which no PostgreSQL text can hold, are left out.
#include <cstdio>
#include <cstring>
#include <string>

#include "engine/convert_values.h"
#include "engine/text_util.h"
#include "host/bytescan.h"
#include "engine/writers.h"

namespace {

// An identifier in double quotes, its quotes doubled; lower-cased, as an
// unquoted name is in PostgreSQL, so that SELECT name finds NAME.
std::string QuoteIdent(const std::string& name) {
  std::string out = "\"";
  for (char c : Lower(name)) {
    if (c == '"') out += '"';
    out += c;
  }
  return out + "\"";
}

// The PostgreSQL type of a field, from its value family and table type letter.
std::string PgType(const ZQField* f) {
  int w = f->Length(), d = f->DecLen();
  char buf[48];
  switch (f->FieldType()) {
    case FT_DATE: return "DATE";
    case FT_DATETIME: return "TIMESTAMP";
    case FT_BOOLEAN: return "BOOLEAN";
    case FT_INTEGER: return "INTEGER";
    case FT_CURRENCY: return "NUMERIC(19,4)";
    case FT_BINARY: return "BYTEA";
    case FT_FLOAT:
      if (char(f->DataType().Usage()) == 'B' || w <= 0 || w > 1000) return "DOUBLE PRECISION";
      [[fallthrough]];
    case FT_NUMERIC:
      if (w <= 0 || w > 1000) return "NUMERIC";
      if (d == 0 && w <= 4) return "SMALLINT";
      if (d == 0 && w <= 9) return "INTEGER";
      if (d == 0 && w <= 18) return "BIGINT";
      snprintf(buf, sizeof buf, "NUMERIC(%d,%d)", w, d < w ? d : w);
      return buf;
    default:
      if (char(f->DataType().Usage()) == 'M' || w <= 0 || w > 10485760) return "TEXT";
      snprintf(buf, sizeof buf, "VARCHAR(%d)", w);
      return buf;
  }
}

class PgsqlWriter : public RecordWriter {
 public:
  PgsqlWriter(OutBuf& out, const std::string& table) : out_(out), table_(QuoteIdent(table)) {}

  void Begin(const ZQRecord& layout) override {
    RecordWriter::Columns(layout);
    std::string s = "SET client_encoding = 'UTF8';\nSET standard_conforming_strings = on;\nBEGIN;\n";
    s += "DROP TABLE IF EXISTS " + table_ + ";\nCREATE TABLE " + table_ + " (";
    std::string names;
    for (size_t k = 0; k < cols_.size(); ++k) {
      const ZQField* f = layout[cols_[k]];
      s += (k ? ", " : "") + QuoteIdent(f->Name()) + " " + PgType(f);
      names += (k ? ", " : "") + QuoteIdent(f->Name());
    }
    s += ");\nCOPY " + table_ + " (" + names + ") FROM STDIN;\n";
    out_.Put(s.data(), s.size());
  }

  void Row(ZQRecord& record) override {
    for (size_t k = 0; k < cols_.size(); ++k) {
      if (k) out_.Put('\t');
      ZQField* f = record.GetFieldbyPos(cols_[k]);
      switch (f->held()) {
        case ZQField::Held::kBlank: out_.Put("\\N", 2); break;
        case ZQField::Held::kText: {
          const ZQString& s = f->StringRef();
          if (IsNumericType(f->FieldType())) PutNumber(s.c_str(), size_t(s.length()));
          else PutText(s.c_str(), size_t(s.length()));
          break;
        }
        case ZQField::Held::kLong: out_.PutInt(f->LongVal()); break;
        case ZQField::Held::kDouble: out_.PutDouble(f->DoubleVal()); break;
        case ZQField::Held::kDate: {
          const ZQDate& d = f->DateRef();
          out_.PutDate(d.Year(), d.Month(), d.Day());
          break;
        }
        case ZQField::Held::kDateTime: out_.PutDateTime(f->DateTimeRef()); break;
        case ZQField::Held::kBool: out_.Put(f->BoolVal() ? 't' : 'f'); break;
      }
    }
    out_.Put('\n');
  }

  void End() override { out_.Put("\\.\nCOMMIT;\n"); }

 private:

  // A number held as the table's text: as it stands when it is one (no
  // blanks, a sign, digits, a point, an exponent), else NULL: text that
  // isn't a number would fail the whole COPY.
  void PutNumber(const char* s, size_t n) {
    // A sign, digits and at most one point, the form a table holds (and
    // forms JSON refuses but PostgreSQL reads: "+5", ".5", "5.", "007");
    // else JSON's forms, which add exponents.
    size_t i = n > 0 && (s[0] == '+' || s[0] == '-') ? 1 : 0, digits = 0, points = 0;
    for (size_t k = i; k < n; ++k) {
      if (unsigned(uint8_t(s[k])) - '0' <= 9) ++digits;
      else if (s[k] == '.') ++points;
      else digits = 0, k = n;
    }
    if ((digits > 0 && points <= 1 && digits + points == n - i) || IsJsonNumber(s, n)) out_.Put(s, n);
    else out_.Put("\\N", 2);
  }

  // True when the `n` bytes of `p` need no escape: no control byte, no
  // backslash, no DEL and nothing beyond ASCII. Eight bytes a step, the
  // last step overlapping the one before.
  static bool PlainAscii(const char* p, size_t n) {
    using namespace bytescan;
    // A byte below 0x20 borrows when 0x20 is taken from it; the high bit
    // catches 0x80 and up; DEL and backslash by their values.
    auto plain = [](uint64_t v) {
      return ((((v - kOnes * 0x20) & ~v) | v) & kHighs) == 0 && !HasByte(v, 0x7F) && !HasByte(v, '\\');
    };
    if (n < 8) {
      for (size_t i = 0; i < n; ++i) {
        unsigned char c = static_cast<unsigned char>(p[i]);
        if (c < 0x20 || c >= 0x7F || c == '\\') return false;
      }
      return true;
    }
    for (size_t i = 0; i + 8 < n; i += 8)
      if (!plain(Load64(p + i))) return false;
    return plain(Load64(p + n - 8));
  }

  void PutText(const char* s, size_t n) {
    if (PlainAscii(s, n)) {
      out_.Put(s, n);
      return;
    }
    PutEscaped(
        out_, s, n, [](unsigned char c) { return c >= 0x20 && c != '\\' && c != 0x7F; },
        [](OutBuf& o, unsigned char c) {
          switch (c) {
            case '\\': o.Put("\\\\", 2); break;
            case '\n': o.Put("\\n", 2); break;
            case '\r': o.Put("\\r", 2); break;
            case '\t': o.Put("\\t", 2); break;
            case 0: break;  // no PostgreSQL text holds NUL
            default: {
              char esc[8];
              snprintf(esc, sizeof esc, "\\%03o", c);
              o.Put(esc, 4);
            }
          }
        },
        [](OutBuf& o, unsigned char c) {  // the byte as a Latin-1 character
          o.Put(char(0xC0 | (c >> 6)));
          o.Put(char(0x80 | (c & 0x3F)));
        });
  }

  OutBuf& out_;
  std::string table_;
};

}  // namespace

std::unique_ptr<RecordWriter> MakePgsqlWriter(OutBuf& out, const std::string& table) {
  return std::make_unique<PgsqlWriter>(out, table);
}
