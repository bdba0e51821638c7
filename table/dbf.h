// The DBF table engine: the table file's layout and the plain functions on
// it. These functions know nothing of the host's records and fields; they give
// NULL, 0, -1 or a count and log nothing.
//
// Narrow header (dialects 0 and 3). All numbers little-endian.
//   OFFSET SIZE  FIELD
//      0     1   version byte
//      1     2   record count, 16 bits
//      3     1   month of last change        (written, never read)
//      4     1   year of last change mod 100
//      5     1   day of last change
//      6     2   record length, flag byte included; 0 refuses the table
//      8  16*n   field descriptors, then 0x0D
//   First record at 521 with 32 fields or fewer, else at 16 * fields + 9.
//
// Narrow field descriptor (16 bytes):
//      0    11   name, zero-filled
//     11     1   type letter
//     12     1   length
//     13     2   zero, skipped
//     15     1   decimal count
//
// Wide header (all other dialects):
//      0     1   version byte
//      1     1   year of last change mod 100
//      2     1   month
//      3     1   day
//      4     4   record count
//      8     2   header length: offset of the first record
//     10     2   record length, flag byte included
//     12    16   zero, skipped
//     28     1   1 if the table has a production index (written, not read)
//     29     3   zero, skipped
//     32  32*n   field descriptors, then 0x0D (and, as written here, 0x00)
//
// Wide field descriptor (32 bytes):
//      0    11   name, zero-filled
//     11     1   type letter
//     12     4   zero, skipped (Visual FoxPro: displacement in the record)
//     16     1   length
//     17     1   decimal count
//     18    14   zero, skipped
//
// Records: record n (from 0) starts at header length + n * record length; a
// flag byte (0x20 live, anything else deleted) and the fields in descriptor
// order. A changed table ends with 0x1A behind its last record.
#pragma once

#include <cstdint>

#include "connector/export.h"
#include "host/zqfile.h"
#include "host/zqstring.h"

// Offsets of the narrow header and descriptor.
constexpr int kNarrowRecCount = 1, kNarrowMonth = 3, kNarrowYear = 4, kNarrowDay = 5;
constexpr int kNarrowRecLen = 6, kNarrowFields = 8, kNarrowDescSize = 16;
constexpr int kNarrowDescType = 11, kNarrowDescLength = 12, kNarrowDescDecimals = 15;
constexpr int kNarrowFirstRecord = 521;  // 8 + 32 * 16 + 1
constexpr int kNarrowMaxRoomFields = 32;

// Offsets of the wide header and descriptor.
constexpr int kWideYear = 1, kWideMonth = 2, kWideDay = 3, kWideRecCount = 4;
constexpr int kWideHdrLen = 8, kWideRecLen = 10, kWideProdIndex = 28, kWideFields = 32;
constexpr int kWideDescSize = 32;
constexpr int kWideDescType = 11, kWideDescOffset = 12, kWideDescLength = 16, kWideDescDecimals = 17;

constexpr uint8_t kHeaderTerminator = 0x0D;
constexpr uint8_t kEndMark = 0x1A;
constexpr uint8_t kLiveFlag = 0x20;
constexpr uint8_t kDeletedFlag = 0x2A;

// Room of the caller's descriptor array: the highest field limit of any
// dialect.
constexpr int kMaxFields = 1024;

// Memo kinds (values of ZQDBFILE::memokind).
enum : uint8_t {
  MEMO_NONE = 0,
  MEMO_DB4 = 2,
  MEMO_DB3 = 4,
  MEMO_DB4FREE = 5,
  MEMO_FPT = 6,
  MEMO_SMT = 8,
};

// The last transfer on a table (position cache of dbget/dbput).
enum : uint8_t { LASTOP_NONE = 0, LASTOP_READ = 1, LASTOP_WRITE = 2 };

// Dialect numbers.
enum : int {
  DIALECT_DBASE2 = 0,
  DIALECT_DBASE3P = 1,
  DIALECT_DBASE4 = 2,
  DIALECT_ENABLE = 3,
  DIALECT_DBASE3 = 4,
  DIALECT_UNNAMED = 5,
  DIALECT_FOXPRO = 6,
  DIALECT_ENABLEOA = 7,
  DIALECT_CLIPPER = 8,
  DIALECT_VDBASE = 9,
  DIALECT_VFOXPRO = 10,
};

// One field descriptor. `name` has room for the 11 name bytes and a NUL that
// is always there, so a name that uses all 11 bytes is kept whole. `length`
// is the descriptor's length byte, except for a character field that Clipper
// and FoxPro writers made longer than 255 bytes: its decimals byte is the
// length's high byte (see dbopen).
struct ZQDBFIELD {
  char name[12];
  int8_t type;
  uint16_t length;
  uint8_t decimals;
};

