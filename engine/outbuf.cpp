#include "engine/outbuf.h"

#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <cstdlib>

OutBuf::OutBuf(int fd) : fd_(fd), buf_(static_cast<char*>(malloc(kSize))) {
  if (buf_ == nullptr) failed_ = true;
}

OutBuf::~OutBuf() {
  Flush();
  free(buf_);
}

void OutBuf::WriteAll(const char* s, size_t len) {
  while (len > 0 && !failed_) {
    ssize_t w = ::write(fd_, s, len);
    if (w < 0 && errno == EINTR) continue;
    if (w <= 0) {
      failed_ = true;
      error_ = w < 0 ? errno : ENOSPC;
      return;
    }
    s += w;
    len -= size_t(w);
  }
}

bool OutBuf::Flush() {
  if (buf_ != nullptr && n_ > 0) WriteAll(buf_, n_);
  n_ = 0;
  return !failed_;
}

void OutBuf::PutInt(int64_t v) {
  char* p = Reserve(24);
  auto r = std::to_chars(p, p + 24, v);
  Commit(size_t(r.ptr - p));
}

void OutBuf::PutDouble(double v) {
  if (!std::isfinite(v)) {
    Put("null");
    return;
  }
  char* p = Reserve(32);
  auto r = std::to_chars(p, p + 32, v);
  Commit(size_t(r.ptr - p));
}

void OutBuf::PutDate(int32_t y, int32_t m, int32_t d) {
  char* p = Reserve(16);
  if (y < 0 || y > 9999 || m < 0 || m > 99 || d < 0 || d > 99) {
    Commit(size_t(snprintf(p, 16, "%04d-%02d-%02d", int(y % 10000), int(m % 100), int(d % 100))));
    return;
  }
  // Two digits at a time from a table of "00" to "99".
  static constexpr struct Pairs {
    char at[200];
    constexpr Pairs() : at() {
      for (int i = 0; i < 100; ++i) at[2 * i] = char('0' + i / 10), at[2 * i + 1] = char('0' + i % 10);
    }
  } kPairs;
  memcpy(p, kPairs.at + 2 * (y / 100), 2);
  memcpy(p + 2, kPairs.at + 2 * (y % 100), 2);
  p[4] = '-';
  memcpy(p + 5, kPairs.at + 2 * m, 2);
  p[7] = '-';
  memcpy(p + 8, kPairs.at + 2 * d, 2);
  Commit(10);
}
