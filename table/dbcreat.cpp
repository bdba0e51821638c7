// Creating a table: the header of its dialect, and an empty memo file when
// the table has memo fields. Layouts: dbf.h (table), memo_format.h (memo).
//
// A new Visual FoxPro table (dialect 10) takes that program's own shape, so
// that its own open (which takes only the version byte 0x30) and other
// readers of such tables read it:
//   - version byte 0x30 with or without memo fields;
//   - the wide header with 263 zero bytes behind the terminator (the room
//     such tables keep for the path of their database container), so the
//     header length is 32 * fields + 296;
//   - the table flags at offset 28: 0x01 with a production index, 0x02 with
//     memo fields ("M", "G");
//   - descriptors with the field's displacement in the record (flag byte
//     included) at offset 12, and the fixed widths of the binary forms:
//     "I" 4, "B", "T", "Y" 8, memo pointers "M" and "G" 4;
//   - no _NullFlags field: nothing written here is ever null;
//   - an FPT memo file with block size 64 and next free block 8 (the first
//     block behind the 512-byte header).
#include <cctype>
#include <cstring>

#include "host/endian.h"
#include "host/zqglob.h"
#include "table/dbf.h"
#include "table/memo.h"
#include "table/memo_format.h"

namespace {

constexpr int kMemoFlag = 0x8000;
constexpr int kMemoPointerWidth = 10;
constexpr uint8_t kNarrowVersion = 0x02, kNarrowManyFields = 0xFE;
constexpr uint8_t kPlainVersion = 0x03;

// Visual FoxPro: version byte, the zero area behind the terminator, the
// table flags of header offset 28, and the widths of the binary forms.
constexpr uint8_t kVfpVersion = 0x30;
constexpr int kVfpBacklink = 263;
constexpr uint8_t kVfpFlagProduction = 0x01, kVfpFlagMemo = 0x02;
constexpr int kVfpMemoPointerWidth = 4, kVfpIntegerWidth = 4, kVfpEightByteWidth = 8;
// A new Visual FoxPro memo file: 64-byte blocks, the first memo at block 8,
// right behind the 512-byte header.
constexpr uint32_t kNewVfpNextFree = 8;
constexpr uint16_t kNewVfpBlockSize = 64;

bool IsMemoType(int8_t type) { return type == 'B' || type == 'G' || type == 'M'; }

// In dialect 10 "B" is a double held in the record, not a memo.
bool IsVfpMemoType(int8_t type) { return type == 'G' || type == 'M'; }

// The width a field takes in a Visual FoxPro record: the binary forms have
// fixed widths whatever the caller says, as memo pointers do elsewhere.
int VfpLength(const ZQDBFIELD* fd) {
  switch (fd->type) {
    case 'M':
    case 'G': return kVfpMemoPointerWidth;
    case 'I': return kVfpIntegerWidth;
    case 'B':
    case 'T':
    case 'Y': return kVfpEightByteWidth;
    default: return fd->length;
  }
}

// The width a field takes in a wide record: memo pointers are always 10.
int WideLength(const ZQDBFIELD* fd, int dialect) {
  if (dialect == DIALECT_VFOXPRO) return VfpLength(fd);
  return IsMemoType(fd->type) ? kMemoPointerWidth : fd->length;
}

int32_t RecordLength(int count, ZQDBFIELD** fields, int dialect) {
  bool narrow = IsNarrowDialect(dialect);
  int32_t n = 1;
  for (int i = 0; i < count; ++i) n += narrow ? fields[i]->length : WideLength(fields[i], dialect);
  return n;
}

// The names are NUL-padded to 11 bytes in the caller's records.
void PadName(ZQDBFIELD* fd) {
  size_t n = strnlen(fd->name, 11);
  memset(fd->name + n, 0, sizeof fd->name - n);
}

uint8_t VersionByte(int dialect, int count, bool memo) {
  if (dialect == DIALECT_VFOXPRO) return kVfpVersion;
  if (IsNarrowDialect(dialect))
    return dialect == DIALECT_ENABLE && count > kNarrowMaxRoomFields ? kNarrowManyFields : kNarrowVersion;
  if (!memo) return kPlainVersion;
  switch (dialect) {
    case DIALECT_DBASE3P:
    case DIALECT_DBASE3: return 0x83;
    case DIALECT_FOXPRO: return 0xF5;
    case DIALECT_CLIPPER: return 0xE5;
    default: return 0x8B;
  }
}

// The memo kind a new table of `dialect` gets. The unnamed dialect 5 writes
// 0x8B, which every reader takes for the dBASE IV form, so it gets that
// form's header too: with a dBASE III header it could not read its own memos.
uint8_t NewMemoKind(int dialect) {
  switch (dialect) {
    case DIALECT_FOXPRO:
    case DIALECT_VFOXPRO: return MEMO_FPT;
    case DIALECT_CLIPPER: return MEMO_SMT;
    case DIALECT_DBASE4:
    case DIALECT_VDBASE:
    case DIALECT_UNNAMED: return MEMO_DB4;
    default: return MEMO_DB3;
  }
}

void WriteZeros(ZQFileProxy& f, int n) {
  static const char zeros[kMemoHeaderSize] = {};
  if (n > 0) f.write(zeros, n);
}

// Writes a new memo file's 512-byte header. 0, or -1 on a write error.
int WriteMemoHeader(ZQFileProxy& f, uint8_t kind, int dialect, const char* base) {
  uint8_t head[8] = {};
  int rc = 0;
  bool vfp = dialect == DIALECT_VFOXPRO;
  switch (kind) {
    case MEMO_FPT:
      PutBe32(head + kMemoNextFree, vfp ? kNewVfpNextFree : kNewFptNextFree);
      PutBe16(head + kFptBlockSize, vfp ? kNewVfpBlockSize : kNewFptBlockSize);
      f.write(reinterpret_cast<const char*>(head), 8);
      break;
    case MEMO_SMT:
      PutLe32(head + kMemoNextFree, kNewSmtNextFree);
      PutLe32(head + kSmtBlockSize, kNewSmtBlockSize);
      f.write(reinterpret_cast<const char*>(head), 8);
      break;
    case MEMO_DB4:
      putmlong(f, kNewDb4NextFree);
      rc = dbmemohdr(f, base);
      break;
    default: putmlong(f, kNewDb3NextFree); break;
  }
  WriteZeros(f, kMemoHeaderSize - int(f.tell()));
  return rc != 0 || f.hasError() ? -1 : 0;
}

}  // namespace

