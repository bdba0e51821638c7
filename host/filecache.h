// The page cache behind the platform layer's descriptors (_open, _read,
// _write, _lseek, _close). Index files are read and written a block at a time,
// in place, in any order; keeping their pages in memory turns the thousands of
// block reads and writes of a large index build into a few.
//
// Pages belong to the file (device and inode), not to a descriptor, so that
// the several descriptors a program opens on one index file see each other's
// writes at once. Changed pages go to the file when they are evicted and when
// the last descriptor of the file closes. The cache holds at most
// kMaxPages pages in all, whatever the file sizes: enough for the whole of
// an index of a few million keys, whose inserts land on random blocks (a
// smaller cache writes the same blocks out again and again). One thread at
// a time.
#pragma once

#include <cstdint>

namespace filecache {

constexpr int64_t kPage = 4096;
constexpr int64_t kMaxPages = 65536;  // 256 MiB

// Lowers (or restores) the number of pages held, for tests of eviction.
void SetPageBudget(int64_t pages);

// Takes over a descriptor just opened; `truncated` when the open cut the file.
void Attach(int fd, bool truncated);
// Writes the file's changed pages if `fd` was its last descriptor, and
// forgets `fd`. False when a write failed.
bool Detach(int fd);
bool Attached(int fd);

// Like pread and pwrite; -1 with errno on failure.
int64_t Read(int fd, void* buffer, int64_t count, int64_t offset);
int64_t Write(int fd, const void* buffer, int64_t count, int64_t offset);
// The file's length as the cache sees it (written pages included).
int64_t Size(int fd);

}  // namespace filecache
