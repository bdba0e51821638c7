// The framework's choices that a connector leans on: the type lists a spoke
// keeps, the type for an unknown usage, option definitions, and fields'
// text and number forms.
#include <gtest/gtest.h>

#include <string>

#include "host/zqfield.h"
#include "host/zqspoke.h"

namespace {

std::string Text(const ZQString& s) { return std::string(s.c_str(), size_t(s.length())); }

ZQDType Defined(const char* text) {
  ZQDType t;
  t.Define(text);
  return t;
}

class PlainSpoke : public ZQImport {
 public:
  PlainSpoke() : ZQImport(ZQSpokeDef{}, nullptr, false) {}
};

TEST(ZQSpokeTest, KeepsItsOwnCopyOfTypeLists) {
  static const ZQDType date = Defined("Date;usage=0x44;picture=yyyymmdd");
  static const ZQDType text = Defined("Text;usage=0x43");
  PlainSpoke spoke;
  {
    // The list dies with its block; the spoke must not point into it.
    const ZQDType** list = new const ZQDType*[3]{&date, &text, nullptr};
    spoke.ReplaceValidTypes(list);
    spoke.ReplaceIndexTypes(list);
    list[0] = list[1] = nullptr;
    delete[] list;
  }
  ASSERT_NE(spoke.GetValidTypes()[0], nullptr);
  EXPECT_EQ(spoke.GetValidTypes()[0], &date);
  EXPECT_EQ(spoke.GetValidTypes()[1], &text);
  EXPECT_EQ(spoke.GetValidTypes()[2], nullptr);
  EXPECT_EQ(spoke.GetIndexTypes()[1], &text);
  EXPECT_EQ(&spoke.TypeByUsage('C'), &text);
  EXPECT_EQ(&spoke.GetDType(0), &date);
  EXPECT_EQ(&spoke.GetIdxType(1), &text);

  // A letter no type has gets plain text, so such a column still reads as
  // its bytes; entries past the end of a list do too.
  const ZQDType& unknown = spoke.TypeByUsage('Q');
  EXPECT_EQ(unknown.Family(), FT_TEXT);
  EXPECT_EQ(unknown.Kind(), DT_TEXT);
  EXPECT_EQ(spoke.GetDType(5).Family(), FT_TEXT);
  EXPECT_EQ(spoke.GetIdxType(7).Family(), FT_TEXT);
}

BATCHERR GetNothing(void*, ZQString& value, const wchar*) {
  value = "v";
  return 0;
}

TEST(ZQOptionDefTest, HandsFlagsAndTrailingArgumentsOverUnchanged) {
  ZQOptionDef def(u"version", u"Version", u"d", 0xC001, "2", nullptr, GetNothing, nullptr, nullptr, nullptr,
                  nullptr, 0, nullptr, nullptr, 0, 0);
  EXPECT_EQ(def.Flags(), 0xC001);
  EXPECT_STREQ(def.NameText(), "version");
  EXPECT_STREQ(def.Default(), "2");
  ZQString value;
  EXPECT_EQ(def.Get(nullptr, value), 0);
  EXPECT_EQ(Text(value), "v");
  EXPECT_EQ(def.Set(nullptr, "1"), ZQ_NOT_SUPPORTED);  // no setter
  ZQOptionDef* cp = ZQSpokeOptions::CodePageOption();
  EXPECT_STREQ(cp->NameText(), "codepage");
  ZQSpokeOptions block(4, nullptr);
  EXPECT_EQ(cp->Set(&block, "850"), 0);
  EXPECT_EQ(block.CodePage(), 850);
  EXPECT_EQ(cp->Get(&block, value), 0);
  EXPECT_EQ(Text(value), "850");
}

TEST(ZQFieldTest, RenderFlagsDatesAndNumbers) {
  ZQDType numeric = Defined("dBASE Numeric;usage=0x4e");
  numeric.DecimalPlaces(2);
  ZQField n(numeric, "AMOUNT");
  n = 1.5;
  ZQString out;
  n.RenderText(out, 0);  // a number: with the type's decimals
  EXPECT_EQ(Text(out), "1.50");
  n.RenderText(out, 1);
  EXPECT_EQ(Text(out), "1.50");
  n = ZQString("  12.5 ");  // text keeps its digits, blanks go
  n.RenderText(out, 0);     // flag 0: the plain number form, brought to 2 decimals
  EXPECT_EQ(Text(out), "12.50");
  n.RenderText(out, 1);  // flag 1: the text as it came
  EXPECT_EQ(Text(out), "12.5");
  EXPECT_EQ(Text(n.StringRef()), "12.5");
  EXPECT_DOUBLE_EQ(n.DoubleVal(), 12.5);
  n = ZQString("     ");
  EXPECT_TRUE(n.IsBlank());

  ZQDType date = Defined("Date;usage=0x44;picture=yyyymmdd");
  ZQField d(date, "BORN");
  d = ZQString("20000101");
  ASSERT_EQ(d.held(), ZQField::Held::kDate);
  EXPECT_EQ(d.DisplayLength(), 8);
  // A date's number is its Julian day number, which index keys hold as is.
  EXPECT_DOUBLE_EQ(d.DoubleVal(), 2451545.0);
  d.RenderText(out, 1);
  EXPECT_EQ(Text(out), "20000101");
  d.SetPicture("mm/dd/yy");
  d.RenderText(out, 1);
  EXPECT_EQ(Text(out), "01/01/00");
  d.RenderText(out, 0);
  EXPECT_EQ(Text(out), "20000101");

  ZQField l(Defined("Boolean;usage=0x4c;picture=T.F"), "OK");
  EXPECT_EQ(l.DisplayLength(), 1);
  l = ZQString("y");
  EXPECT_TRUE(l.BoolVal());
  l = ZQString("?");
  EXPECT_TRUE(l.IsBlank());

  ZQField t(Defined("DateTime;usage=0x54"), "AT");
  t = ZQDateTime(730122, 3661, 0);
  EXPECT_EQ(Text(t.StringRef()), "2000-01-01T01:01:01");
}

}  // namespace
