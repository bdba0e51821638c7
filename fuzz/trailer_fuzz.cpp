// Fuzzes the trailer reader of the module scanner: any bytes as the end of a
// file of any size at least as large.
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include "engine/modules.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  std::vector<ConnectorDef> defs;
  std::string why;
  // The first byte, when there is one, makes the file larger than the bytes
  // seen, as a scanner that read only the tail would find it.
  uint64_t file_size = size + (size > 0 ? uint64_t(data[0]) * 1000 : 0);
  std::vector<uint8_t> copy(data, data + size);  // exact bounds for the sanitizer
  ParseTrailer(copy.data(), copy.size(), file_size, &defs, &why);
  return 0;
}
