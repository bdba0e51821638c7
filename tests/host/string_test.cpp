// ZQString as a counted byte string, ZQWString widening, and the endian
// helpers, on exact bytes.
#include <gtest/gtest.h>

#include <string>

#include "host/endian.h"
#include "host/zqstring.h"

namespace {

std::string Bytes(const ZQString& s) { return std::string(s.c_str(), size_t(s.length())); }

TEST(ZQStringTest, HoldsNulBytesAsContent) {
  ZQString s("a\0b", 3);
  EXPECT_EQ(s.length(), 3);
  EXPECT_EQ(s[1], '\0');
  EXPECT_EQ(s[2], 'b');
  EXPECT_EQ(s[3], '\0');   // outside the count: NUL, not a read past it
  EXPECT_EQ(s[-1], '\0');

  s += '\0';  // the char form appends even a NUL byte
  s += "cd";
  EXPECT_EQ(Bytes(s), std::string("a\0b\0cd", 6));

  ZQString copy(s);
  EXPECT_EQ(copy.length(), 6);
  EXPECT_TRUE(copy == s);

  s = "";  // empties and keeps the buffer
  EXPECT_EQ(s.length(), 0);
  EXPECT_GE(s.Capacity(), 6);
  s = copy;
  EXPECT_EQ(Bytes(s), std::string("a\0b\0cd", 6));
  s += s;  // appending itself
  EXPECT_EQ(Bytes(s), std::string("a\0b\0cda\0b\0cd", 12));
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
  EXPECT_EQ(Bytes(s), "adef");
  s.Remove(10, 3);  // a count past the end stops at the end
  EXPECT_EQ(Bytes(s), "ade");
  s.Remove(1, 7);  // a position past the end removes nothing
  EXPECT_EQ(Bytes(s), "ade");

  ZQString src("xbcx");
  ASSERT_TRUE(s.Insert(1, src, 2, 1));  // "bc" before 'd'
  EXPECT_EQ(Bytes(s), "abcde");
  ASSERT_TRUE(s.Insert(5, src, -1, 0));  // all of src at the end
  EXPECT_EQ(Bytes(s), "abcdexbcx");
  ASSERT_TRUE(s.Insert(0, s, 2, 0));  // from itself
  EXPECT_EQ(Bytes(s), "ababcdexbcx");

  ZQString a("12");
  ASSERT_TRUE(a.Append(ZQString("345"), 2, 1));
  EXPECT_EQ(Bytes(a), "1245");

  // Append may reach behind the count of its source into bytes of the
  // source's buffer: written bytes come back, never-written ones read as NUL,
  // and nothing beyond the buffer is read.
  ZQString room;
  ASSERT_TRUE(room.Allocate(8));
  char* buf = room.GetBuffer();
  buf[0] = 'p';
  buf[1] = 'q';
  buf[2] = 'r';
  room.SetLength(2);  // count 2; byte 2 becomes the terminating NUL
  ZQString b;
  ASSERT_TRUE(b.Append(room, 4, 0));
  EXPECT_EQ(Bytes(b), std::string("pq\0\0", 4));
  ZQString c;
  ASSERT_TRUE(c.Append(room, 1000000, 0));  // clamped to the buffer
  EXPECT_LE(c.length(), room.Capacity());

  ZQString d;
  ASSERT_TRUE(d.CopyN("hello world", 5, 6));
  EXPECT_EQ(Bytes(d), "world");
  ASSERT_TRUE(d.CopyN(ZQString("a\0bc", 4), 3, 1));
  EXPECT_EQ(Bytes(d), std::string("\0bc", 3));
  ASSERT_TRUE(d.CopyN(d, 2, 1));  // from itself
  EXPECT_EQ(Bytes(d), "bc");
  ZQString empty;
  ASSERT_TRUE(empty.CopyN(empty, 0, 0));
  EXPECT_EQ(empty.length(), 0);

  ZQString t("  ab  ");
  t.StripChars(false, true, ' ');
  EXPECT_EQ(Bytes(t), "  ab");
  t.StripChars(true, false, ' ');
  EXPECT_EQ(Bytes(t), "ab");
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

  uint8_t o[8] = {};
  PutLe16(o, 0xBEEF);
  EXPECT_EQ(o[0], 0xEF);
  EXPECT_EQ(o[1], 0xBE);
  PutBe16(o, 0xBEEF);
  EXPECT_EQ(o[0], 0xBE);
  EXPECT_EQ(o[1], 0xEF);
  PutLe32(o, 0xA1B2C3D4u);
  EXPECT_EQ(std::string(reinterpret_cast<char*>(o), 4), "\xD4\xC3\xB2\xA1");
  PutBe32(o, 0xA1B2C3D4u);
  EXPECT_EQ(std::string(reinterpret_cast<char*>(o), 4), "\xA1\xB2\xC3\xD4");
  PutLe64(o, 0x0102030405060708ull);
  EXPECT_EQ(std::string(reinterpret_cast<char*>(o), 8), "\x08\x07\x06\x05\x04\x03\x02\x01");
  PutBe64(o, 0x0102030405060708ull);
  EXPECT_EQ(std::string(reinterpret_cast<char*>(o), 8), "\x01\x02\x03\x04\x05\x06\x07\x08");
}

}  // namespace
