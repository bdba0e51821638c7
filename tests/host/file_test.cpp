// ZQFileProxy: buffered reads, writes and seeks across buffer boundaries,
// read-after-write, the end and error states, and sticky write failure.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "host/zqfile.h"
#include "tests/support/read_harness.h"

namespace {

constexpr int32_t kBuf = ZQFileProxy::kBufferSize;

// Byte i of the pattern files: differs from its neighbours at every
// boundary the tests cross.
uint8_t Pattern(int64_t i) { return uint8_t((i * 7 + i / 251) & 0xFF); }

tests::Bytes PatternBytes(int64_t n) {
  tests::Bytes b(static_cast<size_t>(n));
  for (int64_t i = 0; i < n; ++i) b[size_t(i)] = Pattern(i);
  return b;
}

TEST(ZQFileProxyTest, ReadsAndSeeksAcrossBufferBoundaries) {
  const int64_t size = 3 * int64_t{kBuf} + 123;
  std::string path = tests::WriteScratch("file_read.bin", PatternBytes(size));
  ZQFileProxy f;
  ASSERT_EQ(f.openfile(path.c_str(), "rb", 0), 0);
  EXPECT_EQ(f.size(), size);

  // Byte by byte over the first boundary.
  ASSERT_EQ(f.seek(kBuf - 3, 0), kBuf - 3);
  for (int64_t i = kBuf - 3; i < kBuf + 3; ++i) ASSERT_EQ(f.getch(), Pattern(i)) << i;

  // A record-sized read that straddles the second boundary.
  std::vector<char> got(1000);
  ASSERT_EQ(f.seek(2 * int64_t{kBuf} - 500, 0), 2 * int64_t{kBuf} - 500);
  ASSERT_EQ(f.read(got.data(), 1000), 1000);
  for (int i = 0; i < 1000; ++i) ASSERT_EQ(uint8_t(got[size_t(i)]), Pattern(2 * kBuf - 500 + i)) << i;

  // Backwards, relative and from the end.
  ASSERT_EQ(f.seek(-1500, 1), 2 * int64_t{kBuf} - 1000);
  EXPECT_EQ(f.getch(), Pattern(2 * kBuf - 1000));
  ASSERT_EQ(f.seek(-2, 2), size - 2);
  EXPECT_EQ(f.getch(), Pattern(size - 2));
  EXPECT_EQ(f.getch(), Pattern(size - 1));

  // One read larger than the buffer, from an odd place.
  std::vector<char> big(size_t(kBuf) + 4096);
  ASSERT_EQ(f.seek(17, 0), 17);
  ASSERT_EQ(f.read(big.data(), int32_t(big.size())), int32_t(big.size()));
  for (size_t i = 0; i < big.size(); ++i) ASSERT_EQ(uint8_t(big[i]), Pattern(17 + int64_t(i))) << i;

  // A short read at the end sets the end state but no error.
  ASSERT_EQ(f.seek(size - 10, 0), size - 10);
  EXPECT_EQ(f.read(got.data(), 100), 10);
  EXPECT_TRUE(f.atEof());
  EXPECT_FALSE(f.hasError());

  // A negative target is refused with the error state; the position stays.
  EXPECT_EQ(f.seek(-1, 0), -1);
  EXPECT_TRUE(f.hasError());
  f.clearErrors();
  EXPECT_EQ(f.tell(), size);
  EXPECT_EQ(f.close(true), 0);
}

TEST(ZQFileProxyTest, GetchAtEndSetsEndAndErrorUntilCleared) {
  std::string path = tests::WriteScratch("file_eof.bin", {0x41, 0x42});
  ZQFileProxy f;
  ASSERT_EQ(f.openfile(path.c_str(), "rb", 0), 0);
  EXPECT_EQ(f.getch(), 0x41);
  EXPECT_EQ(f.getch(), 0x42);
  EXPECT_FALSE(f.hasError());
  EXPECT_EQ(f.getch(), -1);
  EXPECT_TRUE(f.atEof());
  EXPECT_TRUE(f.hasError());  // a byte-wise reader that runs off the file has met a cut structure
  EXPECT_EQ(f.getch(), -1);
  EXPECT_TRUE(f.hasError());  // and it stays set
  f.clearErrors();
  EXPECT_FALSE(f.hasError());
  EXPECT_FALSE(f.atEof());
  ASSERT_EQ(f.seek(0, 0), 0);
  EXPECT_EQ(f.getch(), 0x41);

  ZQFileProxy empty;
  std::string none = tests::WriteScratch("file_empty.bin", {});
  ASSERT_EQ(empty.openfile(none.c_str(), "rb", 0), 0);
  EXPECT_EQ(empty.getch(), -1);
  EXPECT_TRUE(empty.hasError());
}

TEST(ZQFileProxyTest, WritesReadBackBeforeAndAfterFlush) {
  const int64_t size = 2 * int64_t{kBuf} + 77;
  std::string path = tests::WriteScratch("file_write.bin", PatternBytes(size));
  tests::Bytes expect = PatternBytes(size);
  ZQFileProxy f;
  ASSERT_EQ(f.openfile(path.c_str(), "r+b", 0), 0);

  // Read into the buffer, then overwrite inside it and read straight back.
  EXPECT_EQ(f.getch(), Pattern(0));
  ASSERT_EQ(f.seek(100, 0), 100);
  ASSERT_EQ(f.write("ABCDE", 5), 5);
  for (int i = 0; i < 5; ++i) expect[size_t(100 + i)] = uint8_t("ABCDE"[i]);
  ASSERT_EQ(f.seek(98, 0), 98);
  char got[9];
  ASSERT_EQ(f.read(got, 9), 9);
  for (int i = 0; i < 9; ++i) EXPECT_EQ(uint8_t(got[i]), expect[size_t(98 + i)]) << i;

  // A write that straddles the first boundary, in odd-sized pieces.
  std::string piece(3001, 'x');
  for (size_t i = 0; i < piece.size(); ++i) piece[i] = char('a' + i % 26);
  ASSERT_EQ(f.seek(kBuf - 1500, 0), kBuf - 1500);
  ASSERT_EQ(f.write(piece.data(), 1000), 1000);
  ASSERT_EQ(f.write(piece.data() + 1000, 2001), 2001);
  for (size_t i = 0; i < piece.size(); ++i) expect[size_t(kBuf - 1500) + i] = uint8_t(piece[i]);
  // putch behind the end of the file grows it.
  ASSERT_EQ(f.seek(0, 2), size);
  EXPECT_EQ(f.putch(0x1A), 0x1A);
  expect.push_back(0x1A);
  EXPECT_EQ(f.size(), size + 1);

  // Everything reads back through the object before any flush...
  ASSERT_EQ(f.seek(0, 0), 0);
  std::vector<char> all(expect.size());
  ASSERT_EQ(f.read(all.data(), int32_t(all.size())), int32_t(all.size()));
  for (size_t i = 0; i < all.size(); ++i) ASSERT_EQ(uint8_t(all[i]), expect[i]) << i;
  // ...and from the disk after close.
  EXPECT_EQ(f.close(true), 0);
  EXPECT_EQ(tests::ReadFile(path), expect);
}

TEST(ZQFileProxyTest, WriteFailureIsStickyUntilCleared) {
  // /dev/full takes the bytes into the buffer and fails when they are flushed.
  ZQFileProxy f;
  ASSERT_EQ(f.openfile("/dev/full", "r+b", 0), 0);
  ASSERT_EQ(f.write("abc", 3), 3);
  EXPECT_FALSE(f.flush());
  EXPECT_TRUE(f.hasError());
  EXPECT_EQ(f.write("d", 1), 0);  // refused while failed
  EXPECT_EQ(f.putch('e'), -1);
  EXPECT_FALSE(f.flush());
  EXPECT_EQ(f.close(true), -1);

  // Writing to a file opened for reading fails the same way.
  std::string path = tests::WriteScratch("file_ro.bin", {1, 2, 3});
  ZQFileProxy ro;
  ASSERT_EQ(ro.openfile(path.c_str(), "rb", 0), 0);
  EXPECT_EQ(ro.write("x", 1), 0);
  EXPECT_TRUE(ro.hasError());
  EXPECT_EQ(ro.close(true), -1);  // the refused write is reported at close
  EXPECT_EQ(tests::ReadFile(path), (tests::Bytes{1, 2, 3}));

  ZQFileProxy bad;
  EXPECT_EQ(bad.openfile(tests::ScratchPath("no/such/dir/t.dbf").c_str(), "rb", 0), -1);
  EXPECT_EQ(bad.openfile(tests::ScratchPath("").c_str(), "rb", 0), -1);  // a directory
  EXPECT_EQ(bad.openfile(path.c_str(), "a+", 0), -1);                    // unknown mode
  EXPECT_FALSE(bad.isOpen());
  EXPECT_EQ(bad.getch(), -1);
  EXPECT_TRUE(bad.hasError());
}

TEST(ZQFileProxyTest, CreateModeTruncates) {
  std::string path = tests::WriteScratch("file_wb.bin", {9, 9, 9, 9});
  ZQFileProxy f;
  ASSERT_EQ(f.openfile(path.c_str(), "wb", 0), 0);
  EXPECT_EQ(f.size(), 0);
  ASSERT_EQ(f.write("\x01\x02", 2), 2);
  EXPECT_EQ(f.close(true), 0);
  EXPECT_EQ(tests::ReadFile(path), (tests::Bytes{1, 2}));
  EXPECT_TRUE(ZQFileProxy::fileExists(path.c_str()));
  EXPECT_FALSE(ZQFileProxy::fileExists(tests::ScratchPath("file_none.bin").c_str()));
}

// The window over the first 512 bytes: header words written while the main
// buffer is elsewhere, read back and written out in order.
TEST(ZQFileProxyWindow, HeaderWordsBesideAppendsReadBackAndLand) {
  std::string path = tests::WriteScratch("window.bin", tests::Bytes(600, 'a'));
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

}  // namespace
