// dbopen: which version bytes each dialect takes, the two header layouts,
// field limits, the memo kind, and headers that must be refused.
#include <gtest/gtest.h>

#include <string>

#include "table/dbf.h"
#include "tests/support/read_harness.h"

namespace {

using tests::Bytes;
using tests::DbfBuilder;

using Opened = tests::OpenedTable;

bool IsNarrow(int dialect) { return dialect == 0 || dialect == 3; }

// The version bytes each dialect opens, as the dialect table gives them.
bool Accepts(int dialect, int v) {
  bool low3 = (v & 7) == 3;
  switch (dialect) {
    case 0: return v == 0x02;
    case 1: case 2: case 4: case 8: case 9: return low3 || v == 0xF5 || v == 0xE5;
    case 3: return v == 0x02 || v == 0xFE;
    case 5: return true;
    case 6: return v == 0x03 || v == 0xF5;
    case 7: return low3 || v == 0xFE;
    case 10: return v == 0x30;
  }
  return false;
}

Bytes SmallTable(uint8_t version, bool narrow) {
  return DbfBuilder(version, narrow).Field("NAME", 'C', 4).Record({"abcd"}).Build();
}

TEST(ReadOpenTest, VersionBytesEachDialectAccepts) {
  for (int dialect = 0; dialect <= 10; ++dialect) {
    for (int v = 0; v < 256; ++v) {
      std::string path = tests::WriteScratch("open_version.dbf", SmallTable(uint8_t(v), IsNarrow(dialect)));
      Opened t(path, dialect);
      ASSERT_EQ(t.db != nullptr, Accepts(dialect, v)) << "dialect " << dialect << " byte " << v;
      if (t.db == nullptr) {
        EXPECT_EQ(t.version, dialect);  // a refusal leaves the caller's dialect
        continue;
      }
      int expect = dialect;
      if (dialect == 1 || dialect == 2 || dialect == 4 || dialect == 8 || dialect == 9) {
        if (v == 0xF5) expect = 6;  // the file overrides the option only here
        if (v == 0xE5) expect = 8;
      }
      ASSERT_EQ(t.version, expect) << "dialect " << dialect << " byte " << v;
      EXPECT_EQ(t.db->dialect, expect);
      EXPECT_EQ(t.db->fieldcount, 1);
      EXPECT_STREQ(t.fields[0]->name, "NAME");
    }
  }
}

TEST(ReadOpenTest, OverriddenDialectReadsWithItsOwnLimits) {
  // 0xF5 under dialect 1 is read as FoxPro, whose limit is 256 fields, not 128.
  DbfBuilder b(0xF5);
  for (int i = 0; i < 200; ++i) b.Field("F" + std::to_string(i), 'C', 1);
  Opened t(tests::WriteScratch("open_f5.dbf", b.Build()), 1);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.version, 6);
  EXPECT_EQ(t.db->fieldcount, 200);
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

  // dBASE II can't have a memo: an M field refuses the table.
  Bytes dbase2 = DbfBuilder(0x02, true).Field("NAME", 'C', 4).Field("NOTE", 'M', 10).Build();
  EXPECT_EQ(Opened(tests::WriteScratch("open_d2memo.dbf", dbase2), 0).db, nullptr);
}

TEST(ReadOpenTest, NarrowHeaderPlacesTheFirstRecord) {
  // 32 fields or fewer: always 32 descriptors' room, first record at 521.
  DbfBuilder b32(0x02, true);
  for (int i = 0; i < 32; ++i) b32.Field("F" + std::to_string(i), 'C', 1);
  b32.Record(std::vector<std::string>(32, "x"));
  Bytes bytes = b32.Build();
  ASSERT_EQ(bytes[520], 0x0D);  // the terminator, last of the 32 descriptors' room
  ASSERT_EQ(bytes[521], 0x20);  // the flag of record 0
  Opened t32(tests::WriteScratch("open_n32.dbf", bytes), 0);
  ASSERT_NE(t32.db, nullptr);
  EXPECT_EQ(t32.db->hdrlen, 521);
  EXPECT_EQ(t32.db->reclen, 33);
  EXPECT_EQ(t32.db->reccount, 1);

  // 33 fields (Enable only): the terminator is the last header byte, 16n + 9.
  DbfBuilder b33(0x02, true);
  for (int i = 0; i < 33; ++i) b33.Field("F" + std::to_string(i), 'C', 1);
  b33.Record(std::vector<std::string>(33, "y"));
  Opened t33(tests::WriteScratch("open_n33.dbf", b33.Build()), 3);
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
  EXPECT_EQ(std::string(f.name) + char(f.type) + std::to_string(f.length) + "," + std::to_string(f.decimals), "PRICEN7,2");
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

  // The skipped areas of header and descriptor don't matter.
  Bytes noisy = DbfBuilder(0x03).Field("ID", 'C', 3).Record({"xyz"}).Build();
  for (int i = 12; i < 32; ++i) noisy[size_t(i)] = 0xAA;
  for (int i = 12; i < 16; ++i) noisy[size_t(kWideFields + i)] = 0xBB;
  for (int i = 18; i < 32; ++i) noisy[size_t(kWideFields + i)] = 0xCC;
  Opened n(tests::WriteScratch("open_noisy.dbf", noisy), 2);
  ASSERT_NE(n.db, nullptr);
  EXPECT_EQ(n.fields[0]->length, 3);
  ASSERT_EQ(dbget(n.db, 0, buf, &live), 0);
  EXPECT_EQ(std::string(buf, 3), "xyz");
}

