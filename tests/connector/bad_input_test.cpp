// Bad input at the source spoke: each damage gives its result and its
// message, and nothing crashes or hangs.
#include <gtest/gtest.h>

#include <string>

#include "tests/support/read_harness.h"

namespace {

using tests::Bytes;
using tests::DbfBuilder;
using tests::Source;

Bytes Good() {
  return DbfBuilder(0x03).Field("NAME", 'C', 4).Field("QTY", 'N', 3).Record({"ab", "1"}).Record({"cd", "2"})
      .Record({"ef", "3"}).Build();
}

// Opens `bytes` as dialect `dialect` and expects 19 with the open message.
void ExpectRefused(const std::string& name, const Bytes& bytes, int dialect = 2) {
  SCOPED_TRACE(name);
  tests::LogCapture log;
  std::string path = tests::WriteScratch(name, bytes);
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

TEST(BadInputTest, TablesThatDontOpen) {
  // Which headers dbopen refuses is tested at the table layer; here, the one
  // message and the closed spoke that any refusal gives.
  Bytes good = Good();
  ExpectRefused("bad_cut40.dbf", Bytes(good.begin(), good.begin() + 40));
  ExpectRefused("bad_d2memo.dbf", DbfBuilder(0x02, true).Field("NOTE", 'M', 10).Build(), 0);

  // Missing, and a name longer than any path the platform takes.
  for (const std::string& path : {tests::ScratchPath("bad_missing.dbf"), std::string(5000, 'x')}) {
    tests::LogCapture log;
    Source s;
    EXPECT_EQ(s.Open(path), ZQ_OPEN_ERROR);
    EXPECT_EQ(log.Last(), "Error opening data file " + path);
  }
}

TEST(BadInputTest, NoTargetAndNoTable) {
  tests::LogCapture log;
  Source s;
  EXPECT_EQ(s->GetRecord(0), ZQ_NOT_OPEN);
  EXPECT_EQ(s->MakeFields(), ZQ_NO_FILENAME);  // nothing named yet
  EXPECT_EQ(s.Open(""), ZQ_NO_FILENAME);
  EXPECT_TRUE(log.entries().empty());
}

TEST(BadInputTest, RecordCutShortByTheEndOfTheFile) {
  tests::LogCapture log;
  Bytes bytes = Good();
  bytes.resize(65 + 32 + 8 * 2 + 4);  // record 2 stops after its flag and 3 bytes
  Source s;
  ASSERT_EQ(s.Open(tests::WriteScratch("bad_half.dbf", bytes)), 0);
  ASSERT_EQ(s->GetRecord(0), 0);
  ASSERT_EQ(s->GetRecord(1), 0);
  EXPECT_EQ(s->GetRecord(2), ZQ_READ_ERROR);
  EXPECT_EQ(log.Last(), "Error retrieving record 2");
  EXPECT_EQ(log.entries().back().code, ZQ_READ_ERROR);
  EXPECT_TRUE(s.Field(0)->IsBlank());
  // The position is unchanged: the records ahead still read.
  ASSERT_EQ(s->GetRecord(1), 0);
  EXPECT_EQ(s.Text(0), "cd");
}

TEST(BadInputTest, HeaderNumbersThatDontFitTheFile) {
  tests::LogCapture log;
  // A header length far behind the end: no records, no error.
  Bytes far = Good();
  PutLe16(&far[kWideHdrLen], 0xFFFF);
  Source a;
  ASSERT_EQ(a.Open(tests::WriteScratch("bad_hdrlen.dbf", far)), 0);
  EXPECT_EQ(a->GetRecord(0), ZQ_END);

  // A record length of 0 in a wide header isn't refused at open; every
  // field then runs past the record.
  Bytes zero = Good();
  PutLe16(&zero[kWideRecLen], 0);
  Source b;
  ASSERT_EQ(b.Open(tests::WriteScratch("bad_reclen0w.dbf", zero)), 0);
  BATCHERR rc = b->GetRecord(0);
  EXPECT_TRUE(rc == ZQ_READ_ERROR || rc == ZQ_END) << rc;

  // A record count that is negative as a signed number: an empty table.
  Bytes negative = Good();
  PutLe32(&negative[kWideRecCount], 0xFFFFFFFF);
  Source c;
  ASSERT_EQ(c.Open(tests::WriteScratch("bad_negcount.dbf", negative)), 0);
  EXPECT_EQ(c->GetRecord(0), ZQ_END);
  EXPECT_GE(c->EstimateRecordCount(), 0);
}

}  // namespace
