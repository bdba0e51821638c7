// How a field takes the text of a record: dates by picture and ISO form,
// numbers kept as digits and brought to the type's decimals, blanks.
#include <gtest/gtest.h>

#include <cstring>

#include "host/zqfield.h"

namespace {

ZQDType Make(const char* def, int32_t length = 0, int16_t dec = 0) {
  ZQDType t;
  t.Define(def);
  if (length) t.Length(length);
  t.DecimalPlaces(dec);
  return t;
}

TEST(ZQFieldTest, DatesParseByPicture) {
  ZQField d(Make("Date;usage=0x44;picture=yyyymmdd"), "D");
  d.AssignText("20240229", 8);
  ASSERT_EQ(d.held(), ZQField::Held::kDate);
  EXPECT_EQ(d.DateRef().Day(), 29);
  d.AssignText("2024-01-31", 10);  // ISO, as text files write dates
  ASSERT_EQ(d.held(), ZQField::Held::kDate);
  EXPECT_EQ(d.DateRef().Month(), 1);
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
  EXPECT_STREQ(out.c_str(), "        ");
}

TEST(ZQFieldTest, NumbersKeepTheirDigitsAndTakeTheTypesDecimals) {
  ZQField n(Make("dBASE Numeric;usage=0x4e", 12, 2), "N");
  struct {
    const char* in;
    const char* plain;  // RenderText flag 0
  } cases[] = {
      {"   12.50", "12.50"}, {"12.5", "12.50"},   {"+5", "5.00"},     {"007", "7.00"},
      {"-0.005", "-0.01"},  {"9.999", "10.00"}, {"-0.001", "0.00"},  {".5", "0.50"},
      {"123456789012345678.25", "123456789012345678.25"},  // beyond a double's digits
  };
  ZQString out;
  for (const auto& c : cases) {
    n.AssignText(c.in, int32_t(strlen(c.in)));
    n.RenderText(out, 0);
    EXPECT_STREQ(out.c_str(), c.plain) << c.in;
  }
  // Asterisks mark a number that didn't fit, or none: blank.
  n.AssignText("******", 6);
  EXPECT_TRUE(n.IsBlank());
  n.AssignText("  ", 2);
  EXPECT_TRUE(n.IsBlank());
}

TEST(ZQFieldTest, ZeroDateTimeIsBlank) {
  ZQField t(Make("DateTime;usage=0x54"), "T");
  t = ZQDateTime(-kZQEpochJulianDay, 0, 0);  // eight zero bytes in a table
  EXPECT_TRUE(t.IsBlank());
  t = ZQDateTime(730122, 1, 0);
  ASSERT_EQ(t.held(), ZQField::Held::kDateTime);
  EXPECT_EQ(t.DateTimeRef().Year(), 2000);
}

}  // namespace
