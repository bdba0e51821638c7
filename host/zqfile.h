// The host's file object for table and memo files.
//
// One buffer serves reads and writes: it always holds valid bytes of the file
// from `buf_start_` on, those read from the file and those written but not yet
// flushed. Byte-sized calls (getch, putch) and record-sized reads and writes
// cost a memcpy; the file is touched once per buffer. Seeks only move the
// position. Errors are sticky until clearErrors().
//
// States: closed -> open (reading and writing through the buffer) -> closed.
// A failed write puts the object in the error state; every later flush is
// refused until clearErrors().
//
// The first 512 bytes (a file's header) have a window of their own while the
// main buffer is elsewhere: a header word updated for every record appended
// at the end (a memo file's next free block) then costs no system call. The
// window is written out by flush() and close(), and before the main buffer
// moves over the header.
#pragma once

#include <cstdint>

#include "host/zqtypes.h"

class ZQNotifier;  // passed through unopened

class ZQFileProxy {
 public:
  static constexpr int32_t kBufferSize = 64 * 1024;

  ZQFileProxy();
  ~ZQFileProxy();
  ZQFileProxy(const ZQFileProxy&) = delete;
  ZQFileProxy& operator=(const ZQFileProxy&) = delete;

  void setNotifier(ZQNotifier* n) { notifier_ = n; }
  // Modes "rb", "r+b" and "wb" (create or truncate); -1 on failure.
  int openfile(const char* path, const char* mode, ZQ_CSET cset);
  // Flushes and closes; -1 if a write or the close failed.
  int close(bool flush = true);
  bool isOpen() const { return fd_ >= 0; }

  // The next byte, 0 to 255; -1 at the end of the file, which also sets the
  // end state and the error state (a byte-wise reader that runs off the file
  // has met a cut structure).
  int getch();
  int putch(int c);
  // The count transferred. A short read sets the end state only.
  int32_t read(char* buffer, int32_t n);
  int32_t write(const char* buffer, int32_t n);
  // whence 0 from the start, 1 from the present position, 2 from the end;
  // the new position, or -1 (a negative target) with the error state set.
  int64_t seek(int64_t offset, int whence);
  int64_t tell() const { return pos_; }
  // The file's size, unflushed bytes included; -1 when closed.
  int64_t size();
  // Writes buffered bytes to the file; false on failure.
  bool flush();

  bool hasError() const { return error_; }
  void clearErrors() {
    error_ = false;
    eof_ = false;
  }
  bool atEof() const { return eof_; }

  static bool fileExists(const char* path);

 private:
  bool Fill();  // loads the buffer at pos_
  bool EnsureBuffer();
  // Moves the main buffer to start at `start` (nothing valid in it yet);
  // false if what it held couldn't be written.
  bool Restart(int64_t start);
  // True when the header window serves position pos_.
  bool InHead() const { return head_valid_ && pos_ < kHeadSize; }
  // Loads the header window from the file; false on a read error.
  bool LoadHead();
  bool FlushHead();
  // Writes `len` bytes at file offset `off`; false (and the error state) on
  // failure.
  bool WriteOut(const char* p, int64_t off, int64_t len);
  static constexpr int32_t kHeadSize = 512;

  int fd_ = -1;
  bool writable_ = false;
  bool error_ = false;
  bool eof_ = false;
  ZQNotifier* notifier_ = nullptr;
  char* buf_ = nullptr;
  int64_t buf_start_ = 0;  // file offset of buf_[0]
  int32_t buf_len_ = 0;    // valid bytes in buf_
  int32_t dirty_lo_ = -1;  // unflushed range [dirty_lo_, dirty_hi_) in buf_
  int32_t dirty_hi_ = -1;
  int64_t pos_ = 0;
  int64_t file_size_ = 0;  // size on disk as last known, for seeks from the end
  char head_[kHeadSize];
  bool head_valid_ = false;  // the window holds the file's bytes [0, head_len_)
  int32_t head_len_ = 0;
  int32_t head_dirty_lo_ = -1, head_dirty_hi_ = -1;
};
