// The file object's window over the first 512 bytes: header words written
// while the main buffer is elsewhere, read back and written out in order.
#include <gtest/gtest.h>

#include <string>

#include "host/zqfile.h"
#include "support/dbf_builder.h"

namespace {

TEST(ZQFileProxyWindow, HeaderWordsBesideAppendsReadBackAndLand) {
  std::string path = tests::WriteTemp("window.bin", tests::Bytes(600, 'a'));
  ZQFileProxy f;
  ASSERT_EQ(f.openfile(path.c_str(), "r+b", 0), 0);
  // As a memo file grows: a word at offset 0, then a block at the end, many
  // times; and a record that straddles offset 512.
  for (int i = 0; i < 200; ++i) {
    char word[4] = {char('0' + i % 10), 'w', 'x', 'y'};
    ASSERT_EQ(f.seek(0, 0), 0);
    ASSERT_EQ(f.write(word, 4), 4);
    std::string block(100, char('A' + i % 26));
    ASSERT_EQ(f.seek(600 + 100 * int64_t(i), 0), 600 + 100 * i);
    ASSERT_EQ(f.write(block.data(), 100), 100);
  }
  ASSERT_EQ(f.seek(500, 0), 500);
  ASSERT_EQ(f.write("0123456789abcdefghij", 20), 20);  // 500..520 across the edge
  // Reads see every write, before anything is flushed.
  char got[24] = {0};
  ASSERT_EQ(f.seek(0, 0), 0);
  ASSERT_EQ(f.read(got, 4), 4);
  EXPECT_EQ(std::string(got, 4), "9wxy");
  ASSERT_EQ(f.seek(505, 0), 505);
  ASSERT_EQ(f.read(got, 12), 12);
  EXPECT_EQ(std::string(got, 12), "56789abcdefg");
  ASSERT_EQ(f.seek(510, 0), 510);
  EXPECT_EQ(f.getch(), 'a');
  EXPECT_EQ(f.size(), 600 + 100 * 200);
  ASSERT_EQ(f.close(true), 0);

  tests::Bytes b = tests::ReadFile(path);
  ASSERT_EQ(b.size(), size_t(600 + 100 * 200));
  EXPECT_EQ(std::string(b.begin(), b.begin() + 4), "9wxy");
  EXPECT_EQ(std::string(b.begin() + 4, b.begin() + 8), "aaaa");
  EXPECT_EQ(std::string(b.begin() + 500, b.begin() + 520), "0123456789abcdefghij");
  EXPECT_EQ(b[600], 'A');
  EXPECT_EQ(b[600 + 100 * 199], char('A' + 199 % 26));
}

TEST(ZQFileProxyWindow, NewFileWrittenFromTheStart) {
  // A header written from offset 0 of an empty file, then records behind it:
  // the window and the buffer meet at 512 without a gap or an overlap.
  std::string path = tests::ScratchPath("new.bin");
  ZQFileProxy f;
  ASSERT_EQ(f.openfile(path.c_str(), "wb", 0), 0);
  std::string all;
  for (int i = 0; i < 1000; ++i) {
    std::string chunk(7, char('a' + i % 26));
    ASSERT_EQ(f.write(chunk.data(), 7), 7);
    all += chunk;
  }
  ASSERT_EQ(f.seek(1, 0), 1);  // a count in the header, as a close writes it
  ASSERT_EQ(f.write("XYZ", 3), 3);
  all.replace(1, 3, "XYZ");
  ASSERT_EQ(f.close(true), 0);
  tests::Bytes b = tests::ReadFile(path);
  EXPECT_EQ(std::string(b.begin(), b.end()), all);
}

}  // namespace
