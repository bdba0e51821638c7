// The engine's own text forms: CSV quoting, JSON strings and numbers, CSV
// reading, the schema text.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "engine/csv_reader.h"
#include "engine/csv_source.h"
#include "engine/outbuf.h"
#include "engine/writers.h"
#include "support/dbf_builder.h"

namespace {

// Runs `fill` against an OutBuf on a scratch file and gives what it wrote.
template <typename F>
std::string Captured(F fill) {
  std::string path = tests::ScratchPath("captured.out");
  int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
  {
    OutBuf out(fd);
    fill(out);
  }
  close(fd);
  tests::Bytes b = tests::ReadFile(path);
  return std::string(b.begin(), b.end());
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
  ZQDType text, num;
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
  const std::string text = "a,b\r\n\"x,\"\"y\",\n\"m\nl\",z\n1,2";
  std::string path = tests::WriteScratch("reader.csv", tests::Text(text));
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
  EXPECT_EQ(r.Line(), 5);  // the line break inside quotes counted
  EXPECT_FALSE(r.Next());
  EXPECT_TRUE(r.error().empty());

  const std::pair<const char*, const char*> bad[] = {
      {"a,\"open\n", "a quoted field runs to the end of the file"},
      {"a,b\"c\n", "a quote inside an unquoted field"},
      {"\"q\"x\n", "text behind a closing quote"}};
  for (const auto& c : bad) {
    std::string p = tests::WriteScratch("bad.csv", tests::Text(c.first));
    CsvReader b;
    ASSERT_TRUE(b.Open(p, &error));
    EXPECT_FALSE(b.Next()) << c.first;
    EXPECT_EQ(b.error(), c.second) << c.first;
  }
}

TEST(Schema, ParsesTypesWidthsAndRefusesNonsense) {
  std::vector<SchemaField> f;
  std::string error;
  ASSERT_TRUE(ParseSchema("NAME C(30), BORN D, AMOUNT N(12,2), NOTE M, OK l", &f, &error)) << error;
  std::string got;  // name, letter, width and decimals (0: not given)
  for (const SchemaField& s : f)
    got += s.name + " " + s.letter + std::to_string(s.length) + "," + std::to_string(s.decimals) + " ";
  EXPECT_EQ(got, "NAME C30,0 BORN D0,0 AMOUNT N12,2 NOTE M0,0 OK L0,0 ");
  for (const char* bad : {"", "NAME", "NAME X(3)", "A C(0)", "A C(300)", "A N(5,5)", "A N(5", "A C(3),,B D"})
    EXPECT_FALSE(ParseSchema(bad, &f, &error)) << bad;
}

}  // namespace
