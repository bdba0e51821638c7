// libxbase64 as an independent writer and reader of NDX files, for
// test_index_dbase.py:
//   xbase64_ndx index T.dbf T.ndx EXPR               builds T.ndx over the records of T.dbf
//   xbase64_ndx walk T.dbf T.ndx forwards|backwards  prints the record number of each key
#include <xbase64/xbase64.h>

#include <cstdint>
#include <cstdio>
#include <cstring>

// libxbase64 3.1.2 decodes a 4-byte number into the low half of an 8-byte
// long on the stack and returns the whole long, so on a 64-bit system every
// node and record number it reads from a file carries stack bytes in its
// upper half, and its walks seek far past the end of the file. The library
// calls these two through the dynamic linker, so the definitions here, which
// decode the 4 little-endian bytes into the whole long, take their place.
xbULong xbXBase::GetULong(const char* p) {
  const uint8_t* b = reinterpret_cast<const uint8_t*>(p);
  return uint32_t(b[0]) | uint32_t(b[1]) << 8 | uint32_t(b[2]) << 16 | uint32_t(b[3]) << 24;
}

xbLong xbXBase::GetLong(const char* p) { return int32_t(GetULong(p)); }

namespace {

int Fail(const char* what, int rc) {
  fprintf(stderr, "xbase64_ndx: %s: %d\n", what, rc);
  return 1;
}

}  // namespace

int main(int argc, char** argv) {
  bool build = argc == 5 && strcmp(argv[1], "index") == 0;
  bool walk = argc == 5 && strcmp(argv[1], "walk") == 0;
  if (!build && !walk) {
    fprintf(stderr, "usage: xbase64_ndx index T.dbf T.ndx EXPR | walk T.dbf T.ndx forwards|backwards\n");
    return 2;
  }
  xbXBase x;
  xbDbf table(&x);
  xbNdx ndx(&table);
  table.AutoLockOff();
  int rc = table.OpenDatabase(argv[2]);
  if (rc != XB_NO_ERROR) return Fail("OpenDatabase", rc);
  if (build) {
    if ((rc = ndx.CreateIndex(argv[3], argv[4], XB_NOT_UNIQUE, XB_OVERLAY)) != XB_NO_ERROR)
      return Fail("CreateIndex", rc);
    if ((rc = ndx.ReIndex()) != XB_NO_ERROR) return Fail("ReIndex", rc);
  } else {
    bool forwards = strcmp(argv[4], "backwards") != 0;
    if ((rc = ndx.OpenIndex(argv[3])) != XB_NO_ERROR) return Fail("OpenIndex", rc);
    for (rc = forwards ? ndx.GetFirstKey() : ndx.GetLastKey(); rc == XB_NO_ERROR;
         rc = forwards ? ndx.GetNextKey() : ndx.GetPrevKey())
      printf("%ld\n", long(table.GetCurRecNo()));
    if (rc != XB_EOF && rc != XB_BOF) return Fail("walk", rc);
  }
  ndx.CloseIndex();
  table.CloseDatabase();
  return 0;
}
