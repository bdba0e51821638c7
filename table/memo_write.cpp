// Writing memos: storing a text, placing it, and giving up old memos with the
// free chain of the dBASE IV form. Layouts: memo_format.h; the reader that
// reads what is written here: memo_read.cpp.
//
// Space is reused in two ways only: a new text that fits the old memo's
// blocks is written over it, and MEMO_DB4FREE keeps a chain of freed runs
// whose last entry is the end of the used space. New memos always go to that
// end; in the other kinds blocks given up are lost and the file only grows.
#include <cstring>

#include "host/endian.h"
#include "table/memo.h"
#include "table/memo_format.h"

namespace {

const char kZeros[512] = {};

void WriteZeros(ZQFileProxy& f, int64_t n) {
  while (n > 0) {
    int32_t k = n < int64_t{sizeof kZeros} ? int32_t(n) : int32_t{sizeof kZeros};
    f.write(kZeros, k);
    n -= k;
  }
}

bool MemoUsable(const ZQDBFILE* file) {
  return file != nullptr && file->hasmemo && file->memofile.isOpen() && file->memoblksize != 0;
}

// Bytes at the start of the header that carry its fields, by kind.
int64_t HeaderUsed(uint8_t kind) {
  switch (kind) {
    case MEMO_DB4:
    case MEMO_DB4FREE: return kDb4HeaderUsed;
    case MEMO_FPT: return kFptHeaderUsed;
    case MEMO_SMT: return kSmtHeaderUsed;
    default: return kDb3HeaderUsed;
  }
}

// Whether `blocks` blocks from `block` may be written: never on the header's
// fields (a damaged pointer or a tiny block size could put them there), and
// all within the 32-bit offsets of a memo file.
bool WritableRun(const ZQDBFILE* file, uint32_t block, uint64_t blocks) {
  uint64_t off = uint64_t{block} * file->memoblksize;
  if (block == 0 || off < uint64_t(HeaderUsed(file->memokind))) return false;
  return off + blocks * file->memoblksize <= uint64_t{INT32_MAX};
}

// Blocks that writememo fills for a text of `n` bytes: (n + 8) / size + 1,
// for SMT n / size + 1. The same count decides whether a text fits in place,
// so a write never runs past the blocks it was granted.
uint64_t ExtentWritten(const ZQDBFILE* file, int64_t n) {
  if (file->memokind == MEMO_SMT) return uint64_t(n) / file->memoblksize + 1;
  return uint64_t(n + kMemoBlockHead) / file->memoblksize + 1;
}

// The header's first word: big-endian in FPT, little-endian otherwise.
bool ReadHeadWord(ZQDBFILE* file, uint32_t* value) {
  ZQFileProxy& f = file->memofile;
  f.clearErrors();
  if (f.seek(kMemoNextFree, 0) < 0) return false;
  if (file->memokind == MEMO_FPT) {
    uint8_t b[4];
    if (f.read(reinterpret_cast<char*>(b), 4) != 4) return false;
    *value = GetBe32(b);
  } else {
    *value = getmlong(f);
  }
  return !f.hasError();
}

void WriteWordAt(ZQDBFILE* file, int64_t offset, uint32_t value) {
  ZQFileProxy& f = file->memofile;
  f.seek(offset, 0);
  if (file->memokind == MEMO_FPT) {
    uint8_t b[4];
    PutBe32(b, value);
    f.write(reinterpret_cast<const char*>(b), 4);
  } else {
    putmlong(f, value);
  }
}

int64_t Offset(const ZQDBFILE* file, uint32_t block) { return int64_t{block} * file->memoblksize; }

// Walks the free chain from `head` to its last entry, the end of the used
// space. Sets *previous (0 for none) and gives the block for a memo of
// `extent` blocks. A run ended by 0xFFFF that is longer than the memo leaves
// *split blocks behind it; one used up whole sets *ended. Sets *chained false when the chain can't be trusted:
// a link that doesn't go up, points past the end of the file or at the
// header, or an entry ended by 0xFFFF inside the file whose run is too short.
// The memo then goes to the end of the file and the chain stays untouched.
// The walk ends because every link must rise and stay within the file.
uint32_t WalkFreeChain(ZQDBFILE* file, uint32_t head, uint64_t extent, uint32_t* previous, bool* chained,
                       uint32_t* split, bool* ended) {
  ZQFileProxy& f = file->memofile;
  uint32_t end = memoendblock(file);
  uint32_t block = head;
  *previous = 0;
  *split = 0;
  *ended = false;
  while (true) {
    if (block == end) return block;  // the usual end: no word behind the file
    if (block > end || !WritableRun(file, block, 1)) break;
    f.clearErrors();
    f.seek(Offset(file, block), 0);
    uint32_t next = getmlong(f);
    uint32_t count = getmlong(f);
    if (f.hasError()) return end;  // a cut last block: the end of the file
    if (next == kFreeChainEnd) {
      // A chain ended by 0xFFFF (another program's way): its last run takes
      // the memo only if it holds it; what is left of the run stays free.
      if (count < extent) break;
      if (count > extent) *split = count - uint32_t(extent);
      else *ended = true;  // the run is used up: the chain ends before it
      return block;
    }
    if (next <= block) break;
    *previous = block;
    block = next;
  }
  *chained = false;
  *previous = 0;
  return end;
}

}  // namespace

