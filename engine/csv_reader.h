// A streaming RFC 4180 reader: fields separated by commas (or another
// delimiter), records by CRLF or LF, double quotes around fields that hold
// delimiters, quotes or line breaks.
// Memory holds one record at a time whatever the file's size.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

class CsvReader {
 public:
  CsvReader() = default;
  ~CsvReader();
  CsvReader(const CsvReader&) = delete;
  CsvReader& operator=(const CsvReader&) = delete;

  bool Open(const std::string& path, std::string* error);
  // The byte between fields; ',' unless set (before the first Next).
  void SetDelimiter(char c) { delim_ = c; }
  // Back to the first record.
  bool Rewind();
  // The next record's fields; false at the end or on an error (error() set).
  // Fields stay valid until the next call.
  bool Next();
  size_t FieldCount() const { return ends_.size(); }
  const char* Field(size_t i) const { return (base_ ? base_ : field_data_.data()) + starts_[i]; }
  size_t FieldLength(size_t i) const { return ends_[i] - starts_[i]; }
  std::string FieldString(size_t i) const { return std::string(Field(i), FieldLength(i)); }
  // 1-based line on which the current record starts.
  int64_t Line() const { return record_line_; }
  const std::string& error() const { return error_; }

 private:
  // Makes at least one byte available at pos_; false at the end of the file.
  bool Fill();
  // Splits a line of `n` bytes at `p` (in the buffer) at its commas; false
  // when it holds a quote or a CR, which the careful path reads.
  bool SplitPlainLine(const char* p, size_t n);

  static constexpr size_t kBufSize = 1 << 20;
  static constexpr size_t kMaxRecord = 64 << 20;  // a longer record is an error
  int fd_ = -1;
  char delim_ = ',';
  char* buf_ = nullptr;
  size_t pos_ = 0, len_ = 0;
  bool eof_ = false;
  int64_t line_ = 1, record_line_ = 1;
  std::string field_data_;
  // Where the current record's fields are: in the read buffer itself for a
  // plain line (no copy), else (NULL) in field_data_. Field i spans
  // [starts_[i], ends_[i]) from there.
  const char* base_ = nullptr;
  std::vector<size_t> starts_;
  size_t field_start_ = 0;
  std::vector<size_t> ends_;
  std::string error_;
};
