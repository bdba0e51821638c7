// The host's utilities: the bounded record map, message formatting, the
// keyword reader, path helpers, code pages and dates.
#include <gtest/gtest.h>

#include <array>
#include <cstdio>
#include <cstring>
#include <string>

#include "host/zqdate.h"
#include "host/zqglob.h"
#include "host/zqhash.h"
#include "host/zqutil.h"

namespace {

std::string Text(const ZQString& s) { return std::string(s.c_str(), size_t(s.length())); }

TEST(ZQHashTableTest, StaysBoundedAndFindsTheLargestKeyNotAbove) {
  ZQHashTable map(512);
  int32_t found = 123;
  EXPECT_EQ(map.FindRec(5, found), nullptr);
  EXPECT_EQ(found, -1);

  // Physical number = 2 * logical + 1: every entry tells its own key.
  const int32_t keys = 200000;
  for (int32_t k = 0; k < keys; ++k) map.AddRec(k, 2 * int64_t{k} + 1, 0);
  EXPECT_LE(map.Count(), 4096);  // 512 asked for; a few thousand kept at most
  EXPECT_GT(map.Stride(), 1);
  for (int32_t k : {0, 1, 777, 65535, 65536, 123457, keys - 1, keys + 50}) {
    const ZQHashEntry* e = map.FindRec(k, found);
    ASSERT_NE(e, nullptr) << k;
    int32_t top = k < keys ? k : keys - 1;  // the largest key stored that may answer
    EXPECT_LE(found, top);
    EXPECT_LT(top - found, map.Stride());
    EXPECT_EQ(e->value, 2 * found + 1);
    EXPECT_EQ(e->key, found);
  }
  EXPECT_EQ(map.FindRec(-1, found), nullptr);

  map.Reset();
  EXPECT_EQ(map.Count(), 0);
  EXPECT_EQ(map.FindRec(10, found), nullptr);
  map.AddRec(0, 3, 0);
  map.AddRec(4, 9, 0);
  map.AddRec(4, 11, 0);  // the same key again replaces the value
  EXPECT_EQ(map.FindRec(3, found)->value, 3);
  EXPECT_EQ(found, 0);
  EXPECT_EQ(map.FindRec(4, found)->value, 11);
  EXPECT_EQ(map.FindRec(1000, found)->value, 11);
  EXPECT_EQ(found, 4);
}

template <typename... Args>
std::string Fmt(const wchar* format, Args... args) {
  ZQString out;
  FormatMessage(out, format, args...);
  return Text(out);
}

TEST(MessageFormatTest, WideNarrowNumbersAndPositions) {
  EXPECT_EQ(Fmt(u"Error opening data file %s", u"/tmp/t\u00e9.dbf"),
            "Error opening data file /tmp/t\xC3\xA9.dbf");  // wide in, UTF-8 out
  EXPECT_EQ(Fmt(u"narrow %S, also %hs", "a.dbf", "b"), "narrow a.dbf, also b");
  EXPECT_EQ(Fmt(u"Error retrieving record %ld", int32_t(-17)), "Error retrieving record -17");
  EXPECT_EQ(Fmt(u"Field %d extends beyond end of record", int32_t(3)), "Field 3 extends beyond end of record");
  EXPECT_EQ(Fmt(u"%lld|%5d|%-3d|%03d|%x|%%", int64_t{1} << 40, int32_t(42), int32_t(7), int32_t(5), int32_t(255)),
            "1099511627776|   42|7  |005|ff|%");
  // Positional arguments, taken in their own order.
  EXPECT_EQ(Fmt(u"%2$s has %1$d fields; %2$s", int32_t(4), u"t.dbf"), "t.dbf has 4 fields; t.dbf");
  EXPECT_EQ(Fmt(u"%s and %S", static_cast<const wchar*>(nullptr), static_cast<const char*>(nullptr)),
            "(null) and (null)");
  EXPECT_EQ(Fmt(u"trailing %"), "trailing %");
  EXPECT_EQ(Fmt(u"\U0001F600"), "\xF0\x9F\x98\x80");  // a surrogate pair becomes one 4-byte character
}

// The next line of `text` as "keyword=value", or "" when none is left.
std::string NextLine(ZQString& text) {
  char keyword[kKeywordSize];
  if (!NextKeyword(keyword, text)) return "";
  ZQString value;
  value.Extract(text);
  return std::string(keyword) + "=" + Text(value);
}

TEST(NextKeywordTest, TakesLinesOffAndExtractsTheirValues) {
  ZQString text("version= dBASE IV\r\n\n   \nindex number =  3  \nflag\n");
  EXPECT_EQ(NextLine(text), "version=dBASE IV");
  EXPECT_EQ(NextLine(text), "index number=3");  // blank lines are skipped
  EXPECT_EQ(NextLine(text), "flag=");           // a line without '='
  EXPECT_EQ(NextLine(text), "");
  EXPECT_EQ(text.length(), 0);
  // A keyword longer than the room is cut, not overrun.
  ZQString longer(std::string(200, 'k').append("=v").c_str());
  EXPECT_EQ(NextLine(longer), std::string(kKeywordSize - 1, 'k') + "=v");
  ZQString last("version=6");  // no newline at the end
  EXPECT_EQ(NextLine(last), "version=6");
  EXPECT_EQ(NextLine(last), "");
}

// sepfile's three parts of `path`, joined by '|'.
std::string Split(const char* path, bool with_ext = true) {
  char dir[64], name[64], ext[64] = "";
  snprintf(dir, sizeof dir, "%s", path);
  ZQGlob::sepfile(dir, name, with_ext ? ext : nullptr);
  return std::string(dir) + "|" + name + "|" + ext;
}

TEST(ZQGlobTest, SplitsAndJoinsPaths) {
  EXPECT_EQ(Split("/data/dir/table.dbf"), "/data/dir/|table|dbf");
  EXPECT_EQ(Split("a.b.DBF"), "|a.b|DBF");  // the last point starts the extension
  EXPECT_EQ(Split("/x.y/table", false), "/x.y/|table|");  // a point in the directory is no extension
  EXPECT_EQ(Split("dir/.hidden"), "dir/|.hidden|");
  char path[64] = "/data/dir/";
  ZQGlob::appndnam(path, "table");
  EXPECT_STREQ(path, "/data/dir/table");
  ZQGlob::appndext(path, "fpt");
  EXPECT_STREQ(path, "/data/dir/table.fpt");
  char plain[64] = "";
  ZQGlob::appndnam(plain, "a.b");
  EXPECT_STREQ(plain, "a.b");
  char nodir[64] = "/tmp";
  ZQGlob::appndnam(nodir, "t");
  EXPECT_STREQ(nodir, "/tmp/t");

  char* buffer = nullptr;
  unsigned capacity = 0;
  ASSERT_TRUE(ZQGlob::growbuf(10, buffer, capacity, nullptr));
  EXPECT_GE(capacity, 10u);
  char* before = buffer;
  ASSERT_TRUE(ZQGlob::growbuf(5, buffer, capacity, nullptr));  // only grows
  EXPECT_EQ(buffer, before);
  ASSERT_TRUE(ZQGlob::growbuf(5000, buffer, capacity, nullptr));
  EXPECT_GE(capacity, 5000u);
  ZQGlob::freebuf(buffer);
  ZQGlob::freebuf(nullptr);
}

TEST(CodePageTest, ToUtf8AndBack) {
  struct Case {
    int codepage;
    const char* bytes;
    const char* utf8;
  };
  const Case cases[] = {
      {437, "\x82\x9B", "\xC3\xA9\xC2\xA2"},          // é ¢
      {850, "\x82\x9B", "\xC3\xA9\xC3\xB8"},          // é ø
      {852, "\x8A\xA5", "\xC5\x90\xC4\x85"},          // Ő ą
      {866, "\x80\x82", "\xD0\x90\xD0\x92"},          // А В
      {1250, "\x8A\xC0", "\xC5\xA0\xC5\x94"},         // Š Ŕ
      {1251, "\xC0\x80", "\xD0\x90\xD0\x82"},         // А Ђ
      {1252, "\x80\xC0", "\xE2\x82\xAC\xC3\x80"},     // € À
      {1253, "\xC1\xC0", "\xCE\x91\xCE\x90"},         // Α ΐ
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.codepage);
    ASSERT_TRUE(ZQGlob::CodePageSupported(c.codepage));
    ZQString s((std::string("ab ") + c.bytes).c_str());
    ZQGlob::ExternalToInternal(c.codepage, s);
    EXPECT_EQ(Text(s), std::string("ab ") + c.utf8);
    ZQGlob::InternalToExternal(c.codepage, s);
    EXPECT_EQ(Text(s), std::string("ab ") + c.bytes);
  }