TEST(ReadOpenTest, FieldLimitsStopTheDescriptorsNotTheRecords) {
  // 300 one-byte fields in dialect 1: 128 fields, and the record length still
  // covers all 300, so the flags of later records stay right.
  DbfBuilder b(0x03);
  for (int i = 0; i < 300; ++i) b.Field("F" + std::to_string(i), 'C', 1);
  b.Record(std::vector<std::string>(300, "a")).Deleted(std::vector<std::string>(300, "b"))
      .Record(std::vector<std::string>(300, "c"));
  Bytes bytes = b.Build();
  Opened t(tests::WriteScratch("open_300.dbf", bytes), 1);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->fieldcount, 128);
  EXPECT_EQ(t.fields[127] != nullptr, true);
  EXPECT_EQ(t.fields[128], nullptr);
  EXPECT_EQ(t.db->reclen, 301);
  char buf[300];
  int live = 0;
  const char expect[] = {'a', 'b', 'c'};
  for (int r = 0; r < 3; ++r) {
    ASSERT_EQ(dbget(t.db, r, buf, &live), 0);
    EXPECT_EQ(live, r == 1 ? 0 : 1) << r;
    EXPECT_EQ(std::string(buf, 300), std::string(300, expect[r])) << r;
  }

  struct Limit {
    int dialect;
    int limit;
  };
  DbfBuilder wide(0x03);
  for (int i = 0; i < 1100; ++i) wide.Field("F" + std::to_string(i), 'C', 1);
  std::string path = tests::WriteScratch("open_1100.dbf", wide.Build());
  for (Limit l : {Limit{1, 128}, Limit{2, 256}, Limit{4, 128}, Limit{5, 128}, Limit{7, 128}, Limit{8, 1000},
                  Limit{9, 1024}}) {
    Opened w(path, l.dialect);
    ASSERT_NE(w.db, nullptr) << l.dialect;
    EXPECT_EQ(w.db->fieldcount, l.limit) << l.dialect;
    EXPECT_EQ(w.db->reclen, 1101);
  }
}

TEST(ReadOpenTest, FullElevenByteNameStaysBounded) {
  Bytes bytes = DbfBuilder(0x03).Field("ABCDEFGHIJK", 'C', 2).Build();
  Opened t(tests::WriteScratch("open_name11.dbf", bytes), 2);
  ASSERT_NE(t.db, nullptr);
  EXPECT_STREQ(t.fields[0]->name, "ABCDEFGHIJK");  // all 11 bytes, then a NUL
}

TEST(ReadOpenTest, DamagedHeadersAreRefused) {
  Bytes good_wide = DbfBuilder(0x03).Field("NAME", 'C', 4).Field("QTY", 'N', 3).Record({"ab", "1"}).Build();
  Bytes good_narrow = DbfBuilder(0x02, true).Field("NAME", 'C', 4).Record({"ab"}).Build();
  ASSERT_NE(Opened(tests::WriteScratch("bad_ok.dbf", good_wide), 2).db, nullptr);
  ASSERT_NE(Opened(tests::WriteScratch("bad_ok2.dbf", good_narrow), 0).db, nullptr);

  EXPECT_EQ(Opened(tests::ScratchPath("bad_missing.dbf"), 2).db, nullptr);
  EXPECT_EQ(Opened(tests::WriteScratch("bad_empty.dbf", {}), 2).db, nullptr);
  EXPECT_EQ(Opened(tests::WriteScratch("bad_empty0.dbf", {}), 5).db, nullptr);
  EXPECT_EQ(Opened(tests::ScratchPath(""), 2).db, nullptr);  // a directory

  // Cut anywhere inside the header or the descriptors, including just before
  // the terminator (the file ends where the descriptors should stop).
  for (size_t cut : {size_t(1), size_t(8), size_t(11), size_t(20), size_t(32), size_t(40), size_t(95)}) {
    Bytes b(good_wide.begin(), good_wide.begin() + long(cut));
    EXPECT_EQ(Opened(tests::WriteScratch("bad_cut.dbf", b), 2).db, nullptr) << cut;
  }
  for (size_t cut : {size_t(3), size_t(7), size_t(9), size_t(24)}) {
    Bytes b(good_narrow.begin(), good_narrow.begin() + long(cut));
    EXPECT_EQ(Opened(tests::WriteScratch("bad_cutn.dbf", b), 0).db, nullptr) << cut;
  }

  // Narrow: a record length of 0, and a header with no descriptors.
  Bytes zero_len = good_narrow;
  PutLe16(&zero_len[kNarrowRecLen], 0);
  EXPECT_EQ(Opened(tests::WriteScratch("bad_reclen0.dbf", zero_len), 0).db, nullptr);
  Bytes no_fields = good_narrow;
  no_fields[kNarrowFields] = 0x0D;
  EXPECT_EQ(Opened(tests::WriteScratch("bad_nofields.dbf", no_fields), 3).db, nullptr);

  // A wide header with zero descriptors isn't refused: no fields to read.
  Bytes wide_none = DbfBuilder(0x03).Build();
  Opened none(tests::WriteScratch("bad_widenone.dbf", wide_none), 2);
  ASSERT_NE(none.db, nullptr);
  EXPECT_EQ(none.db->fieldcount, 0);

  // Descriptors that never meet 0x0D: the file ends inside them.
  Bytes endless = good_wide;
  endless.resize(32 + 64);  // drop the terminator and all behind it
  EXPECT_EQ(Opened(tests::WriteScratch("bad_noterm.dbf", endless), 2).db, nullptr);
  Bytes endless_narrow(good_narrow.begin(), good_narrow.begin() + 8 + 16);
  EXPECT_EQ(Opened(tests::WriteScratch("bad_noterm2.dbf", endless_narrow), 0).db, nullptr);
}

}  // namespace
