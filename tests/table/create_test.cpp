// What dbcreat writes for each dialect, byte for byte (Visual FoxPro's 263
// bytes behind the terminator, displacements and fixed binary widths
// included); dbput, dbclose and dbdelete on a new table.
#include <gtest/gtest.h>

#include <cstdio>
#include <string>
#include <vector>

#include "table/dbf.h"
#include "table/memo.h"
#include "tests/support/memo_builder.h"
#include "tests/support/read_harness.h"

namespace {

using tests::Bytes;

constexpr int kMemo = 0x8000;

// Descriptors owned by the test; dbcreat pads their names in place.
using Fields = std::vector<ZQDBFIELD>;

// `n` fields F0, F1, ... of one type and length.
Fields Numbered(int n, char type, uint16_t length) {
  Fields f(size_t(n), ZQDBFIELD{"", int8_t(type), length, 0});
  for (int i = 0; i < n; ++i) snprintf(f[size_t(i)].name, sizeof f[0].name, "F%d", i);
  return f;
}

int DbCreat(const std::string& path, Fields f, int version, bool production = false) {
  std::vector<ZQDBFIELD*> ptrs;
  for (auto& d : f) ptrs.push_back(&d);
  ptrs.push_back(nullptr);
  return dbcreat(path.c_str(), int(f.size()), ptrs.data(), version, production);
}

// A table made in the scratch file `file`; its path.
std::string Create(const std::string& file, const Fields& f, int version, bool production = false) {
  std::string path = tests::ScratchPath(file);
  EXPECT_EQ(DbCreat(path, f, version, production), 0) << file;
  return path;
}

std::string Sibling(const std::string& path, const std::string& ext) {
  return path.substr(0, path.rfind('.') + 1) + ext;
}

// Compares the table dbcreat made at `path` with the builder's bytes (with
// no end mark), the date aside: the file's must be today's.
void ExpectTable(const std::string& path, tests::DbfBuilder want, bool narrow) {
  Bytes b = tests::ReadFile(path), w = want.NoEndMark().Build();
  ASSERT_GE(b.size(), 8u);
  char day, month, year;
  dbdate(&day, &month, &year);
  size_t at = narrow ? 3 : 1;  // narrow: month, year, day; wide: year, month, day
  Bytes today = narrow ? Bytes{uint8_t(month), uint8_t(year), uint8_t(day)}
                       : Bytes{uint8_t(year), uint8_t(month), uint8_t(day)};
  EXPECT_EQ(Bytes(b.begin() + long(at), b.begin() + long(at) + 3), today);
  for (size_t i = at; i < at + 3; ++i) b[i] = w[i] = 0;
  EXPECT_EQ(b, w);
}

TEST(Create, MemoHeaderOfEachKind) {
  struct Case {
    int dialect;
    const char* file;
    const char* ext;
    uint8_t version;
    Bytes memo;
  } cases[] = {
      {DIALECT_DBASE3P, "m1.dbf", "dbt", 0x83, tests::Db3Header(1)},
      {DIALECT_DBASE3, "m4.dbf", "dbt", 0x83, tests::Db3Header(1)},
      {DIALECT_ENABLEOA, "m7.dbf", "dbt", 0x8B, tests::Db3Header(1)},
      {DIALECT_VFOXPRO, "m10.dbf", "fpt", 0x30, tests::FptHeader(8, 64)},
      {DIALECT_FOXPRO, "m6.dbf", "fpt", 0xF5, tests::FptHeader(1, 128)},
      {DIALECT_CLIPPER, "m8.dbf", "smt", 0xE5, tests::SmtHeader(8, 64)},
      {DIALECT_VDBASE, "averyverylongname.dbf", "dbt", 0x8B, tests::Db4Header(1, 0x0101, 512, "AVERYVERY")},
      // The unnamed dialect writes 0x8B, read as the dBASE IV form: it gets
      // that form's header, so that it reads its own memos back.
      {DIALECT_UNNAMED, "m5.dbf", "dbt", 0x8B, tests::Db4Header(1, 0x0101, 512, "M5")},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.file);
    int8_t type = c.dialect == DIALECT_FOXPRO ? 'G' : 'M';
    std::string path = Create(c.file, {{"PIC", type, 10, 0}}, c.dialect | kMemo);
    EXPECT_EQ(tests::ReadFile(path)[0], c.version);
    EXPECT_EQ(tests::ReadFile(Sibling(path, c.ext)), c.memo);
    tests::MemoTable t(path, c.dialect);
    ASSERT_NE(t.db, nullptr);
    EXPECT_EQ(t.db->memofailed, 0);
    uint32_t at = t.Put(0, "round trip");
    EXPECT_NE(at, 0u);
    EXPECT_EQ(t.Get(at, 10), "round trip");
  }
}