int writememo(ZQDBFILE* file, uint32_t block, const ZQString& text) {
  if (!MemoUsable(file)) return -1;
  int64_t n = text.length();
  uint64_t extent = ExtentWritten(file, n);
  if (!WritableRun(file, block, extent)) return -1;
  ZQFileProxy& f = file->memofile;
  f.clearErrors();
  if (f.seek(Offset(file, block), 0) < 0) return -1;
  int64_t used = n;
  uint8_t head[kMemoBlockHead];
  switch (file->memokind) {
    case MEMO_DB3:
      f.write(text.c_str(), int32_t(n));
      f.putch(kDb3Terminator);
      used = n + 1;
      break;
    case MEMO_DB4:
    case MEMO_DB4FREE:
      head[kDb4BlockMark] = 0xFF;
      head[kDb4BlockMark + 1] = 0xFF;
      PutLe16(head + kDb4TextOffset, kMemoBlockHead);
      PutLe32(head + kDb4TotalLength, uint32_t(n + kMemoBlockHead));
      f.write(reinterpret_cast<const char*>(head), kMemoBlockHead);
      f.write(text.c_str(), int32_t(n));
      used = n + kMemoBlockHead;
      break;
    case MEMO_FPT:
      PutBe32(head + kFptType, kFptTypeText);
      PutBe32(head + kFptLength, uint32_t(n));
      f.write(reinterpret_cast<const char*>(head), kMemoBlockHead);
      f.write(text.c_str(), int32_t(n));
      used = n + kMemoBlockHead;
      break;
    default:  // SMT: bare text
      f.write(text.c_str(), int32_t(n));
      break;
  }
  // Zeros to the end of the extent, in every kind.
  WriteZeros(f, int64_t(extent) * file->memoblksize - used);
  return f.hasError() ? -1 : 0;
}

uint32_t addmemo(ZQDBFILE* file, uint32_t block, const ZQString& text) {
  if (!MemoUsable(file)) return 0;
  if (block != 0) return writememo(file, block, text) == 0 ? block : 0;
  uint32_t head;
  if (!ReadHeadWord(file, &head)) return 0;
  uint64_t extent = ExtentWritten(file, text.length());
  uint32_t previous = 0, split = 0;
  bool chained = true, ended = false;
  if (file->memokind == MEMO_DB4FREE) {
    block = WalkFreeChain(file, head, extent, &previous, &chained, &split, &ended);
  } else {
    // A next free block of 0 (the header) or past the end of the file is
    // damage: the memo goes to the end of the file and the header follows.
    uint32_t end = memoendblock(file);
    block = head == 0 || head > end ? end : head;
  }
  if (writememo(file, block, text) != 0) return 0;
  if (chained) {
    uint32_t after = block + uint32_t(extent);
    ZQFileProxy& f = file->memofile;
    if (split != 0) {
      // The rest of a 0xFFFF-ended run becomes the chain's last entry.
      f.seek(Offset(file, after), 0);
      putmlong(f, kFreeChainEnd);
      putmlong(f, split);
    }
    WriteWordAt(file, previous != 0 ? Offset(file, previous) : kMemoNextFree, ended ? kFreeChainEnd : after);
  }
  return file->memofile.hasError() ? 0 : block;
}

