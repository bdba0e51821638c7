// The host's utilities: ZQString as a counted byte string, ZQWString
// widening and the endian helpers on exact bytes; the bounded record map,
// message formatting, the keyword reader, path helpers, code pages and dates.
#include <gtest/gtest.h>

#include <array>
#include <cstdio>
#include <cstring>
#include <string>

#include "host/endian.h"
#include "host/zqdate.h"
#include "host/zqglob.h"
#include "host/zqhash.h"
#include "host/zqstring.h"
#include "host/zqutil.h"

namespace {

std::string Text(const ZQString& s) { return std::string(s.c_str(), size_t(s.length())); }

TEST(ZQStringTest, HoldsNulBytesAsContent) {
  ZQString s("a\0b", 3);
  EXPECT_EQ(s.length(), 3);
  EXPECT_EQ(s[1], '\0');
  EXPECT_EQ(s[2], 'b');
  EXPECT_EQ(s[3], '\0');   // outside the count: NUL, not a read past it
  EXPECT_EQ(s[-1], '\0');

  s += '\0';  // the char form appends even a NUL byte
  s += "cd";
  EXPECT_EQ(Text(s), std::string("a\0b\0cd", 6));

  ZQString copy(s);
  EXPECT_EQ(copy.length(), 6);
  EXPECT_TRUE(copy == s);

  s = "";  // empties and keeps the buffer
  EXPECT_EQ(s.length(), 0);
  EXPECT_GE(s.Capacity(), 6);
  s = copy;
  EXPECT_EQ(Text(s), std::string("a\0b\0cd", 6));
  s += s;  // appending itself
  EXPECT_EQ(Text(s), std::string("a\0b\0cda\0b\0cd", 12));
}

TEST(ZQStringTest, OrderIsUnsignedBytesWithPrefixFirst) {
  // The first differing byte decides, compared as unsigned: 0x80 sorts
  // above 0x7F, and NUL below every other byte.
  EXPECT_LT(ZQString("\x7F", 1), ZQString("\x80", 1));
  EXPECT_LT(ZQString("a\x00z", 3), ZQString("a\x01", 2));
  EXPECT_GT(ZQString("\xFF", 1), ZQString("zzzz", 4));
  // A prefix comes first, NUL bytes counted.
  EXPECT_LT(ZQString("ab", 2), ZQString("abc", 3));
  EXPECT_LT(ZQString("ab", 2), ZQString("ab\0", 3));
  EXPECT_LT(ZQString(), ZQString("\0", 1));
  EXPECT_TRUE(ZQString("ab\0", 3) != ZQString("ab", 2));
  EXPECT_TRUE(ZQString("ab", 2) <= ZQString("ab", 2));
  EXPECT_TRUE(ZQString("ab", 2) >= ZQString("ab", 2));
  EXPECT_TRUE(ZQString("abc") == "abc");
  EXPECT_TRUE(ZQString("abc") != "ab");
}

TEST(ZQStringTest, EditingOperations) {
  ZQString s("abcdef");
  s.Remove(2, 1);  // count first, then position
  EXPECT_EQ(Text(s), "adef");
  s.Remove(10, 3);  // a count past the end stops at the end
  EXPECT_EQ(Text(s), "ade");
  s.Remove(1, 7);  // a position past the end removes nothing
  EXPECT_EQ(Text(s), "ade");

  ZQString src("xbcx");
  ASSERT_TRUE(s.Insert(1, src, 2, 1));  // "bc" before 'd'
  EXPECT_EQ(Text(s), "abcde");
  ASSERT_TRUE(s.Insert(5, src, -1, 0));  // all of src at the end
  EXPECT_EQ(Text(s), "abcdexbcx");
  ASSERT_TRUE(s.Insert(0, s, 2, 0));  // from itself
  EXPECT_EQ(Text(s), "ababcdexbcx");

  ZQString a("12");
  ASSERT_TRUE(a.Append(ZQString("345"), 2, 1));
  EXPECT_EQ(Text(a), "1245");

  // Append may reach behind the count of its source into bytes of the
  // source's buffer: written bytes come back, never-written ones read as NUL,
  // and nothing beyond the buffer is read.
  ZQString room;
  ASSERT_TRUE(room.Allocate(8));
  memcpy(room.GetBuffer(), "pqr", 3);
  room.SetLength(2);  // count 2; byte 2 becomes the terminating NUL
  ZQString b;
  ASSERT_TRUE(b.Append(room, 4, 0));
  EXPECT_EQ(Text(b), std::string("pq\0\0", 4));
  ZQString c;
  ASSERT_TRUE(c.Append(room, 1000000, 0));  // clamped to the buffer
  EXPECT_LE(c.length(), room.Capacity());

  ZQString d;
  ASSERT_TRUE(d.CopyN("hello world", 5, 6));
  EXPECT_EQ(Text(d), "world");
  ASSERT_TRUE(d.CopyN(ZQString("a\0bc", 4), 3, 1));
  EXPECT_EQ(Text(d), std::string("\0bc", 3));
  ASSERT_TRUE(d.CopyN(d, 2, 1));  // from itself
  EXPECT_EQ(Text(d), "bc");
  ZQString empty;
  ASSERT_TRUE(empty.CopyN(empty, 0, 0));
  EXPECT_EQ(empty.length(), 0);

  ZQString t("  ab  ");
  t.StripChars(false, true, ' ');
  EXPECT_EQ(Text(t), "  ab");
  t.StripChars(true, false, ' ');
  EXPECT_EQ(Text(t), "ab");
  ZQString blanks("     ");
  blanks.StripChars(false, true, ' ');
  EXPECT_EQ(blanks.length(), 0);
}

TEST(ZQWStringTest, WidensUtf8AndKeepsOtherBytes) {
  ZQWString w;
  ASSERT_TRUE(w.Assign("t\xC3\xA9st.dbf", 0, -1));  // UTF-8 é
  EXPECT_EQ(w.length(), 8);
  EXPECT_EQ(w.c_str()[1], char16_t(0xE9));
  ASSERT_TRUE(w.Assign("\xE9x", 0, -1));  // not UTF-8: the byte as Latin-1
  EXPECT_EQ(w.length(), 2);
  EXPECT_EQ(w.c_str()[0], char16_t(0xE9));
  EXPECT_EQ(w.c_str()[2], char16_t(0));
}

TEST(EndianTest, ExactBytes) {
  const uint8_t b[8] = {0x78, 0x56, 0x34, 0x12, 0xFF, 0xFE, 0x80, 0x01};
  EXPECT_EQ(GetLe16(b), 0x5678);
  EXPECT_EQ(GetBe16(b), 0x7856);
  EXPECT_EQ(GetLe32(b), 0x12345678u);
  EXPECT_EQ(GetBe32(b), 0x78563412u);
  EXPECT_EQ(GetLe32(b + 4), 0x0180FEFFu);  // high bytes widen without sign
  EXPECT_EQ(GetBe32(b + 4), 0xFFFE8001u);
  EXPECT_EQ(GetLe64(b), 0x0180FEFF12345678ull);
  EXPECT_EQ(GetBe64(b), 0x78563412FFFE8001ull);

  // Each writer's bytes, as many as it writes.
  auto put = [](auto write, uint64_t v, size_t n) {
    uint8_t o[8] = {};
    write(o, v);
    return std::string(reinterpret_cast<char*>(o), n);
  };
  EXPECT_EQ(put(PutLe16, 0xBEEF, 2), "\xEF\xBE");
  EXPECT_EQ(put(PutBe16, 0xBEEF, 2), "\xBE\xEF");
  EXPECT_EQ(put(PutLe32, 0xA1B2C3D4u, 4), "\xD4\xC3\xB2\xA1");
  EXPECT_EQ(put(PutBe32, 0xA1B2C3D4u, 4), "\xA1\xB2\xC3\xD4");
  EXPECT_EQ(put(PutLe64, 0x0102030405060708ull, 8), "\x08\x07\x06\x05\x04\x03\x02\x01");
  EXPECT_EQ(put(PutBe64, 0x0102030405060708ull, 8), "\x01\x02\x03\x04\x05\x06\x07\x08");
}

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
  for (unsigned want : {10u, 5u, 5000u}) {
    ASSERT_TRUE(ZQGlob::growbuf(want, buffer, capacity, nullptr));
    EXPECT_GE(capacity, want);
  }
  ZQGlob::freebuf(buffer);
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
      // A byte the code page leaves undefined comes back as itself.
      {1252, "\x81", "\xC2\x81"},
      {1251, "\x98", "\xC2\x98"},
      {1253, "\xAA", "\xC2\xAA"},
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

TEST(ZQDateTest, EpochCalendarAndValidity) {
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
}

}  // namespace
