// The source spoke driven as the engine drives it: the layout, every plain
// type decoded, deleted records skipped, records asked for in any order,
// the memo policy when the memo file is missing, and code pages.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <random>
#include <string>
#include <vector>

#include "tests/support/dbase_peer.h"
#include "tests/support/read_harness.h"

namespace {

using tests::Bytes;
using tests::DbfBuilder;
using tests::Dbl;
using tests::Le32;
using tests::Le64;
using tests::Rec;
using tests::Source;
using tests::Text;
using Rows = std::vector<std::string>;
const std::string kEnd = Source::End();

TEST(SourceTest, LayoutAndPlainTypes) {
  Bytes bytes = DbfBuilder(0x03).Field("NAME", 'C', 8).Field("PRICE", 'N', 6, 2).Field("RATE", 'F', 8, 3)
                    .Field("BORN", 'D', 8).Field("OK", 'L', 1).Field("DIGIT", 'N', 1)
                    .Record({"  hi", "  1.50", "   2.125", "20240229", "T", "7"})
                    .Record({"", "", "", "", "?", ""})
                    .Record({"x y", "-12.00", "       0", "        ", "f", "0"})
                    .Build();
  Source s(2);
  ASSERT_EQ(s.Open(tests::WriteScratch("src_plain.dbf", bytes)), 0);
  EXPECT_TRUE(s->ConnectionEstablished());
  EXPECT_TRUE(s->EstimateIsAccurate());
  EXPECT_EQ(s->EstimateRecordCount(), 3);
  ASSERT_EQ(s.FieldCount(), 6);
  // Name, type letter, length, decimals, picture, and for N whether signed.
  Rows layout;
  for (int i = 0; i < 6; ++i) {
    const ZQDType& t = s.Field(i)->DataType();
    layout.push_back(s.Name(i) + " " + char(t.Usage()) + std::to_string(t.Length()) + "." +
                     std::to_string(t.DecimalPlaces()) + " " + t.GetPicture() +
                     (t.Usage() == 'N' ? (t.IsSigned() ? " signed" : " unsigned") : ""));
  }
  EXPECT_EQ(layout, (Rows{"NAME C8.0 ", "PRICE N6.2  signed", "RATE F8.3 ", "BORN D8.0 yyyymmdd", "OK L1.0 T.F",
                          "DIGIT N1.0  unsigned"}));  // N of width 1 is unsigned

  EXPECT_EQ(s.At(0), "  hi");  // trailing blanks go, leading ones stay
  EXPECT_DOUBLE_EQ(s.Field(1)->DoubleVal(), 1.5);
  EXPECT_DOUBLE_EQ(s.Field(2)->DoubleVal(), 2.125);
  EXPECT_EQ(s.Text(3), "20240229");
  ASSERT_EQ(s.Field(3)->held(), ZQField::Held::kDate);
  EXPECT_EQ(s.Field(3)->DateRef().Day(), 29);
  EXPECT_TRUE(s.Field(4)->BoolVal());
  EXPECT_DOUBLE_EQ(s.Field(5)->DoubleVal(), 7);

  EXPECT_EQ(s.At(2), "x y");
  EXPECT_DOUBLE_EQ(s.Field(1)->DoubleVal(), -12);
  EXPECT_TRUE(s.Field(3)->IsBlank());
  ASSERT_EQ(s.Field(4)->held(), ZQField::Held::kBool);
  EXPECT_FALSE(s.Field(4)->BoolVal());

  for (int n : {3, 1}) {  // behind the last record the record goes blank; record 1 is all blank
    EXPECT_EQ(s.At(n), n == 1 ? "" : kEnd);
    for (int i = 0; i < 6; ++i) EXPECT_TRUE(s.Field(i)->IsBlank()) << n << " " << i;
  }
  EXPECT_EQ(s.At(0), "  hi");  // and any record can be asked for again

  EXPECT_EQ(s->ConnectionClose(), 0);
  EXPECT_FALSE(s->ConnectionEstablished());
  EXPECT_EQ(s->EstimateRecordCount(), 0);
  EXPECT_EQ(s->GetRecord(0), ZQ_NOT_OPEN);
}

TEST(SourceTest, LogicalNumbersInAnyOrder) {
  // Live physical records: 1 2 4 5 7 8 9 -> logical 0..6; any flag but a
  // space counts as deleted.
  Bytes bytes = tests::NumberedTable(10, {0, 3, 6});
  bytes[65 + 7 * 3] = 0x00;  // header 32 + 32 + 1, records of 7
  bytes[65 + 7 * 6] = 'D';
  std::string path = tests::WriteScratch("src_order.dbf", bytes);
  Source s;
  ASSERT_EQ(s.Open(path), 0);
  EXPECT_EQ(s.At(2), "p4");
  EXPECT_EQ(s->EstimateRecordCount(), 10 - 2);  // the deleted records passed so far
  EXPECT_EQ(s.At(5), "p8");
  EXPECT_EQ(s.At(3), "p5");  // through the map
  EXPECT_EQ(s.At(4), "p7");  // on from the last one
  EXPECT_EQ(s.At(6), "p9");
  EXPECT_EQ(s.At(7), kEnd);
  EXPECT_EQ(s->EstimateRecordCount(), 10 - 3);
  EXPECT_EQ(s.At(0), "p1");
  EXPECT_EQ(s.At(0), "p1");  // the same record again
  BATCHERR rc;
  EXPECT_EQ(s.FirstColumn(&rc), (Rows{"p1", "p2", "p4", "p5", "p7", "p8", "p9"}));
  EXPECT_EQ(rc, ZQ_END);

  // A fresh target starts afresh, and a first request for record 1 doesn't
  // take the deleted physical record 0 for logical 0.
  ASSERT_EQ(s.Open(path), 0);
  EXPECT_EQ(s.At(1), "p2");
  EXPECT_EQ(s.At(0), "p1");
}

TEST(SourceTest, LargeTableInRandomOrder) {
  const int count = 20000;
  std::vector<int> deleted, live;
  for (int p = 0; p < count; ++p)
    (p % 7 == 3 || p % 13 == 0 || (p > 5000 && p < 5100) ? deleted : live).push_back(p);
  Source s;
  ASSERT_EQ(s.Open(tests::WriteScratch("src_large.dbf", tests::NumberedTable(count, deleted))), 0);
  std::vector<int> order(live.size());
  for (size_t i = 0; i < order.size(); ++i) order[i] = int(i);
  std::shuffle(order.begin(), order.end(), std::mt19937(20240229));
  for (int n : order) ASSERT_EQ(s.At(n), "p" + std::to_string(live[size_t(n)])) << n;
  EXPECT_EQ(s.At(int32_t(live.size())), kEnd);
  EXPECT_EQ(s->EstimateRecordCount(), int64_t(live.size()));
  ZQDbase& db = DbaseTestPeer::Of(s.spoke());
  EXPECT_LE(DbaseTestPeer::RecordMap(db).Count(), 4096);  // bounded, whatever the table's size
}

TEST(SourceTest, RecordCountBeyondTheFileEndsCleanly) {
  // No records and no end mark; a header that promises 5 records where the
  // file holds 2 and an end mark; and a count of 2^31 - 1 without an end
  // mark, which ends as soon as the file does, and a request for a record
  // far behind it too (a read per promised record would never end).
  Bytes promised =
      DbfBuilder(0x03).Field("PHYS", 'C', 6).Record({"p0"}).Record({"p1"}).CountInHeader(5).Build();
  Bytes huge = promised;
  PutLe32(&huge[kWideRecCount], 0x7FFFFFFF);
  huge.pop_back();
  struct Case {
    Bytes bytes;
    Rows rows;
    int32_t far;
  } cases[] = {{DbfBuilder(0x03).Field("PHYS", 'C', 6).NoEndMark().Build(), {}, 3},
               {promised, {"p0", "p1"}, 4},
               {huge, {"p0", "p1"}, 2000000000}};
  tests::LogCapture log;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.far);
    Source s;
    ASSERT_EQ(s.Open(tests::WriteScratch("src_short.dbf", c.bytes)), 0);
    BATCHERR rc;
    EXPECT_EQ(s.FirstColumn(&rc), c.rows);
    EXPECT_EQ(rc, ZQ_END);
    EXPECT_TRUE(s.Field(0)->IsBlank());
    EXPECT_EQ(s.At(c.far), kEnd);
  }
  EXPECT_TRUE(log.entries().empty());
}

