// Reading tables. dbopen: which version bytes each dialect takes, the two
// header layouts, field limits, the memo kind, and headers that must be
// refused. dbget and dbclose: record bytes and flags, the bound on the record
// number, records cut by the end of the file, and a read-only close that
// leaves the file as it was.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "table/dbf.h"
#include "tests/support/read_harness.h"

namespace {

using tests::Bytes;
using tests::DbfBuilder;

using Opened = tests::OpenedTable;

bool IsNarrow(int dialect) { return dialect == 0 || dialect == 3; }

// The dialect a table of version byte `v` is read as under `dialect`, as the
// dialect table gives it (the file overrides the option only with 0xF5 and
// 0xE5), or -1 when the dialect refuses the byte.
int OpensAs(int dialect, int v) {
  bool low3 = (v & 7) == 3;
  switch (dialect) {
    case 0: return v == 0x02 ? 0 : -1;
    case 1: case 2: case 4: case 8: case 9: return v == 0xF5 ? 6 : v == 0xE5 ? 8 : low3 ? dialect : -1;
    case 3: return v == 0x02 || v == 0xFE ? 3 : -1;
    case 5: return 5;
    case 6: return v == 0x03 || v == 0xF5 ? 6 : -1;
    case 7: return low3 || v == 0xFE ? 7 : -1;
    case 10: return v == 0x30 ? 10 : -1;
  }
  return -1;
}

// A table of `n` one-byte C fields F0, F1, ...; its records hold `values`,
// each repeated in every field.
DbfBuilder OneByteFields(uint8_t version, int n, const std::string& values = "", bool narrow = false) {
  DbfBuilder b(version, narrow);
  for (int i = 0; i < n; ++i) b.Field("F" + std::to_string(i), 'C', 1);
  for (char v : values) b.Record(std::vector<std::string>(size_t(n), std::string(1, v)));
  return b;
}

TEST(ReadOpenTest, VersionBytesEachDialectAccepts) {
  for (int v = 0; v < 256; ++v) {
    std::string wide = tests::WriteScratch("open_wide.dbf", DbfBuilder(uint8_t(v)).Field("NAME", 'C', 4).Build());
    std::string narrow =
        tests::WriteScratch("open_narrow.dbf", DbfBuilder(uint8_t(v), true).Field("NAME", 'C', 4).Build());
    for (int dialect = 0; dialect <= 10; ++dialect) {
      SCOPED_TRACE(testing::Message() << "dialect " << dialect << " byte " << v);
      Opened t(IsNarrow(dialect) ? narrow : wide, dialect);
      int expect = OpensAs(dialect, v);
      ASSERT_EQ(t.db != nullptr, expect >= 0);
      ASSERT_EQ(t.version, expect < 0 ? dialect : expect);  // a refusal leaves the caller's dialect
      if (t.db == nullptr) continue;
      EXPECT_EQ(t.db->dialect, expect);
      EXPECT_EQ(t.db->fieldcount, 1);
      EXPECT_STREQ(t.fields[0]->name, "NAME");
    }
  }
}

TEST(ReadOpenTest, MemoKindFollowsTheVersionByte) {
  struct Case {
    uint8_t version;
    int dialect;
    char type;  // of the only field
    int hasmemo;
    uint8_t memokind;
  };
  const Case cases[] = {
      {0x03, 2, 'C', 0, MEMO_NONE},  {0x83, 1, 'C', 1, MEMO_DB3},   {0x8B, 2, 'C', 1, MEMO_DB4},
      {0x8B, 7, 'C', 1, MEMO_DB3},   {0xF5, 6, 'C', 1, MEMO_FPT},   {0xE5, 8, 'C', 1, MEMO_SMT},
      {0x03, 2, 'M', 1, MEMO_DB3},   // a memo-type field sets bit 7
      {0x0B, 2, 'G', 1, MEMO_DB4},   {0x03, 1, 'B', 1, MEMO_DB3},
      {0xF3, 7, 'C', 0, MEMO_NONE},  // Enable OA reads 0xF3 as 0x03
      {0xFE, 3, 'C', 1, MEMO_DB4},   {0x30, 10, 'C', 0, MEMO_NONE},
      {0x30, 10, 'B', 1, MEMO_FPT},  // B sets the memo bit in every dialect: 0xB0
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::Message() << "byte " << int(c.version) << " dialect " << c.dialect << " " << c.type);
    Bytes bytes = DbfBuilder(c.version, IsNarrow(c.dialect)).Field("F", c.type, 10).Build();
    Opened t(tests::WriteScratch("open_memo.dbf", bytes), c.dialect);
    ASSERT_NE(t.db, nullptr);
    EXPECT_EQ(t.db->hasmemo, c.hasmemo);
    EXPECT_EQ(t.db->memokind, c.memokind);
    EXPECT_EQ(t.db->memofailed, c.hasmemo);  // no memo file lies beside any of them
  }

