// How zqdb speaks to its user: errors and warnings, one line each on
// standard error.
#pragma once

#include <cstdio>
#include <string>

inline void Warn(const std::string& message) { fprintf(stderr, "zqdb: warning: %s\n", message.c_str()); }

// Prints the error; the exit status of a failed command (1).
inline int Fail(const std::string& message) {
  fprintf(stderr, "zqdb: %s\n", message.c_str());
  return 1;
}