// A table of NAME C(4), QTY N(3) and three records: header 97, records of 8.
Bytes ThreeRecords() {
  return DbfBuilder(0x03).Field("NAME", 'C', 4).Field("QTY", 'N', 3).Record({"ab", "1"}).Record({"cd", "2"})
      .Record({"ef", "3"}).Build();
}

TEST(SourceTest, TablesThatDontOpen) {
  // Which headers dbopen refuses is tested at the table layer; here, the one
  // message and the closed spoke that any refusal gives: a cut header, a
  // memo field in dBASE II, a missing file, a name longer than any path.
  Bytes good = ThreeRecords();
  const std::pair<std::string, int> cases[] = {
      {tests::WriteScratch("bad_cut40.dbf", Bytes(good.begin(), good.begin() + 40)), 2},
      {tests::WriteScratch("bad_d2memo.dbf", DbfBuilder(0x02, true).Field("NOTE", 'M', 10).Build()), 0},
      {tests::ScratchPath("bad_missing.dbf"), 2},
      {std::string(5000, 'x'), 2}};
  for (const auto& [path, dialect] : cases) {
    SCOPED_TRACE(path.substr(0, 80));
    tests::LogCapture log;
    Source s(dialect);
    EXPECT_EQ(s.Open(path), ZQ_OPEN_ERROR);
    ASSERT_EQ(log.entries().size(), 1u);
    EXPECT_EQ(log.Last(), "Error opening data file " + path);
    EXPECT_EQ(log.entries()[0].level, 4);
    EXPECT_EQ(log.entries()[0].code, ZQ_OPEN_ERROR);
    EXPECT_FALSE(s->ConnectionEstablished());
    EXPECT_EQ(s->GetRecord(0), ZQ_NOT_OPEN);
    EXPECT_EQ(s->EstimateRecordCount(), 0);
  }
  // Nothing named yet.
  tests::LogCapture log;
  Source s;
  EXPECT_EQ(s->GetRecord(0), ZQ_NOT_OPEN);
  EXPECT_EQ(s->MakeFields(), ZQ_NO_FILENAME);
  EXPECT_EQ(s.Open(""), ZQ_NO_FILENAME);
  EXPECT_TRUE(log.entries().empty());
}

