// Counted byte strings of the host.
//
// ZQString owns its bytes; it may hold NUL bytes, and its length is the count,
// not a NUL-ended length. The bytes are always followed by one NUL that is not
// content, so c_str() can be handed to C functions when the content has none.
// Allocation uses malloc/realloc so that running out of memory is a false
// result, never an exception. Copyable and movable.
#pragma once

#include <cstdint>
#include <cstring>

#include "host/zqtypes.h"

class ZQString {
 public:
  ZQString();
  ZQString(const ZQString& other);
  ZQString(ZQString&& other) noexcept;
  // `length` -1 takes `text` up to its NUL.
  ZQString(const char* text, int32_t length = -1);
  ~ZQString();

  int32_t length() const { return len_; }
  const char* c_str() const { return data_ ? data_ : ""; }
  char operator[](int32_t i) const { return i >= 0 && i < len_ ? data_[i] : '\0'; }

  void operator=(const char* text);
  void operator=(const ZQString& other);
  ZQString& operator=(ZQString&& other) noexcept;

  // The char form appends that byte even when it is NUL.
  ZQString& operator+=(char c);
  ZQString& operator+=(const char* text);
  ZQString& operator+=(const ZQString& other);

  // Reserves room for `n` bytes of content; false when memory runs out.
  bool Allocate(int32_t n);
  int32_t Capacity() const { return cap_; }
  // The writable buffer of the reserved capacity. REQUIRES: Allocate first.
  char* GetBuffer();
  // Sets the count after GetBuffer was filled; clamped to the capacity.
  void SetLength(int32_t n);

  bool Pad(char c, int32_t n);  // appends c n times; n <= 0 adds nothing
  bool Set(char c, int32_t n);  // becomes n copies of c
  void Remove(int32_t count, int32_t position);
  // Inserts `length` bytes of `s` from `from` before `position`; -1 = all.
  bool Insert(int32_t position, const ZQString& s, int32_t length = -1, int32_t from = 0);
  // Appends `length` bytes of `s` from `from`; -1 = to the end. The length may
  // reach behind the count of `s` into bytes of its capacity; it is clamped
  // there, and bytes never written read as zero.
  bool Append(const ZQString& s, int32_t length = -1, int32_t from = 0);
  bool Append(const char* s, int32_t length);
  // Replaces the content with `length` bytes of `s` from `from`.
  bool CopyN(const ZQString& s, int32_t length, int32_t from);
  bool CopyN(const char* s, int32_t length, int32_t from) {
    // Fast path of the record loop: the buffer is already large enough.
    if (data_ != nullptr && length >= 0 && length <= cap_ && from >= 0) {
      memmove(data_, s + from, size_t(length));
      len_ = length;
      data_[len_] = '\0';
      return true;
    }
    return CopyNSlow(s, length, from);
  }
  void Replace(int32_t position, char c);
  void ToUpper();
  void ToLower();
  void StripChars(bool leading, bool trailing, char c);
  // Exchanges contents with `other` (no copy).
  void Swap(ZQString& other) noexcept {
    char* d = data_;
    int32_t l = len_, c = cap_;
    data_ = other.data_;
    len_ = other.len_;
    cap_ = other.cap_;
    other.data_ = d;
    other.len_ = l;
    other.cap_ = c;
  }
  // Takes the value that NextKeyword left in `in`.
  void Extract(const ZQString& in);

  // Total order over the whole counted content, bytes compared unsigned; a
  // prefix comes first.
  int Compare(const ZQString& other) const;
  int Compare(const char* text, int32_t length) const;
  bool operator==(const char* text) const;
  bool operator!=(const char* text) const { return !(*this == text); }
  bool operator==(const ZQString& o) const { return Compare(o) == 0; }
  bool operator!=(const ZQString& o) const { return Compare(o) != 0; }
  bool operator<(const ZQString& o) const { return Compare(o) < 0; }
  bool operator>(const ZQString& o) const { return Compare(o) > 0; }
  bool operator<=(const ZQString& o) const { return Compare(o) <= 0; }
  bool operator>=(const ZQString& o) const { return Compare(o) >= 0; }

 private:
  friend bool NextKeyword(char* keyword, ZQString& text);
  bool Reserve(int32_t n);  // capacity for n bytes of content plus the NUL
  bool CopyNSlow(const char* s, int32_t length, int32_t from);

  char* data_ = nullptr;
  int32_t len_ = 0;
  int32_t cap_ = 0;  // bytes of content the buffer can hold
  // The value of the last line that NextKeyword took off this string.
  char* pending_ = nullptr;
};

// A wide (16-bit) string, used to hand names to messages.
class ZQWString {
 public:
  ZQWString();
  ~ZQWString();
  ZQWString(const ZQWString&) = delete;
  ZQWString& operator=(const ZQWString&) = delete;
  // Widens `s` (UTF-8, or bytes as Latin-1 where not valid UTF-8); `length`
  // -1 for up to the NUL. False when memory runs out.
  bool Assign(const char* s, ZQ_CSET cs, int32_t length);
  const wchar* c_str() const;
  int32_t length() const { return len_; }

 private:
  wchar* data_ = nullptr;
  int32_t len_ = 0;
};