  // Visual FoxPro: a .fpt file beside the table makes the byte count as 0xB0.
  std::string path = tests::WriteScratch("open_vfp.dbf", DbfBuilder(0x30).Field("F", 'C', 10).Build());
  Bytes fpt(512, 0);
  fpt[7] = 64;  // block size 64, big-endian at offset 6
  tests::WriteScratch("open_vfp.fpt", fpt);
  Opened vfp(path, 10);
  ASSERT_NE(vfp.db, nullptr);
  EXPECT_EQ(vfp.db->hasmemo, 1);
  EXPECT_EQ(vfp.db->memokind, MEMO_FPT);
}

TEST(ReadOpenTest, SkippedHeaderBytesDontCount) {
  // The skipped areas of header and descriptor, and a name of all 11 bytes
  // (no NUL in the file), read whole and ended there.
  Bytes bytes = DbfBuilder(0x03).Field("ABCDEFGHIJK", 'N', 7, 2).Build();
  for (int i = 12; i < 32; ++i) bytes[size_t(i)] = 0xAA;
  for (int i = 12; i < 16; ++i) bytes[size_t(kWideFields + i)] = 0xBB;
  for (int i = 18; i < 32; ++i) bytes[size_t(kWideFields + i)] = 0xCC;
  Opened t(tests::WriteScratch("open_skipped.dbf", bytes), 2);
  ASSERT_NE(t.db, nullptr);
  const ZQDBFIELD& f = *t.fields[0];
  EXPECT_EQ(std::string(f.name) + char(f.type) + std::to_string(f.length) + "," + std::to_string(f.decimals),
            "ABCDEFGHIJKN7,2");
}

TEST(ReadOpenTest, FieldLimitsStopTheDescriptorsNotTheRecords) {
  // 1100 one-byte fields: each dialect reads as many as its limit, and the
  // record length still covers all of them. 0xF5 under dialect 1 is read as
  // FoxPro, with FoxPro's limit.
  std::string path = tests::WriteScratch("open_1100.dbf", OneByteFields(0x03, 1100).Build());
  std::string fox = tests::WriteScratch("open_f5.dbf", OneByteFields(0xF5, 1100).Build());
  struct Limit {
    const std::string& file;
    int dialect;
    int limit;
  } limits[] = {{path, 1, 128}, {path, 2, 256}, {path, 4, 128}, {path, 5, 128}, {path, 7, 128},
                {path, 8, 1000}, {path, 9, 1024}, {fox, 1, 256}};
  for (const Limit& l : limits) {
    SCOPED_TRACE(l.dialect);
    Opened t(l.file, l.dialect);
    ASSERT_NE(t.db, nullptr);
    EXPECT_EQ(t.db->fieldcount, l.limit);
    EXPECT_NE(t.fields[l.limit - 1], nullptr);
    if (l.limit < kMaxFields) {
      EXPECT_EQ(t.fields[l.limit], nullptr);
    }
    EXPECT_EQ(t.db->reclen, 1101);
  }
}

