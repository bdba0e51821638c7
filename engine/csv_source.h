// A CSV file as a source spoke. The first row names the columns. Types come
// from a schema ("NAME C(30), BORN D, AMOUNT N(12,2), NOTE M") or are
// inferred by one pass over the whole file: integers and decimals become N
// with the widths seen, ISO dates D, true/false/T/F/Y/N L, other text C of the
// longest value, and text over 254 bytes M.
#pragma once

#include <string>
#include <vector>

#include "engine/csv_reader.h"
#include "host/zqspoke.h"

struct SchemaField {
  std::string name;
  char letter;
  int length;
  int decimals;
};

// Parses a schema text; false with `error` set when it is malformed.
bool ParseSchema(const std::string& text, std::vector<SchemaField>* out, std::string* error);

class ZQFromCsv : public ZQImport {
 public:
  ZQFromCsv();
  ~ZQFromCsv() override;

  void SetSchema(const std::vector<SchemaField>& schema) { schema_ = schema; }
  // Types for columns of these names when the schema doesn't give them (the
  // fields of a table the records go to); names without a column are passed
  // over.
  void SetTypeHints(const std::vector<SchemaField>& hints) { hints_ = hints; }
  BATCHERR SetUserInfo(const ZQConnTarget& target) override;
  BATCHERR MakeFields() override;
  BATCHERR GetRecord(int32_t n) override;
  bool ConnectionEstablished() override { return open_; }
  BATCHERR ConnectionClose() override;
  int64_t EstimateRecordCount() override { return rows_; }
  bool EstimateIsAccurate() override { return rows_known_; }

 private:
  BATCHERR Infer(std::vector<SchemaField>* columns);
  BATCHERR AssignRow();

  CsvReader reader_;
  std::vector<SchemaField> schema_;
  std::vector<SchemaField> hints_;
  std::vector<std::string> header_;
  bool open_ = false;
  int32_t next_ = 0;  // logical number of the record Next() reads next
  int64_t rows_ = 0;
  bool rows_known_ = false;
};
