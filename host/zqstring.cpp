#include "host/zqstring.h"

#include <cstdlib>
#include <cstring>

namespace {
// Largest content a string may reach; keeps size arithmetic inside int32_t.
constexpr int32_t kMaxLength = 0x7FFFFF00;
}  // namespace

ZQString::ZQString() = default;

ZQString::ZQString(const ZQString& other) { CopyN(other.c_str(), other.len_, 0); }

ZQString::ZQString(ZQString&& other) noexcept
    : data_(other.data_), len_(other.len_), cap_(other.cap_), pending_(other.pending_) {
  other.data_ = nullptr;
  other.pending_ = nullptr;
  other.len_ = other.cap_ = 0;
}

ZQString::ZQString(const char* text, int32_t length) {
  if (text == nullptr) return;
  if (length < 0) length = int32_t(strlen(text));
  CopyN(text, length, 0);
}

ZQString::~ZQString() {
  free(data_);
  free(pending_);
}

ZQString& ZQString::operator=(ZQString&& other) noexcept {
  if (this != &other) {
    free(data_);
    free(pending_);
    data_ = other.data_;
    len_ = other.len_;
    cap_ = other.cap_;
    pending_ = other.pending_;
    other.data_ = nullptr;
    other.pending_ = nullptr;
    other.len_ = other.cap_ = 0;
  }
  return *this;
}

bool ZQString::Reserve(int32_t n) {
  if (n < 0 || n > kMaxLength) return false;
  if (n <= cap_ && data_ != nullptr) return true;
  int32_t want = cap_ < 16 ? 16 : cap_;
  while (want < n) want = want > kMaxLength / 2 ? kMaxLength : want * 2;
  char* grown = static_cast<char*>(realloc(data_, size_t(want) + 1));
  if (grown == nullptr) return false;
  // Bytes of the capacity never written read as zero (see Append).
  memset(grown + cap_, 0, size_t(want - cap_) + 1);
  data_ = grown;
  cap_ = want;
  return true;
}

void ZQString::operator=(const char* text) {
  if (text == nullptr) text = "";
  CopyN(text, int32_t(strlen(text)), 0);
}

void ZQString::operator=(const ZQString& other) {
  if (this != &other) CopyN(other.c_str(), other.len_, 0);
}

ZQString& ZQString::operator+=(char c) {
  Append(&c, 1);
  return *this;
}

ZQString& ZQString::operator+=(const char* text) {
  if (text != nullptr) Append(text, int32_t(strlen(text)));
  return *this;
}

ZQString& ZQString::operator+=(const ZQString& other) {
  if (this == &other) {
    ZQString copy(other);
    Append(copy.c_str(), copy.len_);
  } else {
    Append(other.c_str(), other.len_);
  }
  return *this;
}

bool ZQString::Allocate(int32_t n) { return Reserve(n); }

char* ZQString::GetBuffer() {
  if (data_ == nullptr && !Reserve(0)) return nullptr;
  return data_;
}

void ZQString::SetLength(int32_t n) {
  if (data_ == nullptr) return;
  if (n < 0) n = 0;
  if (n > cap_) n = cap_;
  len_ = n;
  data_[len_] = '\0';
}

bool ZQString::Pad(char c, int32_t n) {
  if (n <= 0) return true;
  if (n > kMaxLength - len_ || !Reserve(len_ + n)) return false;
  memset(data_ + len_, c, size_t(n));
  len_ += n;
  data_[len_] = '\0';
  return true;
}

bool ZQString::Set(char c, int32_t n) {
  if (n < 0) n = 0;
  if (!Reserve(n)) return false;
  memset(data_, c, size_t(n));
  len_ = n;
  data_[len_] = '\0';
  return true;
}

void ZQString::Remove(int32_t count, int32_t position) {
  if (position < 0 || position >= len_ || count <= 0) return;
  if (count > len_ - position) count = len_ - position;
  memmove(data_ + position, data_ + position + count, size_t(len_ - position - count));
  len_ -= count;
  data_[len_] = '\0';
}

bool ZQString::Insert(int32_t position, const ZQString& s, int32_t length, int32_t from) {
  if (from < 0 || from > s.len_) return false;
  if (length < 0 || length > s.len_ - from) length = s.len_ - from;
  if (position < 0) position = 0;
  if (position > len_) position = len_;
  if (length == 0) return true;
  ZQString copy(s.c_str() + from, length);  // s may be this string
  if (length > kMaxLength - len_ || !Reserve(len_ + length)) return false;
  memmove(data_ + position + length, data_ + position, size_t(len_ - position));
  memcpy(data_ + position, copy.c_str(), size_t(length));
  len_ += length;
  data_[len_] = '\0';
  return true;
}

