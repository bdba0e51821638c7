// Small text helpers of the engine.
#pragma once

#include <cctype>
#include <string>

inline std::string Lower(std::string s) {
  for (char& c : s) c = char(tolower(static_cast<unsigned char>(c)));
  return s;
}
