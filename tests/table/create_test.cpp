// What dbcreat writes for each dialect, byte for byte (Visual FoxPro's 263
// bytes behind the terminator, displacements and fixed binary widths
// included); dbput, dbclose and dbdelete on a new table.
#include <gtest/gtest.h>

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
struct Fields {
  Fields& Add(const std::string& name, char type, int length, int decimals = 0) {
    ZQDBFIELD f{};
    for (size_t i = 0; i < name.size() && i < 11; ++i) f.name[i] = name[i];
    f.type = int8_t(type);
    f.length = uint8_t(length);
    f.decimals = uint8_t(decimals);
    list.push_back(f);
    return *this;
  }
  ZQDBFIELD** Ptrs() {
    ptrs.clear();
    for (auto& f : list) ptrs.push_back(&f);
    ptrs.push_back(nullptr);
    return ptrs.data();
  }
  int Count() const { return int(list.size()); }
  std::vector<ZQDBFIELD> list;
  std::vector<ZQDBFIELD*> ptrs;
};

std::string Create(const std::string& file, Fields& f, int version, bool production = false) {
  std::string path = tests::MemoScratch(file);
  EXPECT_EQ(dbcreat(path.c_str(), f.Count(), f.Ptrs(), version, production), 0) << file;
  return path;
}

std::string Sibling(const std::string& path, const std::string& ext) {
  return path.substr(0, path.rfind('.') + 1) + ext;
}

// Checks the date bytes against today and blanks them for a byte comparison.
void TakeDate(Bytes& b, int day_off, int month_off, int year_off) {
  char day, month, year;
  dbdate(&day, &month, &year);
  EXPECT_EQ(b[size_t(day_off)], uint8_t(day));
  EXPECT_EQ(b[size_t(month_off)], uint8_t(month));
  EXPECT_EQ(b[size_t(year_off)], uint8_t(year));
  b[size_t(day_off)] = b[size_t(month_off)] = b[size_t(year_off)] = 0;
}

// A descriptor of the wide header; Visual FoxPro's carry the field's
// displacement in the record.
Bytes WideDescriptor(const char* name, char type, uint8_t length, uint8_t decimals, uint32_t displacement = 0) {
  Bytes d(32, 0);
  for (size_t i = 0; name[i] != '\0'; ++i) d[i] = uint8_t(name[i]);
  d[11] = uint8_t(type);
  PutLe32(&d[12], displacement);
  d[16] = length;
  d[17] = decimals;
  return d;
}

TEST(Create, WideHeaderWithMemoFieldsAndProductionFlag) {
  Fields f;
  f.Add("NAME", 'C', 10).Add("NOTES", 'M', 4).Add("AMOUNT", 'N', 8, 2);
  std::string path = Create("wide4.dbf", f, DIALECT_DBASE4 | kMemo, true);
  Bytes b = tests::ReadFile(path);
  ASSERT_EQ(b.size(), 130u);
  TakeDate(b, 3, 2, 1);
  Bytes want = {0x8B, 0, 0, 0, 0, 0, 0, 0, 0x82, 0x00, 0x1D, 0x00};  // header 130, record 29
  want.resize(32, 0);
  want[28] = 1;
  for (const Bytes& d : {WideDescriptor("NAME", 'C', 10, 0), WideDescriptor("NOTES", 'M', 10, 0),
                         WideDescriptor("AMOUNT", 'N', 8, 2)})
    want.insert(want.end(), d.begin(), d.end());
  want.push_back(0x0D);
  want.push_back(0x00);
  EXPECT_EQ(b, want);

  Bytes memo = tests::ReadFile(Sibling(path, "dbt"));
  Bytes want_memo(512, 0);
  want_memo[0] = 1;
  for (int i = 0; i < 5; ++i) want_memo[size_t(8 + i)] = uint8_t("WIDE4"[i]);
  want_memo[18] = 0x01;
  want_memo[19] = 0x01;
  want_memo[20] = 0x00;
  want_memo[21] = 0x02;
  EXPECT_EQ(memo, want_memo);

  // Reopened in the same dialect: the same fields, the memo as dBASE IV.
  tests::OpenedTable t(path, DIALECT_DBASE4);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->fieldcount, 3);
  EXPECT_STREQ(t.fields[2]->name, "AMOUNT");
  EXPECT_EQ(t.fields[2]->decimals, 2);
  EXPECT_EQ(t.fields[1]->length, 10);
  EXPECT_EQ(t.db->memokind, MEMO_DB4);
  EXPECT_EQ(t.db->memofailed, 0);
}

