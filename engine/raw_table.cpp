#include "engine/raw_table.h"

#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "engine/dbf_source.h"
#include "host/endian.h"
#include "table/memo_format.h"

std::vector<RawField> RawFieldsOf(const std::vector<std::pair<std::string, std::string>>& facts) {
  std::vector<RawField> fields;
  int32_t offset = 0;
  for (const auto& f : facts) {
    if (f.first != "field") continue;
    size_t a = f.second.find('\t');
    if (a == std::string::npos || a + 1 >= f.second.size()) continue;
    size_t b = f.second.find('\t', a + 1);
    if (b == std::string::npos) continue;
    RawField d{f.second.substr(0, a), f.second[a + 1], offset, atoi(f.second.c_str() + b + 1)};
    offset += d.width;
    fields.push_back(d);
  }
  return fields;
}

int64_t MemoBlockOf(const char* p, int32_t width, bool vfp, bool smt, int64_t* length) {
  const auto* u = reinterpret_cast<const uint8_t*>(p);
  *length = -1;
  if (vfp && width == 4) return GetLe32(u);
  if (smt && width == kSmtPtrSize) {
    *length = GetLe32(u + kSmtPtrLength);
    return GetLe32(u + kSmtPtrBlock);
  }
  int32_t i = 0, n = width;
  while (i < n && p[i] == ' ') ++i;
  while (n > i && (p[n - 1] == ' ' || p[n - 1] == '\0')) --n;
  int64_t block = 0;
  for (int32_t k = i; k < n; ++k) {
    if (p[k] < '0' || p[k] > '9') return -1;
    block = block * 10 + (p[k] - '0');
    if (block > INT32_MAX) break;
  }
  return block;
}

std::string MemoFileTrouble(const std::string& table, std::string* memo, std::string* kind) {
  TableHeader h;
  if (!ReadTableHeader(table, &h) || h.size < 1) return "";
  // The kind by the version byte, as the module picks it.
  const uint8_t v = h.bytes[0];
  const char* ext = "dbt";
  if (v == 0xF5 || v == 0x30 || v == 0x31 || v == 0xB0) *kind = "FoxPro", ext = "fpt";
  else if (v == 0xE5) *kind = "Clipper SMT", ext = "smt";
  else if ((v & 0x08) != 0 && GuessDialect(table) != 7) *kind = "dBASE IV";
  else *kind = "dBASE III";
  std::string base = table;
  size_t dot = base.rfind('.');
  if (dot != std::string::npos && base.find('/', dot) == std::string::npos) base.resize(dot);
  std::string upper = ext;
  for (char& c : upper) c = char(toupper(static_cast<unsigned char>(c)));
  *memo = base + "." + ext;
  if (access(memo->c_str(), F_OK) != 0 && access((base + "." + upper).c_str(), F_OK) == 0) *memo = base + "." + upper;
  FILE* f = fopen(memo->c_str(), "rb");
  if (f == nullptr) return strerror(errno);
  uint8_t head[24] = {};
  size_t got = fread(head, 1, sizeof head, f);
  fclose(f);
  if (got == 0) return "empty file";
  char buf[96];
  if (*kind == "dBASE IV") {
    if (got < 20) return "shorter than its header";
    unsigned word = GetLe16(head + 18);
    if (word != 0x0101 && word != 0x0102) {
      snprintf(buf, sizeof buf, "its header's version word is 0x%04X, not 0x0101 or 0x0102", word);
      return buf;
    }
  }
  return "";
}