TEST(Create, NarrowHeaderTakesTheRoomOf32Fields) {
  // Up to 32 fields the header has the room of 32 descriptors, and the first
  // record lies at 521. 33 fields (Enable only) make 0xFE, no filler, the
  // first record at 16n + 9, and an empty memo file of the dBASE IV form, the
  // form in which 0xFE reopens, so that the table opens cleanly.
  Fields f32 = Numbered(32, 'C', 2);
  Fields f33 = f32;
  f33.push_back({"F32", 'N', 3, 1});
  struct Case {
    int dialect;
    Fields fields;
    uint8_t version;
    int hdrlen;  // as reopened (a table of no fields isn't)
    Bytes memo;  // none: no memo file
  } cases[] = {{DIALECT_DBASE2, {}, 0x02, 0, {}},
               {DIALECT_ENABLE, f32, 0x02, 521, {}},
               {DIALECT_ENABLE, f33, 0xFE, 537, tests::Db4Header(1, 0x0101, 512, "N33")}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.fields.size());
    std::string path = Create("n" + std::to_string(c.fields.size()) + ".dbf", c.fields, c.dialect);
    tests::DbfBuilder want(c.version, true);
    for (const ZQDBFIELD& d : c.fields) want.Field(d.name, char(d.type), d.length, d.decimals);
    ExpectTable(path, want, true);
    EXPECT_EQ(ZQFileProxy::fileExists(Sibling(path, "dbt").c_str()), !c.memo.empty());
    EXPECT_EQ(tests::ReadFile(Sibling(path, "dbt")), c.memo);
    if (c.hdrlen == 0) continue;
    tests::OpenedTable t(path, DIALECT_ENABLE);
    ASSERT_NE(t.db, nullptr);
    EXPECT_EQ(t.db->fieldcount, int(c.fields.size()));
    EXPECT_EQ(t.db->hdrlen, c.hdrlen);
    EXPECT_EQ(t.db->memokind, c.memo.empty() ? MEMO_NONE : MEMO_DB4);
    EXPECT_EQ(t.db->memofailed, 0);
  }
}

TEST(Create, WideEdgeCases) {
  ExpectTable(Create("w0.dbf", {}, DIALECT_DBASE3), tests::DbfBuilder(0x03).HeaderExtra(1), false);

  // A name of all 11 bytes has no NUL in the file.
  Bytes b = tests::ReadFile(Create("w11.dbf", {{"ABCDEFGHIJK", 'C', 5, 0}}, DIALECT_DBASE3P));
  EXPECT_EQ(Bytes(b.begin() + 32, b.begin() + 44), tests::Text("ABCDEFGHIJKC"));

  // A record length past 16 bits is refused before any file is made.
  std::string path = tests::ScratchPath("wbig.dbf");
  EXPECT_EQ(DbCreat(path, Numbered(300, 'C', 255), DIALECT_CLIPPER), -1);
  EXPECT_FALSE(ZQFileProxy::fileExists(path.c_str()));

  // dBASE II can't read a memo field back: refused, nothing made.
  Fields memo = {{"NOTES", 'M', 10, 0}};
  path = tests::ScratchPath("d2memo.dbf");
  EXPECT_EQ(DbCreat(path, memo, DIALECT_DBASE2 | kMemo), -1);
  EXPECT_EQ(DbCreat(path, memo, DIALECT_DBASE2), -1);
  EXPECT_FALSE(ZQFileProxy::fileExists(path.c_str()));
  // Enable takes it, with a dBASE III memo file.
  tests::OpenedTable t(Create("d3memo.dbf", memo, DIALECT_ENABLE | kMemo), DIALECT_ENABLE, true);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->memokind, MEMO_DB3);
  EXPECT_EQ(t.db->memofailed, 0);
}

