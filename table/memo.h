// The memo engine: memo file kinds, reading, storing and freeing memos.
//
// This header is the interface between the table object and the memo
// engine; the memo engine's own layout notes live in memo_format.h.
#pragma once

#include <cstddef>
#include <cstdint>

#include "connector/export.h"
#include "host/zqfield.h"
#include "host/zqstring.h"
#include "table/dbf.h"

// A memo pointer that travels with a field from a read record to the update
// of that record. The field that holds it owns it.
class ZQ_EXPORT ZQMemoBlockNumber : public ZQFieldInfo {
 public:
  static constexpr int string_length = 10;
  static constexpr const char* format_str = "%010ld";
  static constexpr const char* blank_memo_str = "          ";

  ZQMemoBlockNumber(uint32_t block, uint32_t length) : block(block), length(length) {}
  ZQMemoBlockNumber(const ZQString& text, uint32_t length) : block(StringtoNumber(text)), length(length) {}
  ZQMemoBlockNumber(const ZQMemoBlockNumber&) = default;
  ZQMemoBlockNumber& operator=(const ZQMemoBlockNumber&) = default;
  ~ZQMemoBlockNumber() override;

  // 0 for ten blanks, else the decimal value of the text (digits after
  // leading blanks; anything else ends the number).
  static uint32_t StringtoNumber(const ZQString& text);
  // Ten digits and a NUL into `buffer` (11 bytes); returns `buffer`.
  static char* NumbertoBuf(char* buffer, uint32_t block);
  uint32_t Number() const { return block; }
  static unsigned StringLength() { return string_length; }

  uint32_t block;
  uint32_t length;
};

// Fills `text` with the memo at `block`; `length` counts only for SMT. True:
// `text` holds the memo (empty if none). False: no memo file (then `text`
// holds the block number as "%10ld" text), a block outside the file, a
// stored length that runs past the end of the file (then `text` holds the
// bytes up to the end), or, with `memostat` 0, a block that holds no text.
extern "C" ZQ_EXPORT bool getmemo(ZQDBFILE* file, uint32_t block, uint32_t length, ZQString& text);

// Stores `text` (never empty), replacing the memo at `oldblock` unless that
// is 0. The block number the record must now hold (`oldblock` when the memo
// stayed), or 0 on failure.
extern "C" ZQ_EXPORT uint32_t putmemo(ZQDBFILE* file, uint32_t oldblock, const ZQString& text);
// Gives up the memo at `block`, `blocks` blocks long (old length / block
// size + 1). 0, or -1 on a failed seek or write.
extern "C" ZQ_EXPORT int deloldm(ZQDBFILE* file, uint32_t block, int blocks);

// Places a memo: at `block`, or, for block 0, where the header (or the free
// chain's last entry) says, moving that on. The block used, or 0.
uint32_t addmemo(ZQDBFILE* file, uint32_t block, const ZQString& text);
uint32_t addsmtmemo(ZQDBFILE* file, uint32_t block, const ZQString& text);
// Writes one memo with its head and zero padding at `block`. 0, or -1.
int writememo(ZQDBFILE* file, uint32_t block, const ZQString& text);

// Byte-wise little-endian numbers of the memo code. A read that runs off the
// file gives 0xFF for each missing byte (so 0xFFFF / 0xFFFFFFFF) and sets
// the file's error state, which callers test.
uint32_t getmword(ZQFileProxy& f);
uint32_t getmlong(ZQFileProxy& f);
void putmlong(ZQFileProxy& f, uint32_t value);

// Writes the tail of a new dBASE IV memo header, offsets 4 to 23: zeros, the
// base name `base` upper-cased in 9 bytes, the version word 0x0101 and the
// block size 512. 0, or -1 when the file reports a write error.
int dbmemohdr(ZQFileProxy& f, const char* base);

// ---- Shared by the memo reader and writer; not for the table object. ----

// How a memo read ended.
enum class MemoRead {
  kOk,          // the text is whole
  kNotText,     // an FPT block of another type (picture, object)
  kNoFile,      // no memo file open
  kSeekFailed,  // the block's offset is outside 32 bits
  kDamaged,     // block past the end, or a stored length the file can't hold
};
// Reads the memo at `block` into `text` as its kind stores it (SMT: `length`
// bytes). Never allocates more than the file holds behind the block.
MemoRead readmemo(ZQDBFILE* file, uint32_t block, uint32_t length, ZQString& text);
// The path of the table's memo file: directory and base name of `tablepath`,
// then "." and `ext`, into `out` (`size` bytes). False when it doesn't fit.
bool memopath(const char* tablepath, const char* ext, char* out, size_t size);
// The memo file's size in whole blocks, rounded up: the block at which the
// used space ends at the latest.
uint32_t memoendblock(ZQDBFILE* file);
