#include "host/zqfile.h"

#include "host/journal.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

ZQFileProxy::ZQFileProxy() = default;

ZQFileProxy::~ZQFileProxy() {
  if (fd_ >= 0) close(true);
  free(buf_);
}

bool ZQFileProxy::fileExists(const char* path) { return path && access(path, F_OK) == 0; }

int ZQFileProxy::openfile(const char* path, const char* mode, ZQ_CSET) {
  if (fd_ >= 0) close(true);
  if (path == nullptr || mode == nullptr || path[0] == '\0') return -1;
  int flags;
  if (strcmp(mode, "rb") == 0 || strcmp(mode, "r") == 0) flags = O_RDONLY;
  else if (strcmp(mode, "r+b") == 0 || strcmp(mode, "rb+") == 0 || strcmp(mode, "r+") == 0) flags = O_RDWR;
  else if (strcmp(mode, "wb") == 0 || strcmp(mode, "w") == 0) flags = O_RDWR | O_CREAT | O_TRUNC;
  else return -1;
  // An open undo journal keeps the file's length (and the bytes a cut
  // loses) before the open.
  if (flags != O_RDONLY && !journal::BeforeOpen(path, (flags & O_TRUNC) != 0)) return -1;
  int fd = ::open(path, flags | O_CLOEXEC, 0644);
  if (fd < 0) return -1;
  if (flags != O_RDONLY) journal::Opened(fd);
  struct stat st;
  if (fstat(fd, &st) != 0 || S_ISDIR(st.st_mode)) {
    ::close(fd);
    return -1;
  }
  fd_ = fd;
  writable_ = flags != O_RDONLY;
  error_ = eof_ = false;
  buf_start_ = 0;
  buf_len_ = 0;
  dirty_lo_ = dirty_hi_ = -1;
  pos_ = 0;
  file_size_ = st.st_size;
  head_valid_ = false;
  head_len_ = 0;
  head_dirty_lo_ = head_dirty_hi_ = -1;
  return 0;
}

bool ZQFileProxy::LoadHead() {
  ssize_t n;
  do n = pread(fd_, head_, kHeadSize, 0);
  while (n < 0 && errno == EINTR);
  if (n < 0) {
    error_ = true;
    return false;
  }
  head_len_ = int32_t(n);
  head_valid_ = true;
  return true;
}

bool ZQFileProxy::WriteOut(const char* p, int64_t off, int64_t len) {
  if (error_) return false;
  if (!journal::BeforeWrite(fd_, off, len)) {
    error_ = true;
    return false;
  }
  while (len > 0) {
    ssize_t n = pwrite(fd_, p, size_t(len), off);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) {
      journal::NoteWriteError(n == 0 ? ENOSPC : errno, fd_);
      error_ = true;
      return false;
    }
    p += n;
    off += n;
    len -= n;
  }
  if (off > file_size_) file_size_ = off;
  return true;
}

bool ZQFileProxy::FlushHead() {
  if (head_dirty_lo_ < 0) return true;
  if (!WriteOut(head_ + head_dirty_lo_, head_dirty_lo_, head_dirty_hi_ - head_dirty_lo_)) return false;
  head_dirty_lo_ = head_dirty_hi_ = -1;
  return true;
}

bool ZQFileProxy::Restart(int64_t start) {
  if (!flush()) return false;
  // The main buffer must never hold header bytes while the window does.
  if (start < kHeadSize) head_valid_ = false;
  buf_start_ = start;
  buf_len_ = 0;
  return true;
}

bool ZQFileProxy::EnsureBuffer() {
  if (buf_ != nullptr) return true;
  buf_ = static_cast<char*>(malloc(kBufferSize));
  return buf_ != nullptr;
}

bool ZQFileProxy::flush() {
  if (fd_ < 0) return false;
  if (!FlushHead()) return false;
  if (dirty_lo_ < 0) return !error_;
  if (!WriteOut(buf_ + dirty_lo_, buf_start_ + dirty_lo_, dirty_hi_ - dirty_lo_)) return false;
  dirty_lo_ = dirty_hi_ = -1;
  return true;
}

int ZQFileProxy::close(bool) {
  if (fd_ < 0) return -1;
  bool ok = flush();
  journal::Closed(fd_);
  if (::close(fd_) != 0) ok = false;
  fd_ = -1;
  buf_len_ = 0;
  dirty_lo_ = dirty_hi_ = -1;
  head_valid_ = false;
  head_dirty_lo_ = head_dirty_hi_ = -1;
  return ok ? 0 : -1;
}

bool ZQFileProxy::Fill() {
  if (!Restart(pos_)) return false;
  if (!EnsureBuffer()) {
    error_ = true;
    return false;
  }
  while (buf_len_ < kBufferSize) {
    ssize_t n = pread(fd_, buf_ + buf_len_, size_t(kBufferSize - buf_len_), buf_start_ + buf_len_);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) {
      error_ = true;
      return false;
    }
    if (n == 0) break;
    buf_len_ += int32_t(n);
  }
  return true;
}

