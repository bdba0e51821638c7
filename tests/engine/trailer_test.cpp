// The descriptor trailer: as the build appends it to the module, and as the
// engine's scanner reads it, damaged ones included.
#include <gtest/gtest.h>

#include <cstdio>
#include <string>
#include <vector>

#include "connector/trailer.h"
#include "engine/modules.h"
#include "host/endian.h"
#include "support/dbf_builder.h"

namespace {

struct Expected {
  uint32_t number;
  const char* key;
  const char* display;
  uint64_t flags;
  const char* option;
  const char* short_name;
};

// The nine definitions, written out here rather than taken from the table
// the build uses.
const Expected kExpected[] = {
    {4, "DADBASE", "dBASE IV", 0x1F, "", "dbase"},
    {200, "DADBASE2", "dBASE II", 0x1F, "version=0", "dbase2"},
    {202, "DADBASE3P", "dBASE III+", 0x1F, "version=1", "dbase3p"},
    {203, "DAENABLE", "Enable", 0x1F, "version=3", "enable"},
    {204, "DAFOXPRO", "FoxPro", 0x1F, "version=6", "foxpro"},
    {205, "DAENABLEOA", "Enable OA (Database)", 0x1F, "version=7", "enableoa"},
    {206, "DACLIPPER", "Clipper", 0x1F, "version=8", "clipper"},
    {207, "DADBASE5", "Visual dBASE 5.5", 0x1F, "version=9", "dbase5"},
    {208, "DAVFOXPRO", "Visual FoxPro", 0x0D, "version=10", "vfoxpro"},
};

std::string Cstr(const uint8_t*& p) {
  std::string s(reinterpret_cast<const char*>(p));
  p += s.size() + 1;
  return s;
}

TEST(Trailer, BuiltModuleEndsWithTheNineDefinitions) {
  tests::Bytes file = tests::ReadFile(ZQ_MODULE_FILE);
  ASSERT_GT(file.size(), 2000u);
  const uint8_t* end = file.data() + file.size();
  EXPECT_EQ(std::string(reinterpret_cast<const char*>(end - 8), 8), "ZQSPOKEX");
  EXPECT_EQ(GetBe32(end - 16), 9u);
  ASSERT_EQ(GetBe32(end - 12), 1196u);
  const uint8_t* lengths = end - 16 - 36;
  // Walk the definitions field by field: each must take its length, and the
  // walk must end on the lengths.
  const uint8_t* p = end - 16 - 1196;
  for (int i = 0; i < 9; ++i) {
    const Expected& e = kExpected[i];
    const uint8_t* start = p;
    std::vector<uint32_t> words(8);
    for (uint32_t& w : words) w = GetBe32(p), p += 4;
    EXPECT_EQ(words, (std::vector<uint32_t>{1, e.number, 4, 6, 0, 900, 0, 0})) << e.key;
    EXPECT_EQ(Cstr(p), e.key);
    EXPECT_EQ(Cstr(p), e.display);
    uint64_t flags = GetBe64(p);
    p += 8;
    EXPECT_EQ(flags, e.flags) << e.key;
    EXPECT_EQ(Cstr(p), e.option);
    EXPECT_EQ(Cstr(p), "dbf");
    EXPECT_EQ(Cstr(p), e.display);
    EXPECT_EQ(Cstr(p), e.short_name);
    EXPECT_EQ(Cstr(p), "dbse");
    EXPECT_EQ(Cstr(p), "Dbase");
    EXPECT_EQ(std::vector<uint32_t>({GetBe32(p), GetBe32(p + 4), GetBe32(p + 8)}), (std::vector<uint32_t>{4, 1, 0}));
    p += 12;
    EXPECT_EQ(Cstr(p), "FlatFile");
    EXPECT_EQ(GetBe32(p), 0u);
    p += 4;
    EXPECT_EQ(uint32_t(p - start), GetBe32(lengths + 4 * i)) << e.key;
  }
  EXPECT_EQ(p, lengths);

  // The scanner reads the same nine.
  std::vector<ConnectorDef> defs;
  std::string why;
  ASSERT_EQ(ParseTrailer(file.data(), file.size(), file.size(), &defs, &why), TrailerStatus::kOk) << why;
  ASSERT_EQ(defs.size(), 9u);
  EXPECT_EQ(defs[6].short_name + "|" + defs[6].option_text, "clipper|version=8");
  EXPECT_EQ(defs[0].class_stem + "|" + defs[0].kind, "Dbase|FlatFile");
  EXPECT_EQ(defs[8].flags, 0x0Du);
}

// A file body followed by a trailer, with a hook to break one part.
tests::Bytes WithTrailer(const tests::Bytes& body, const std::vector<uint8_t>& t) {
  tests::Bytes out = body;
  out.insert(out.end(), t.begin(), t.end());
  return out;
}

TrailerStatus Parse(const tests::Bytes& f, std::string* why) {
  std::vector<ConnectorDef> defs;
  return ParseTrailer(f.data(), f.size(), f.size(), &defs, why);
}

TEST(Trailer, DamagedTrailersAreRefusedWithAReason) {
  const tests::Bytes body(64, 0x55);
  const std::vector<uint8_t> good = trailer::EncodeTrailer();
  std::string why;
  EXPECT_EQ(Parse(WithTrailer(body, good), &why), TrailerStatus::kOk);
  // No magic: no trailer at all, and nothing to warn about.
  EXPECT_EQ(Parse(body, &why), TrailerStatus::kNone);
  EXPECT_EQ(Parse(tests::Bytes(5, 0), &why), TrailerStatus::kNone);

  auto broken = [&](size_t at_from_end, uint32_t value) {
    tests::Bytes f = WithTrailer(body, good);
    PutBe32(&f[f.size() - at_from_end], value);
    return f;
  };
  EXPECT_EQ(Parse(broken(16, 0), &why), TrailerStatus::kDamaged);  // count 0
  EXPECT_NE(why.find("count"), std::string::npos);
  EXPECT_EQ(Parse(broken(16, 100000), &why), TrailerStatus::kDamaged);
  EXPECT_EQ(Parse(broken(12, 0x7FFFFFF0), &why), TrailerStatus::kDamaged);  // size past the file
  EXPECT_NE(why.find("outside"), std::string::npos);
  EXPECT_EQ(Parse(broken(12, 1200), &why), TrailerStatus::kDamaged);  // lengths don't add up
  EXPECT_EQ(Parse(broken(16, 10), &why), TrailerStatus::kDamaged);    // count disagrees with the lengths

  // Truncated: only the last part of the trailer left.
  tests::Bytes cut(good.end() - 100, good.end());
  EXPECT_EQ(Parse(cut, &why), TrailerStatus::kDamaged);

  // Definitions without their NUL ends: every NUL in the definitions made
  // a letter.
  tests::Bytes f = WithTrailer(body, good);
  for (size_t i = body.size(); i < body.size() + 1160; ++i)
    if (f[i] == 0) f[i] = 'x';
  EXPECT_EQ(Parse(f, &why), TrailerStatus::kDamaged);
}

TEST(Trailer, ScannerSkipsForeignFilesWithOneWarning) {
  // A text file that carries a valid trailer is no module.
  tests::Bytes fake = WithTrailer(tests::Bytes(100, 'a'), trailer::EncodeTrailer());
  std::string path = tests::WriteScratch("fake-module.so", fake);
  ModuleRegistry r;
  std::vector<std::string> warnings;
  EXPECT_FALSE(r.ScanFile(path, &warnings));
  ASSERT_EQ(warnings.size(), 1u);
  EXPECT_NE(warnings[0].find("skipped"), std::string::npos);
  EXPECT_TRUE(r.Definitions().empty());

  // A file without a trailer is passed over without a word.
  warnings.clear();
  EXPECT_FALSE(r.ScanFile(tests::WriteScratch("plain.so", tests::Bytes(300, 1)), &warnings));
  EXPECT_TRUE(warnings.empty());

  // The real module is taken, once, whatever path names it.
  EXPECT_TRUE(r.ScanFile(ZQ_MODULE_FILE, &warnings));
  EXPECT_TRUE(r.ScanFile(ZQ_MODULE_FILE, &warnings));
  EXPECT_EQ(r.Definitions().size(), 9u);
  ASSERT_NE(r.ByShortName("FOXPRO"), nullptr);
  EXPECT_EQ(r.Default()->key, "DADBASE");
}

}  // namespace
