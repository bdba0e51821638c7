// A large output buffer over a file descriptor: one write(2) per megabyte,
// with the small formatting helpers the record writers need.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "host/zqdate.h"

class OutBuf {
 public:
  static constexpr size_t kSize = 1 << 20;

  explicit OutBuf(int fd);
  ~OutBuf();
  OutBuf(const OutBuf&) = delete;
  OutBuf& operator=(const OutBuf&) = delete;

  void Put(char c) {
    if (n_ == kSize) Flush();
    buf_[n_++] = c;
  }
  void Put(const char* s, size_t len) {
    if (len > kSize - n_) {
      Flush();
      if (len > kSize) {
        WriteAll(s, len);
        return;
      }
    }
    memcpy(buf_ + n_, s, len);
    n_ += len;
  }
  void Put(const char* s) { Put(s, strlen(s)); }
  // Room for `len` bytes written straight into the buffer; call Commit after.
  char* Reserve(size_t len) {
    if (len > kSize - n_) Flush();
    return buf_ + n_;
  }
  void Commit(size_t len) { n_ += len; }
  void PutInt(int64_t v);
  // Shortest text that reads back as the same double.
  void PutDouble(double v);
  // "YYYY-MM-DD"
  void PutDate(int32_t y, int32_t m, int32_t d);
  // "YYYY-MM-DDTHH:MM:SS"
  void PutDateTime(const ZQDateTime& dt) {
    char* p = Reserve(ZQDateTime::kIsoSize);
    Commit(size_t(dt.PrintIso(p, ZQDateTime::kIsoSize)));
  }
  bool Flush();
  bool failed() const { return failed_; }
  // Why the write failed: an errno value, 0 when it didn't.
  int error() const { return error_; }

 private:
  void WriteAll(const char* s, size_t len);

  int fd_;
  char* buf_;
  size_t n_ = 0;
  bool failed_ = false;
  int error_ = 0;
};
