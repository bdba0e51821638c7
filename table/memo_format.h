// Memo file layouts, shared by the memo reader (memo_read.cpp), the memo
// writer (memo_write.cpp) and the creator of new memo files (dbcreat.cpp).
//
// Block n of a memo file lies at byte n * block size; block 0 holds the file
// header, so 0 is never the number of a memo. A memo runs on through the
// following blocks; the blocks of one memo carry no links.
//
// dBASE III (MEMO_DB3). Little-endian. The block size is always 512.
//   OFFSET SIZE  FIELD
//      0     4   next free block
//      4   508   zero on a new file; not read
//   A memo is its text ended by one 0x1A. Reads stop at 32,000 bytes.
//
// dBASE IV (MEMO_DB4 with version word 0x0101, MEMO_DB4FREE with 0x0102).
// Little-endian.
//      0     4   next free block (DB4); head of the free chain (DB4FREE)
//      4     4   zero; not read
//      8     9   the memo file's base name upper-cased, NUL-padded
//     17     1   zero; not read
//     18     2   version word: 0x0101 or 0x0102, anything else refused
//     20     2   block size
//     22     1   non-zero switches memo handling off (memooff)
//     23   489   zero; not read
//   Memo block:
//      0     2   FF FF on write; not checked on read
//      2     2   offset of the text (8 on write)
//      4     4   total length: text plus the word at offset 2
//      8     -   the text (read from offset 8 whatever the word at 2 says)
//   Free run (DB4FREE), at the start of its first block:
//      0     4   next free run; 0x0000FFFF ends the chain
//      4     4   blocks in this run
//   The chain runs in ascending block order. Its last entry is the end of
//   the used space: the block at which the next memo is appended.
//
// FoxPro (MEMO_FPT). Big-endian.
//      0     4   next free block
//      4     2   zero; not read
//      6     2   block size
//      8   504   zero; not read
//   Memo block:
//      0     4   record type; 1 is text, only text is read
//      4     4   text length, without these 8 bytes
//      8     -   the text
//
// SMT (MEMO_SMT). Little-endian.
//      0     4   next free block
//      4     4   block size; only the low 16 bits count
//      8   504   zero; not read
//   A memo is bare text; its length lives in the record's pointer:
//      0     2   01 00 on write; not read
//      2     4   text length, little-endian
//      6     4   block number, little-endian
//   Ten zero bytes mean no memo.
#pragma once

#include <cstdint>

// Every new memo file is one 512-byte header.
constexpr int kMemoHeaderSize = 512;
constexpr int kDb3BlockSize = 512;
constexpr int kDb3MaxText = 32000;
constexpr uint8_t kDb3Terminator = 0x1A;

// Header fields.
constexpr int kMemoNextFree = 0;
constexpr int kDb4Name = 8, kDb4NameSize = 9, kDb4Version = 18, kDb4BlockSize = 20, kDb4MemoOff = 22;
constexpr int kDb4HeaderUsed = 24;  // bytes of the dBASE IV header that carry fields
constexpr uint16_t kDb4VersionPlain = 0x0101, kDb4VersionFree = 0x0102;
constexpr int kFptBlockSize = 6;
constexpr int kSmtBlockSize = 4;
// Bytes at the start of the header that a memo must never overwrite, by kind.
constexpr int kDb3HeaderUsed = 4, kFptHeaderUsed = 8, kSmtHeaderUsed = 8;

// Memo block of dBASE IV and FoxPro: an 8-byte head, then the text.
constexpr int kMemoBlockHead = 8;
constexpr int kDb4BlockMark = 0, kDb4TextOffset = 2, kDb4TotalLength = 4;
constexpr int kFptType = 0, kFptLength = 4;
constexpr uint32_t kFptTypeText = 1;

// Free run of MEMO_DB4FREE.
constexpr int kFreeNext = 0, kFreeCount = 4, kFreeEntrySize = 8;
constexpr uint32_t kFreeChainEnd = 0x0000FFFF;

// SMT pointer in a record.
constexpr int kSmtPtrMark = 0, kSmtPtrLength = 2, kSmtPtrBlock = 6, kSmtPtrSize = 10;

// What a new memo file holds, by kind: next free block and block size.
constexpr uint32_t kNewDb3NextFree = 1;
constexpr uint32_t kNewDb4NextFree = 1;
constexpr uint16_t kNewDb4BlockSize = 512;
constexpr uint32_t kNewFptNextFree = 1;
constexpr uint16_t kNewFptBlockSize = 128;
constexpr uint32_t kNewSmtNextFree = 8;
constexpr uint32_t kNewSmtBlockSize = 64;
