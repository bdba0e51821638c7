// Opening a table: the version byte against the dialect, the header and
// descriptors, and the choice of the memo file.
#include <cstring>
#include <new>

#include "host/platform.h"
#include "host/zqglob.h"
#include "table/dbf.h"

namespace {

bool LowBitsThree(uint8_t v) { return (v & 7) == 3; }

// Whether dialect `*version` accepts the version byte `v`. For the dialects
// that take 0xF5 and 0xE5 besides their own bytes, the file overrides the
// option: 0xF5 is read as FoxPro, 0xE5 as Clipper.
bool AcceptVersion(uint8_t v, int* version) {
  switch (*version) {
    case DIALECT_DBASE2: return v == 0x02;
    case DIALECT_ENABLE: return v == 0x02 || v == 0xFE;
    case DIALECT_DBASE3P:
    case DIALECT_DBASE4:
    case DIALECT_DBASE3:
    case DIALECT_CLIPPER:
    case DIALECT_VDBASE:
      if (v == 0xF5) *version = DIALECT_FOXPRO;
      else if (v == 0xE5) *version = DIALECT_CLIPPER;
      else return LowBitsThree(v);
      return true;
    case DIALECT_UNNAMED: return true;
    case DIALECT_FOXPRO: return v == 0x03 || v == 0xF5;
    case DIALECT_ENABLEOA: return LowBitsThree(v) || v == 0xFE;
    case DIALECT_VFOXPRO: return v == 0x30;
    default: return false;
  }
}

void FreeFields(ZQDBFIELD** fields) {
  for (int i = 0; i < kMaxFields && fields[i] != nullptr; ++i) {
    delete fields[i];
    fields[i] = nullptr;
  }
}

// Reads 11 name bytes, the first already in hand. `name` has a twelfth byte
// that stays NUL, so a name that uses all 11 bytes keeps them and still ends.
void ReadName(ZQFileProxy& f, int first, ZQDBFIELD* fd) {
  fd->name[0] = char(first);
  for (int i = 1; i < 11; ++i) fd->name[i] = char(f.getch());
  fd->name[11] = '\0';
}

// The path of the table with another extension: directory and base name of
// `name`, then ".ext".
void SiblingPath(const char* name, const char* ext, char* out, size_t size) {
  size_t n = strlen(name);
  if (n + 8 > size) {
    out[0] = '\0';
    return;
  }
  char* base = new (std::nothrow) char[n + 1];
  if (base == nullptr) {
    out[0] = '\0';
    return;
  }
  strcpy(out, name);
  ZQGlob::sepfile(out, base, nullptr);
  ZQGlob::appndnam(out, base);
  ZQGlob::appndext(out, ext);
  delete[] base;
}

// Clipper and FoxPro writers store the length of a character field longer
// than 255 bytes with the decimals byte as its high byte (5,000 = 0x88 +
// 0x13 * 256). Read one byte, such a field would be 136 bytes wide and every
// field behind it read from the wrong offset. When the lengths read so do
// not add up to the record length and the ones read the other way for C
// fields with decimals (which a C field never has otherwise) do, the other
// way is taken.
void ReadLongCharFields(ZQDBFILE* db, ZQDBFIELD** fields, int count) {
  uint32_t plain = 1, wide = 1;
  bool any = false;
  for (int i = 0; i < count; ++i) {
    plain += fields[i]->length;
    bool long_c = fields[i]->type == 'C' && fields[i]->decimals != 0;
    wide += fields[i]->length + (long_c ? 256u * fields[i]->decimals : 0);
    any = any || long_c;
  }
  if (!any || plain == db->reclen || wide != db->reclen) return;
  for (int i = 0; i < count; ++i) {
    if (fields[i]->type != 'C' || fields[i]->decimals == 0) continue;
    fields[i]->length = uint16_t(fields[i]->length + 256 * fields[i]->decimals);
    fields[i]->decimals = 0;
  }
}

}  // namespace

int dbreadhdr2(ZQDBFILE* db, ZQDBFIELD** fields) {
  ZQFileProxy& f = db->datafile;
  int lo = f.getch(), hi = f.getch();
  db->reccount = int32_t(uint16_t((lo & 0xFF) | (hi & 0xFF) << 8));
  f.getch();  // month, year, day: never read
  f.getch();
  f.getch();
  lo = f.getch();
  hi = f.getch();
  db->reclen = uint16_t((lo & 0xFF) | (hi & 0xFF) << 8);
  if (f.hasError() || db->reclen == 0) return -1;
  int count = 0;
  int c = f.getch();
  while (c != kHeaderTerminator && count < kMaxFields) {
    ZQDBFIELD* fd = new (std::nothrow) ZQDBFIELD();
    if (fd == nullptr) return -1;
    fields[count++] = fd;
    ReadName(f, c, fd);
    fd->type = int8_t(f.getch());
    fd->length = uint8_t(f.getch());
    f.getch();
    f.getch();
    fd->decimals = uint8_t(f.getch());
    c = f.getch();
    if (f.hasError()) return -1;
  }
  if (count < kMaxFields) fields[count] = nullptr;
  if (count == 0) return -1;
  db->fieldcount = uint16_t(count);
  ReadLongCharFields(db, fields, count);
  db->hdrlen = uint16_t(count <= kNarrowMaxRoomFields ? kNarrowFirstRecord : 16 * count + 9);
  return 0;
}