bool ZQString::Append(const ZQString& s, int32_t length, int32_t from) {
  // Reading behind the count of `s` is allowed up to its capacity, whose
  // unwritten bytes are zero; nothing beyond the capacity is ever read.
  int32_t limit = s.data_ ? s.cap_ : 0;
  if (from < 0 || from > limit) return false;
  if (length < 0) length = s.len_ > from ? s.len_ - from : 0;
  if (length > limit - from) length = limit - from;
  if (this == &s) {
    ZQString copy(s.data_ + from, length);
    return Append(copy.c_str(), length);
  }
  return Append(s.data_ ? s.data_ + from : "", length);
}

bool ZQString::Append(const char* s, int32_t length) {
  if (length <= 0) return true;
  if (length > kMaxLength - len_ || !Reserve(len_ + length)) return false;
  memmove(data_ + len_, s, size_t(length));
  len_ += length;
  data_[len_] = '\0';
  return true;
}

bool ZQString::CopyN(const ZQString& s, int32_t length, int32_t from) {
  if (from < 0 || from > s.len_) return false;
  if (length < 0 || length > s.len_ - from) length = s.len_ - from;
  if (this == &s) {
    if (length > 0) memmove(data_, data_ + from, size_t(length));  // an empty string has no buffer
    SetLength(length);
    return true;
  }
  return CopyN(s.c_str(), length, from);
}

bool ZQString::CopyNSlow(const char* s, int32_t length, int32_t from) {
  if (length < 0 || from < 0) return false;
  if (!Reserve(length)) return false;
  if (length > 0) memmove(data_, s + from, size_t(length));
  len_ = length;
  data_[len_] = '\0';
  return true;
}

void ZQString::Replace(int32_t position, char c) {
  if (position >= 0 && position < len_) data_[position] = c;
}

void ZQString::ToUpper() {
  for (int32_t i = 0; i < len_; ++i)
    if (data_[i] >= 'a' && data_[i] <= 'z') data_[i] = char(data_[i] - 'a' + 'A');
}

void ZQString::ToLower() {
  for (int32_t i = 0; i < len_; ++i)
    if (data_[i] >= 'A' && data_[i] <= 'Z') data_[i] = char(data_[i] - 'A' + 'a');
}

void ZQString::StripChars(bool leading, bool trailing, char c) {
  if (len_ == 0) return;
  int32_t end = len_;
  if (trailing)
    while (end > 0 && data_[end - 1] == c) --end;
  int32_t start = 0;
  if (leading)
    while (start < end && data_[start] == c) ++start;
  if (start > 0) memmove(data_, data_ + start, size_t(end - start));
  len_ = end - start;
  data_[len_] = '\0';
}

void ZQString::Extract(const ZQString& in) { *this = in.pending_ ? in.pending_ : ""; }

int ZQString::Compare(const char* text, int32_t length) const {
  int32_t n = len_ < length ? len_ : length;
  int r = n > 0 ? memcmp(c_str(), text, size_t(n)) : 0;  // memcmp is unsigned
  if (r != 0) return r < 0 ? -1 : 1;
  return len_ < length ? -1 : len_ > length ? 1 : 0;
}

int ZQString::Compare(const ZQString& other) const { return Compare(other.c_str(), other.len_); }

bool ZQString::operator==(const char* text) const {
  if (text == nullptr) text = "";
  return Compare(text, int32_t(strlen(text))) == 0;
}

// ---------------------------------------------------------------------------

ZQWString::ZQWString() = default;
ZQWString::~ZQWString() { free(data_); }

const wchar* ZQWString::c_str() const {
  static const wchar kEmpty[1] = {0};
  return data_ ? data_ : kEmpty;
}

bool ZQWString::Assign(const char* s, ZQ_CSET, int32_t length) {
  if (s == nullptr) s = "";
  if (length < 0) length = int32_t(strlen(s));
  wchar* out = static_cast<wchar*>(malloc((size_t(length) + 1) * sizeof(wchar)));
  if (out == nullptr) return false;
  const auto* p = reinterpret_cast<const uint8_t*>(s);
  int32_t n = 0;
  for (int32_t i = 0; i < length;) {
    uint32_t c = p[i];
    int extra = c >= 0xF0 && c < 0xF8 ? 3 : c >= 0xE0 ? 2 : c >= 0xC2 && c < 0xE0 ? 1 : 0;
    if (c >= 0xF8) extra = 0;
    bool ok = extra > 0 && i + extra < length;
    uint32_t cp = c & (0x3F >> extra);
    for (int k = 1; ok && k <= extra; ++k) {
      if ((p[i + k] & 0xC0) != 0x80) ok = false;
      cp = cp << 6 | (p[i + k] & 0x3F);
    }
    if (!ok || extra == 0) {  // ASCII, or a byte that starts no valid sequence
      out[n++] = wchar(c);
      ++i;
      continue;
    }
    i += extra + 1;
    // Characters outside the 16-bit range become U+FFFD: the wide form is
    // only used to show names in messages.
    out[n++] = cp > 0xFFFF ? wchar(0xFFFD) : wchar(cp);
  }
  out[n] = 0;
  free(data_);
  data_ = out;
  len_ = n;
  return true;
}