TEST(SourceTest, RecordCutShortByTheEndOfTheFile) {
  tests::LogCapture log;
  Bytes bytes = ThreeRecords();
  bytes.resize(97 + 8 * 2 + 4);  // record 2 stops after its flag and 3 bytes
  Source s;
  ASSERT_EQ(s.Open(tests::WriteScratch("bad_half.dbf", bytes)), 0);
  ASSERT_EQ(s.At(1), "cd");
  EXPECT_EQ(s.At(2), "#" + std::to_string(ZQ_READ_ERROR));
  EXPECT_EQ(log.Last(), "Error retrieving record 2");
  EXPECT_EQ(log.entries().back().code, ZQ_READ_ERROR);
  EXPECT_TRUE(s.Field(0)->IsBlank());
  EXPECT_EQ(s.At(1), "cd");  // the position is unchanged: the records ahead still read
}

TEST(SourceTest, HeaderNumbersThatDontFitTheFile) {
  // A header length far behind the end: no records, no error. A record
  // length of 0 in a wide header isn't refused at open; every field then
  // runs past the record. A record count that is negative as a signed
  // number: an empty table.
  struct Case {
    size_t offset;
    uint32_t value;
    BATCHERR first;  // what reading record 0 gives (ZQ_END also taken for the record length)
  };
  for (Case c : {Case{kWideHdrLen, 0xFFFF, ZQ_END}, Case{kWideRecLen, 0, ZQ_READ_ERROR},
                 Case{kWideRecCount, 0xFFFFFFFF, ZQ_END}}) {
    SCOPED_TRACE(c.offset);
    Bytes bytes = ThreeRecords();
    if (c.offset == kWideRecCount) PutLe32(&bytes[c.offset], c.value);
    else PutLe16(&bytes[c.offset], uint16_t(c.value));
    Source s;
    ASSERT_EQ(s.Open(tests::WriteScratch("bad_header.dbf", bytes)), 0);
    BATCHERR rc = s->GetRecord(0);
    EXPECT_TRUE(rc == c.first || rc == ZQ_END) << rc;
    EXPECT_GE(s->EstimateRecordCount(), 0);
  }
}

