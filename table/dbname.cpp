// Descriptor names and header dates.
#include <cstring>

#include "host/platform.h"
#include "table/dbf.h"

void dbname(const char* src, char* dst) {
  memset(dst, 0, 11);
  for (int i = 0; i < 10 && src != nullptr && src[i] != '\0'; ++i) {
    char c = src[i];
    if (c >= 'a' && c <= 'z') c = char(c - 'a' + 'A');
    else if (!((c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9'))) c = '_';
    dst[i] = c;
  }
}

void dbdate(char* day, char* month, char* year) {
  int64_t now = _time64(nullptr);
  struct tm* t = _localtime64(&now);
  if (t == nullptr) {
    *day = 1;
    *month = 1;
    *year = 0;
    return;
  }
  *day = char(t->tm_mday);
  *month = char(t->tm_mon + 1);
  *year = char(t->tm_year % 100);
}
