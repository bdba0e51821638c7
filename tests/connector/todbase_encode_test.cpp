// The target spoke writing new tables: number forms by dialect, dates, text
// and code pages, the field caps and widths of a new table, the type rules,
// the record length limit, and what a layout that differs from an existing
// table gets.
#include <gtest/gtest.h>

#include <cmath>
#include <string>
#include <vector>

#include "tests/support/todbase_harness.h"

namespace {

using tests::Bytes;
using tests::DbfBuilder;
using tests::LogCapture;
using tests::ScratchPath;
using tests::Target;
using tests::Written;

// Writes `text` (nullptr: a blank) or, when `value` is a number, that double
// into N(width, decimals) of a new table, with NEXT C(2) "ok" behind it; gives
// the N field's bytes, and checks that the number stayed out of NEXT.
std::string Number(int dialect, int width, int decimals, const char* text, double value = NAN) {
  Target t(dialect);
  t.Add('N', "N", width, decimals);
  t.Add('C', "NEXT", 2);
  std::string path = ScratchPath("num.dbf");
  EXPECT_EQ(t.Open(path), 0);
  if (std::isnan(value)) t.Set(0, text);
  else *t[0] = value;
  t.Set(1, "ok");
  EXPECT_EQ(t.Write(), 0);
  t.Close();
  std::string r = Written(path).Record(0);
  EXPECT_EQ(r.substr(1 + size_t(width)), "ok");
  return r.substr(1, size_t(width));
}

TEST(ToDbaseEncodeTest, NumberForms) {
  struct Case {
    int dialect, width, decimals;
    const char* text;  // written as text, and `value` as a double, where given
    double value;
    const char* want;
  };
  const double kNone = NAN;
  const Case cases[] = {
      // Too wide for N(5): dialect 1 keeps the low digits, dialect 2 goes to
      // the exponent form, which keeps the magnitude.
      {1, 5, 0, "123456", 123456, "23456"},
      {2, 5, 0, "123456", 123456, "1E+05"},
      // A six-character rendering loses its sign, in every dialect.
      {0, 5, 0, "-99999", -99999, "99999"},
      {1, 5, 0, "-99999", -99999, "99999"},
      {2, 5, 0, "-99999", -99999, "99999"},
      {8, 5, 0, "-99999", -99999, "99999"},
      {9, 5, 0, "-99999", -99999, "99999"},
      // The plain form holds while log10 stays below the width; leading zeros
      // count for nothing.
      {2, 5, 0, "99999", 99999, "99999"},
      {2, 5, 0, "100000", kNone, "1E+05"},
      {2, 5, 0, "0099999", kNone, "99999"},
      // A fraction below 1 is plain whatever the width.
      {8, 3, 1, "0.5", 0.5, "0.5"},
      {8, 8, 3, "-0.5", kNone, "  -0.500"},
      // Width 10, 2 decimals: 7 places before the point; P = 10 - 6; no
      // exponent form in dialect 1.
      {2, 10, 2, "1234567", 1234567, "1234567.00"},
      {2, 10, 2, "12345678", 12345678, " 1.235E+07"},
      {1, 10, 2, "12345678", kNone, "2345678.00"},
      // Right-justified with blanks, decimals as the field has them; 0 is
      // plain; wider than the field even so: cut at the field's end.
      {2, 8, 2, "-1.5", kNone, "   -1.50"},
      {9, 6, 0, nullptr, 0.0, "     0"},
      {2, 6, 0, nullptr, 1e300, "1E+300"},
      {2, 5, 0, nullptr, 1e300, "1E+30"},
      {2, 4, 0, nullptr, kNone, "    "},  // a blank number is blanks
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::Message() << c.dialect << " " << (c.text ? c.text : "") << " " << c.value);
    if (c.text != nullptr || std::isnan(c.value)) {
      EXPECT_EQ(Number(c.dialect, c.width, c.decimals, c.text), c.want);
    }
    if (!std::isnan(c.value)) {
      EXPECT_EQ(Number(c.dialect, c.width, c.decimals, nullptr, c.value), c.want);
    }
  }
}

