// The target spoke in dialect 10: the binary forms of "I", "T", "B", "Y" and
// the 4-byte memo pointers as the read side decodes them, values that a form
// can't hold, memo blocks kept or given up on rewrite, and tables of the
// shape other programs write (FPT blocks of 128, a _NullFlags column).
#include <gtest/gtest.h>

#include <string>

#include "host/zqdate.h"
#include "tests/support/memo_builder.h"
#include "tests/support/todbase_harness.h"

namespace {

using tests::Bytes;
using tests::Dbl;
using tests::FptBlock;
using tests::Le32;
using tests::Le64;
using tests::Rec;
using tests::ScratchPath;
using tests::Target;
using tests::Text;

// Record n of the table at `path`, flag included.
Bytes RecordAt(const std::string& path, int n) { return Text(tests::Written(path).Record(n)); }

// ID I, NAME C(6), NOTE M, WHEN T, RATE B, PRICE Y, BORN D, OK L.
void AddAll(Target& t) {
  t.Add('I', "ID", 4);
  t.Add('C', "NAME", 6);
  t.Add('M', "NOTE");
  t.Add('T', "WHEN", 8);
  t.Add('B', "RATE", 8);
  t.Add('Y', "PRICE", 8, 4);
  t.Add('D', "BORN");
  t.Add('L', "OK");
}

TEST(VfpTarget, RecordsInTheFormsTheReadSideDecodes) {
  std::string path = ScratchPath("vfp_forms.dbf");
  {
    Target t(10);
    AddAll(t);
    ASSERT_EQ(t.Open(path), 0);
    // Values as text, the way a CSV file or a text-typed host gives them.
    ASSERT_EQ(t.Put({"-7", "ann", "a memo", "2000-01-01T12:00:01", "1.5", "1.15", "20240131", "T"}), 0);
    // Values held as numbers and a date-time; a double 0.57 times 10000 is
    // 5699.999... and still stores 5700 ten-thousandths.
    t[0]->SetLong(2147483647);
    t.Set(1, "bob");
    t.Set(2, nullptr);
    *t[3] = ZQDateTime(730122, 59, 0);
    *t[4] = -0.25;
    *t[5] = 0.57;
    t.Set(6, nullptr);
    t.Set(7, "F");
    ASSERT_EQ(t.Write(), 0);
    // No value at all: zeros in the binary forms, blanks in the date.
    ASSERT_EQ(t.Put({nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, nullptr}), 0);
    ASSERT_EQ(t.Close(), 0);
  }
  EXPECT_EQ(RecordAt(path, 0), Rec({Le32(uint32_t(-7)), Text("ann   "), Le32(8), Le32(2451545), Le32(43201000),
                                    Dbl(1.5), Le64(11500), Text("20240131T")}));
  EXPECT_EQ(RecordAt(path, 1), Rec({Le32(2147483647), Text("bob   "), Le32(0), Le32(2451545), Le32(59000),
                                    Dbl(-0.25), Le64(5700), Text("        F")}));
  EXPECT_EQ(RecordAt(path, 2), Rec({Bytes(4, 0), Text("      "), Bytes(28, 0), Text("        F")}));
  // The memo: an FPT text block at block 8, right behind the header.
  Bytes want = tests::MemoBytes(tests::FptHeader(9, 64)).At(8, FptBlock("a memo"), 64).Build();
  EXPECT_EQ(tests::ReadFile(ScratchPath("vfp_forms.fpt")), want);

}

TEST(VfpTarget, ValuesAFormCantHoldStopTheRecord) {
  struct Case {
    int field;
    const char* value;
  } cases[] = {
      {0, "2147483648"},  // past 32 bits
      {0, "1.5"},         // no whole number
      {0, "ten"},
      {3, "yesterday"},
      {3, "2024-02-30"},
      {3, "2024-01-01T25:00:00"},
      {4, "abc"},
      {5, "1e3"},  // currency is taken by its digits only
      {5, "99999999999999999999"},
  };
  std::string path = ScratchPath("vfp_refused.dbf");
  Target t(10);
  AddAll(t);
  ASSERT_EQ(t.Open(path), 0);
  tests::LogCapture log;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.value);
    for (int i = 0; i < 8; ++i) t.Set(i, nullptr);
    t.Set(c.field, c.value);
    EXPECT_EQ(t.Write(), 8);
    EXPECT_NE(log.Last().find(std::string("can't hold the value ") + c.value), std::string::npos) << log.Last();
    EXPECT_EQ(t->Position(), 0);  // nothing written
  }
  ASSERT_EQ(t.Close(), 0);
  EXPECT_EQ(tests::Written(path).count, 0);
}

TEST(VfpTarget, MemoBlocksKeptOrGivenUpOnRewrite) {
  std::string path = ScratchPath("vfp_update.dbf"), fpt = ScratchPath("vfp_update.fpt");
  auto open = [&](Target& t) {
    t.Add('C', "KEY", 2);
    t.Add('M', "NOTE");
    return t.Open(path);
  };
  {
    Target t(10);
    ASSERT_EQ(open(t), 0);
    ASSERT_EQ(t.Put({"a", "first"}), 0);
    ASSERT_EQ(t.Put({"b", std::string(100, 'x').c_str()}), 0);  // blocks 9 and 10
  }
  {
    Target t(10, 2);
    ASSERT_EQ(open(t), 0);
    // The same text again through DeleteRecord: nothing is written.
    ASSERT_EQ(t->DeleteRecord(), 0);
    ASSERT_EQ(t.Put({"a", "first"}), 0);
    // A text that fits the old blocks stays there; a blank one gives them up.
    ASSERT_EQ(t.Reread(1), "b");
    ASSERT_EQ(t.Put({"b", std::string(110, 'y').c_str()}), 0);
    ASSERT_EQ(t.Reread(0), "a");
    ASSERT_EQ(t.Put({"a", nullptr}), 0);
    ASSERT_EQ(t.Close(), 0);
  }
  EXPECT_EQ(RecordAt(path, 0), Rec({Text("a "), Le32(0)}));
  EXPECT_EQ(RecordAt(path, 1), Rec({Text("b "), Le32(9)}));
  // Nothing appended, the header and block 8 as they were, block 9 rewritten.
  Bytes want = tests::MemoBytes(tests::FptHeader(11, 64)).At(8, FptBlock("first"), 64)
                   .At(9, FptBlock(std::string(110, 'y')), 64).Build();
  EXPECT_EQ(tests::ReadFile(fpt), want);
}

TEST(VfpTarget, TablesOfOtherWriters) {
  // A binary field of a width this form doesn't have is no table to write.
  // (Appending to and updating a table that python3-dbf wrote, with its own
  // FPT blocks, is tests/interop/test_convert.py.)
  std::string odd =
      tests::WriteScratch("vfp_odd.dbf", tests::DbfBuilder(0x30).Field("N", 'I', 8).HeaderExtra(263).Build());
  Target t(10, 1);
  t.Add('I', "N", 4);
  tests::LogCapture log;
  EXPECT_EQ(t.Open(odd), ZQ_LAYOUT_DIFFERS);
  EXPECT_NE(log.Last().find("Field type mismatch on field N"), std::string::npos);
}

}  // namespace