TEST(Create, WideHeaderFlagsWidthsAndMemoFile) {
  // dBASE IV: the production flag 1 at 28, the terminator and one zero. Visual
  // FoxPro: the caller's widths of the binary forms don't count (I is 4, B, T
  // and Y 8, M and G 4), displacements in the descriptors, flags for a
  // production index (1) and memo fields (2), 263 bytes behind the
  // terminator. "B" is a double in the record, not a memo; a caller that
  // marks a table of doubles as having memos (as the target does in every
  // dialect) gets an empty FPT file all the same, since the table's own open
  // looks for one whenever a "B" field is there, but its flags say it has no
  // memo fields.
  using tests::DbfBuilder;
  struct Case {
    const char* file;
    Fields fields;
    int dialect;
    bool production;
    DbfBuilder header;
    const char* ext;  // of the memo file, if any
    Bytes memo;
  } cases[] = {
      {"wide4.dbf", {{"NAME", 'C', 10, 0}, {"NOTES", 'M', 4, 0}, {"AMOUNT", 'N', 8, 2}}, DIALECT_DBASE4 | kMemo,
       true, DbfBuilder(0x8B).Field("NAME", 'C', 10).Field("NOTES", 'M', 10).Field("AMOUNT", 'N', 8, 2)
           .HeaderExtra(1).Flags(1),
       "dbt", tests::Db4Header(1, 0x0101, 512, "WIDE4")},
      {"vfp_plain.dbf",
       {{"ID", 'I', 11, 0}, {"NAME", 'C', 10, 0}, {"WHEN", 'T', 19, 0}, {"PRICE", 'Y', 20, 4},
        {"AMOUNT", 'N', 8, 2}},
       DIALECT_VFOXPRO, false,
       DbfBuilder(0x30).Field("ID", 'I', 4).Field("NAME", 'C', 10).Field("WHEN", 'T', 8).Field("PRICE", 'Y', 8, 4)
           .Field("AMOUNT", 'N', 8, 2).HeaderExtra(263).Displacements(),
       "", {}},
      {"vfp_memo.dbf",
       {{"NAME", 'C', 10, 0}, {"NOTES", 'M', 10, 0}, {"PIC", 'G', 10, 0}, {"RATE", 'B', 10, 0}},
       DIALECT_VFOXPRO | kMemo, true,
       DbfBuilder(0x30).Field("NAME", 'C', 10).Field("NOTES", 'M', 4).Field("PIC", 'G', 4).Field("RATE", 'B', 8)
           .HeaderExtra(263).Displacements().Flags(0x03),
       "fpt", tests::FptHeader(8, 64)},
      {"vfp_double.dbf", {{"RATE", 'B', 8, 0}}, DIALECT_VFOXPRO | kMemo, false,
       DbfBuilder(0x30).Field("RATE", 'B', 8).HeaderExtra(263).Displacements(), "fpt", tests::FptHeader(8, 64)},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.file);
    std::string path = Create(c.file, c.fields, c.dialect, c.production);
    ExpectTable(path, c.header, false);
    for (const char* ext : {"dbt", "fpt"}) {
      bool made = std::string(ext) == c.ext;
      EXPECT_EQ(ZQFileProxy::fileExists(Sibling(path, ext).c_str()), made) << ext;
      EXPECT_EQ(tests::ReadFile(Sibling(path, ext)), made ? c.memo : Bytes()) << ext;
    }
    // Its own open takes it: the header length is read, not recomputed.
    tests::OpenedTable t(path, c.dialect & ~kMemo);
    ASSERT_NE(t.db, nullptr);
    EXPECT_EQ(t.db->hdrlen, c.header.HeaderLength());
    EXPECT_EQ(t.db->fieldcount, int(c.fields.size()));
    EXPECT_EQ(t.db->reclen, c.header.RecLen());
    EXPECT_EQ(t.db->memofailed, 0);
  }
}

