// The target spoke in dialect 10: the binary forms of "I", "T", "B", "Y" and
// the 4-byte memo pointers as the read side decodes them, values that a form
// can't hold, memo blocks kept or given up on rewrite, and tables of the
// shape other programs write (FPT blocks of 128, a _NullFlags column).
#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "host/zqdate.h"
#include "tests/support/todbase_harness.h"
#include "tests/support/memo_builder.h"

namespace {

using tests::Bytes;
using tests::DbfBuilder;
using tests::LogCapture;
using tests::Target;

std::string Le32(uint32_t v) {
  uint8_t b[4];
  PutLe32(b, v);
  return std::string(reinterpret_cast<char*>(b), 4);
}
std::string Le64(uint64_t v) {
  uint8_t b[8];
  PutLe64(b, v);
  return std::string(reinterpret_cast<char*>(b), 8);
}
std::string Double(double d) {
  uint64_t bits;
  memcpy(&bits, &d, 8);
  return Le64(bits);
}

// Record n (flag included) of a Visual FoxPro table, by its header.
std::string VfpRecord(const Bytes& b, int n) {
  size_t hdr = GetLe16(&b[8]), len = GetLe16(&b[10]);
  size_t at = hdr + size_t(n) * len;
  if (at + len > b.size()) return "";
  return std::string(b.begin() + long(at), b.begin() + long(at + len));
}

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
  std::string path = tests::ScratchPath("vfp_forms.dbf");
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
  Bytes b = tests::ReadFile(path);
  ASSERT_EQ(GetLe16(&b[10]), 1 + 4 + 6 + 4 + 8 + 8 + 8 + 8 + 1);
  EXPECT_EQ(VfpRecord(b, 0), " " + Le32(uint32_t(-7)) + "ann   " + Le32(8) + Le32(2451545) + Le32(43201000) +
                                 Double(1.5) + Le64(11500) + "20240131T");
  EXPECT_EQ(VfpRecord(b, 1), " " + Le32(2147483647) + "bob   " + Le32(0) + Le32(2451545) + Le32(59000) +
                                 Double(-0.25) + Le64(5700) + "        F");
  EXPECT_EQ(VfpRecord(b, 2), " " + std::string(4, '\0') + "      " + std::string(28, '\0') + "        F");
  // The memo: an FPT text block at block 8, right behind the header.
  Bytes memo = tests::ReadFile(path.substr(0, path.size() - 3) + "fpt");
  Bytes want = tests::MemoBytes(tests::FptHeader(9, 64)).At(8, tests::FptBlock("a memo"), 64).Build();
  EXPECT_EQ(memo, want);

  tests::Source s(10);
  ASSERT_EQ(s.Open(path), 0);
  ASSERT_EQ(s->GetRecord(0), 0);
  EXPECT_EQ(s.Text(0), "-7");
  EXPECT_EQ(s.Text(2), "a memo");
  EXPECT_EQ(s.Text(3), "2000-01-01T12:00:01");
  EXPECT_EQ(s.Field(4)->DoubleVal(), 1.5);
  EXPECT_EQ(s.Field(5)->DoubleVal(), 1.15);
  ASSERT_EQ(s->GetRecord(2), 0);
  EXPECT_TRUE(s.Field(2)->IsBlank());
  EXPECT_TRUE(s.Field(3)->IsBlank());
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
  std::string path = tests::ScratchPath("vfp_refused.dbf");
  Target t(10);
  AddAll(t);
  ASSERT_EQ(t.Open(path), 0);
  LogCapture log;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.value);
    for (int i = 0; i < 8; ++i) t.Set(i, nullptr);
    t.Set(c.field, c.value);
    EXPECT_EQ(t.Write(), 8);
    EXPECT_NE(log.Last().find(std::string("can't hold the value ") + c.value), std::string::npos) << log.Last();
    EXPECT_EQ(t->Position(), 0);  // nothing written
  }
  ASSERT_EQ(t.Close(), 0);
  EXPECT_EQ(GetLe32(&tests::ReadFile(path)[4]), 0u);
}

