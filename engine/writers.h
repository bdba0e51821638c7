// Record writers of `zqdb cat`: CSV (RFC 4180 with a header row), JSON lines
// with typed values, and an aligned text table for people.
#pragma once

#include <memory>
#include <string>

#include "engine/outbuf.h"
#include "host/zqfield.h"

enum class OutputFormat { kCsv, kJsonl, kTable };

bool ParseFormat(const std::string& name, OutputFormat* out);

class RecordWriter {
 public:
  virtual ~RecordWriter() = default;
  virtual void Begin(const ZQRecord& layout) = 0;
  virtual void Row(ZQRecord& record) = 0;
  virtual void End() {}
};

std::unique_ptr<RecordWriter> MakeWriter(OutputFormat format, OutBuf& out);

// Writes `s` as a CSV field, quoted where it must be.
void PutCsvText(OutBuf& out, const char* s, size_t n);
// Writes `s` as a JSON string literal. Bytes that are not UTF-8 are taken as
// Latin-1 characters, so the output is always valid JSON.
void PutJsonString(OutBuf& out, const char* s, size_t n);
// True when `s` is a number in JSON's own grammar.
bool IsJsonNumber(const char* s, size_t n);
