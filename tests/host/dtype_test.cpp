// ZQDType: the twelve definition strings of the connector, and binary
// numbers in and out.
#include <gtest/gtest.h>

#include <string>

#include "host/zqdtype.h"

namespace {

ZQDType Defined(const char* text) {
  ZQDType t;
  t.Define(text);
  return t;
}

std::string Bytes(const ZQString& s) { return std::string(s.c_str(), size_t(s.length())); }

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
  EXPECT_EQ(Bytes(out), std::string("\x04\x03\x02\x01\xFE\xFF\xFF\xFF", 8));
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
  EXPECT_EQ(Bytes(out), std::string("\x00\x00\x00\x00\x00\x00\x08\x40", 8));
  ZQDType text;  // a text kind has no binary form
  EXPECT_EQ(text.Output(out, int32_t(1)), 0);
  EXPECT_EQ(text.Input(out, 0, v), 0);
}

}  // namespace