TEST(Create, MemoHeaderOfEachKind) {
  struct Case {
    int dialect;
    const char* file;
    const char* ext;
    uint8_t version;
    Bytes head;  // the memo file's first bytes; zeros follow to 512
  } cases[] = {
      {DIALECT_DBASE3P, "m1.dbf", "dbt", 0x83, {1, 0, 0, 0}},
      {DIALECT_DBASE3, "m4.dbf", "dbt", 0x83, {1, 0, 0, 0}},
      {DIALECT_ENABLEOA, "m7.dbf", "dbt", 0x8B, {1, 0, 0, 0}},
      {DIALECT_VFOXPRO, "m10.dbf", "fpt", 0x30, {0, 0, 0, 8, 0, 0, 0, 0x40}},
      {DIALECT_FOXPRO, "m6.dbf", "fpt", 0xF5, {0, 0, 0, 1, 0, 0, 0, 0x80}},
      {DIALECT_CLIPPER, "m8.dbf", "smt", 0xE5, {8, 0, 0, 0, 0x40, 0, 0, 0}},
      {DIALECT_VDBASE, "averyverylongname.dbf", "dbt", 0x8B,
       {1, 0, 0, 0, 0, 0, 0, 0, 'A', 'V', 'E', 'R', 'Y', 'V', 'E', 'R', 'Y', 0, 1, 1, 0, 2}},
      // The unnamed dialect writes 0x8B, read as the dBASE IV form: it gets
      // that form's header, so that it reads its own memos back.
      {DIALECT_UNNAMED, "m5.dbf", "dbt", 0x8B, {1, 0, 0, 0, 0, 0, 0, 0, 'M', '5', 0, 0, 0, 0, 0, 0, 0, 0, 1, 1, 0, 2}},
  };
  for (const Case& c : cases) {
    Fields f;
    f.Add("PIC", c.dialect == DIALECT_FOXPRO ? 'G' : 'M', 10);
    std::string path = Create(c.file, f, c.dialect | kMemo);
    EXPECT_EQ(tests::ReadFile(path)[0], c.version) << c.file;
    Bytes want = c.head;
    want.resize(512, 0);
    EXPECT_EQ(tests::ReadFile(Sibling(path, c.ext)), want) << c.file;
    tests::OpenedTable t(path, c.dialect, true);
    ASSERT_NE(t.db, nullptr) << c.file;
    EXPECT_EQ(t.db->memofailed, 0) << c.file;
    uint32_t at = putmemo(t.db, 0, ZQString("round trip"));
    EXPECT_NE(at, 0u) << c.file;
    ZQString text;
    EXPECT_TRUE(getmemo(t.db, at, 10, text)) << c.file;
    EXPECT_EQ(std::string(text.c_str()), "round trip") << c.file;
  }
}

