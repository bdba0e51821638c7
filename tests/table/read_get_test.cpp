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

// Three records of "ID" C3 and "N" N2: live, deleted, live.
Bytes ThreeRecords() {
  return DbfBuilder(0x03).Field("ID", 'C', 3).Field("N", 'N', 2).Record({"abc", "1"}).Deleted({"def", "2"})
      .Record({"ghi", "3"}).Build();
}

TEST(ReadGetTest, RecordsFlagsAndTheBoundOnTheNumber) {
  std::string path = tests::WriteScratch("get_three.dbf", ThreeRecords());
  Opened t(path, 2);
  ASSERT_NE(t.db, nullptr);
  ASSERT_EQ(t.db->reccount, 3);
  char buf[5];
  int live = -1;
  const char* expect[] = {"abc1 ", "def2 ", "ghi3 "};
  for (int r = 0; r < 3; ++r) {
    ASSERT_EQ(dbget(t.db, r, buf, &live), 0) << r;
    EXPECT_EQ(std::string(buf, 5), expect[r]);
    EXPECT_EQ(live, r == 1 ? 0 : 1);
    EXPECT_EQ(t.db->filepos, 97 + 6 * (r + 1));  // behind the record just read
    EXPECT_EQ(t.db->lastop, LASTOP_READ);
  }
  // Out of order: the position is found again.
  ASSERT_EQ(dbget(t.db, 0, buf, &live), 0);
  EXPECT_EQ(std::string(buf, 5), "abc1 ");

  // recno equal to the count passes the bound and reads behind the last
  // record: the end mark, then nothing, so a dead record and 0.
  live = -1;
  EXPECT_EQ(dbget(t.db, 3, buf, &live), 0);
  EXPECT_EQ(live, 0);
  EXPECT_EQ(t.db->filepos, -1);
  // Above the count: -1 without a read.
  EXPECT_EQ(dbget(t.db, 4, buf, &live), -1);
  EXPECT_EQ(dbget(t.db, -1, buf, &live), -1);
  // A failed read doesn't spoil the next one.
  ASSERT_EQ(dbget(t.db, 2, buf, &live), 0);
  EXPECT_EQ(std::string(buf, 5), "ghi3 ");
  EXPECT_EQ(live, 1);
}

TEST(ReadGetTest, RecordsCutByTheEndOfTheFile) {
  // Header count 3, bytes for two records and a half: the half record gives
  // the count of bytes that came.
  Bytes bytes = ThreeRecords();
  bytes.resize(97 + 6 * 2 + 3);  // flag and two bytes of record 2
  Opened half(tests::WriteScratch("get_half.dbf", bytes), 2);
  ASSERT_NE(half.db, nullptr);
  char buf[5];
  int live = 0;
  ASSERT_EQ(dbget(half.db, 1, buf, &live), 0);
  EXPECT_EQ(dbget(half.db, 2, buf, &live), 2);
  EXPECT_EQ(half.db->filepos, -1);

  // The file ends right behind a live flag: no record bytes came, so there is
  // no record, whatever the flag says.
  bytes.resize(97 + 6 * 2 + 1);
  ASSERT_EQ(bytes.back(), 0x20);
  Opened flag_only(tests::WriteScratch("get_flagonly.dbf", bytes), 2);
  ASSERT_NE(flag_only.db, nullptr);
  live = -1;
  EXPECT_EQ(dbget(flag_only.db, 2, buf, &live), 0);
  EXPECT_EQ(live, 0);
  EXPECT_EQ(flag_only.db->filepos, -1);

  // Wholly behind the end, no end mark: 0 and dead.
  bytes.resize(97 + 6 * 2);
  Opened none(tests::WriteScratch("get_none.dbf", bytes), 2);
  ASSERT_NE(none.db, nullptr);
  live = -1;
  EXPECT_EQ(dbget(none.db, 2, buf, &live), 0);
  EXPECT_EQ(live, 0);
}

TEST(ReadGetTest, ClosingAReadTableLeavesItsBytes) {
  // Read everything, run off the end, then close: not one byte changes, and
  // no end mark is added to a table that had none.
  Bytes bytes = DbfBuilder(0x03).Field("ID", 'C', 3).Record({"abc"}).Record({"def"}).NoEndMark().Build();
  std::string path = tests::WriteScratch("get_close.dbf", bytes);
  Opened t(path, 2);
  ASSERT_NE(t.db, nullptr);
  char buf[3];
  int live = 0;
  for (int r = 0; r <= 2; ++r) dbget(t.db, r, buf, &live);
  EXPECT_EQ(t.Close(), 0);
  EXPECT_EQ(tests::ReadFile(path), bytes);

  // The same with a memo file that failed to open, and in a narrow dialect.
  Bytes memo = DbfBuilder(0x83).Field("NOTE", 'M', 10).Record({"         1"}).Build();
  std::string memo_path = tests::WriteScratch("get_close_memo.dbf", memo);
  Opened m(memo_path, 1);
  ASSERT_NE(m.db, nullptr);
  ASSERT_EQ(m.db->memofailed, 1);
  EXPECT_EQ(m.Close(), 0);
  EXPECT_EQ(tests::ReadFile(memo_path), memo);

  Bytes narrow = DbfBuilder(0xFE, true).Field("A", 'C', 1).Record({"z"}).Build();
  std::string narrow_path = tests::WriteScratch("get_close_narrow.dbf", narrow);
  Opened n(narrow_path, 3);
  ASSERT_NE(n.db, nullptr);
  EXPECT_EQ(n.Close(), 0);
  EXPECT_EQ(tests::ReadFile(narrow_path), narrow);
}

}  // namespace
