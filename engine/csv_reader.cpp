#include "engine/csv_reader.h"

#if defined(__SSE2__)
#include <emmintrin.h>
#endif

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

CsvReader::~CsvReader() {
  if (fd_ >= 0) close(fd_);
  free(buf_);
}

bool CsvReader::Open(const std::string& path, std::string* error) {
  fd_ = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd_ < 0) {
    *error = "cannot open " + path + ": " + strerror(errno);
    return false;
  }
  // 16 bytes of room behind the data, so that a line can be scanned in
  // whole 16-byte blocks.
  buf_ = static_cast<char*>(calloc(1, kBufSize + 16));
  if (buf_ == nullptr) {
    *error = "out of memory";
    return false;
  }
  return Rewind();
}

bool CsvReader::Rewind() {
  if (lseek(fd_, 0, SEEK_SET) != 0) return false;
  pos_ = len_ = 0;
  eof_ = false;
  line_ = record_line_ = 1;
  error_.clear();
  // A byte order mark at the start is not data.
  if (Fill() && len_ >= 3 && memcmp(buf_, "\xEF\xBB\xBF", 3) == 0) pos_ = 3;
  return true;
}

bool CsvReader::Fill() {
  if (pos_ < len_) return true;
  if (eof_) return false;
  ssize_t n;
  do n = read(fd_, buf_, kBufSize);
  while (n < 0 && errno == EINTR);
  if (n <= 0) {
    eof_ = true;
    if (n < 0) error_ = strerror(errno);
    return false;
  }
  pos_ = 0;
  len_ = size_t(n);
  return true;
}

bool CsvReader::SplitPlainLine(const char* p, size_t n) {
  size_t at = 0;  // start of the current field
#if defined(__SSE2__)
  const __m128i comma = _mm_set1_epi8(delim_), quote = _mm_set1_epi8('"'), cr = _mm_set1_epi8('\r');
  for (size_t i = 0; i < n; i += 16) {
    __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + i));
    unsigned keep = n - i < 16 ? (1u << (n - i)) - 1 : 0xFFFF;
    if (unsigned(_mm_movemask_epi8(_mm_or_si128(_mm_cmpeq_epi8(v, quote), _mm_cmpeq_epi8(v, cr)))) & keep)
      return false;  // quotes or a lone CR: the careful path
    unsigned commas = unsigned(_mm_movemask_epi8(_mm_cmpeq_epi8(v, comma))) & keep;
    while (commas != 0) {
      size_t end = i + size_t(__builtin_ctz(commas));
      starts_.push_back(at);
      ends_.push_back(end);
      at = end + 1;
      commas &= commas - 1;
    }
  }
#else
  if (memchr(p, '"', n) != nullptr || memchr(p, '\r', n) != nullptr) return false;
  for (const char* c; (c = static_cast<const char*>(memchr(p + at, delim_, n - at))) != nullptr;) {
    starts_.push_back(at);
    ends_.push_back(size_t(c - p));
    at = size_t(c - p) + 1;
  }
#endif
  starts_.push_back(at);
  ends_.push_back(n);
  return true;
}

bool CsvReader::Next() {
  field_data_.clear();
  ends_.clear();
  starts_.clear();
  if (!error_.empty() || !Fill()) return false;
  record_line_ = line_;
  // The usual case: the whole line is in the buffer and holds no quote and
  // no lone CR. Its fields are found in place, without a copy.
  {
    const char* start = buf_ + pos_;
    const char* nl = static_cast<const char*>(memchr(start, '\n', len_ - pos_));
    if (nl != nullptr) {
      const char* stop = nl > start && nl[-1] == '\r' ? nl - 1 : nl;
      size_t n = size_t(stop - start);
      if (SplitPlainLine(start, n)) {
        base_ = start;
        pos_ = size_t(nl - buf_) + 1;
        ++line_;
        return true;
      }
      starts_.clear();
      ends_.clear();
    }
  }
  base_ = nullptr;
  field_start_ = 0;
  bool quoted = false, in_field_quotes = false, after_quote = false;
  for (;;) {
    if (!Fill()) {
      if (in_field_quotes) {
        error_ = "a quoted field runs to the end of the file";
        return false;
      }
      starts_.push_back(field_start_);
      ends_.push_back(field_data_.size());
      return true;
    }
    if (!in_field_quotes) {
      // Copy a run of plain bytes at once.
      const char* start = buf_ + pos_;
      const char* end = buf_ + len_;
      const char* p = start;
      while (p < end && *p != delim_ && *p != '\n' && *p != '\r' && *p != '"') ++p;
      if (p > start) {
        if (after_quote) {
          error_ = "text behind a closing quote";
          return false;
        }
        field_data_.append(start, size_t(p - start));
        pos_ += size_t(p - start);
        if (field_data_.size() > kMaxRecord) {
          error_ = "a record longer than 64 MiB";
          return false;
        }
        continue;
      }
      char c = buf_[pos_++];
      if (c == delim_) {
        starts_.push_back(field_start_);
        ends_.push_back(field_data_.size());
        field_start_ = field_data_.size();
        quoted = after_quote = false;
      } else if (c == '\n' || c == '\r') {
        if (c == '\r' && Fill() && buf_[pos_] == '\n') ++pos_;
        ++line_;
        starts_.push_back(field_start_);
        ends_.push_back(field_data_.size());
        return true;
      } else {  // '"'
        if (quoted || field_data_.size() != field_start_) {
          error_ = "a quote inside an unquoted field";
          return false;
        }
        quoted = in_field_quotes = true;
      }
    } else {
      const char* start = buf_ + pos_;
      const char* q = static_cast<const char*>(memchr(start, '"', len_ - pos_));
      const char* stop = q ? q : buf_ + len_;
      for (const char* k = start; k < stop; ++k) line_ += *k == '\n';
      field_data_.append(start, size_t(stop - start));
      pos_ += size_t(stop - start);
      if (field_data_.size() > kMaxRecord) {
        error_ = "a record longer than 64 MiB";
        return false;
      }
      if (q == nullptr) continue;
      ++pos_;  // the quote
      if (Fill() && buf_[pos_] == '"') {  // a doubled quote is one quote
        field_data_ += '"';
        ++pos_;
        continue;
      }
      in_field_quotes = false;
      after_quote = true;
    }
  }
}
