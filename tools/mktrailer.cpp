// Build step: appends the descriptor trailer to the built module file, so
// that a host finds the connector definitions by reading its last 16 bytes.
// A file that already ends with the trailer is left alone (a rebuild that
// didn't relink must not append it twice).
#include <cstdio>
#include <cstring>
#include <vector>

#include "connector/trailer.h"

int main(int argc, char** argv) {
  if (argc != 2) {
    fprintf(stderr, "usage: mktrailer MODULE_FILE\n");
    return 2;
  }
  std::vector<uint8_t> t = trailer::EncodeTrailer();
  FILE* f = fopen(argv[1], "r+b");
  if (f == nullptr) {
    perror(argv[1]);
    return 1;
  }
  if (fseek(f, 0, SEEK_END) == 0) {
    long size = ftell(f);
    if (size >= long(t.size())) {
      std::vector<uint8_t> tail(t.size());
      if (fseek(f, size - long(t.size()), SEEK_SET) == 0 && fread(tail.data(), 1, tail.size(), f) == tail.size() &&
          tail == t) {
        fclose(f);
        return 0;
      }
    }
  }
  if (fseek(f, 0, SEEK_END) != 0 || fwrite(t.data(), 1, t.size(), f) != t.size() || fclose(f) != 0) {
    perror(argv[1]);
    return 1;
  }
  return 0;
}