TEST(SourceTest, FieldPastTheRecord) {
  tests::LogCapture log;
  // Fields of 3 + 4 bytes, records of 1 + 5: the second field runs past.
  Bytes bytes = DbfBuilder(0x03).Field("A", 'C', 3).Field("B", 'C', 4).RecordLength(6)
                    .RawRecord(Rec({Text("abcde")})).RawRecord(Rec({Text("fghij")})).Build();
  Source s;
  ASSERT_EQ(s.Open(tests::WriteScratch("src_past.dbf", bytes)), 0);
  ASSERT_EQ(s.FieldCount(), 2);
  for (int n = 0; n < 2; ++n) {
    log.Clear();
    EXPECT_EQ(s->GetRecord(n), ZQ_READ_ERROR);
    EXPECT_EQ(s.Text(0), n == 0 ? "abc" : "fgh");  // fields ahead of it keep their values
    EXPECT_TRUE(s.Field(1)->IsBlank());
    ASSERT_EQ(log.entries().size(), 1u);
    EXPECT_EQ(log.entries()[0].message, "Field 1 extends beyond end of record");
    EXPECT_EQ(log.entries()[0].level, 4);
    EXPECT_EQ(log.entries()[0].code, ZQ_READ_ERROR);
  }
  EXPECT_EQ(s.At(2), kEnd);
}

TEST(SourceTest, MissingMemoFileByPolicy) {
  // Policy 0: an error, and the table stays open without a layout. The same
  // spoke read a smaller table first: its buffer and its layout must not be
  // read through. Policies 1 and 2: the memo field reads blank.
  Bytes bytes = DbfBuilder(0x83).Field("NAME", 'C', 250).Field("NOTE", 'M', 10).Field("AGE", 'N', 3)
                    .Record({"ann", "         1", " 42"}).Record({"bob", "          ", "  7"}).Build();
  std::string path = tests::WriteScratch("src_nomemo.dbf", bytes);
  for (int policy : {0, 1, 2}) {
    SCOPED_TRACE(policy);
    Source s(4, policy);
    Bytes small = DbfBuilder(0x03).Field("A", 'C', 1).Record({"a"}).Build();
    ASSERT_EQ(s.Open(tests::WriteScratch("src_small.dbf", small)), 0);
    ASSERT_EQ(s.At(0), "a");
    tests::LogCapture log;
    if (policy == 0) {
      EXPECT_EQ(s.Open(path), ZQ_MEMO_OPEN_ERROR);
      ASSERT_EQ(log.entries().size(), 1u);
      EXPECT_EQ(log.Last(), "Could not open memo file, or wrong version");
      EXPECT_EQ(log.entries()[0].code, ZQ_MEMO_OPEN_ERROR);
      EXPECT_TRUE(s->ConnectionEstablished());
      EXPECT_EQ(s->GetRecord(0), ZQ_NOT_OPEN);
      EXPECT_EQ(s.FieldCount(), 0);
      continue;
    }
    ASSERT_EQ(s.Open(path), 0);
    ASSERT_EQ(s.FieldCount(), 3);
    EXPECT_EQ(s.Field(1)->DataType().Length(), 255);
    EXPECT_EQ(s.At(0), "ann");
    EXPECT_TRUE(s.Field(1)->IsBlank());
    EXPECT_DOUBLE_EQ(s.Field(2)->DoubleVal(), 42);
    EXPECT_EQ(s.At(1), "bob");
    EXPECT_EQ(s.At(2), kEnd);
    EXPECT_TRUE(log.entries().empty());
  }
}

