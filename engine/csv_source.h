// A CSV file as a source spoke. The first row names the columns. Types come
// from a schema ("NAME C(30), BORN D, AMOUNT N(12,2), NOTE M") or are
// inferred by one pass over the whole file: integers and decimals become N
// with the widths seen, ISO dates D, true/false/T/F/Y/N L, other text C of the
// longest value, and text over 255 bytes M. Digits with a leading zero
// (01234) or more than 15 of them are codes, not numbers: they stay text.
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
  // The byte between fields; 0: a comma, or ';' or a tab when the header
  // has no comma but one of those.
  void SetDelimiter(char c) { delimiter_ = c; }
  // Columns the schema doesn't type are text, not inferred.
  void SetNoInfer(bool v) { no_infer_ = v; }
  // The file's own code page (0: UTF-8): its text is converted from it.
  void SetCodePage(int cp) { codepage_ = cp; }
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
  char DetectDelimiter() const;
  // Field `i` of the current row as UTF-8: in place, or converted into text_.
  const char* FieldText(size_t i, size_t* n);

  CsvReader reader_;
  std::vector<SchemaField> schema_;
  std::vector<SchemaField> hints_;
  std::vector<std::string> header_;
  char delimiter_ = 0;
  bool no_infer_ = false;
  int codepage_ = 0;
  ZQString text_;  // scratch of FieldText
  bool open_ = false;
  int32_t next_ = 0;  // logical number of the record Next() reads next
  int64_t rows_ = 0;
  bool rows_known_ = false;
};