// The handle of an open table; made by dbopen, destroyed by dbclose.
struct ZQDBFILE {
  ZQFileProxy datafile;
  ZQFileProxy memofile;
  int32_t reccount = 0;    // records, deleted ones included (dialect 0: low 16 bits)
  int32_t filepos = 0;     // offset just behind the last record transferred; -1 after a failure
  uint16_t hdrlen = 0;     // offset of the first record
  uint16_t reclen = 0;     // record length, flag byte included
  uint16_t fieldcount = 0; // descriptors read
  uint16_t memoblksize = 0;
  int16_t hasmemo = 0;
  int16_t memofailed = 0;
  int16_t memooff = 0;
  uint8_t changed = 0;
  uint8_t dialect = 0;
  uint8_t memokind = 0;
  uint8_t memostat = 1;
  uint8_t lastop = LASTOP_NONE;
  // Not part of the interface: the version byte as read and after the memo
  // normalisation, for reports such as `zqdb info`.
  uint8_t filever = 0;
  uint8_t version = 0;
};

// True when `dialect` uses the narrow header (dialects 0 and 3).
inline bool IsNarrowDialect(int dialect) { return dialect == DIALECT_DBASE2 || dialect == DIALECT_ENABLE; }

// The record count by which the table is bounded: the low 16 bits in dialect 0.
inline int32_t TableCount(const ZQDBFILE* db) {
  return db->dialect == DIALECT_DBASE2 ? int32_t(uint16_t(db->reccount)) : db->reccount;
}

// Opens a table. `fields` has room for kMaxFields entries; `version` is the
// caller's dialect, which the file may change (0xF5 -> 6, 0xE5 -> 8). NULL when
// the table can't be used; a memo failure only sets `memofailed`.
ZQDBFILE* dbopen(ZQNotifier* notifier, const char* name, ZQDBFIELD** fields, int* version, bool writable);
// Reads physical record `recno` (from 0) into `buf` (reclen - 1 bytes) without
// its flag; *live becomes 1 for a space flag. 0, -1 if recno is above the
// count, or the count of bytes a short read gave.
int32_t dbget(ZQDBFILE* db, int32_t recno, char* buf, int* live);
// Finishes a table (end mark, count and date if changed), frees the
// descriptors and the handle. 0, or -1 if the header could not be written.
int dbclose(ZQDBFIELD** fields, ZQDBFILE* db);
// Today's local date: day of month, month 1-12, year mod 100.
void dbdate(char* day, char* month, char* year);
// A descriptor name from `src`: at most 10 characters, letters and digits
// upper-cased, all else '_', zero-filled to 11 bytes.
void dbname(const char* src, char* dst);

// Creates an empty table `name` (full path with extension) with `count`
// descriptors, and its memo file when bit 15 of `version` is set (the low 15
// bits are the dialect). Names are NUL-padded to 11 bytes in place.
// `production` fills byte 28 of the wide header. 0, or -1; nothing is
// cleaned up on failure.
extern "C" ZQ_EXPORT int dbcreat(const char* name, int count, ZQDBFIELD** fields, int version, bool production);
// Writes physical record `number` (from 0; the count appends) from `record`
// (reclen - 1 bytes) with flag 0x20 if `live`, else 0x2A. 0, or -1 (a number
// above the count, a count the header can't hold, or a failed write).
extern "C" ZQ_EXPORT int dbput(ZQDBFILE* db, const char* record, int32_t number, int live);
// Removes the table `name` and, if `hasmemo`, its memo file of `memokind`.
// 0, or -1 when a file could not be removed.
int dbdelete(const char* name, bool hasmemo, char memokind);

// Header writers of dbcreat: the narrow and the wide form, with descriptors
// and terminators. 0, or -1 when the file reports a write error.
int dbhdr2(ZQFileProxy& f, int count, ZQDBFIELD** fields, uint8_t version);
int dbhdr3(ZQFileProxy& f, int count, ZQDBFIELD** fields, uint8_t version, bool production);

// Header readers of dbopen; the position is offset 1. 0, or -1 refused.
int dbreadhdr2(ZQDBFILE* db, ZQDBFIELD** fields);
int dbreadhdr3(ZQDBFILE* db, ZQDBFIELD** fields);

// The memo engine's open (memo.cpp): opens and checks the memo file of the
// table `name`. 0, or -1 (the caller sets `memofailed`).
int openmemo(const char* name, ZQDBFILE* db, bool writable);