TEST(Create, NarrowHeaderTakesTheRoomOf32Fields) {
  Fields none;
  std::string p0 = Create("n0.dbf", none, DIALECT_DBASE2);
  Bytes b = tests::ReadFile(p0);
  ASSERT_EQ(b.size(), 521u);
  TakeDate(b, 5, 3, 4);
  Bytes want(521, 0);
  want[0] = 0x02;
  want[6] = 1;  // record length: the flag byte alone
  want[8] = 0x0D;
  EXPECT_EQ(b, want);

  Fields f32;
  for (int i = 0; i < 32; ++i) f32.Add("F" + std::to_string(i), 'C', 2);
  std::string p32 = Create("n32.dbf", f32, DIALECT_ENABLE);
  b = tests::ReadFile(p32);
  ASSERT_EQ(b.size(), 521u);
  EXPECT_EQ(b[0], 0x02);
  EXPECT_EQ(GetLe16(&b[6]), 65);
  EXPECT_EQ(Bytes(b.begin() + 8, b.begin() + 24),
            (Bytes{'F', '0', 0, 0, 0, 0, 0, 0, 0, 0, 0, 'C', 2, 0, 0, 0}));
  EXPECT_EQ(b[520], 0x0D);
  EXPECT_FALSE(ZQFileProxy::fileExists(Sibling(p32, "dbt").c_str()));

  // 33 fields: 0xFE, no filler, and an empty memo file of the dBASE IV form,
  // the form in which 0xFE reopens, so that the table opens cleanly.
  Fields f33 = f32;
  f33.Add("F32", 'N', 3, 1);
  std::string p33 = Create("n33.dbf", f33, DIALECT_ENABLE);
  b = tests::ReadFile(p33);
  ASSERT_EQ(b.size(), 537u);
  EXPECT_EQ(b[0], 0xFE);
  EXPECT_EQ(Bytes(b.begin() + 520, b.begin() + 536),
            (Bytes{'F', '3', '2', 0, 0, 0, 0, 0, 0, 0, 0, 'N', 3, 0, 0, 1}));
  EXPECT_EQ(b[536], 0x0D);
  Bytes memo = {1, 0, 0, 0, 0, 0, 0, 0, 'N', '3', '3', 0, 0, 0, 0, 0, 0, 0, 1, 1, 0, 2};
  memo.resize(512, 0);
  EXPECT_EQ(tests::ReadFile(Sibling(p33, "dbt")), memo);
  tests::OpenedTable t(p33, DIALECT_ENABLE);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->fieldcount, 33);
  EXPECT_EQ(t.db->hdrlen, 537);
  EXPECT_EQ(t.db->hasmemo, 1);
  EXPECT_EQ(t.db->memokind, MEMO_DB4);
  EXPECT_EQ(t.db->memofailed, 0);
}

TEST(Create, WideEdgeCases) {
  Fields none;
  Bytes b = tests::ReadFile(Create("w0.dbf", none, DIALECT_DBASE3));
  ASSERT_EQ(b.size(), 34u);
  EXPECT_EQ(b[0], 0x03);
  EXPECT_EQ(GetLe16(&b[8]), 34);
  EXPECT_EQ(GetLe16(&b[10]), 1);
  EXPECT_EQ(b[32], 0x0D);

  // A name of all 11 bytes has no NUL in the file.
  Fields eleven;
  eleven.Add("ABCDEFGHIJK", 'C', 5);
  b = tests::ReadFile(Create("w11.dbf", eleven, DIALECT_DBASE3P));
  EXPECT_EQ(Bytes(b.begin() + 32, b.begin() + 44), tests::Text("ABCDEFGHIJKC"));

  // A record length past 16 bits is refused before any file is made.
  Fields wide;
  for (int i = 0; i < 300; ++i) wide.Add("F" + std::to_string(i), 'C', 255);
  std::string path = tests::MemoScratch("wbig.dbf");
  EXPECT_EQ(dbcreat(path.c_str(), wide.Count(), wide.Ptrs(), DIALECT_CLIPPER, false), -1);
  EXPECT_FALSE(ZQFileProxy::fileExists(path.c_str()));

  // dBASE II can't read a memo field back: refused, nothing made.
  Fields memo;
  memo.Add("NOTES", 'M', 10);
  path = tests::MemoScratch("d2memo.dbf");
  EXPECT_EQ(dbcreat(path.c_str(), 1, memo.Ptrs(), DIALECT_DBASE2 | kMemo, false), -1);
  EXPECT_EQ(dbcreat(path.c_str(), 1, memo.Ptrs(), DIALECT_DBASE2, false), -1);
  EXPECT_FALSE(ZQFileProxy::fileExists(path.c_str()));
  // Enable takes it, with a dBASE III memo file.
  path = tests::MemoScratch("d3memo.dbf");
  ASSERT_EQ(dbcreat(path.c_str(), 1, memo.Ptrs(), DIALECT_ENABLE | kMemo, false), 0);
  tests::OpenedTable t(path, DIALECT_ENABLE, true);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->memokind, MEMO_DB3);
  EXPECT_EQ(t.db->memofailed, 0);
}

