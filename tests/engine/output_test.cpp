// The engine's own text forms: CSV quoting, JSON strings and numbers, CSV
// reading, the schema text.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "engine/csv_reader.h"
#include "engine/csv_source.h"
#include "engine/outbuf.h"
#include "engine/writers.h"
#include "support/dbf_builder.h"

namespace {

// Runs `fill` against an OutBuf on a pipe and gives what it wrote.
template <typename F>
std::string Captured(F fill) {
  int fds[2];
  if (pipe(fds) != 0) return "";
  {
    OutBuf out(fds[1]);
    fill(out);
  }
  close(fds[1]);
  std::string s;
  char buf[4096];
  ssize_t n;
  while ((n = read(fds[0], buf, sizeof buf)) > 0) s.append(buf, size_t(n));
  close(fds[0]);
  return s;
}

TEST(JsonOutput, StringsAreAlwaysValidJson) {
  auto json = [](const std::string& in) {
    return Captured([&](OutBuf& o) { PutJsonString(o, in.data(), in.size()); });
  };
  EXPECT_EQ(json("plain"), "\"plain\"");
  EXPECT_EQ(json("a\"b\\c\nd\te"), "\"a\\\"b\\\\c\\nd\\te\"");
  EXPECT_EQ(json(std::string("nul\0x", 5)), "\"nul\\u0000x\"");
  EXPECT_EQ(json("caf\xc3\xa9"), "\"caf\xc3\xa9\"");  // UTF-8 stays
  // Bytes that are no UTF-8 (a table read without --codepage) are taken as
  // Latin-1 characters: \u00e9 for 0xE9.
  EXPECT_EQ(json("caf\xe9"), "\"caf\\u00e9\"");
  EXPECT_EQ(json("\xc3"), "\"\\u00c3\"");  // a cut sequence at the end
}

TEST(JsonOutput, NumberGrammar) {
  for (const char* good : {"0", "-0", "12", "12.50", "-0.5", "1e5", "1.5E-3"})
    EXPECT_TRUE(IsJsonNumber(good, strlen(good))) << good;
  for (const char* bad : {"", "-", ".5", "5.", "+1", "007", "1e", "1,5", "***", "0x10", "1 2"})
    EXPECT_FALSE(IsJsonNumber(bad, strlen(bad))) << bad;
}

TEST(CsvOutput, QuotesOnlyWhatNeedsIt) {
  ZQDType text;
  text.Define("Text;usage=0x43");
  ZQRecord r;
  ZQField* a = r.NewField(text, "A");
  ZQField* b = r.NewField(text, "B,1");
  std::string got = Captured([&](OutBuf& o) {
    auto w = MakeWriter(OutputFormat::kCsv, o);
    w->Begin(r);
    a->AssignText("x", 1);
    const std::string said = "say \"hi\", twice\nok";
    b->AssignText(said.data(), int32_t(said.size()));
    w->Row(r);
    a->Blank();
    b->AssignText(std::string(40, 'z').c_str(), 40);  // long enough for the 16-byte scan
    w->Row(r);
  });
  EXPECT_EQ(got, "A,\"B,1\"\r\nx,\"say \"\"hi\"\", twice\nok\"\r\n," + std::string(40, 'z') + "\r\n");
}

// A PostgreSQL script on exact bytes: names lower-cased and quoted, types
// by width, COPY's escapes, NULL as \N, bytes that are no UTF-8 as Latin-1,
// NUL left out, a number that isn't one as NULL.
TEST(PgsqlOutput, ScriptTypesAndEscapes) {
  ZQDType text, num, money;
  text.Define("Text;usage=0x43");
  num.Define("dBASE Numeric;decsep=.;usage=0x4e");
  ZQRecord r;
  text.Length(20);
  ZQField* a = r.NewField(text, "Say\"It");
  num.Length(5);  // "-9999" to "99999": more than SMALLINT holds
  ZQField* q = r.NewField(num, "QTY");
  num.Length(12);
  num.DecimalPlaces(2);
  ZQField* m = r.NewField(num, "AMT");
  std::string got = Captured([&](OutBuf& o) {
    auto w = MakeWriter(OutputFormat::kPgsql, o, "Shop");
    w->Begin(r);
    static const char kSaid[] = "tab\there\nback\\slash\r\x01 caf\xe9 \xc3\xa9 nul\0!";
    const std::string said(kSaid, sizeof kSaid - 1);
    a->AssignText(said.data(), int32_t(said.size()));
    q->AssignText("-42", 3);
    m->AssignText("***", 3);
    w->Row(r);
    a->Blank();
    q->Blank();
    m->AssignText("12.50", 5);
    w->Row(r);
    w->End();
  });
  EXPECT_EQ(got,
            "SET client_encoding = 'UTF8';\nSET standard_conforming_strings = on;\nBEGIN;\n"
            "DROP TABLE IF EXISTS \"shop\";\n"
            "CREATE TABLE \"shop\" (\"say\"\"it\" VARCHAR(20), \"qty\" INTEGER, \"amt\" NUMERIC(12,2));\n"
            "COPY \"shop\" (\"say\"\"it\", \"qty\", \"amt\") FROM STDIN;\n"
            "tab\\there\\nback\\\\slash\\r\\001 caf\xc3\xa9 \xc3\xa9 nul!\t-42\t\\N\n"
            "\\N\t\\N\t12.50\n"
            "\\.\nCOMMIT;\n");
}

TEST(CsvReading, QuotesLineBreaksAndDamage) {
  std::string path = tests::WriteScratch(
      "reader.csv", tests::Bytes{'a', ',', 'b', '\r', '\n', '"', 'x', ',', '"', '"', 'y', '"', ',', '\n',
                                 '"', 'm', '\n', 'l', '"', ',', 'z', '\n', '1', ',', '2'});
  CsvReader r;
  std::string error;
  ASSERT_TRUE(r.Open(path, &error)) << error;
  ASSERT_TRUE(r.Next());
  EXPECT_EQ(r.FieldString(0), "a");
  EXPECT_EQ(r.FieldString(1), "b");
  ASSERT_TRUE(r.Next());
  EXPECT_EQ(r.FieldCount(), 2u);
  EXPECT_EQ(r.FieldString(0), "x,\"y");
  EXPECT_EQ(r.FieldString(1), "");
  ASSERT_TRUE(r.Next());
  EXPECT_EQ(r.FieldString(0), "m\nl");
  EXPECT_EQ(r.Line(), 3);
  ASSERT_TRUE(r.Next());  // the last line has no line end
  EXPECT_EQ(r.FieldString(1), "2");
  EXPECT_FALSE(r.Next());
  EXPECT_TRUE(r.error().empty());

  for (const char* bad : {"a,\"open\n", "a,b\"c\n", "\"q\"x\n"}) {
    std::string p = tests::WriteScratch("bad.csv", tests::Bytes(bad, bad + strlen(bad)));
    CsvReader b;
    ASSERT_TRUE(b.Open(p, &error));
    EXPECT_FALSE(b.Next()) << bad;
    EXPECT_FALSE(b.error().empty()) << bad;
  }
}

TEST(Schema, ParsesTypesWidthsAndRefusesNonsense) {
  std::vector<SchemaField> f;
  std::string error;
  ASSERT_TRUE(ParseSchema("NAME C(30), BORN D, AMOUNT N(12,2), NOTE M, OK l", &f, &error)) << error;
  ASSERT_EQ(f.size(), 5u);
  EXPECT_EQ(f[0].letter, 'C');
  EXPECT_EQ(f[0].length, 30);
  EXPECT_EQ(f[2].length, 12);
  EXPECT_EQ(f[2].decimals, 2);
  EXPECT_EQ(f[4].letter, 'L');
  for (const char* bad : {"", "NAME", "NAME X(3)", "A C(0)", "A C(300)", "A N(5,5)", "A N(5", "A C(3),,B D"})
    EXPECT_FALSE(ParseSchema(bad, &f, &error)) << bad;
}

}  // namespace
