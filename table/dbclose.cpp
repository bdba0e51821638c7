// Closing a table: the end mark, the record count and today's date when it
// was written to; nothing when it was only read.
#include <new>

#include "table/dbf.h"

int dbclose(ZQDBFIELD** fields, ZQDBFILE* db) {
  if (db == nullptr) return -1;
  // The memo file is closed whether it opened or not (a failed memo leaves a
  // closed object), so the table file never stays open behind a memo failure.
  // Memo bytes still buffered are written now; a failure there counts as a
  // failed close like one of the table file.
  int rc = 0;
  if (db->hasmemo && db->memofile.isOpen() && db->memofile.close(true) != 0) rc = -1;
  if (fields != nullptr) {
    for (int i = 0; i < kMaxFields && fields[i] != nullptr; ++i) {
      delete fields[i];
      fields[i] = nullptr;
    }
  }
  ZQFileProxy& f = db->datafile;
  // An error state left by a read (dbget running off the end of the file) is
  // no failure of the close: only the stamp and the flush below count.
  f.clearErrors();
  if (db->changed && f.isOpen()) {
    int64_t end = int64_t{db->hdrlen} + int64_t{TableCount(db)} * db->reclen;
    f.seek(end, 0);
    f.putch(kEndMark);
    char day, month, year;
    dbdate(&day, &month, &year);
    uint32_t n = uint32_t(db->reccount);
    f.seek(1, 0);
    if (IsNarrowDialect(db->dialect)) {
      const char stamp[5] = {char(n), char(n >> 8), month, year, day};
      f.write(stamp, 5);
    } else {
      const char stamp[7] = {year, month, day, char(n), char(n >> 8), char(n >> 16), char(n >> 24)};
      f.write(stamp, 7);
    }
    if (!f.flush() || f.hasError()) rc = -1;
  }
  if (f.isOpen() && f.close(true) != 0) rc = -1;
  delete db;
  return rc;
}
