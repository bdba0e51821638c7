#include "host/codepage.h"

#include "host/bytescan.h"

#include <iconv.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {

constexpr int kMaxTables = 16;
CodePageMap* g_tables[kMaxTables];
int g_failed[kMaxTables];
int g_table_count = 0;
int g_failed_count = 0;

bool BuildTable(int codepage, CodePageMap* map) {
  char name[32];
  snprintf(name, sizeof name, "CP%d", codepage);
  iconv_t cd = iconv_open("UTF-32LE", name);
  if (cd == iconv_t(-1)) return false;
  map->codepage = codepage;
  bool single_byte = true;
  for (int b = 0; b < 256; ++b) {
    char in = char(b);
    unsigned char out[8];
    char* ip = &in;
    size_t il = 1;
    char* op = reinterpret_cast<char*>(out);
    size_t ol = sizeof out;
    iconv(cd, nullptr, nullptr, nullptr, nullptr);
    size_t r = iconv(cd, &ip, &il, &op, &ol);
    if (r == size_t(-1) && il == 1 && b >= 0x80) {
      map->to_unicode[b] = uint32_t(b);  // undefined: same number (see header)
      continue;
    }
    if (r == size_t(-1) || sizeof out - ol != 4) {
      single_byte = false;  // a lead byte of a multi-byte code page
      break;
    }
    map->to_unicode[b] = uint32_t(out[0]) | uint32_t(out[1]) << 8 | uint32_t(out[2]) << 16 |
                         uint32_t(out[3]) << 24;
  }
  iconv_close(cd);
  if (!single_byte) return false;
  // Insertion sort of the upper half by code point for the reverse lookup.
  for (int i = 0; i < 128; ++i) {
    uint32_t cp = map->to_unicode[0x80 + i];
    int j = i;
    while (j > 0 && map->sorted_cp[j - 1] > cp) {
      map->sorted_cp[j] = map->sorted_cp[j - 1];
      map->sorted_byte[j] = map->sorted_byte[j - 1];
      --j;
    }
    map->sorted_cp[j] = cp;
    map->sorted_byte[j] = uint8_t(0x80 + i);
  }
  return true;
}

int PutUtf8(uint32_t cp, char* out) {
  if (cp < 0x80) {
    out[0] = char(cp);
    return 1;
  }
  if (cp < 0x800) {
    out[0] = char(0xC0 | cp >> 6);
    out[1] = char(0x80 | (cp & 0x3F));
    return 2;
  }
  if (cp < 0x10000) {
    out[0] = char(0xE0 | cp >> 12);
    out[1] = char(0x80 | (cp >> 6 & 0x3F));
    out[2] = char(0x80 | (cp & 0x3F));
    return 3;
  }
  out[0] = char(0xF0 | cp >> 18);
  out[1] = char(0x80 | (cp >> 12 & 0x3F));
  out[2] = char(0x80 | (cp >> 6 & 0x3F));
  out[3] = char(0x80 | (cp & 0x3F));
  return 4;
}

}  // namespace

const CodePageMap* CodePageTable(int codepage) {
  for (int i = 0; i < g_table_count; ++i)
    if (g_tables[i]->codepage == codepage) return g_tables[i];
  for (int i = 0; i < g_failed_count; ++i)
    if (g_failed[i] == codepage) return nullptr;
  if (codepage <= 0 || codepage > 99999) return nullptr;
  auto* map = static_cast<CodePageMap*>(calloc(1, sizeof(CodePageMap)));
  if (map == nullptr) return nullptr;
  if (!BuildTable(codepage, map) || g_table_count == kMaxTables) {
    free(map);
    if (g_failed_count < kMaxTables) g_failed[g_failed_count++] = codepage;
    return nullptr;
  }
  g_tables[g_table_count++] = map;
  return map;
}

void CodePageToUtf8(int codepage, ZQString& text) {
  int32_t n = text.length();
  const auto* p = reinterpret_cast<const uint8_t*>(text.c_str());
  // Plain ASCII reads the same in every code page here.
  if (!bytescan::HasHighBit(text.c_str(), size_t(n))) return;
  const CodePageMap* map = CodePageTable(codepage);
  if (map == nullptr) return;
  static ZQString out;  // scratch swapped with the text: no allocation per field
  if (!out.Allocate(n * 3)) return;
  char* o = out.GetBuffer();
  int32_t k = 0;
  for (int32_t i = 0; i < n; ++i) {
    if (p[i] < 0x80) o[k++] = char(p[i]);
    else k += PutUtf8(map->to_unicode[p[i]], o + k);
  }
  out.SetLength(k);
  text.Swap(out);
}

namespace {

// The byte of the code page for the UTF-8 character at p[*i] (of n bytes),
// moving *i past it; -1 for a character the code page lacks, or a byte that
// is no UTF-8.
int MapUtf8Char(const CodePageMap* map, const uint8_t* p, int32_t n, int32_t* at) {
  int32_t i = *at;
  uint32_t c = p[i];
  int extra = c >= 0xF0 && c < 0xF8 ? 3 : c >= 0xE0 && c < 0xF0 ? 2 : c >= 0xC2 && c < 0xE0 ? 1 : 0;
  uint32_t cp = c;
  bool ok = c < 0x80 || (extra > 0 && i + extra < n);
  if (extra > 0 && ok) {
    cp = c & (0x3F >> extra);
    for (int j = 1; j <= extra; ++j) {
      if ((p[i + j] & 0xC0) != 0x80) ok = false;
      cp = cp << 6 | (p[i + j] & 0x3F);
    }
  }
  if (!ok || (c >= 0x80 && extra == 0)) {
    *at = i + 1;  // not UTF-8
    return -1;
  }
  *at = i + extra + 1;
  if (cp < 0x80 && map->to_unicode[cp] == cp) return int(cp);
  int lo = 0, hi = 128;
  while (lo < hi) {
    int mid = (lo + hi) / 2;
    if (map->sorted_cp[mid] < cp) lo = mid + 1;
    else hi = mid;
  }
  if (lo < 128 && map->sorted_cp[lo] == cp) return map->sorted_byte[lo];
  int b = 0;
  while (b < 0x80 && map->to_unicode[b] != cp) ++b;  // low half of odd code pages
  return b < 0x80 ? b : -1;
}

}  // namespace

void Utf8ToCodePage(int codepage, ZQString& text) {
  int32_t n = text.length();
  const auto* p = reinterpret_cast<const uint8_t*>(text.c_str());
  if (!bytescan::HasHighBit(text.c_str(), size_t(n))) return;  // ASCII is the same in every code page here
  const CodePageMap* map = CodePageTable(codepage);
  if (map == nullptr) return;
  static ZQString out;
  if (!out.Allocate(n)) return;
  char* o = out.GetBuffer();
  int32_t k = 0;
  for (int32_t i = 0; i < n;) {
    int b = MapUtf8Char(map, p, n, &i);
    o[k++] = b < 0 ? '?' : char(b);
  }
  out.SetLength(k);
  text.Swap(out);
}

int32_t Utf8Unmappable(int codepage, const char* s, int32_t n) {
  const CodePageMap* map = CodePageTable(codepage);
  if (map == nullptr) return -1;
  if (!bytescan::HasHighBit(s, size_t(n))) return 0;
  const auto* p = reinterpret_cast<const uint8_t*>(s);
  int32_t lost = 0;
  for (int32_t i = 0; i < n;) lost += MapUtf8Char(map, p, n, &i) < 0;
  return lost;
}
