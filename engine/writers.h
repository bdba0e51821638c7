// Record writers of `zqdb cat`: CSV (RFC 4180 with a header row), JSON lines
// with typed values, and an aligned text table for people.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "engine/outbuf.h"
#include "engine/text_util.h"
#include "host/zqfield.h"

enum class OutputFormat { kCsv, kJsonl, kTable, kPgsql };

bool ParseFormat(const std::string& name, OutputFormat* out);

class RecordWriter {
 public:
  virtual ~RecordWriter() = default;
  virtual void Begin(const ZQRecord& layout) = 0;
  virtual void Row(ZQRecord& record) = 0;
  virtual void End() {}
  // Writes only these fields of the layout, in this order (--fields); all
  // of them when `columns` is empty. Before Begin.
  void Select(std::vector<int> columns) { select_ = std::move(columns); }

 protected:
  // Sets cols_, the positions written, for `layout`.
  void Columns(const ZQRecord& layout) {
    cols_ = select_;
    if (cols_.empty())
      for (int i = 0; i < layout.FieldCount(); ++i) cols_.push_back(i);
  }
  std::vector<int> cols_;

 private:
  std::vector<int> select_;
};

// `table` names the table of the formats that have one (pgsql).
std::unique_ptr<RecordWriter> MakeWriter(OutputFormat format, OutBuf& out, const std::string& table = "");
// The PostgreSQL script writer (pgsql_writer.cpp).
std::unique_ptr<RecordWriter> MakePgsqlWriter(OutBuf& out, const std::string& table);

// Writes the `n` bytes of `s`: runs of bytes below 0x80 that `plain(c)`
// accepts, and valid UTF-8 sequences, as they are; every other byte below
// 0x80 through `escape(out, c)`, and every byte of 0x80 and up that is no
// UTF-8 through `latin1(out, c)`. The one loop of the text forms' escaping.
template <typename Plain, typename Escape, typename Latin1>
void PutEscaped(OutBuf& out, const char* s, size_t n, Plain plain, Escape escape, Latin1 latin1) {
  const auto* p = reinterpret_cast<const unsigned char*>(s);
  size_t start = 0;
  for (size_t i = 0; i < n;) {
    unsigned char c = p[i];
    if (c < 0x80 && plain(c)) {
      ++i;
      continue;
    }
    size_t run = c >= 0x80 ? Utf8Sequence(p + i, n - i) : 0;
    if (run > 0) {
      i += run;
      continue;
    }
    out.Put(s + start, i - start);
    if (c >= 0x80) latin1(out, c);
    else escape(out, c);
    start = ++i;
  }
  out.Put(s + start, n - start);
}

// Writes `s` as a CSV field, quoted where it must be.
void PutCsvText(OutBuf& out, const char* s, size_t n);
// Writes `s` as a JSON string literal. Bytes that are not UTF-8 are taken as
// Latin-1 characters, so the output is always valid JSON.
void PutJsonString(OutBuf& out, const char* s, size_t n);
// True when `s` is a number in JSON's own grammar.
bool IsJsonNumber(const char* s, size_t n);
