// Single-byte code pages to and from UTF-8.
//
// Each code page's table is built once with iconv, byte by byte. A byte that
// the code page leaves undefined maps to the code point of the same number
// (U+0080 to U+00FF), as Windows does, so that converting and converting back
// gives the bytes again. Characters a code page can't hold become '?'.
#pragma once

#include <cstdint>

#include "host/zqstring.h"

struct CodePageMap {
  int codepage;
  uint32_t to_unicode[256];
  // Code points of bytes 0x80-0xFF in ascending order, with their bytes, for
  // the reverse lookup.
  uint32_t sorted_cp[128];
  uint8_t sorted_byte[128];
};

// The table of a code page, or NULL when iconv doesn't know it as a
// single-byte code page.
const CodePageMap* CodePageTable(int codepage);
void CodePageToUtf8(int codepage, ZQString& text);
void Utf8ToCodePage(int codepage, ZQString& text);
// How many characters of the UTF-8 text `s` (`n` bytes) Utf8ToCodePage would
// write as '?' (not in the code page, or not UTF-8); -1 for a code page
// without a table. A '?' of the text itself is no loss and isn't counted.
int32_t Utf8Unmappable(int codepage, const char* s, int32_t n);