TEST(ToDbaseEncodeTest, DatesLogicalsAndFieldBounds) {
  Target t(2);
  t.Add('D', "D");
  t.Add('L', "L");
  t.Add('C', "C", 3);
  std::string path = ScratchPath("dates.dbf");
  ASSERT_EQ(t.Open(path), 0);
  t[0]->SetDate(2024, 2, 29);
  t[1]->SetBool(true);
  t.Set(2, "abc");
  ASSERT_EQ(t.Write(), 0);
  t[0]->SetDate(12345, 6, 7);  // more than eight characters
  t[1]->SetBool(false);
  t.Set(2, "abcdef");  // cut on the right
  ASSERT_EQ(t.Write(), 0);
  t[0]->Blank();  // no date: blanks
  t[1]->Blank();  // the format has no blank logical
  t.Set(2, "");
  ASSERT_EQ(t.Write(), 0);
  t.Set(0, "2024-1");  // text that is no date, as it stands, padded to 8
  t[1]->SetBool(true);
  t.Set(2, "x");
  ASSERT_EQ(t.Write(), 0);
  EXPECT_EQ(t->InsertedRecordCount(), 4);
  t.Close();
  Written w(path);
  ASSERT_EQ(w.count, 4);
  EXPECT_EQ(w.reclen, 1 + 8 + 1 + 3);
  EXPECT_EQ(w.Record(0), " 20240229Tabc");
  EXPECT_EQ(w.Record(1).substr(9), "Fabc");  // the year's fifth digit stays out of the next field
  EXPECT_EQ(w.Record(2), "         F   ");
  EXPECT_EQ(w.Record(3).substr(9), "Tx  ");
  EXPECT_EQ(w.bytes.back(), 0x1A);
}

TEST(ToDbaseEncodeTest, TextStopsAtNulAndOnlyTextTakesTheCodePage) {
  Target t(1, 0, 0, 850);
  t.Add('C', "NAME", 8);
  t.Add('M', "NOTE");
  t.Add('N', "QTY", 3);
  std::string path = ScratchPath("cp.dbf");
  ASSERT_EQ(t.Open(path), 0);
  // UTF-8 "Müller": one byte in code page 850; memo text goes as it is.
  ASSERT_EQ(t.Put({"M\xC3\xBCller", "gr\xC3\xBC\xC3\x9F", "12"}), 0);
  t[0]->AssignText("ab\0cd", 5);  // the copy stops at the NUL byte
  t.Set(1, nullptr);
  t.Set(2, nullptr);
  ASSERT_EQ(t.Write(), 0);
  t.Close();
  Written w(path);
  EXPECT_EQ(w.version(), 0x83);
  EXPECT_EQ(w.Record(0).substr(0, 9), std::string(" M\x81ller  "));
  EXPECT_EQ(w.Record(0).substr(9, 10), "0000000001");
  EXPECT_EQ(w.Record(0).substr(19), " 12");
  EXPECT_EQ(w.Record(1).substr(0, 9), std::string(" ab\0\0\0\0\0\0", 9));
  EXPECT_EQ(w.Record(1).substr(9, 10), "0000000000");  // a blank memo stores nothing
  Bytes memo = tests::ReadFile(ScratchPath("cp.dbt"));
  ASSERT_GE(memo.size(), 512u + 7);
  EXPECT_EQ(std::string(memo.begin() + 512, memo.begin() + 512 + 7), "gr\xC3\xBC\xC3\x9F\x1A");
}

TEST(ToDbaseEncodeTest, TypeOfAnotherConnectorByItsAlias) {
  // (Float as N or F by dialect is compared field by field in
  // tests/interop/test_convert.py.)
  Target t(2);
  ZQDType foreign;
  foreign.Define("Some text;alias=Character");
  foreign.Length(7);
  t.AddType(foreign, "NAME", 7);
  std::string path = ScratchPath("types.dbf");
  ASSERT_EQ(t.Open(path), 0);
  t.Close();
  Written w(path);
  ASSERT_EQ(w.FieldCount(), 1);
  EXPECT_EQ(w.Type(0), 'C');
  EXPECT_EQ(w.Length(0), 7);
}

TEST(ToDbaseEncodeTest, FieldCapsOfNewTables) {
  struct Case {
    int dialect, cap;
  };
  for (Case c : {Case{0, 32}, Case{3, 32}, Case{1, 128}, Case{4, 128}, Case{7, 128}, Case{2, 256}, Case{6, 256},
                 Case{8, 1000}, Case{9, 1024}}) {
    SCOPED_TRACE(c.dialect);
    Target t(c.dialect);
    EXPECT_EQ(t->MaxNewFieldCount(), c.cap);
    int n = c.cap + 8 > 1024 ? 1024 : c.cap + 8;
    for (int i = 0; i < n; ++i) t.Add('C', ("F" + std::to_string(i)).c_str(), 1);
    std::string path = ScratchPath("cap.dbf");
    ASSERT_EQ(t.Open(path), 0);
    for (int i = 0; i < n; ++i) t.Set(i, std::to_string(i % 10).c_str());
    ASSERT_EQ(t.Write(), 0);
    t.Close();
    Written w(path);
    EXPECT_EQ(w.reclen, 1 + c.cap);
    std::string r = w.Record(0);
    ASSERT_EQ(r.size(), size_t(1 + c.cap));
    EXPECT_EQ(r[1], '0');
    EXPECT_EQ(r[size_t(c.cap)], char('0' + (c.cap - 1) % 10));
    // The new table opens as this dialect with every field it was given.
    tests::Source s(c.dialect);
    ASSERT_EQ(s.Open(path), 0);
    EXPECT_EQ(s.FieldCount(), c.cap);
  }
}

