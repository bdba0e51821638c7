// dbopen: which version bytes each dialect takes, the two header layouts,
// field limits, the memo kind, and headers that must be refused.
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
  for (int dialect = 0; dialect <= 10; ++dialect) {
    for (int v = 0; v < 256; ++v) {
      Bytes bytes = DbfBuilder(uint8_t(v), IsNarrow(dialect)).Field("NAME", 'C', 4).Record({"abcd"}).Build();
      Opened t(tests::WriteScratch("open_version.dbf", bytes), dialect);
      int expect = OpensAs(dialect, v);
      ASSERT_EQ(t.db != nullptr, expect >= 0) << "dialect " << dialect << " byte " << v;
      // A refusal leaves the caller's dialect.
      ASSERT_EQ(t.version, expect < 0 ? dialect : expect) << "dialect " << dialect << " byte " << v;
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

TEST(ReadOpenTest, NarrowHeaderPlacesTheFirstRecord) {
  // 32 fields or fewer: always 32 descriptors' room, first record at 521.
  Bytes bytes = OneByteFields(0x02, 32, "x", true).Build();
  ASSERT_EQ(bytes[520], 0x0D);  // the terminator, last of the 32 descriptors' room
  ASSERT_EQ(bytes[521], 0x20);  // the flag of record 0
  Opened t32(tests::WriteScratch("open_n32.dbf", bytes), 0);
  ASSERT_NE(t32.db, nullptr);
  EXPECT_EQ(t32.db->hdrlen, 521);
  EXPECT_EQ(t32.db->reclen, 33);
  EXPECT_EQ(t32.db->reccount, 1);

  // 33 fields (Enable only): the terminator is the last header byte, 16n + 9.
  Opened t33(tests::WriteScratch("open_n33.dbf", OneByteFields(0x02, 33, "y", true).Build()), 3);
  ASSERT_NE(t33.db, nullptr);
  EXPECT_EQ(t33.db->hdrlen, 537);
  EXPECT_EQ(t33.db->fieldcount, 33);
  char buf[33];
  int live = 0;
  ASSERT_EQ(dbget(t33.db, 0, buf, &live), 0);
  EXPECT_EQ(live, 1);
  EXPECT_EQ(std::string(buf, 33), std::string(33, 'y'));

  // Descriptor bytes: name, type, length, two skipped bytes, decimals.
  Bytes one = DbfBuilder(0x02, true).Field("PRICE", 'N', 7, 2).Build();
  one[kNarrowFields + 13] = one[kNarrowFields + 14] = 0xEE;  // skipped on reading
  Opened t1(tests::WriteScratch("open_n1.dbf", one), 0);
  ASSERT_NE(t1.db, nullptr);
  const ZQDBFIELD& f = *t1.fields[0];
  EXPECT_EQ(std::string(f.name) + char(f.type) + std::to_string(f.length) + "," + std::to_string(f.decimals),
            "PRICEN7,2");
}

TEST(ReadOpenTest, WideHeaderLengthIsTakenAsWritten) {
  // Visual FoxPro keeps 263 bytes behind the terminator; the header length
  // at offsets 8 and 9 says where records start.
  Bytes bytes = DbfBuilder(0x30).Field("ID", 'C', 3).Field("QTY", 'N', 4).HeaderExtra(263)
                    .Record({"abc", "  12"}).Record({"def", "  34"}).Build();
  ASSERT_EQ(GetLe16(&bytes[kWideHdrLen]), 32 + 64 + 1 + 263);
  for (int i = 97; i < 360; ++i) bytes[size_t(i)] = 0x0D;  // even terminator bytes in the extra room
  Opened t(tests::WriteScratch("open_extra.dbf", bytes), 10);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->hdrlen, 360);
  EXPECT_EQ(t.db->fieldcount, 2);
  char buf[7];
  int live = 0;
  ASSERT_EQ(dbget(t.db, 1, buf, &live), 0);
  EXPECT_EQ(std::string(buf, 7), "def  34");

  // The skipped areas of header and descriptor don't matter, and a name of
  // all 11 bytes (no NUL in the file) is read whole and ends there.
  Bytes noisy = DbfBuilder(0x03).Field("ABCDEFGHIJK", 'C', 3).Record({"xyz"}).Build();
  for (int i = 12; i < 32; ++i) noisy[size_t(i)] = 0xAA;
  for (int i = 12; i < 16; ++i) noisy[size_t(kWideFields + i)] = 0xBB;
  for (int i = 18; i < 32; ++i) noisy[size_t(kWideFields + i)] = 0xCC;
  Opened n(tests::WriteScratch("open_noisy.dbf", noisy), 2);
  ASSERT_NE(n.db, nullptr);
  EXPECT_STREQ(n.fields[0]->name, "ABCDEFGHIJK");
  EXPECT_EQ(n.fields[0]->length, 3);
  ASSERT_EQ(dbget(n.db, 0, buf, &live), 0);
  EXPECT_EQ(std::string(buf, 3), "xyz");
}

TEST(ReadOpenTest, FieldLimitsStopTheDescriptorsNotTheRecords) {
  // 300 one-byte fields in dialect 1: 128 fields, and the record length still
  // covers all 300, so the flags of later records stay right.
  Bytes bytes = OneByteFields(0x03, 300, "ac").Deleted(std::vector<std::string>(300, "b")).Build();
  Opened t(tests::WriteScratch("open_300.dbf", bytes), 1);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->fieldcount, 128);
  EXPECT_NE(t.fields[127], nullptr);
  EXPECT_EQ(t.fields[128], nullptr);
  EXPECT_EQ(t.db->reclen, 301);
  char buf[300];
  int live = 0;
  for (int r = 0; r < 3; ++r) {
    ASSERT_EQ(dbget(t.db, r, buf, &live), 0);
    EXPECT_EQ(live, r == 2 ? 0 : 1) << r;
    EXPECT_EQ(std::string(buf, 300), std::string(300, "acb"[r])) << r;
  }

  // 1100 fields. 0xF5 under dialect 1 is read as FoxPro, with FoxPro's limit.
  std::string path = tests::WriteScratch("open_1100.dbf", OneByteFields(0x03, 1100).Build());
  std::string fox = tests::WriteScratch("open_f5.dbf", OneByteFields(0xF5, 1100).Build());
  struct Limit {
    const std::string& file;
    int dialect;
    int limit;
  } limits[] = {{path, 1, 128}, {path, 2, 256}, {path, 4, 128}, {path, 5, 128}, {path, 7, 128},
                {path, 8, 1000}, {path, 9, 1024}, {fox, 1, 256}};
  for (const Limit& l : limits) {
    Opened w(l.file, l.dialect);
    ASSERT_NE(w.db, nullptr) << l.dialect;
    EXPECT_EQ(w.db->fieldcount, l.limit) << l.dialect;
    EXPECT_EQ(w.db->reclen, 1101);
  }
}

TEST(ReadOpenTest, DamagedHeadersAreRefused) {
  Bytes good_wide = DbfBuilder(0x03).Field("NAME", 'C', 4).Field("QTY", 'N', 3).Record({"ab", "1"}).Build();
  Bytes good_narrow = DbfBuilder(0x02, true).Field("NAME", 'C', 4).Record({"ab"}).Build();
  ASSERT_NE(Opened(tests::WriteScratch("bad_ok.dbf", good_wide), 2).db, nullptr);
  ASSERT_NE(Opened(tests::WriteScratch("bad_ok2.dbf", good_narrow), 0).db, nullptr);

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

}  // namespace