TEST(SourceTest, VisualFoxProColumns) {
  // C3, I4, Y8, T8, B8 and the hidden _NullFlags as the last column.
  auto build = [](const char* last_name) {
    return DbfBuilder(0x30).Field("ID", 'C', 3).Field("QTY", 'I', 4).Field("PRICE", 'Y', 8).Field("AT", 'T', 8)
        .Field("RATE", 'B', 8).Field(last_name, '0', 1).HeaderExtra(263)
        .RawRecord(Rec({Text("ab "), Le32(uint32_t(-7)), Le64(15000), Le32(2451545), Le32(999), Dbl(2.25), {0}}))
        .RawRecord(Rec({Text("cd "), Le32(123456), Le64(uint64_t(-15000)), Le32(2451545 + 366), Le32(86398999),
                        Dbl(-0.5), {0x10}}))
        .Build();
  };
  for (const char* name : {"_NullFlags", "_NULLFLAGS", "_nullflags"}) {
    SCOPED_TRACE(name);
    // A B field sets the memo bit; without a .fpt file that is a memo
    // failure, which policy 1 lets pass.
    Source s(10, 1);
    ASSERT_EQ(s.Open(tests::WriteScratch("src_vfp.dbf", build(name))), 0);
    ASSERT_EQ(s.FieldCount(), 5);  // one fewer than the descriptors
    EXPECT_EQ(s.Name(4), "RATE");
    EXPECT_EQ(s.Field(4)->DataType().Length(), 8);  // B is no memo here

    EXPECT_EQ(s.At(0), "ab");
    EXPECT_EQ(s.Field(1)->LongVal(), -7);
    EXPECT_DOUBLE_EQ(s.Field(2)->DoubleVal(), 1.5);
    ASSERT_EQ(s.Field(3)->held(), ZQField::Held::kDateTime);
    EXPECT_EQ(s.Field(3)->DateTimeRef().Days(), 730122);
    EXPECT_EQ(s.Field(3)->DateTimeRef().Seconds(), 1);  // 999 ms rounds to the second
    EXPECT_DOUBLE_EQ(s.Field(4)->DoubleVal(), 2.25);

    EXPECT_EQ(s.At(1, 3), "2001-01-01T23:59:59");
    EXPECT_EQ(s.Field(1)->LongVal(), 123456);
    EXPECT_DOUBLE_EQ(s.Field(2)->DoubleVal(), -1.5);
    EXPECT_DOUBLE_EQ(s.Field(4)->DoubleVal(), -0.5);
    EXPECT_EQ(s.At(2), kEnd);
  }

  // Anywhere but last, the column is a plain field.
  Bytes middle = DbfBuilder(0x30).Field("_NullFlags", '0', 1).Field("ID", 'C', 2).Record({"\x01", "zz"}).Build();
  Source m(10, 1);
  ASSERT_EQ(m.Open(tests::WriteScratch("src_vfp_mid.dbf", middle)), 0);
  ASSERT_EQ(m.FieldCount(), 2);
  EXPECT_EQ(m.Name(0), "_NullFlags");
  EXPECT_EQ(m.At(0, 1), "zz");

  // Read as dialect 5, which takes any version byte, the same table keeps the
  // column, reads B as a memo (blank here) and still decodes I, Y and T.
  Source five(5, 1);
  ASSERT_EQ(five.Open(tests::WriteScratch("src_vfp5.dbf", build("_NullFlags"))), 0);
  ASSERT_EQ(five.FieldCount(), 6);
  EXPECT_EQ(five.At(0, 1), "-7");
  EXPECT_DOUBLE_EQ(five.Field(2)->DoubleVal(), 1.5);
  EXPECT_EQ(five.Field(3)->DateTimeRef().Days(), 730122);
  EXPECT_TRUE(five.Field(4)->IsBlank());

  // Widths the writer never makes: a Y of 4 bytes is sign-extended, an I of 2
  // bytes and a T of 4 bytes hold no full number.
  Bytes short_bin = DbfBuilder(0x30).Field("Y4", 'Y', 4).Field("I2", 'I', 2).Field("T4", 'T', 4)
                        .RawRecord(Rec({Le32(uint32_t(-30000)), {0x05, 0x00}, Le32(2451545)})).Build();
  Source s(10);
  ASSERT_EQ(s.Open(tests::WriteScratch("src_short_bin.dbf", short_bin)), 0);
  ASSERT_EQ(s->GetRecord(0), 0);
  EXPECT_DOUBLE_EQ(s.Field(0)->DoubleVal(), -3.0);
  EXPECT_EQ(s.Field(1)->LongVal(), 0);
  EXPECT_EQ(s.Field(2)->DateTimeRef().Days(), 730122);
  EXPECT_EQ(s.Field(2)->DateTimeRef().Seconds(), 0);
}

