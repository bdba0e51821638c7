// ZQFileProxy: buffered reads, writes and seeks across buffer boundaries,
// read-after-write, the end and error states, and sticky write failure.
// The page cache behind the platform layer's descriptors: what one
// descriptor writes the others read at once, an open that truncates forgets
// the cached pages, pages evicted or left at close reach the file, and the
// file ends where the last write ended.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "host/filecache.h"
#include "host/platform.h"
#include "host/zqfile.h"
#include "tests/support/read_harness.h"

namespace {

using tests::ReadFile;
using tests::ScratchPath;

constexpr int32_t kBuf = ZQFileProxy::kBufferSize;

// Byte i of the pattern files: differs from its neighbours at every
// boundary the tests cross.
uint8_t Pattern(int64_t i) { return uint8_t((i * 7 + i / 251) & 0xFF); }

tests::Bytes PatternBytes(int64_t n) {
  tests::Bytes b(static_cast<size_t>(n));
  for (int64_t i = 0; i < n; ++i) b[size_t(i)] = Pattern(i);
  return b;
}

TEST(ZQFileProxyTest, ReadsWritesAndSeeksAcrossBufferBoundaries) {
  const int64_t size = 2 * int64_t{kBuf} + 77;
  std::string path = tests::WriteScratch("file_rw.bin", PatternBytes(size));
  tests::Bytes expect = PatternBytes(size);
  ZQFileProxy f;
  ASSERT_EQ(f.openfile(path.c_str(), "r+b", 0), 0);
  EXPECT_EQ(f.size(), size);

  // Byte by byte over the first boundary, then back by a relative seek.
  ASSERT_EQ(f.seek(kBuf - 3, 0), kBuf - 3);
  for (int64_t i = kBuf - 3; i < kBuf + 3; ++i) ASSERT_EQ(f.getch(), Pattern(i)) << i;
  ASSERT_EQ(f.seek(-1000, 1), kBuf - 997);
  EXPECT_EQ(f.getch(), Pattern(kBuf - 997));

  // A short read at the end sets the end state but no error.
  char got[100];
  ASSERT_EQ(f.seek(-10, 2), size - 10);
  EXPECT_EQ(f.read(got, 100), 10);
  EXPECT_TRUE(f.atEof());
  EXPECT_FALSE(f.hasError());
  // A negative target is refused with the error state; the position stays.
  EXPECT_EQ(f.seek(-1, 0), -1);
  EXPECT_TRUE(f.hasError());
  f.clearErrors();
  EXPECT_EQ(f.tell(), size);

  // Read into the buffer, then overwrite inside it and read straight back.
  ASSERT_EQ(f.seek(0, 0), 0);
  EXPECT_EQ(f.getch(), Pattern(0));
  ASSERT_EQ(f.seek(100, 0), 100);
  ASSERT_EQ(f.write("ABCDE", 5), 5);
  for (int i = 0; i < 5; ++i) expect[size_t(100 + i)] = uint8_t("ABCDE"[i]);
  ASSERT_EQ(f.seek(98, 0), 98);
  ASSERT_EQ(f.read(got, 9), 9);
  EXPECT_EQ(tests::Bytes(got, got + 9), tests::Bytes(&expect[98], &expect[107]));

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

  // Everything reads back through the object before any flush (most of it
  // in one read larger than the buffer)...
  ASSERT_EQ(f.seek(0, 0), 0);
  tests::Bytes all(expect.size());
  ASSERT_EQ(f.read(reinterpret_cast<char*>(all.data()), int32_t(all.size())), int32_t(all.size()));
  EXPECT_EQ(all, expect);
  // ...and from the disk after close.
  EXPECT_EQ(f.close(true), 0);
  EXPECT_EQ(tests::ReadFile(path), expect);
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

TEST(FileCache, DescriptorsOfOneFileShareItsPages) {
  std::string path = ScratchPath("cache-share.bin");
  int a = _open(path.c_str(), kRtReadWrite | kRtCreate | kRtTruncate | kRtBinary);
  int b = _open(path.c_str(), kRtReadWrite | kRtBinary);
  ASSERT_GE(a, 0);
  ASSERT_GE(b, 0);
  ASSERT_EQ(_lseek(a, 5000, 0), 5000);
  ASSERT_EQ(_write(a, "abc", 3), 3);
  EXPECT_EQ(_lseek(b, 0, 2), 5003);  // the end as written, not yet on disk
  char got[4] = {};
  ASSERT_EQ(_lseek(b, 5000, 0), 5000);
  ASSERT_EQ(_read(b, got, 8), 3);  // a read stops at the end
  EXPECT_STREQ(got, "abc");
  EXPECT_EQ(ReadFile(path).size(), 0u);  // nothing written back while both are open
  _close(a);
  EXPECT_EQ(ReadFile(path).size(), 0u);
  _close(b);
  tests::Bytes file = ReadFile(path);
  ASSERT_EQ(file.size(), 5003u);
  EXPECT_EQ(file[4999], 0);
  EXPECT_EQ(std::string(file.begin() + 5000, file.end()), "abc");
}

TEST(FileCache, ATruncatingOpenForgetsThePages) {
  std::string path = ScratchPath("cache-trunc.bin");
  int a = _open(path.c_str(), kRtReadWrite | kRtCreate | kRtTruncate | kRtBinary);
  ASSERT_EQ(_write(a, "old text", 8), 8);
  int b = _open(path.c_str(), kRtReadWrite | kRtCreate | kRtTruncate | kRtBinary);
  EXPECT_EQ(_lseek(a, 0, 2), 0);
  ASSERT_EQ(_write(b, "new", 3), 3);
  _close(b);
  _close(a);
  tests::Bytes file = ReadFile(path);
  EXPECT_EQ(std::string(file.begin(), file.end()), "new");
}

TEST(FileCache, EvictedPagesReachTheFileWhole) {
  // More pages than the cache holds: the first ones are evicted while the
  // file is open and must come back as written.
  std::string path = ScratchPath("cache-evict.bin");
  int fd = _open(path.c_str(), kRtReadWrite | kRtCreate | kRtTruncate | kRtBinary);
  filecache::SetPageBudget(64);
  const int pages = 64 + 100;
  std::vector<char> page(filecache::kPage);
  for (int i = 0; i < pages; ++i) {
    std::fill(page.begin(), page.end(), char('a' + i % 26));
    ASSERT_EQ(_write(fd, page.data(), uint32_t(page.size())), int32_t(page.size()));
  }
  char c = 0;
  for (int i : {0, 1, pages / 2, pages - 1}) {
    const int32_t at = int32_t(int64_t(i) * filecache::kPage + 17);
    ASSERT_EQ(_lseek(fd, at, 0), at);
    ASSERT_EQ(_read(fd, &c, 1), 1);
    EXPECT_EQ(c, char('a' + i % 26)) << i;
  }
  ASSERT_EQ(_close(fd), 0);
  tests::Bytes file = ReadFile(path);
  ASSERT_EQ(file.size(), size_t(pages) * size_t(filecache::kPage));
  EXPECT_EQ(file[0], 'a');
  EXPECT_EQ(file[size_t(pages - 1) * size_t(filecache::kPage)], char('a' + (pages - 1) % 26));
  filecache::SetPageBudget(filecache::kMaxPages);
}

}  // namespace
