// dbget and dbclose on the read side: record bytes and flags, the bound on
// the record number, records cut by the end of the file, and a read-only
// close that leaves the file as it was.
#include <gtest/gtest.h>

#include <string>

#include "table/dbf.h"
#include "tests/support/read_harness.h"

namespace {

using tests::Bytes;
using tests::DbfBuilder;

using Opened = tests::OpenedTable;

// Three records of "ID" C3 and "N" N2 behind a header of 97 bytes: live,
// deleted, live.
const Bytes kThree = DbfBuilder(0x03).Field("ID", 'C', 3).Field("N", 'N', 2).Record({"abc", "1"})
                         .Deleted({"def", "2"}).Record({"ghi", "3"}).Build();

TEST(ReadGetTest, RecordsFlagsAndTheBoundOnTheNumber) {
  Opened t(tests::WriteScratch("get_three.dbf", kThree), 2);
  ASSERT_NE(t.db, nullptr);
  ASSERT_EQ(t.db->reccount, 3);
  struct Call {
    int32_t recno;
    int rc;
    const char* bytes;  // nullptr: not looked at
    int live;
    int32_t filepos;  // behind the record just read; -1 at the end
  } calls[] = {
      {0, 0, "abc1 ", 1, 103}, {1, 0, "def2 ", 0, 109}, {2, 0, "ghi3 ", 1, 115},
      {0, 0, "abc1 ", 1, 103},  // out of order: the position is found again
      // recno equal to the count passes the bound and reads behind the last
      // record: the end mark, then nothing, so a dead record and 0.
      {3, 0, nullptr, 0, -1},
      {4, -1, nullptr, -1, -1}, {-1, -1, nullptr, -1, -1},  // outside: -1 without a read
      {2, 0, "ghi3 ", 1, 115},                               // a failed read spoils nothing
  };
  for (const Call& c : calls) {
    SCOPED_TRACE(c.recno);
    char buf[5];
    int live = -1;
    ASSERT_EQ(dbget(t.db, c.recno, buf, &live), c.rc);
    if (c.rc != 0) continue;
    if (c.bytes != nullptr) {
      EXPECT_EQ(std::string(buf, 5), c.bytes);
    }
    EXPECT_EQ(live, c.live);
    EXPECT_EQ(t.db->filepos, c.filepos);
    EXPECT_EQ(t.db->lastop, LASTOP_READ);
  }
}

TEST(ReadGetTest, RecordsCutByTheEndOfTheFile) {
  // The header counts 3 records; the file ends inside record 2, right behind
  // its live flag (no record bytes came: no record, whatever the flag says),
  // or before it (no end mark either). A cut record gives the count of bytes
  // that came.
  struct Case {
    size_t size;
    int rc;
    int live;  // -1: not looked at
  } cases[] = {{97 + 2 * 6 + 3, 2, -1}, {97 + 2 * 6 + 1, 0, 0}, {97 + 2 * 6, 0, 0}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.size);
    Bytes bytes(kThree.begin(), kThree.begin() + long(c.size));
    Opened t(tests::WriteScratch("get_cut.dbf", bytes), 2);
    ASSERT_NE(t.db, nullptr);
    char buf[5];
    int live = -1;
    ASSERT_EQ(dbget(t.db, 1, buf, &live), 0);
    EXPECT_EQ(dbget(t.db, 2, buf, &live), c.rc);
    if (c.live >= 0) {
      EXPECT_EQ(live, c.live);
    }
    EXPECT_EQ(t.db->filepos, -1);
  }
}

TEST(ReadGetTest, ClosingAReadTableLeavesItsBytes) {
  // Read everything, run off the end, then close: not one byte changes, and
  // no end mark is added to a table that had none. The same with a memo file
  // file that failed to open (0xFE always has one), and in a narrow dialect.
  struct Case {
    Bytes bytes;
    int dialect;
    int memofailed;
  } cases[] = {
      {DbfBuilder(0x03).Field("ID", 'C', 3).Record({"abc"}).Record({"def"}).NoEndMark().Build(), 2, 0},
      {DbfBuilder(0x83).Field("NOTE", 'M', 10).Record({"         1"}).Build(), 1, 1},
      {DbfBuilder(0xFE, true).Field("A", 'C', 1).Record({"z"}).Build(), 3, 1},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(int(c.bytes[0]));
    std::string path = tests::WriteScratch("get_close.dbf", c.bytes);
    Opened t(path, c.dialect);
    ASSERT_NE(t.db, nullptr);
    EXPECT_EQ(t.db->memofailed, c.memofailed);
    char buf[10];
    int live = 0;
    for (int32_t r = 0; r <= t.db->reccount; ++r) dbget(t.db, r, buf, &live);
    EXPECT_EQ(t.Close(), 0);
    EXPECT_EQ(tests::ReadFile(path), c.bytes);
  }
}

}  // namespace
