// The framework's types and fields as a connector leans on them: the
// definition strings of its types, binary numbers in and out, the type lists
// a spoke keeps and the type for an unknown usage, option definitions, and
// how a field takes and gives the text of a record (dates by picture,
// numbers kept as digits and brought to the type's decimals, blanks).
#include <gtest/gtest.h>

#include <cstring>
#include <string>

#include "host/zqdtype.h"
#include "host/zqfield.h"
#include "host/zqspoke.h"

namespace {

std::string Text(const ZQString& s) { return std::string(s.c_str(), size_t(s.length())); }

ZQDType Defined(const char* text, int32_t length = 0, int16_t decimals = 0) {
  ZQDType t;
  t.Define(text);
  if (length) t.Length(length);
  if (decimals) t.DecimalPlaces(decimals);
  return t;
}

std::string Rendered(ZQField& f, int flag) {
  ZQString out;
  f.RenderText(out, flag);
  return Text(out);
}

TEST(ZQDTypeTest, DefinesTheTwelveConnectorTypes) {
  struct Case {
    const char* definition;
    int16_t usage;
    const char* alias;
    FIELDTYPE family;
    DATATYPE kind;
    const char* picture;
  };
  const Case cases[] = {
      {"Date;usage=0x44;picture=yyyymmdd;picture_settable=0", 0x44, "", FT_DATE, DT_DOUBLE, "yyyymmdd"},
      {"Boolean;alias=Logical;usage=0x4c;picture=T.F;picture_settable=False", 0x4C, "Logical", FT_BOOLEAN,
       DT_TEXT, "T.F"},
      {"dBASE Numeric;decsep=.;alias=Numeric;usage=0x4e", 0x4E, "Numeric", FT_NUMERIC, DT_DOUBLE, ""},
      {"Text;alias=Character;usage=0x43;maxlength=254;maxprecision=254", 0x43, "Character", FT_TEXT, DT_TEXT, ""},
      {"Memo;alias=Memo;usage=0x4d;length=255;length_invalid;maxlength=32000;maxprecision=32000;"
       "padchar_invalid;varlen_invalid",
       0x4D, "Memo", FT_TEXT, DT_TEXT, ""},
      {"dBASE Numeric;alias=Float;decsep=.;usage=0x46", 0x46, "Float", FT_NUMERIC, DT_DOUBLE, ""},
      {"Binary;alias=Ole;usage=0x47", 0x47, "Ole", FT_BINARY, DT_TEXT, ""},
      {"Binary;usage=0x42", 0x42, "", FT_BINARY, DT_TEXT, ""},
      {"Float;alias=Double;decsep=.;usage=0x42", 0x42, "Double", FT_FLOAT, DT_DOUBLE, ""},
      {"Float;alias=Currency;currency;decsep=.;usage=0x59", 0x59, "Currency", FT_CURRENCY, DT_DOUBLE, ""},
      {"Integer;usage=0x49", 0x49, "", FT_INTEGER, DT_LONG, ""},
      {"DateTime;usage=0x54", 0x54, "", FT_DATETIME, DT_TEXT, ""},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.definition);
    ZQDType t = Defined(c.definition);
    EXPECT_EQ(t.Usage(), c.usage);
    EXPECT_STREQ(t.Alias(), c.alias);
    EXPECT_EQ(t.Family(), c.family);
    EXPECT_EQ(t.Kind(), c.kind);
    EXPECT_STREQ(t.GetPicture(), c.picture);
    EXPECT_EQ(t.DecimalSeparator(), '.');
  }
  ZQDType text = Defined(cases[3].definition);
  EXPECT_EQ(text.MaxLength(), 254);
  EXPECT_EQ(text.MaxPrecision(), 254);
  EXPECT_EQ(text.GetPadChar(nullptr), ' ');
  ZQDType memo = Defined(cases[4].definition);
  EXPECT_EQ(memo.Length(), 255);
  EXPECT_EQ(memo.MaxLength(), 32000);
  EXPECT_TRUE(memo.LengthInvalid());
  EXPECT_EQ(memo.GetPadChar(nullptr), '\0');
  EXPECT_TRUE(Defined(cases[9].definition).IsCurrency());
  EXPECT_FALSE(Defined(cases[8].definition).IsCurrency());
  EXPECT_EQ(Defined(cases[8].definition).BinaryWidth(), 8);
  EXPECT_EQ(Defined(cases[10].definition).BinaryWidth(), 4);

  // Define starts afresh: nothing of an earlier definition survives.
  ZQDType t = Defined(cases[1].definition);
  t.Define("Text;usage=0x43");
  EXPECT_STREQ(t.Alias(), "");
  EXPECT_STREQ(t.GetPicture(), "");
  EXPECT_EQ(t.Family(), FT_TEXT);
}

