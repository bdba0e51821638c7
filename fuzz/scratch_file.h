// What the fuzz targets share: a scratch directory of this process alone
// (targets run side by side), a file written there from the fuzzed bytes, and
// the dialect a version byte points to.
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

// The dialect whose version bytes include `v`, as far as one stands out.
inline int NaturalDialect(uint8_t v) {
  switch (v) {
    case 0x02: return 0;
    case 0xFE: return 3;
    case 0xF5: return 6;
    case 0xE5: return 8;
    case 0x30: return 10;
    default: return (v & 7) == 3 ? ((v & 0x08) ? 2 : 1) : 5;
  }
}

}  // namespace fuzz