// A Visual FoxPro header (date blanked) with its descriptors, the terminator
// and the 263 bytes behind it.
Bytes VfpHeader(uint16_t reclen, uint8_t flags, std::initializer_list<Bytes> descriptors) {
  Bytes h(32, 0);
  h[0] = 0x30;
  PutLe16(&h[8], uint16_t(32 + 32 * descriptors.size() + 264));
  PutLe16(&h[10], reclen);
  h[28] = flags;
  for (const Bytes& d : descriptors) h.insert(h.end(), d.begin(), d.end());
  h.push_back(0x0D);
  h.resize(h.size() + 263, 0);
  return h;
}

TEST(CreateVfp, TableWithoutMemoFields) {
  // The caller's widths of the binary forms don't count: I is 4, T and Y 8.
  Fields f;
  f.Add("ID", 'I', 11).Add("NAME", 'C', 10).Add("WHEN", 'T', 19).Add("PRICE", 'Y', 20, 4).Add("AMOUNT", 'N', 8, 2);
  std::string path = Create("vfp_plain.dbf", f, DIALECT_VFOXPRO);
  Bytes b = tests::ReadFile(path);
  TakeDate(b, 3, 2, 1);
  EXPECT_EQ(b, VfpHeader(39, 0x00,  // record: 1 + 4 + 10 + 8 + 8 + 8
                         {WideDescriptor("ID", 'I', 4, 0, 1), WideDescriptor("NAME", 'C', 10, 0, 5),
                          WideDescriptor("WHEN", 'T', 8, 0, 15), WideDescriptor("PRICE", 'Y', 8, 4, 23),
                          WideDescriptor("AMOUNT", 'N', 8, 2, 31)}));
  EXPECT_FALSE(ZQFileProxy::fileExists(Sibling(path, "fpt").c_str()));
  // Its own open takes it: the header length is read, not recomputed.
  tests::OpenedTable t(path, DIALECT_VFOXPRO);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->hdrlen, 456);
  EXPECT_EQ(t.db->fieldcount, 5);
  EXPECT_EQ(t.fields[0]->length, 4);
}