TEST(ZQDTypeTest, LittleEndianBinaryNumbers) {
  // The binary forms the connector reads and writes (Visual FoxPro's I and T,
  // SMT memo pointers, index words) are little-endian.
  ZQDType le(DT_LONG);
  ZQString out;
  EXPECT_EQ(le.Output(out, int32_t(0x01020304)), 4);
  EXPECT_EQ(le.Output(out, int16_t(-2)), 4);  // a 32-bit type given a short still appends four bytes
  EXPECT_EQ(Text(out), std::string("\x04\x03\x02\x01\xFE\xFF\xFF\xFF", 8));
  int32_t v = 0;
  EXPECT_EQ(le.Input(out, 4, v), 4);
  EXPECT_EQ(v, -2);
  EXPECT_EQ(le.Input(ZQString("\x00\x00\x00\x80", 4), 0, v), 4);
  EXPECT_EQ(v, INT32_MIN);
  // Too few bytes at the offset: nothing used, the value 0.
  for (int32_t at : {0, 1, -1}) {
    v = 7;
    EXPECT_EQ(le.Input(ZQString("\x01\x02\x03", 3), at, v), 0) << at;
    EXPECT_EQ(v, 0);
  }
  ZQDType s16(DT_SHORT);
  s16.Signed(false);
  double dv = 0;
  EXPECT_EQ(s16.Input(ZQString("\xFE\xFF", 2), 0, dv), 2);
  EXPECT_EQ(dv, 65534.0);
  ZQDType dbl(DT_DOUBLE);
  out = "";
  EXPECT_EQ(dbl.Output(out, int32_t(3)), 8);  // an integer to a double type
  EXPECT_EQ(Text(out), std::string("\x00\x00\x00\x00\x00\x00\x08\x40", 8));
  ZQDType text;  // a text kind has no binary form
  EXPECT_EQ(text.Output(out, int32_t(1)), 0);
  EXPECT_EQ(text.Input(out, 0, v), 0);
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

TEST(ZQFieldTest, DatesParseByPicture) {
  ZQField d(Defined("Date;usage=0x44;picture=yyyymmdd"), "D");
  d.AssignText("20240229", 8);
  ASSERT_EQ(d.held(), ZQField::Held::kDate);
  EXPECT_EQ(d.DateRef().Day(), 29);
  for (const char* blank : {"        ", "00000000", ""}) {
    d.AssignText(blank, int32_t(strlen(blank)));
    EXPECT_TRUE(d.IsBlank()) << '"' << blank << '"';
  }
  // Not a date: the bytes stay, nothing is made up.
  for (const char* odd : {"20230229", "2024AB01", "31.12.99"}) {
    d.AssignText(odd, int32_t(strlen(odd)));
    EXPECT_EQ(d.held(), ZQField::Held::kText) << odd;
    EXPECT_STREQ(d.StringRef().c_str(), odd);
  }
  // A blank date prints as blanks of the picture's width.
  d.Blank();
  ZQString out;
  d.DateRef().Print(out, "yyyymmdd");
  EXPECT_EQ(Text(out), "        ");
}

TEST(ZQFieldTest, NumbersKeepTheirDigitsAndTakeTheTypesDecimals) {
  ZQField n(Defined("dBASE Numeric;usage=0x4e", 12, 2), "N");
  struct {
    const char* in;
    const char* plain;  // RenderText flag 0
  } cases[] = {
      {"   12.50", "12.50"}, {"12.5", "12.50"},   {"+5", "5.00"},     {"007", "7.00"},
      {"-0.005", "-0.01"},  {"9.999", "10.00"}, {"-0.001", "0.00"},  {".5", "0.50"},
      {"123456789012345678.25", "123456789012345678.25"},  // beyond a double's digits
  };
  for (const auto& c : cases) {
    n.AssignText(c.in, int32_t(strlen(c.in)));
    EXPECT_EQ(Rendered(n, 0), c.plain) << c.in;
  }
  // Asterisks mark a number that didn't fit, or none: blank.
  n.AssignText("******", 6);
  EXPECT_TRUE(n.IsBlank());
  n.AssignText("  ", 2);
  EXPECT_TRUE(n.IsBlank());
}

TEST(ZQFieldTest, RenderFlagsDatesAndNumbers) {
  ZQField n(Defined("dBASE Numeric;usage=0x4e", 0, 2), "AMOUNT");
  n = 1.5;
  EXPECT_EQ(Rendered(n, 0), "1.50");  // a number: with the type's decimals
  EXPECT_EQ(Rendered(n, 1), "1.50");
  n = ZQString("  12.5 ");              // text keeps its digits, blanks go
  EXPECT_EQ(Rendered(n, 0), "12.50");  // flag 0: the plain number form, brought to 2 decimals
  EXPECT_EQ(Rendered(n, 1), "12.5");   // flag 1: the text as it came
  EXPECT_DOUBLE_EQ(n.DoubleVal(), 12.5);

  ZQField d(Defined("Date;usage=0x44;picture=yyyymmdd"), "BORN");
  d = ZQString("20000101");
  ASSERT_EQ(d.held(), ZQField::Held::kDate);
  EXPECT_EQ(d.DisplayLength(), 8);
  // A date's number is its Julian day number, which index keys hold as is.
  EXPECT_DOUBLE_EQ(d.DoubleVal(), 2451545.0);
  EXPECT_EQ(Rendered(d, 1), "20000101");
  d.SetPicture("mm/dd/yy");
  EXPECT_EQ(Rendered(d, 1), "01/01/00");
  EXPECT_EQ(Rendered(d, 0), "20000101");

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
