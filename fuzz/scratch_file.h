// Scratch files of a fuzz target: a directory of this process alone (targets
// run side by side), and a file written there from the fuzzed bytes.
#pragma once

#include <sys/stat.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <string>

namespace fuzz {

// "/tmp/zqdbse-<stem>-<pid>", made on first use.
inline const std::string& ScratchDir(const char* stem) {
  static const std::string dir = [stem] {
    std::string d = std::string("/tmp/zqdbse-") + stem + "-" + std::to_string(getpid());
    mkdir(d.c_str(), 0700);
    return d;
  }();
  return dir;
}

inline bool WriteScratch(const std::string& path, const uint8_t* data, size_t size) {
  FILE* f = fopen(path.c_str(), "wb");
  if (f == nullptr) return false;
  bool ok = size == 0 || fwrite(data, 1, size, f) == size;
  return fclose(f) == 0 && ok;
}

}  // namespace fuzz
