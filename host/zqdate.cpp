#include "host/zqdate.h"

#include <cstdio>
#include <cstring>
#include <ctime>

int32_t JulianDayFromDate(int32_t year, int32_t month, int32_t day) {
  // Fliegel and Van Flandern's conversion, in 64-bit to stay clear of overflow.
  int64_t a = (14 - month) / 12;
  int64_t y = int64_t(year) + 4800 - a;
  int64_t m = month + 12 * a - 3;
  return int32_t(day + (153 * m + 2) / 5 + 365 * y + y / 4 - y / 100 + y / 400 - 32045);
}

void DateFromJulianDay(int64_t jdn, int32_t& year, int32_t& month, int32_t& day) {
  int64_t a = jdn + 32044;
  int64_t b = (4 * a + 3) / 146097;
  int64_t c = a - 146097 * b / 4;
  int64_t d = (4 * c + 3) / 1461;
  int64_t e = c - 1461 * d / 4;
  int64_t m = (5 * e + 2) / 153;
  day = int32_t(e - (153 * m + 2) / 5 + 1);
  month = int32_t(m + 3 - 12 * (m / 10));
  year = int32_t(100 * b + d - 4800 + m / 10);
}

bool IsValidDate(int32_t year, int32_t month, int32_t day) {
  static const int8_t kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  if (year < 1 || year > 9999 || month < 1 || month > 12 || day < 1) return false;
  bool leap = (year % 4 == 0 && year % 100 != 0) || year % 400 == 0;
  return day <= kDays[month - 1] + (month == 2 && leap ? 1 : 0);
}

ZQDate::ZQDate() {
  time_t now = time(nullptr);
  struct tm local;
  localtime_r(&now, &local);
  year_ = local.tm_year + 1900;
  month_ = local.tm_mon + 1;
  day_ = local.tm_mday;
}

ZQDate::ZQDate(int32_t year, int32_t month, int32_t day) : year_(year), month_(month), day_(day) {}

void ZQDate::Print(ZQString& out, const char* picture) const {
  if (picture == nullptr) picture = "yyyymmdd";
  if (year_ == 0 && month_ == 0 && day_ == 0) {  // no date: blanks as wide as the picture
    out.Set(' ', int32_t(strlen(picture)));
    return;
  }
  if (strcmp(picture, "yyyymmdd") == 0 && year_ >= 0 && year_ <= 9999 && month_ >= 0 && month_ <= 99 &&
      day_ >= 0 && day_ <= 99) {
    char b[8] = {char('0' + year_ / 1000),     char('0' + year_ / 100 % 10), char('0' + year_ / 10 % 10),
                 char('0' + year_ % 10),       char('0' + month_ / 10),      char('0' + month_ % 10),
                 char('0' + day_ / 10),        char('0' + day_ % 10)};
    out.CopyN(b, 8, 0);
    return;
  }
  out = "";
  for (const char* p = picture; *p != '\0';) {
    char c = *p;
    int run = 0;
    while (p[run] == c) ++run;
    int32_t value;
    if (c == 'y' || c == 'Y') value = run <= 2 ? year_ % 100 : year_;
    else if (c == 'm' || c == 'M') value = month_;
    else if (c == 'd' || c == 'D') value = day_;
    else {
      out.Pad(c, run);
      p += run;
      continue;
    }
    char digits[16];
    int n = snprintf(digits, sizeof digits, "%0*d", run, int(value < 0 ? 0 : value));
    // A run shorter than the number keeps its rightmost digits.
    out += digits + (n > run ? n - run : 0);
    p += run;
  }
}

ZQDateTime::ZQDateTime(int32_t days, int32_t seconds, int32_t) : days_(days), seconds_(seconds) {}

int ZQDateTime::Year() const {
  int32_t y, m, d;
  DateFromJulianDay(int64_t{days_} + kZQEpochJulianDay, y, m, d);
  return y;
}
int ZQDateTime::Month() const {
  int32_t y, m, d;
  DateFromJulianDay(int64_t{days_} + kZQEpochJulianDay, y, m, d);
  return m;
}
int ZQDateTime::Day() const {
  int32_t y, m, d;
  DateFromJulianDay(int64_t{days_} + kZQEpochJulianDay, y, m, d);
  return d;
}

int ZQDateTime::PrintIso(char* buf, size_t size) const {
  int32_t y, m, d;
  DateFromJulianDay(int64_t{days_} + kZQEpochJulianDay, y, m, d);
  int64_t s = seconds_;
  int n = snprintf(buf, size, "%04d-%02d-%02dT%02d:%02d:%02d", int(y), int(m), int(d), int(s / 3600 % 100),
                   int(s / 60 % 60), int(s % 60));
  return n < 0 ? 0 : n < int(size) ? n : int(size) - 1;
}

void ZQDateTime::PrintIso(ZQString& out) const {
  char buf[kIsoSize];
  PrintIso(buf, sizeof buf);
  out = buf;
}