int ZQFileProxy::getch() {
  if (fd_ < 0) {
    error_ = true;
    return -1;
  }
  if (InHead()) {
    if (pos_ < head_len_) return static_cast<uint8_t>(head_[pos_++]);
    eof_ = error_ = true;
    return -1;
  }
  int64_t rel = pos_ - buf_start_;
  if (buf_ == nullptr || rel < 0 || rel >= buf_len_) {
    if (!Fill() || buf_len_ == 0) {
      eof_ = true;
      error_ = true;
      return -1;
    }
    rel = 0;
  }
  ++pos_;
  return static_cast<uint8_t>(buf_[rel]);
}

int32_t ZQFileProxy::read(char* buffer, int32_t n) {
  if (fd_ < 0 || n < 0) {
    error_ = true;
    return 0;
  }
  int32_t done = 0;
  while (done < n) {
    if (InHead()) {
      if (pos_ >= head_len_) break;  // the file ends inside its header
      int32_t take = int32_t(head_len_ - pos_ < n - done ? head_len_ - pos_ : n - done);
      memcpy(buffer + done, head_ + pos_, size_t(take));
      done += take;
      pos_ += take;
      continue;
    }
    int64_t rel = pos_ - buf_start_;
    if (buf_ != nullptr && rel >= 0 && rel < buf_len_) {
      int32_t take = int32_t(buf_len_ - rel < n - done ? buf_len_ - rel : n - done);
      memcpy(buffer + done, buf_ + rel, size_t(take));
      done += take;
      pos_ += take;
      continue;
    }
    if (n - done >= kBufferSize && pos_ >= kHeadSize) {  // large reads go straight to the caller
      if (!flush()) return done;
      ssize_t got = pread(fd_, buffer + done, size_t(n - done), pos_);
      if (got < 0 && errno == EINTR) continue;
      if (got < 0) {
        error_ = true;
        return done;
      }
      if (got == 0) break;
      done += int32_t(got);
      pos_ += got;
      continue;
    }
    if (!Fill()) return done;
    if (buf_len_ == 0) break;
  }
  if (done < n) eof_ = true;
  return done;
}

int32_t ZQFileProxy::write(const char* buffer, int32_t n) {
  if (fd_ < 0 || !writable_ || n < 0) {
    error_ = true;
    return 0;
  }
  if (error_) return 0;  // a failed write stays failed until cleared
  if (!EnsureBuffer()) {
    error_ = true;
    return 0;
  }
  int32_t done = 0;
  while (done < n) {
    int64_t rel = pos_ - buf_start_;
    bool in_main = rel >= 0 && rel <= buf_len_ && rel < kBufferSize;
    // Header bytes go to the window when the main buffer is elsewhere.
    if (pos_ < kHeadSize && (head_valid_ || !in_main || buf_len_ == 0) &&
        (buf_len_ == 0 || buf_start_ >= kHeadSize)) {
      if (!head_valid_ && !LoadHead()) return done;
      int32_t take = int32_t(kHeadSize - pos_ < n - done ? kHeadSize - pos_ : n - done);
      memcpy(head_ + pos_, buffer + done, size_t(take));
      int32_t lo = int32_t(pos_), hi = int32_t(pos_) + take;
      if (head_dirty_lo_ < 0 || lo < head_dirty_lo_) head_dirty_lo_ = lo;
      if (hi > head_dirty_hi_) head_dirty_hi_ = hi;
      if (hi > head_len_) {
        if (lo > head_len_) memset(head_ + head_len_, 0, size_t(lo - head_len_));  // a hole reads as zeros
        head_len_ = hi;
      }
      done += take;
      pos_ += take;
      continue;
    }
    // The buffer takes the bytes if they start inside or right behind its
    // valid bytes; otherwise it is flushed and restarted at the position.
    if (!in_main) {
      if (!Restart(pos_)) return done;
      rel = 0;
    }
    int32_t take = int32_t(kBufferSize - rel < n - done ? kBufferSize - rel : n - done);
    memcpy(buf_ + rel, buffer + done, size_t(take));
    int32_t lo = int32_t(rel), hi = int32_t(rel) + take;
    if (dirty_lo_ < 0 || lo < dirty_lo_) dirty_lo_ = lo;
    if (hi > dirty_hi_) dirty_hi_ = hi;
    if (hi > buf_len_) buf_len_ = hi;
    done += take;
    pos_ += take;
  }
  return done;
}

int ZQFileProxy::putch(int c) {
  char b = char(c);
  return write(&b, 1) == 1 ? (c & 0xFF) : -1;
}

int64_t ZQFileProxy::size() {
  if (fd_ < 0) return -1;
  // All writes go through this object, so the size known at open and grown
  // by flushes, with what waits in the buffer, is the size: no system call.
  int64_t s = file_size_;
  if (dirty_hi_ > 0 && buf_start_ + dirty_hi_ > s) s = buf_start_ + dirty_hi_;
  if (head_dirty_hi_ > s) s = head_dirty_hi_;
  return s;
}

int64_t ZQFileProxy::seek(int64_t offset, int whence) {
  if (fd_ < 0) {
    error_ = true;
    return -1;
  }
  int64_t base = whence == 0 ? 0 : whence == 1 ? pos_ : size();
  if (whence < 0 || whence > 2 || (offset > 0 && base > INT64_MAX - offset) || base + offset < 0) {
    error_ = true;
    return -1;
  }
  pos_ = base + offset;
  eof_ = false;
  return pos_;
}