int dbhdr2(ZQFileProxy& f, int count, ZQDBFIELD** fields, uint8_t version) {
  char day, month, year;
  dbdate(&day, &month, &year);
  uint8_t h[kNarrowFields] = {};
  h[0] = version;
  PutLe16(h + kNarrowRecCount, 0);
  h[kNarrowMonth] = uint8_t(month);
  h[kNarrowYear] = uint8_t(year);
  h[kNarrowDay] = uint8_t(day);
  PutLe16(h + kNarrowRecLen, uint16_t(RecordLength(count, fields, DIALECT_DBASE2)));
  f.write(reinterpret_cast<const char*>(h), sizeof h);
  for (int i = 0; i < count; ++i) {
    ZQDBFIELD* fd = fields[i];
    PadName(fd);
    uint8_t d[kNarrowDescSize] = {};
    memcpy(d, fd->name, 11);
    d[kNarrowDescType] = uint8_t(fd->type);
    d[kNarrowDescLength] = fd->length;
    d[kNarrowDescDecimals] = fd->decimals;
    f.write(reinterpret_cast<const char*>(d), sizeof d);
  }
  f.putch(kHeaderTerminator);
  // Up to 32 fields the header always takes the room of 32 descriptors.
  if (count < kNarrowMaxRoomFields) WriteZeros(f, kNarrowDescSize * (kNarrowMaxRoomFields - count));
  return f.hasError() ? -1 : 0;
}

