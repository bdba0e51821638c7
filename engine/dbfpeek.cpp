#include "engine/dbfpeek.h"

#include <cstdio>

#include "host/endian.h"

bool PeekTable(const std::string& path, TableFacts* facts) {
  FILE* f = fopen(path.c_str(), "rb");
  if (f == nullptr) return false;
  // 32 bytes of header and at most 1024 descriptors of 32 bytes.
  std::vector<uint8_t> buf(32 + 1024 * 32 + 1);
  size_t n = fread(buf.data(), 1, buf.size(), f);
  fclose(f);
  if (n < 1) return false;
  facts->version = buf[0];
  // dBASE II and Enable's narrow header: 16-byte descriptors from offset 8.
  bool narrow = buf[0] == 0x02 || buf[0] == 0xFE;
  size_t start = narrow ? 8 : 32, size = narrow ? 16 : 32;
  if (n >= 12) {
    facts->record_length = narrow ? GetLe16(&buf[6]) : GetLe16(&buf[10]);
    facts->header_length = narrow ? 0 : GetLe16(&buf[8]);
  }
  for (size_t off = start; off + size <= n && buf[off] != 0x0D; off += size) {
    PeekField pf;
    size_t len = 0;
    while (len < 11 && buf[off + len] != 0) ++len;
    pf.name.assign(reinterpret_cast<const char*>(&buf[off]), len);
    pf.type = char(buf[off + 11]);
    pf.length = narrow ? buf[off + 12] : buf[off + 16];
    pf.decimals = narrow ? buf[off + 15] : buf[off + 17];
    facts->fields.push_back(pf);
  }
  if (narrow) {
    size_t k = facts->fields.size();
    facts->header_length = unsigned(k <= 32 ? 521 : 16 * k + 9);
  }
  return true;
}