uint32_t addsmtmemo(ZQDBFILE* file, uint32_t block, const ZQString& text) {
  if (!MemoUsable(file)) return 0;
  bool move = block == 0;
  if (move) {
    uint32_t head;
    if (!ReadHeadWord(file, &head)) return 0;
    uint32_t end = memoendblock(file);
    block = head == 0 || head > end ? end : head;
  }
  if (writememo(file, block, text) != 0) return 0;
  if (move) {
    // The zero bytes behind the text aren't counted: the next memo may start
    // on them.
    uint32_t used = uint32_t((int64_t{text.length()} + file->memoblksize - 1) / file->memoblksize);
    WriteWordAt(file, kMemoNextFree, block + used);
  }
  return file->memofile.hasError() ? 0 : block;
}

int deloldm(ZQDBFILE* file, uint32_t block, int blocks) {
  if (!MemoUsable(file)) return -1;
  if (file->memokind != MEMO_DB4 && file->memokind != MEMO_DB4FREE) return 0;  // blocks are lost
  // A block that can't hold a memo (on the header, or at or past the end of
  // the file) has nothing to give up; it is left alone.
  uint32_t end = memoendblock(file);
  if (block >= end || blocks <= 0 || !WritableRun(file, block, 1)) return 0;
  ZQFileProxy& f = file->memofile;
  f.clearErrors();
  if (file->memokind == MEMO_DB4) {
    // The total length 8 says that the memo holds no text.
    if (f.seek(Offset(file, block) + kDb4TotalLength, 0) < 0) return -1;
    putmlong(f, kMemoBlockHead);
    return f.hasError() ? -1 : 0;
  }
  // MEMO_DB4FREE: the run joins the chain at its place in ascending order.
  uint32_t run = uint32_t(blocks);
  if (uint64_t{block} + run > end) run = end - block;
  if (uint64_t{run} * file->memoblksize < uint64_t{kFreeEntrySize}) return 0;  // no room for an entry
  uint32_t head;
  if (!ReadHeadWord(file, &head)) return -1;
  if (head == block) return 0;  // already the first free run
  // A chain that doesn't rise or leaves the file can't take the run safely;
  // the blocks are then lost, as in the other kinds.
  if (head > end && head != kFreeChainEnd) return 0;
  uint32_t previous = 0, next = head;
  // A head of 0xFFFF is an empty chain: the run becomes its first entry.
  if (head < block && head != kFreeChainEnd) {
    previous = head;
    while (true) {
      if (previous >= end || !WritableRun(file, previous, 1)) return 0;
      if (f.seek(Offset(file, previous), 0) < 0) return -1;
      next = getmlong(f);
      if (f.hasError()) return 0;
      if (next == block) return 0;  // already free
      if (next > end && next != kFreeChainEnd) return 0;
      if (next >= block || next == kFreeChainEnd) break;
      if (next <= previous) return 0;
      previous = next;
    }
  }
  WriteWordAt(file, previous != 0 ? Offset(file, previous) : kMemoNextFree, block);
  f.seek(Offset(file, block), 0);
  putmlong(f, next);
  putmlong(f, run);
  return f.hasError() ? -1 : 0;
}

uint32_t putmemo(ZQDBFILE* file, uint32_t oldblock, const ZQString& text) {
  if (!MemoUsable(file) || text.length() == 0) return 0;
  int32_t trimmed = text.length();
  while (trimmed > 0 && text[trimmed - 1] == ' ') --trimmed;
  uint64_t need = ExtentWritten(file, text.length());
  if (oldblock != 0) {
    ZQString old;  // an SMT memo's old text counts as empty: its length isn't known here
    MemoRead r = file->memokind == MEMO_SMT ? MemoRead::kOk : readmemo(file, oldblock, 0, old);
    if (r == MemoRead::kNoFile || r == MemoRead::kSeekFailed || r == MemoRead::kNotText) return 0;
    if (r == MemoRead::kDamaged) {
      // An old memo that can't be read whole tells nothing sure about its
      // blocks: it is left as it is and the text goes to the end.
      oldblock = 0;
    } else if (old.length() == trimmed && memcmp(old.c_str(), text.c_str(), size_t(trimmed)) == 0) {
      return oldblock;  // the same text: nothing is written
    } else {
      uint64_t extent = uint64_t(old.length()) / file->memoblksize + 1;
      bool shrinks = need < extent && file->memokind == MEMO_DB4FREE;
      if (shrinks || need > extent) {
        if (deloldm(file, oldblock, int(extent)) != 0) return 0;
        oldblock = 0;
      }
    }
  }
  return file->memokind == MEMO_SMT ? addsmtmemo(file, oldblock, text) : addmemo(file, oldblock, text);
}
