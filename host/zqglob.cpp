#include "host/zqglob.h"

#include <strings.h>

#include <cstdlib>
#include <cstring>

#include "host/codepage.h"

int ZQGlob::sepfile(char* path, char* name, char* extension) {
  if (path == nullptr) return -1;
  char* slash = strrchr(path, '/');
  char* base = slash ? slash + 1 : path;
  char* dot = strrchr(base, '.');
  if (dot == base) dot = nullptr;  // ".hidden" is a name, not an extension
  if (extension != nullptr) strcpy(extension, dot ? dot + 1 : "");
  if (dot != nullptr) *dot = '\0';
  if (name != nullptr) memmove(name, base, strlen(base) + 1);
  *base = '\0';
  return 0;
}

void ZQGlob::appndnam(char* path, const char* name) {
  size_t n = strlen(path);
  if (n > 0 && path[n - 1] != '/') {
    path[n++] = '/';
    path[n] = '\0';
  }
  strcpy(path + n, name);
}

void ZQGlob::appndext(char* path, const char* extension) {
  strcat(path, ".");
  strcat(path, extension);
}

int ZQGlob::stricmp(const char* a, const char* b) { return strcasecmp(a ? a : "", b ? b : ""); }

bool ZQGlob::growbuf(unsigned size, char*& buffer, unsigned& capacity, char**) {
  if (buffer != nullptr && capacity >= size) return true;
  unsigned want = size < 64 ? 64 : size;
  char* grown = static_cast<char*>(realloc(buffer, want));
  if (grown == nullptr) return false;
  buffer = grown;
  capacity = want;
  return true;
}

void ZQGlob::freebuf(char* buffer) { free(buffer); }

void ZQGlob::ExternalToInternal(int codepage, ZQString& text) {
  if (codepage == 0) return;
  CodePageToUtf8(codepage, text);
}

void ZQGlob::InternalToExternal(int codepage, ZQString& text) {
  if (codepage == 0) return;
  Utf8ToCodePage(codepage, text);
}

bool ZQGlob::CodePageSupported(int codepage) { return codepage == 0 || CodePageTable(codepage) != nullptr; }
