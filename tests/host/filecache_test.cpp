// The page cache behind the platform layer's descriptors: what one
// descriptor writes the others read at once, an open that truncates forgets
// the cached pages, pages evicted or left at close reach the file, and the
// file ends where the last write ended.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "host/filecache.h"
#include "host/platform.h"
#include "tests/support/dbf_builder.h"

namespace {

using tests::ReadFile;
using tests::ScratchPath;

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
    ASSERT_EQ(_lseek(fd, int32_t(int64_t(i) * filecache::kPage + 17), 0), int32_t(int64_t(i) * filecache::kPage + 17));
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
