// The memo engine: memo file kinds, reading, storing and freeing memos.
//
// This header is the interface between the table object and the memo
// engine; the memo engine's own layout notes live in memo_format.h.
#pragma once

#include <cstdint>

#include "host/zqfield.h"
#include "host/zqstring.h"
#include "table/dbf.h"

// A memo pointer that travels with a field from a read record to the update
// of that record. The field that holds it owns it.
class ZQMemoBlockNumber : public ZQFieldInfo {
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
// `text` holds the memo (empty if none). False: see the memo engine's notes;
// `memostat` 0 means the block holds no text.
bool getmemo(ZQDBFILE* file, uint32_t block, uint32_t length, ZQString& text);