TEST(ReadOpenTest, DamagedHeadersAreRefused) {
  Bytes good_wide = DbfBuilder(0x03).Field("NAME", 'C', 4).Field("QTY", 'N', 3).Record({"ab", "1"}).Build();
  Bytes good_narrow = DbfBuilder(0x02, true).Field("NAME", 'C', 4).Record({"ab"}).Build();

  EXPECT_EQ(Opened(tests::ScratchPath("bad_missing.dbf"), 2).db, nullptr);
  EXPECT_EQ(Opened(tests::ScratchPath(""), 2).db, nullptr);  // a directory

  Bytes zero_len = good_narrow;  // a narrow record length of 0
  PutLe16(&zero_len[kNarrowRecLen], 0);
  Bytes no_fields = good_narrow;  // a narrow header with no descriptors
  no_fields[kNarrowFields] = 0x0D;
  struct Case {
    const char* what;
    Bytes bytes;
    int dialect;
  } cases[] = {
      {"empty", {}, 2},
      {"empty, any byte", {}, 5},
      {"zero record length", zero_len, 0},
      {"no descriptors", no_fields, 3},
      // Descriptors that never meet 0x0D: the file ends inside them.
      {"no terminator", Bytes(good_wide.begin(), good_wide.begin() + 32 + 64), 2},
      {"no terminator, narrow", Bytes(good_narrow.begin(), good_narrow.begin() + 8 + 16), 0},
      // dBASE II can't have a memo: an M field refuses the table.
      {"dBASE II memo", DbfBuilder(0x02, true).Field("NAME", 'C', 4).Field("NOTE", 'M', 10).Build(), 0},
  };
  for (const Case& c : cases)
    EXPECT_EQ(Opened(tests::WriteScratch("bad.dbf", c.bytes), c.dialect).db, nullptr) << c.what;

  // Cut anywhere inside the header or the descriptors, including just before
  // the terminator (the file ends where the descriptors should stop).
  for (long cut : {1, 8, 11, 20, 32, 40, 95}) {
    Bytes b(good_wide.begin(), good_wide.begin() + cut);
    EXPECT_EQ(Opened(tests::WriteScratch("bad_cut.dbf", b), 2).db, nullptr) << cut;
  }
  for (long cut : {3, 7, 9, 24}) {
    Bytes b(good_narrow.begin(), good_narrow.begin() + cut);
    EXPECT_EQ(Opened(tests::WriteScratch("bad_cutn.dbf", b), 0).db, nullptr) << cut;
  }

  // A wide header with zero descriptors isn't refused: no fields to read.
  Opened none(tests::WriteScratch("bad_widenone.dbf", DbfBuilder(0x03).Build()), 2);
  ASSERT_NE(none.db, nullptr);
  EXPECT_EQ(none.db->fieldcount, 0);
}

// Three records of "ID" C3 and "N" N2 behind a header of 97 bytes: live,
// deleted, live.
const Bytes kThree = DbfBuilder(0x03).Field("ID", 'C', 3).Field("N", 'N', 2).Record({"abc", "1"})
                         .Deleted({"def", "2"}).Record({"ghi", "3"}).Build();

TEST(ReadGetTest, RecordsCutByTheEndOfTheFile) {
  // The header counts 3 records; the file ends inside record 2, right behind
  // its live flag (no record bytes came: no record, whatever the flag says),
  // or before it (no end mark either). Whole records come with their flag and
  // leave the position behind them; a cut record gives the count of bytes
  // that came; a number outside 0 to the count gives -1 without a read.
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
    for (int32_t r : {0, 1}) {
      ASSERT_EQ(dbget(t.db, r, buf, &live), 0);
      EXPECT_EQ(std::string(buf, 5), r == 0 ? "abc1 " : "def2 ");
      EXPECT_EQ(live, 1 - r);
      EXPECT_EQ(t.db->filepos, 97 + 6 * (r + 1));
    }
    EXPECT_EQ(dbget(t.db, 2, buf, &live), c.rc);
    if (c.live >= 0) {
      EXPECT_EQ(live, c.live);
    }
    EXPECT_EQ(t.db->filepos, -1);
    EXPECT_EQ(dbget(t.db, 4, buf, &live), -1);
    EXPECT_EQ(dbget(t.db, -1, buf, &live), -1);
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