// The version byte 0x30 selects the Visual FoxPro shape (see the top).
int dbhdr3(ZQFileProxy& f, int count, ZQDBFIELD** fields, uint8_t version, bool production) {
  const bool vfp = version == kVfpVersion;
  const int dialect = vfp ? DIALECT_VFOXPRO : DIALECT_DBASE4;  // any wide dialect but 10 writes alike
  char day, month, year;
  dbdate(&day, &month, &year);
  uint8_t h[kWideFields] = {};
  h[0] = version;
  h[kWideYear] = uint8_t(year);
  h[kWideMonth] = uint8_t(month);
  h[kWideDay] = uint8_t(day);
  PutLe32(h + kWideRecCount, 0);
  int tail = vfp ? 1 + kVfpBacklink : 2;  // behind the descriptors: 0x0D, then zeros
  PutLe16(h + kWideHdrLen, uint16_t(kWideFields + kWideDescSize * count + tail));
  PutLe16(h + kWideRecLen, uint16_t(RecordLength(count, fields, dialect)));
  if (vfp) {
    uint8_t flags = production ? kVfpFlagProduction : 0;
    for (int i = 0; i < count; ++i)
      if (IsVfpMemoType(fields[i]->type)) flags |= kVfpFlagMemo;
    h[kWideProdIndex] = flags;
  } else {
    h[kWideProdIndex] = production ? 1 : 0;
  }
  f.write(reinterpret_cast<const char*>(h), sizeof h);
  uint32_t displacement = 1;  // behind the flag byte
  for (int i = 0; i < count; ++i) {
    ZQDBFIELD* fd = fields[i];
    PadName(fd);
    uint8_t d[kWideDescSize] = {};
    memcpy(d, fd->name, 11);
    d[kWideDescType] = uint8_t(fd->type);
    int width = WideLength(fd, dialect);
    d[kWideDescLength] = uint8_t(width);
    d[kWideDescDecimals] = fd->decimals;
    if (vfp) PutLe32(d + kWideDescOffset, displacement);
    displacement += uint32_t(width);
    f.write(reinterpret_cast<const char*>(d), sizeof d);
  }
  f.putch(kHeaderTerminator);
  if (vfp) WriteZeros(f, kVfpBacklink);
  else f.putch(0x00);
  return f.hasError() ? -1 : 0;
}

int dbmemohdr(ZQFileProxy& f, const char* base) {
  uint8_t tail[kDb4HeaderUsed - 4] = {};  // offsets 4 to 23 of the header
  for (int i = 0; i < kDb4NameSize && base != nullptr && base[i] != '\0'; ++i)
    tail[kDb4Name - 4 + i] = uint8_t(toupper(static_cast<unsigned char>(base[i])));
  PutLe16(tail + kDb4Version - 4, kDb4VersionPlain);
  PutLe16(tail + kDb4BlockSize - 4, kNewDb4BlockSize);
  f.write(reinterpret_cast<const char*>(tail), sizeof tail);
  return f.hasError() ? -1 : 0;
}

int dbcreat(const char* name, int count, ZQDBFIELD** fields, int version, bool production) {
  if (name == nullptr || count < 0 || count > kMaxFields || (count > 0 && fields == nullptr)) return -1;
  for (int i = 0; i < count; ++i)
    if (fields[i] == nullptr) return -1;
  int dialect = version & ~kMemoFlag;
  bool memo = (version & kMemoFlag) != 0;
  bool narrow = IsNarrowDialect(dialect);
  // dBASE II has no memo: its reader refuses a table with a memo field, so
  // such a table is refused here rather than written unreadable.
  if (dialect == DIALECT_DBASE2) {
    if (memo) return -1;
    for (int i = 0; i < count; ++i)
      if (IsMemoType(fields[i]->type)) return -1;
  }
  // A record length that 16 bits can't hold would wrap into a table that no
  // reader can use: refused before any file is made.
  if (RecordLength(count, fields, dialect) > UINT16_MAX) return -1;
  uint8_t vbyte = VersionByte(dialect, count, memo);

  ZQFileProxy table;
  if (table.openfile(name, "wb", 0) != 0) return -1;
  int rc = narrow ? dbhdr2(table, count, fields, vbyte) : dbhdr3(table, count, fields, vbyte, production);
  if (table.close(true) != 0) rc = -1;
  // An Enable table with more than 32 fields carries 0xFE, which reopens as a
  // table with a memo file, memo fields or not; an empty memo file is made so
  // that it opens cleanly.
  if (!memo && vbyte != kNarrowManyFields) return rc;

  // 0xFE has bit 3 set, so it reopens as the dBASE IV form: its memo file
  // gets that form's header whether or not the table has memo fields.
  uint8_t kind = vbyte == kNarrowManyFields ? uint8_t{MEMO_DB4} : NewMemoKind(dialect);
  const char* ext = kind == MEMO_FPT ? "fpt" : kind == MEMO_SMT ? "smt" : "dbt";
  char path[4096];
  if (!memopath(name, ext, path, sizeof path)) return -1;
  char dir[4096], base[4096];
  strcpy(dir, name);  // fits: memopath took a longer path
  ZQGlob::sepfile(dir, base, nullptr);
  ZQFileProxy memofile;
  if (memofile.openfile(path, "wb", 0) != 0) return -1;
  if (WriteMemoHeader(memofile, kind, dialect, base) != 0) rc = -1;
  if (memofile.close(true) != 0) rc = -1;
  return rc;
}
