// Small text helpers of the engine.
#pragma once

#include <cctype>
#include <cstddef>
#include <string>

inline std::string Lower(std::string s) {
  for (char& c : s) c = char(tolower(static_cast<unsigned char>(c)));
  return s;
}

inline std::string Upper(std::string s) {
  for (char& c : s) c = char(toupper(static_cast<unsigned char>(c)));
  return s;
}

// The file name of `path` without its directories and its last extension
// ("data/customers.dbf" -> "customers").
inline std::string BaseName(const std::string& path) {
  size_t slash = path.rfind('/');
  std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
  size_t dot = name.rfind('.');
  if (dot != std::string::npos && dot > 0) name.resize(dot);
  return name;
}

// The length of the UTF-8 sequence of two to four bytes at the start of `p`
// (`n` bytes left); 0 when the bytes there are no such sequence.
inline size_t Utf8Sequence(const unsigned char* p, size_t n) {
  unsigned char c = p[0];
  size_t extra = c >= 0xF0 && c < 0xF5 ? 3 : c >= 0xE0 && c < 0xF0 ? 2 : c >= 0xC2 && c < 0xE0 ? 1 : 0;
  if (extra == 0 || extra >= n) return 0;
  for (size_t k = 1; k <= extra; ++k)
    if ((p[k] & 0xC0) != 0x80) return 0;
  return extra + 1;
}
