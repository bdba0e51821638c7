// Builds memo files byte by byte for tests, and a table beside them, so that
// expected bytes come from the test, not from the code under test.
//
//   auto memo = MemoBytes(Db4Header(3, 0x0101, 512)).At(1, Db4Block("hello"), 512).Build();
#pragma once

#include <cstdint>
#include <cstring>
#include <string>

#include "host/endian.h"
#include "table/dbf.h"
#include "table/memo.h"
#include "tests/support/dbf_builder.h"
#include "tests/support/read_harness.h"

namespace tests {

// Headers of the four layouts, 512 bytes each.
inline Bytes Db3Header(uint32_t next) {
  Bytes h(512, 0);
  PutLe32(&h[0], next);
  return h;
}
inline Bytes Db4Header(uint32_t next, uint16_t version, uint16_t block_size, const std::string& name = "T") {
  Bytes h(512, 0);
  PutLe32(&h[0], next);
  for (size_t i = 0; i < name.size() && i < 9; ++i) h[8 + i] = uint8_t(name[i]);
  PutLe16(&h[18], version);
  PutLe16(&h[20], block_size);
  return h;
}
inline Bytes FptHeader(uint32_t next, uint16_t block_size) {
  Bytes h(512, 0);
  PutBe32(&h[0], next);
  PutBe16(&h[6], block_size);
  return h;
}
inline Bytes SmtHeader(uint32_t next, uint32_t block_size) {
  Bytes h(512, 0);
  PutLe32(&h[0], next);
  PutLe32(&h[4], block_size);
  return h;
}

// Memo blocks as each kind stores a text.
inline Bytes Db3Block(const std::string& text) { return Text(text + "\x1A"); }
// The block header and the text are laid out in one vector sized once: an
// insert behind the header makes GCC 12 at -O3 report a bound it can't see.
inline Bytes Db4Block(const std::string& text, uint16_t offset = 8) {
  Bytes b(8 + text.size(), 0);
  b[0] = b[1] = 0xFF;
  PutLe16(&b[2], offset);
  PutLe32(&b[4], uint32_t(text.size() + offset));
  if (!text.empty()) memcpy(&b[8], text.data(), text.size());
  return b;
}
inline Bytes FptBlock(const std::string& text, uint32_t type = 1) {
  Bytes b(8 + text.size(), 0);
  PutBe32(&b[0], type);
  PutBe32(&b[4], uint32_t(text.size()));
  if (!text.empty()) memcpy(&b[8], text.data(), text.size());
  return b;
}
// A free run of the dBASE IV chain.
inline Bytes FreeEntry(uint32_t next, uint32_t count) {
  Bytes b(8, 0);
  PutLe32(&b[0], next);
  PutLe32(&b[4], count);
  return b;
}

// A memo file: a header and blocks placed by number, zero-padded to whole
// blocks.
class MemoBytes {
 public:
  explicit MemoBytes(Bytes header) : bytes_(std::move(header)) {}
  MemoBytes& At(uint32_t block, const Bytes& b, uint32_t block_size) {
    size_t off = size_t(block) * block_size;
    size_t end = off + b.size();
    size_t padded = (end + block_size - 1) / block_size * block_size;
    if (bytes_.size() < padded) bytes_.resize(padded, 0);
    // memcpy over a pointer: at -O3 GCC 12 loses the bound of std::copy
    // into a vector just resized and reports an overflow that can't happen.
    if (!b.empty()) memcpy(bytes_.data() + off, b.data(), b.size());
    return *this;
  }
  Bytes Build() const { return bytes_; }

 private:
  Bytes bytes_;
};

// A table with one memo field and its memo file (none when `ext` is empty),
// opened writable.
struct MemoTable : OpenedTable {
  MemoTable(const std::string& stem, uint8_t version, int dialect, const std::string& ext, const Bytes& memo)
      : OpenedTable(Write(stem, version, ext, memo), dialect, true), memo_path(ScratchPath(stem + "." + ext)) {}
  // A table already made, opened writable.
  MemoTable(const std::string& table, int dialect) : OpenedTable(table, dialect, true) {}

  std::string Get(uint32_t block, uint32_t length = 0, bool* ok = nullptr) {
    ZQString text;
    db->memostat = 1;
    bool r = getmemo(db, block, length, text);
    if (ok != nullptr) *ok = r;
    return std::string(text.c_str(), size_t(text.length()));
  }
  uint32_t Put(uint32_t old, const std::string& text) {
    return putmemo(db, old, ZQString(text.data(), int32_t(text.size())));
  }
  // The memo file as it stands on disk (buffered bytes written first).
  Bytes MemoFile() {
    db->memofile.flush();
    return ReadFile(memo_path);
  }

  std::string memo_path;

 private:
  static std::string Write(const std::string& stem, uint8_t version, const std::string& ext, const Bytes& memo) {
    if (!ext.empty()) WriteScratch(stem + "." + ext, memo);
    return WriteScratch(stem + ".dbf", DbfBuilder(version).Field("NOTES", 'M', 10).Build());
  }
};

}  // namespace tests
