// Path, comparison, buffer and code page helpers of the host; all static.
#pragma once

#include <cstdint>

#include "host/zqstring.h"

class ZQGlob {
 public:
  // Splits `path` in place: the directory (with its trailing separator) stays
  // in `path`, the base name goes to `name` and the extension without its
  // point to `extension`; a NULL out-parameter is skipped. `name` and
  // `extension` must have room for strlen(path) + 1 bytes. Returns 0.
  static int sepfile(char* path, char* name, char* extension);
  // Puts `name` behind the directory `path`, adding a separator if needed.
  static void appndnam(char* path, const char* name);
  // Puts "." and `extension` behind `path`.
  static void appndext(char* path, const char* extension);
  static int stricmp(const char* a, const char* b);
  // Makes `buffer` hold at least `size` bytes; false when memory runs out
  // (the old buffer then stays). `spare` is unused.
  static bool growbuf(unsigned size, char*& buffer, unsigned& capacity, char** spare);
  static void freebuf(char* buffer);

  // Converts text in place between a table's code page and UTF-8, the
  // engine's internal form. Code page 0 passes bytes through.
  static void ExternalToInternal(int codepage, ZQString& text);
  static void InternalToExternal(int codepage, ZQString& text);
  // True when the code page is 0 or one that ExternalToInternal converts.
  static bool CodePageSupported(int codepage);
};