  // A byte the code page leaves undefined comes back as itself.
  const Case undefined[] = {{1252, "\x81", "\xC2\x81"}, {1251, "\x98", "\xC2\x98"}, {1253, "\xAA", "\xC2\xAA"}};
  for (const Case& c : undefined) {
    SCOPED_TRACE(c.codepage);
    ZQString s(c.bytes);
    ZQGlob::ExternalToInternal(c.codepage, s);
    EXPECT_EQ(Text(s), c.utf8);
    ZQGlob::InternalToExternal(c.codepage, s);
    EXPECT_EQ(Text(s), c.bytes);
  }

  // A character the code page can't hold, and bytes that aren't UTF-8, become
  // '?'; plain ASCII and code page 0 pass as they are.
  ZQString s("\xD0\x96|\xFF|abc");
  ZQGlob::InternalToExternal(1252, s);
  EXPECT_EQ(Text(s), "?|?|abc");
  ZQString nul("a\0b", 3);
  ZQGlob::ExternalToInternal(850, nul);
  EXPECT_EQ(Text(nul), std::string("a\0b", 3));
  ZQString raw("\x82");
  ZQGlob::ExternalToInternal(0, raw);
  EXPECT_EQ(Text(raw), "\x82");
  EXPECT_FALSE(ZQGlob::CodePageSupported(99998));
  ZQGlob::ExternalToInternal(99998, raw);  // unknown: left alone
  EXPECT_EQ(Text(raw), "\x82");
}