int dbreadhdr3(ZQDBFILE* db, ZQDBFIELD** fields) {
  ZQFileProxy& f = db->datafile;
  f.seek(3, 1);
  uint8_t b[8];
  for (uint8_t& x : b) x = uint8_t(f.getch());
  db->reccount = int32_t(uint32_t(b[0]) | uint32_t(b[1]) << 8 | uint32_t(b[2]) << 16 | uint32_t(b[3]) << 24);
  db->hdrlen = uint16_t(b[4] | b[5] << 8);
  db->reclen = uint16_t(b[6] | b[7] << 8);
  if (f.hasError()) return -1;
  f.seek(20, 1);
  int limit;
  switch (db->dialect) {
    case DIALECT_DBASE4:
    case DIALECT_FOXPRO:
    case DIALECT_VFOXPRO: limit = 256; break;
    case DIALECT_CLIPPER: limit = 1000; break;
    case DIALECT_VDBASE: limit = 1024; break;
    default: limit = 128; break;
  }
  int count = 0;
  int c = f.getch();
  while (c != kHeaderTerminator && count < limit) {
    ZQDBFIELD* fd = new (std::nothrow) ZQDBFIELD();
    if (fd == nullptr) return -1;
    fields[count++] = fd;
    ReadName(f, c, fd);
    fd->type = int8_t(f.getch());
    f.seek(4, 1);
    fd->length = uint8_t(f.getch());
    fd->decimals = uint8_t(f.getch());
    f.seek(14, 1);
    c = f.getch();
    if (f.hasError()) return -1;
  }
  if (count < kMaxFields) fields[count] = nullptr;
  db->fieldcount = uint16_t(count);
  ReadLongCharFields(db, fields, count);
  return 0;
}

ZQDBFILE* dbopen(ZQNotifier* notifier, const char* name, ZQDBFIELD** fields, int* version, bool writable) {
  if (name == nullptr || fields == nullptr || version == nullptr) return nullptr;
  ZQDBFILE* db = new (std::nothrow) ZQDBFILE();
  if (db == nullptr) return nullptr;
  db->datafile.setNotifier(notifier);
  db->memofile.setNotifier(notifier);
  fields[0] = nullptr;
  if (db->datafile.openfile(name, writable ? "r+b" : "rb", 0) != 0) {
    delete db;
    return nullptr;
  }
  auto fail = [&]() -> ZQDBFILE* {
    db->datafile.close(true);
    FreeFields(fields);
    delete db;
    return nullptr;
  };

  int first = db->datafile.getch();
  if (first < 0) return fail();
  uint8_t ver = uint8_t(first);
  db->filever = ver;
  if (!AcceptVersion(ver, version)) return fail();
  // The dialect in force while the header is read (field limits hang on it).
  db->dialect = uint8_t(*version);
  if (*version == DIALECT_VFOXPRO) {
    char fpt[1100];
    SiblingPath(name, "fpt", fpt, sizeof fpt);
    if (fpt[0] != '\0' && _access(fpt, 0) == 0) ver = 0xB0;
  }

  int rc = IsNarrowDialect(*version) ? dbreadhdr2(db, fields) : dbreadhdr3(db, fields);
  if (rc != 0) return fail();

  db->dialect = uint8_t(*version);
  db->changed = 0;
  db->lastop = LASTOP_NONE;
  db->filepos = 0;
  if (db->dialect == DIALECT_ENABLEOA && ver == 0xF3) ver = 0x03;

  for (int i = 0; i < db->fieldcount; ++i) {
    char t = char(fields[i]->type);
    if (t == 'M' || t == 'G' || t == 'B') ver |= 0x80;
  }
  db->version = ver;
  if ((ver & 0x80) == 0) return db;
  if (db->dialect == DIALECT_DBASE2) return fail();
  db->hasmemo = 1;
  if (ver == 0xF5 || ver == 0xB0) db->memokind = MEMO_FPT;
  else if (ver == 0xE5) db->memokind = MEMO_SMT;
  else if (ver & 0x08) db->memokind = db->dialect == DIALECT_ENABLEOA ? MEMO_DB3 : MEMO_DB4;
  else db->memokind = MEMO_DB3;
  if (openmemo(name, db, writable) != 0) db->memofailed = 1;
  return db;
}
