#include "host/platform.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <ctime>

#include "host/filecache.h"
#include "host/journal.h"

namespace {

// The file position of each descriptor that _open made, kept here so that a
// seek costs no system call: the index code seeks before every block it reads
// or writes. Their reads and writes go through the page cache. Descriptors
// beyond the table, or not made by _open, use the kernel's position.
constexpr int kTracked = 4096;
int64_t positions[kTracked];
bool tracked[kTracked];

bool Tracked(int fd) { return fd >= 0 && fd < kTracked && tracked[fd]; }

}  // namespace

int _open(const char* path, int flags, int mode) {
  int f = O_CLOEXEC;
  switch (flags & 3) {
    case kRtWriteOnly: f |= O_WRONLY; break;
    case kRtReadWrite: f |= O_RDWR; break;
    default: f |= O_RDONLY; break;
  }
  if (flags & kRtCreate) f |= O_CREAT;
  if (flags & kRtTruncate) f |= O_TRUNC;
  if (flags & kRtExclusive) f |= O_EXCL;
  bool writes = (flags & 3) != kRtReadOnly;
  if (writes && !journal::BeforeOpen(path, (flags & kRtTruncate) != 0)) return -1;
  int fd = ::open(path, f, mode);
  if (writes) journal::Opened(fd);
  if (fd >= 0 && fd < kTracked) {
    filecache::Attach(fd, (flags & kRtTruncate) != 0);
    tracked[fd] = filecache::Attached(fd);
    positions[fd] = 0;
  }
  return fd;
}

int _close(int fd) {
  bool written = true;
  if (Tracked(fd)) {
    tracked[fd] = false;
    written = filecache::Detach(fd);
  }
  int r = ::close(fd);
  journal::Closed(fd);
  return written ? r : -1;
}

int32_t _lseek(int fd, int32_t offset, int whence) {
  if (Tracked(fd) && whence != SEEK_END) {
    int64_t to = whence == SEEK_CUR ? positions[fd] + offset : int64_t(offset);
    if (whence != SEEK_SET && whence != SEEK_CUR) return -1;
    if (to < 0 || to > INT32_MAX) return -1;
    positions[fd] = to;
    return int32_t(to);
  }
  if (Tracked(fd)) {
    int64_t end = filecache::Size(fd) + offset;
    if (end < 0 || end > INT32_MAX) return -1;
    positions[fd] = end;
    return int32_t(end);
  }
  off_t r = ::lseek(fd, offset, whence);
  if (r < 0 || r > INT32_MAX) return -1;
  return int32_t(r);
}

int32_t _read(int fd, void* buffer, uint32_t count) {
  if (count > INT32_MAX) count = INT32_MAX;
  ssize_t n;
  if (Tracked(fd)) {
    n = filecache::Read(fd, buffer, count, positions[fd]);
    if (n > 0) positions[fd] += n;
    return int32_t(n);
  }
  do n = ::read(fd, buffer, count);
  while (n < 0 && errno == EINTR);
  return int32_t(n);
}

int32_t _write(int fd, const void* buffer, uint32_t count) {
  if (count > INT32_MAX) count = INT32_MAX;
  ssize_t n;
  if (Tracked(fd)) {
    n = filecache::Write(fd, buffer, count, positions[fd]);
    if (n > 0) positions[fd] += n;
    return int32_t(n);
  }
  if (journal::Active()) {
    off_t at = ::lseek(fd, 0, SEEK_CUR);
    if (at >= 0 && !journal::BeforeWrite(fd, at, count)) return -1;
  }
  do n = ::write(fd, buffer, count);
  while (n < 0 && errno == EINTR);
  if (n < 0) journal::NoteWriteError(errno, fd);
  return int32_t(n);
}

int _access(const char* path, int mode) {
  int m = F_OK;
  if (mode & 2) m |= W_OK;
  if (mode & 4) m |= R_OK;
  return ::access(path, m) == 0 ? 0 : -1;
}

int _unlink(const char* path) { return ::unlink(path); }

FILE* _fsopen(const char* path, const char* mode, int) { return fopen(path, mode); }

int64_t _time64(int64_t* out) {
  int64_t now = int64_t(time(nullptr));
  if (out != nullptr) *out = now;
  return now;
}

struct tm* _localtime64(const int64_t* t) {
  static struct tm result;
  if (t == nullptr) return nullptr;
  time_t tt = time_t(*t);
  return localtime_r(&tt, &result);
}