TEST(ZQDateTest, EpochCalendarAndPictures) {
  ZQDateTime t(730122, 1, 0);
  EXPECT_EQ(t.Year() * 10000 + t.Month() * 100 + t.Day(), 20000101);
  ZQString iso;
  t.PrintIso(iso);
  EXPECT_EQ(Text(iso), "2000-01-01T00:00:01");
  ZQDateTime(730122 + 59, 86399, 0).PrintIso(iso);  // 2000 is a leap year
  EXPECT_EQ(Text(iso), "2000-02-29T23:59:59");
  EXPECT_EQ(JulianDayFromDate(2000, 1, 1), 2451545);
  EXPECT_EQ(JulianDayFromDate(1970, 1, 1), 2440588);
  int32_t y, m, d;
  DateFromJulianDay(2440588, y, m, d);
  EXPECT_EQ(y * 10000 + m * 100 + d, 19700101);

  EXPECT_TRUE(IsValidDate(2000, 2, 29));
  for (auto d : {std::array<int32_t, 3>{1900, 2, 29}, {2023, 2, 29}, {2023, 13, 1}, {0, 1, 1}})
    EXPECT_FALSE(IsValidDate(d[0], d[1], d[2])) << d[0] << "-" << d[1] << "-" << d[2];

  for (auto c : {std::pair<const char*, const char*>{"yyyymmdd", "20240209"}, {"mm/dd/yy", "02/09/24"},
                 {"yyyy-mm-dd", "2024-02-09"}}) {
    ZQString out;
    ZQDate(2024, 2, 9).Print(out, c.first);
    EXPECT_EQ(Text(out), c.second);
  }
  ZQDate today;
  EXPECT_TRUE(IsValidDate(today.Year(), today.Month(), today.Day()));
}

}  // namespace