TEST(ToDbaseEncodeTest, WidthsOutsideOneByteAreRefused) {
  for (int width : {256, 300, 32000}) {
    Target t(8);
    LogCapture log;
    t.Add('C', "ID", 4);
    t.Add('C', "LONGTEXT", width);
    std::string path = ScratchPath("wide.dbf");
    unlink(path.c_str());
    EXPECT_EQ(t.Open(path), ZQ_CREATE_ERROR);
    EXPECT_EQ(log.Last(), "Field LONGTEXT has a width of " + std::to_string(width) + ", outside 1 to 255");
    EXPECT_FALSE(ZQFileProxy::fileExists(path.c_str()));
  }
  Target t(8);
  t.Add('C', "MAX", 255);
  std::string path = ScratchPath("wide.dbf");
  ASSERT_EQ(t.Open(path), 0);
  ASSERT_EQ(t.Put({std::string(300, 'y').c_str()}), 0);
  t.Close();
  EXPECT_EQ(Written(path).Record(0), " " + std::string(255, 'y'));
}

TEST(ToDbaseEncodeTest, RecordLengthLimit) {
  // 16 fields of 250 make 4000 bytes: valid; one more byte passes the limit.
  // A memo counts 10, and 4 in dialect 10; the limit is 32767 in 8, 9, 10.
  struct Case {
    int dialect, count, width;  // `count` C fields of `width`
    bool memo, logical;         // then a memo, then a logical
    int at;                     // the field past the limit, or -1
  };
  for (Case c : {Case{2, 16, 250, false, false, -1}, Case{2, 16, 250, false, true, 16},
                 Case{2, 1, 3990, true, false, -1}, Case{2, 1, 3990, true, true, 2},
                 Case{10, 1, 32763, true, false, -1}, Case{10, 1, 32763, true, true, 2},
                 Case{8, 1, 32767, false, false, -1}, Case{1, 1, 4001, false, false, 0}}) {
    SCOPED_TRACE(std::to_string(c.dialect) + " " + std::to_string(c.width));
    Target t(c.dialect);
    for (int i = 0; i < c.count; ++i) t.Add('C', ("C" + std::to_string(i)).c_str(), c.width);
    if (c.memo) t.Add('M', "NOTE");
    if (c.logical) t.Add('L', "ONE");
    int at = -1;
    EXPECT_EQ(t->ValidateLocalRecord(t.Layout(), at), c.at < 0 ? 0 : ZQ_RECORD_TOO_LONG);
    EXPECT_EQ(at, c.at);
  }
}

TEST(ToDbaseEncodeTest, LayoutThatDiffersFromTheTable) {
  Bytes table = DbfBuilder(0x03).Field("NAME", 'C', 10).Field("QTY", 'N', 5).Record({"alice", "   42"}).Build();
  struct Case {
    char name_letter;
    int name_length, qty_length;
    const char* bad;  // the field named in the message: the first difference
  };
  for (int mode : {1, 2}) {
    for (Case c : {Case{'C', 12, 6, "NAME"}, Case{'C', 9, 5, "NAME"}, Case{'N', 10, 5, "NAME"},
                   Case{'C', 10, 6, "QTY"}, Case{'D', 8, 5, "NAME"}}) {
      SCOPED_TRACE(std::string(1, c.name_letter) + std::to_string(c.name_length) + " mode " + std::to_string(mode));
      std::string path = tests::WriteScratch("differs.dbf", table);
      Target t(2, mode);
      LogCapture log;
      t.Add(c.name_letter, "NAME", c.name_length);
      t.Add('N', "QTY", c.qty_length);
      EXPECT_EQ(t.Open(path), ZQ_LAYOUT_DIFFERS);
      EXPECT_EQ(log.Last(), std::string("Field type mismatch on field ") + c.bad);
      ASSERT_FALSE(log.entries().empty());
      EXPECT_EQ(log.entries().back().level, 2);
      EXPECT_EQ(t->TableHandle(), nullptr);
      EXPECT_EQ(tests::ReadFile(path), table);  // untouched
    }
  }
  // More fields on either side are no difference; a table field behind the
  // layout's last one is written as zeros.
  std::string path = tests::WriteScratch("fewer.dbf", table);
  Target t(2, 1);
  t.Add('C', "NAME", 10);
  ASSERT_EQ(t.Open(path), 0);
  EXPECT_EQ(t->Position(), 1);
  ASSERT_EQ(t.Put({"bob"}), 0);
  t.Close();
  Written w(path);
  ASSERT_EQ(w.count, 2);
  EXPECT_EQ(w.Record(0), " alice        42");
  EXPECT_EQ(w.Record(1), std::string(" bob       \0\0\0\0\0", 16));
}

}  // namespace
