// Writing one record, with the position cache shared with dbget.
#include "table/dbf.h"

namespace {
// The narrow header holds the record count in 16 bits.
constexpr int32_t kNarrowMaxRecords = 65535;
}  // namespace

int dbput(ZQDBFILE* db, const char* record, int32_t number, int live) {
  if (db == nullptr || record == nullptr || number < 0) return -1;
  int32_t count = TableCount(db);
  if (number > count) return -1;  // nothing written, so no gap can arise
  if (number == count) {
    // The 65,536th record of a narrow table would wrap its count to 0 and
    // hide every record: refused, with nothing written.
    if (IsNarrowDialect(db->dialect) && number >= kNarrowMaxRecords) return -1;
    if (IsNarrowDialect(db->dialect))
      db->reccount = int32_t((uint32_t(db->reccount) & 0xFFFF0000u) | uint32_t(number + 1));
    else
      db->reccount = number + 1;
  }
  int64_t offset = int64_t{db->hdrlen} + int64_t{number} * db->reclen;
  if (offset + db->reclen > INT32_MAX) return -1;
  ZQFileProxy& f = db->datafile;
  // A read may have left the end state behind; it says nothing of writing.
  f.clearErrors();
  db->changed = 1;
  // A run of writes in sequence makes no seek; the first write after a read
  // always makes one.
  if (db->filepos != offset || db->lastop != LASTOP_WRITE) f.seek(offset, 0);
  db->lastop = LASTOP_WRITE;
  f.putch(live ? kLiveFlag : kDeletedFlag);
  int32_t n = db->reclen > 0 ? int32_t(db->reclen) - 1 : 0;
  f.write(record, n);
  if (f.hasError()) {
    db->filepos = -1;
    return -1;
  }
  db->filepos = int32_t(offset + db->reclen);
  return 0;
}