TEST(VfpTarget, MemoBlocksKeptOrGivenUpOnRewrite) {
  std::string path = tests::ScratchPath("vfp_update.dbf");
  std::string fpt = path.substr(0, path.size() - 3) + "fpt";
  {
    Target t(10);
    t.Add('C', "KEY", 2);
    t.Add('M', "NOTE");
    ASSERT_EQ(t.Open(path), 0);
    ASSERT_EQ(t.Put({"a", "first"}), 0);
    ASSERT_EQ(t.Put({"b", std::string(100, 'x').c_str()}), 0);  // blocks 9 and 10
    ASSERT_EQ(t.Close(), 0);
  }
  Bytes before = tests::ReadFile(fpt);
  ASSERT_EQ(before.size(), 11u * 64);
  {
    Target t(10, 2);
    t.Add('C', "KEY", 2);
    t.Add('M', "NOTE");
    ASSERT_EQ(t.Open(path), 0);
    // The same text again through DeleteRecord: nothing is written.
    ASSERT_EQ(t->DeleteRecord(), 0);
    ASSERT_EQ(t.Put({"a", "first"}), 0);
    // A text that fits the old blocks stays there; a blank one gives them up.
    ZQRecord& r = t.Layout();
    t->SetFilePosition(1);
    ASSERT_EQ(t->GetandDeleteRecord(r), 0);
    t.Set(1, std::string(110, 'y').c_str());
    ASSERT_EQ(t.Write(), 0);
    t->SetFilePosition(0);
    ASSERT_EQ(t->GetandDeleteRecord(r), 0);
    t.Set(1, nullptr);
    ASSERT_EQ(t.Write(), 0);
    ASSERT_EQ(t.Close(), 0);
  }
  Bytes b = tests::ReadFile(path);
  EXPECT_EQ(VfpRecord(b, 0), " a " + Le32(0));
  EXPECT_EQ(VfpRecord(b, 1), " b " + Le32(9));
  Bytes memo = tests::ReadFile(fpt);
  ASSERT_EQ(memo.size(), before.size());  // nothing appended
  EXPECT_EQ(Bytes(memo.begin(), memo.begin() + 576), Bytes(before.begin(), before.begin() + 576));
  Bytes block9 = tests::FptBlock(std::string(110, 'y'));
  EXPECT_EQ(Bytes(memo.begin() + 576, memo.begin() + 576 + long(block9.size())), block9);
}

TEST(VfpTarget, TablesOfOtherWriters) {
  // The shape another writer gives: no table flags, no displacements, FPT
  // blocks of 128 with the next free block 6, and a _NullFlags column last.
  std::string path = tests::ScratchPath("vfp_foreign.dbf");
  Bytes fpt = tests::MemoBytes(tests::FptHeader(5, 128)).At(4, tests::FptBlock("old"), 128).Build();
  tests::WriteAt(path.substr(0, path.size() - 3) + "fpt", fpt);
  Bytes rec = {' '};
  for (char c : Le32(41) + "z " + Le32(4) + Le64(0) + std::string(1, '\0')) rec.push_back(uint8_t(c));
  tests::WriteAt(path, DbfBuilder(0x30).Field("N", 'I', 4).Field("KEY", 'C', 2).Field("NOTE", 'M', 4)
                           .Field("PRICE", 'Y', 8, 4).Field("_NullFlags", '0', 1).HeaderExtra(263).RawRecord(rec)
                           .Build());
  {
    Target t(10, 1);
    t.Add('I', "N", 4);
    t.Add('C', "KEY", 2);
    t.Add('M', "NOTE");
    t.Add('Y', "PRICE", 8, 4);
    ASSERT_EQ(t.Open(path), 0);
    ASSERT_EQ(t.Put({"42", "y", "new", "-2.5"}), 0);
    ASSERT_EQ(t.Close(), 0);
  }
  Bytes b = tests::ReadFile(path);
  EXPECT_EQ(GetLe32(&b[4]), 2u);
  EXPECT_EQ(VfpRecord(b, 1), " " + Le32(42) + "y " + Le32(5) + Le64(uint64_t(-25000)) + std::string(1, '\0'));
  Bytes memo = tests::ReadFile(path.substr(0, path.size() - 3) + "fpt");
  EXPECT_EQ(GetBe32(&memo[0]), 6u);
  EXPECT_EQ(Bytes(memo.begin() + 640, memo.begin() + 651), tests::FptBlock("new"));

  // A binary field of a width this form doesn't have is no table to write.
  std::string odd = tests::WriteScratch("vfp_odd.dbf", DbfBuilder(0x30).Field("N", 'I', 8).HeaderExtra(263).Build());
  Target t(10, 1);
  t.Add('I', "N", 4);
  LogCapture log;
  EXPECT_EQ(t.Open(odd), ZQ_LAYOUT_DIFFERS);
  EXPECT_NE(log.Last().find("Field type mismatch on field N"), std::string::npos);
}

}  // namespace
