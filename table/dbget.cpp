// Reading one record, with the position cache shared with dbput.
#include "table/dbf.h"

int32_t dbget(ZQDBFILE* db, int32_t recno, char* buf, int* live) {
  ZQFileProxy& f = db->datafile;
  f.clearErrors();
  *live = 0;
  if (recno < 0 || recno > TableCount(db)) return -1;
  int64_t offset = int64_t{db->hdrlen} + int64_t{recno} * db->reclen;
  // A run of reads in sequence makes no seek; the first read after a write
  // always makes one.
  if (db->filepos != offset || db->lastop == LASTOP_WRITE) f.seek(offset, 0);
  db->lastop = LASTOP_READ;
  int flag = f.getch();
  int32_t want = db->reclen > 0 ? int32_t(db->reclen) - 1 : 0;
  int32_t got = flag < 0 ? 0 : f.read(buf, want);
  // A flag with no record bytes behind it (the file ends right after it) is
  // no record, whatever the flag says: it reads as a dead one.
  *live = flag == kLiveFlag && (got > 0 || want == 0) ? 1 : 0;
  if (flag >= 0 && got == want && offset + db->reclen <= INT32_MAX) {
    db->filepos = int32_t(offset + db->reclen);
    return 0;
  }
  db->filepos = -1;
  return got;
}