TEST(Put, AppendsRewritesAndCloseStampsTheCount) {
  std::string path = Create("put.dbf", {{"NAME", 'C', 4, 0}}, DIALECT_DBASE3);
  tests::OpenedTable t(path, DIALECT_DBASE3, true);
  ZQDBFILE* db = t.db;
  ASSERT_NE(db, nullptr);
  EXPECT_EQ(dbput(db, "ann ", 0, 1), 0);
  EXPECT_EQ(db->reccount, 1);
  EXPECT_EQ(dbput(db, "bob ", 1, 1), 0);
  EXPECT_EQ(dbput(db, "cy  ", 3, 1), -1);  // above the count: no gap
  EXPECT_EQ(dbput(db, "bo  ", 1, 0), 0);   // the last record again, deleted
  EXPECT_EQ(db->reccount, 2);
  char buf[4];
  int live = -1;
  EXPECT_EQ(dbget(db, 0, buf, &live), 0);  // a read after writes seeks back
  EXPECT_EQ(std::string(buf, 4), "ann ");
  EXPECT_EQ(dbget(db, 2, buf, &live), 0);  // behind the last record: the end state
  EXPECT_EQ(live, 0);
  EXPECT_EQ(dbput(db, "dee ", 2, 1), 0);   // a write after a read, past that state
  EXPECT_EQ(t.Close(), 0);
  Bytes b = tests::ReadFile(path);
  ASSERT_EQ(b.size(), 66u + 3 * 5 + 1);  // header 32 + 32 + 2
  EXPECT_EQ(GetLe32(&b[4]), 3u);
  EXPECT_EQ(Bytes(b.begin() + 66, b.end()), tests::Text(" ann *bo   dee \x1A"));
}

TEST(Put, NarrowCountRefusesThe65536thRecord) {
  for (int dialect : {DIALECT_DBASE2, DIALECT_ENABLE}) {
    std::string path = Create("narrow" + std::to_string(dialect) + ".dbf", {{"C", 'C', 1, 0}}, dialect);
    tests::OpenedTable t(path, dialect, true);
    ZQDBFILE* db = t.db;
    ASSERT_NE(db, nullptr);
    db->reccount = 65535;  // as if the table were full
    EXPECT_EQ(dbput(db, "x", 65535, 1), -1) << dialect;
    EXPECT_EQ(db->reccount, 65535);
    EXPECT_EQ(db->changed, 0);
    EXPECT_EQ(dbput(db, "y", 65534, 1), 0) << dialect;  // rewriting the last one still works
    EXPECT_EQ(db->reccount, 65535);
    EXPECT_EQ(t.Close(), 0);
    Bytes b = tests::ReadFile(path);
    EXPECT_EQ(GetLe16(&b[1]), 65535);
    EXPECT_EQ(b.size(), 521u + 65535u * 2 + 1);
  }
}

TEST(Delete, RemovesTheTableAndItsMemoFile) {
  std::string path = Create("gone.dbf", {{"NOTES", 'M', 10, 0}}, DIALECT_FOXPRO | kMemo);
  ASSERT_TRUE(ZQFileProxy::fileExists(Sibling(path, "fpt").c_str()));
  EXPECT_EQ(dbdelete(path.c_str(), true, char(MEMO_FPT)), 0);
  EXPECT_FALSE(ZQFileProxy::fileExists(path.c_str()));
  EXPECT_FALSE(ZQFileProxy::fileExists(Sibling(path, "fpt").c_str()));
  EXPECT_EQ(dbdelete(path.c_str(), false, 0), -1);  // already gone
}

}  // namespace