TEST(CreateVfp, TableWithMemoFieldsAndProductionIndex) {
  Fields f;
  f.Add("NAME", 'C', 10).Add("NOTES", 'M', 10).Add("PIC", 'G', 10).Add("RATE", 'B', 10);
  std::string path = Create("vfp_memo.dbf", f, DIALECT_VFOXPRO | kMemo, true);
  Bytes b = tests::ReadFile(path);
  TakeDate(b, 3, 2, 1);
  EXPECT_EQ(b, VfpHeader(27, 0x03,  // production index and memo fields
                         {WideDescriptor("NAME", 'C', 10, 0, 1), WideDescriptor("NOTES", 'M', 4, 0, 11),
                          WideDescriptor("PIC", 'G', 4, 0, 15),
                          WideDescriptor("RATE", 'B', 8, 0, 19)}));  // a double in the record, not a memo
  EXPECT_FALSE(ZQFileProxy::fileExists(Sibling(path, "dbt").c_str()));
  EXPECT_EQ(tests::ReadFile(Sibling(path, "fpt")), tests::FptHeader(8, 64));

  // The memo engine fills it from block 8, 64 bytes a block, the header's
  // word big-endian; a text that fits its old blocks stays where it is, a
  // longer one goes to the end and its old blocks are lost.
  {
    tests::OpenedTable t(path, DIALECT_VFOXPRO, true);
    ZQDBFILE* db = t.db;
    ASSERT_NE(db, nullptr);
    EXPECT_EQ(db->memoblksize, 64);
    EXPECT_EQ(putmemo(db, 0, ZQString("first")), 8u);
    EXPECT_EQ(putmemo(db, 0, ZQString(std::string(100, 'x').c_str())), 9u);  // (100 + 8) / 64 + 1 = 2 blocks
    EXPECT_EQ(putmemo(db, 8, ZQString("first, longer")), 8u);
    EXPECT_EQ(putmemo(db, 8, ZQString(std::string(70, 'y').c_str())), 11u);
    EXPECT_EQ(deloldm(db, 11, 2), 0);  // nothing to free in this kind
    ZQString text;
    EXPECT_TRUE(getmemo(db, 11, 0, text));
    EXPECT_EQ(std::string(text.c_str()), std::string(70, 'y'));
  }
  Bytes memo = tests::ReadFile(Sibling(path, "fpt"));
  ASSERT_EQ(memo.size(), 13u * 64);
  EXPECT_EQ(Bytes(memo.begin(), memo.begin() + 8), (Bytes{0, 0, 0, 13, 0, 0, 0, 64}));
  Bytes block8 = {0, 0, 0, 1, 0, 0, 0, 13};
  for (char c : std::string("first, longer")) block8.push_back(uint8_t(c));
  block8.resize(64, 0);
  EXPECT_EQ(Bytes(memo.begin() + 512, memo.begin() + 576), block8);
}

TEST(CreateVfp, DoublesOnlyGetAnEmptyMemoFile) {
  // A caller that marks the table as having memos for a "B" field (as the
  // target does in every dialect) gets an empty FPT file: the table's own open
  // looks for one whenever a "B" field is there. The flags still say that the
  // table has no memo fields.
  Fields f;
  f.Add("RATE", 'B', 8);
  std::string path = Create("vfp_double.dbf", f, DIALECT_VFOXPRO | kMemo);
  Bytes b = tests::ReadFile(path);
  TakeDate(b, 3, 2, 1);
  EXPECT_EQ(b, VfpHeader(9, 0x00, {WideDescriptor("RATE", 'B', 8, 0, 1)}));
  EXPECT_EQ(tests::ReadFile(Sibling(path, "fpt")), tests::FptHeader(8, 64));
  tests::OpenedTable t(path, DIALECT_VFOXPRO);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->memofailed, 0);
}

TEST(Put, AppendsRewritesAndCloseStampsTheCount) {
  Fields f;
  f.Add("NAME", 'C', 4);
  std::string path = Create("put.dbf", f, DIALECT_DBASE3);
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
    Fields f;
    f.Add("C", 'C', 1);
    std::string path = Create("narrow" + std::to_string(dialect) + ".dbf", f, dialect);
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
  Fields f;
  f.Add("NOTES", 'M', 10);
  std::string path = Create("gone.dbf", f, DIALECT_FOXPRO | kMemo);
  ASSERT_TRUE(ZQFileProxy::fileExists(Sibling(path, "fpt").c_str()));
  EXPECT_EQ(dbdelete(path.c_str(), true, char(MEMO_FPT)), 0);
  EXPECT_FALSE(ZQFileProxy::fileExists(path.c_str()));
  EXPECT_FALSE(ZQFileProxy::fileExists(Sibling(path, "fpt").c_str()));
  EXPECT_EQ(dbdelete(path.c_str(), false, 0), -1);  // already gone
}

}  // namespace