TEST(SourceTest, CodePageConvertsTextFieldsOnly) {
  // 0x82 is é in code page 850; the I field holds the same byte in a number.
  Bytes bytes = DbfBuilder(0x30).Field("NAME", 'C', 6).Field("NUM", 'I', 4)
                    .RawRecord(Rec({Text("caf\x82  "), {0x82, 0, 0, 0}})).Build();
  std::string path = tests::WriteScratch("src_cp.dbf", bytes);
  Source converted(10, 0, 850), raw(10, 0, 0);
  ASSERT_EQ(converted.Open(path), 0);
  EXPECT_EQ(converted.At(0), "caf\xC3\xA9");
  EXPECT_EQ(converted.Field(1)->LongVal(), 0x82);
  ASSERT_EQ(raw.Open(path), 0);
  EXPECT_EQ(raw.At(0), "caf\x82");
}

TEST(SourceTest, OverriddenAndUnknownTypeLetters) {
  // 0xF5 under dBASE IV: the table is FoxPro from then on, while the type
  // lists stay those of the option's dialect.
  Source f(1, 1);
  Bytes f5 = DbfBuilder(0xF5).Field("NAME", 'C', 4).Record({"fox"}).Build();
  ASSERT_EQ(f.Open(tests::WriteScratch("src_f5.dbf", f5)), 0);
  EXPECT_EQ(f->TableHandle()->dialect, 6);
  EXPECT_EQ(f->MaxFieldCount(), 256);
  int types = 0;
  while (f->GetValidTypes()[types] != nullptr) ++types;
  EXPECT_EQ(types, 5);  // dialect 1's
  EXPECT_EQ(f.At(0), "fox");

  // An unknown type letter reads as text.
  Source q;
  Bytes odd = DbfBuilder(0x03).Field("ODD", 'Q', 3).Field("N", 'N', 2).Record({"q!", "5"}).Build();
  ASSERT_EQ(q.Open(tests::WriteScratch("src_odd.dbf", odd)), 0);
  ASSERT_EQ(q.FieldCount(), 2);
  EXPECT_EQ(q.Field(0)->DataType().Family(), FT_TEXT);
  EXPECT_EQ(q.At(0), "q!");
  EXPECT_DOUBLE_EQ(q.Field(1)->DoubleVal(), 5);
}

}  // namespace
