// Calendar dates and date-times of the host.
//
// Days are counted in the proleptic Gregorian calendar. ZQDateTime counts days
// from the framework's epoch, Julian day number 1721423, so day 730122 is
// 2000-01-01 (Julian day 2451545).
#pragma once

#include <cstddef>
#include <cstdint>

#include "host/zqstring.h"

constexpr int32_t kZQEpochJulianDay = 1721423;

// Julian day number of a Gregorian date, and back.
int32_t JulianDayFromDate(int32_t year, int32_t month, int32_t day);
void DateFromJulianDay(int64_t jdn, int32_t& year, int32_t& month, int32_t& day);
// True when year/month/day name a real date (year 1 to 9999).
bool IsValidDate(int32_t year, int32_t month, int32_t day);

class ZQDate {
 public:
  ZQDate();  // today, local time
  ZQDate(int32_t year, int32_t month, int32_t day);
  int Year() const { return year_; }
  int Month() const { return month_; }
  int Day() const { return day_; }
  void Set(int32_t year, int32_t month, int32_t day) {
    year_ = year;
    month_ = month;
    day_ = day;
  }
  // Writes the date by a picture of y, m and d runs ("yyyymmdd",
  // "yyyy-mm-dd", "mm/dd/yy"); other characters are copied.
  void Print(ZQString& out, const char* picture) const;

 private:
  int32_t year_ = 0, month_ = 0, day_ = 0;
};

class ZQDateTime {
 public:
  ZQDateTime() = default;
  // `days` from the epoch above, `seconds` within the day; `third` is unused.
  ZQDateTime(int32_t days, int32_t seconds, int32_t third);
  int Year() const;
  int Month() const;
  int Day() const;
  int32_t Days() const { return days_; }
  int32_t Seconds() const { return seconds_; }
  // ISO 8601 "YYYY-MM-DDTHH:MM:SS".
  void PrintIso(ZQString& out) const;
  // The same into `buf` (at most `size` bytes with its NUL; kIsoSize holds
  // any): the length written.
  static constexpr size_t kIsoSize = 48;
  int PrintIso(char* buf, size_t size) const;

 private:
  int32_t days_ = 0;
  int32_t seconds_ = 0;
};
