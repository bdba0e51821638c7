// The index core and the dBASE indexes (NDX files, MDX tags): expressions and
// key bytes, the files as made and grown, byte for byte, and damaged files
// refused. Trees of every shape are walked in trees_test.cpp.
#include <algorithm>
#include <cstring>
#include <string>
#include <vector>

#include "tests/index/index_harness.h"
#include "tests/support/todbase_harness.h"

namespace {

using namespace tests;

// A spoke whose layout 0 has NAME C(10), CITY C(4), AMOUNT N(10,2), BORN D.
struct Fields {
  Target t{2};
  Fields() {
    t.Add('C', "NAME", 10);
    t.Add('C', "CITY", 4);
    t.Add('N', "AMOUNT", 10, 2);
    t.Add('D', "BORN");
  }
  ZQSpoke* spoke() { return t.operator->(); }
};

uint32_t Le32At(const Bytes& b, size_t at) { return GetLe32(&b[at]); }

// ---------------------------------------------------------------------------
// Expressions and keys

TEST(IndexExpression, CompilesTheGrammarAndRefusesTheRest) {
  Fields f;
  // The segments (-1: refused); the first one's offset and length, and
  // whether it makes an 8-byte double.
  struct Case { const char* text; int segs, offset0, length0; bool binary0; } cases[] = {
      {"", 0, 0, 0, false},                    {"NAME+CITY", 2, 0, 10, false},
      {"NAME + CITY", 2, 0, 10, false},        {"NAME CITY", 2, 0, 10, false},
      {"name", 1, 0, 10, false},               {"substr(NAME,1,3)", 1, 1, 3, false},
      {"SUBSTR(NAME,2)", 1, 2, 8, false},      {"SUBSTR(NAME , 2 , 3)", 1, 2, 3, false},
      {"STR(AMOUNT,10,2)", 1, 0, 10, false},   {"STR(AMOUNT)", 1, 0, 0, false},
      {"DTOS(BORN)+NAME", 2, 0, 8, false},     {"BORN", 1, 0, 8, true},
      {"AMOUNT+CITY", 2, 0, 8, true},          {"UPPER(NAME)", -1, 0, 0, false},
      {"(NAME)", -1, 0, 0, false},             {"NOSUCH", -1, 0, 0, false},
      // A byte that starts no term ends the parse instead of stopping it for ever.
      {"NAME-CITY", -1, 0, 0, false},          {"'X'", -1, 0, 0, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.text);
    ZQIndexDef def;
    ZQString text(c.text);
    bool ok = ZQDBIndexBase::ParseExpr(text, &def, f.spoke());
    ASSERT_EQ(ok, c.segs >= 0);
    if (!ok) continue;
    ASSERT_EQ(def.SegCount(), c.segs);
    if (c.segs == 0) continue;
    EXPECT_EQ(def[0].Offset(), c.offset0);
    EXPECT_EQ(def[0].Length(), c.length0);
    EXPECT_EQ(def[0].Type()->Kind() != DT_TEXT, c.binary0);
  }
}

TEST(IndexExpression, BuildsKeysOfTextPaddedAndNumbersAsDoubles) {
  Fields f;
  f.t.Set(0, "AB");
  f.t.Set(1, "ROME");
  f.t.Set(2, "12.5");
  ZQIndexDef def;
  ZQString text("AMOUNT+CITY+NAME");
  ASSERT_TRUE(ZQDBIndexBase::ParseExpr(text, &def, f.spoke()));
  ZQString key;
  ZQDBMdx index("/nonexistent/x", "T");  // BuildKey needs no file
  index.BuildKey(key, &def);
  // 12.5 as a double, then the text fields blank-padded
  EXPECT_EQ(Text(key), std::string("\0\0\0\0\0\0\x29\x40ROMEAB        ", 22));
  EXPECT_EQ(ZQDBIndexBase::KeyFormLength(&def), 22);
  ZQString printed;
  ZQDBIndexBase::PrintExpr(printed, &def);
  EXPECT_STREQ(printed.c_str(), "AMOUNT+CITY+NAME");
}

// ---------------------------------------------------------------------------
// NDX

TEST(NdxFile, IsMadeGrownAndClosedAsLaidOut) {
  const Form ndx{"figures.ndx", false, false};
  EXPECT_EQ(Made(ndx, "unused", 10, {}, true)[23], 1);  // unique
  Bytes fresh = Made(ndx, "unused", 10, {});
  ASSERT_EQ(fresh.size(), 1024u);
  // root 1, blocks 2, key length 10, 25 keys of 20 bytes, duplicates, expression NAME
  ExpectBytes(fresh, 0, {1, 0, 0, 0, 2, 0, 0, 0, 0, 0, 0, 0, 10, 0, 25, 0, 0, 0, 20, 0,
                         0, 0, 0, 0, 'N', 'A', 'M', 'E', 0});
  EXPECT_TRUE(std::all_of(fresh.begin() + 512, fresh.end(), [](uint8_t b) { return b == 0; }));
  {
    Index ix(ndx, "unused");
    ASSERT_TRUE(ix->OK());
    for (int i = 0; i < 26; ++i) ASSERT_TRUE(AddKey(*ix, Key(i, 10), i));
  }
  Bytes b = ReadFile(ScratchPath(ndx.name));
  ASSERT_EQ(b.size(), 4u * 512);
  // The root moved to block 2 of 4 (the header, the old root now the right
  // part, the new root, the left part). The root: one key, the left part
  // (block 3) in its entry, the right part (block 1) in the last child's
  // slot. Left 13 keys, right 13: the middle key of 25 went left with its run.
  ExpectWords(b, {{0, 4, 2}, {4, 4, 4}, {1024, 4, 1}, {1024 + 4, 4, 3}, {1024 + 4 + 20, 4, 1},
                  {1536, 4, 13}, {512, 4, 13}});
}

// ---------------------------------------------------------------------------
// MDX

TEST(MdxFile, OneTagIsLaidOutAsOtherProgramsReadIt) {
  Bytes b = Made(Form{"NAME", false, false}, "figures", 30, {}, true);
  ASSERT_EQ(b.size(), 4096u);
  auto text = [&b](size_t at) { return std::string(reinterpret_cast<const char*>(&b[at])); };
  EXPECT_EQ(text(4), "figures");
  EXPECT_EQ(text(548), "NAME");
  const size_t tag = 4 * 512;
  EXPECT_EQ(text(tag + 24), "NAME");
  // The file header: version 2, blocks of 2 units (1024 bytes), 48 tags, 1 in
  // use, the next free block 8. The tag table: the head names the first tag,
  // whose header is block 4, over one field (0x10), 2, type C. The tag
  // header: root 6, 2 units, 0x40, C, key length 30, 28 keys of 36 bytes, 0x40.
  ExpectWords(b, {{0, 1, 2}, {20, 2, 2}, {22, 2, 1024}, {25, 1, 48}, {28, 1, 1}, {32, 4, 8},
                  {512 + 17, 1, 1}, {544, 4, 4}, {544 + 15, 1, 0x10}, {544 + 19, 1, 2},
                  {544 + 20, 1, 'C'}, {tag, 4, 6}, {tag + 4, 4, 2}, {tag + 8, 1, 0x40},
                  {tag + 9, 1, 'C'}, {tag + 12, 2, 30}, {tag + 14, 2, 28}, {tag + 18, 2, 36},
                  {tag + 23, 1, 0x40}});
}

TEST(MdxFile, TheRootMovesAndTheHeadersFollowAtClose) {
  std::vector<std::string> keys;
  for (int i = 0; i < 64; ++i) keys.push_back(Key(i, 10));
  Bytes b = Made(Form{"NAME", false, false}, "rootmove", 10, keys);
  ASSERT_EQ(b.size(), 12u * 512);
  // The 64th key moved the root to block 8; three nodes of two units; the
  // next free block is the file's end. The root: one entry for the left part
  // (block 10); the right part (block 6) is its last child, in the link and
  // again behind the last entry. Leaves: the right part links to the left
  // part, which links to none.
  const size_t tag = 4 * 512, root = 8 * 512;
  ExpectWords(b, {{tag + 14, 2, 63}, {tag, 4, 8}, {tag + 4, 4, 6}, {32, 4, 12}, {root, 4, 1},
                  {root + 4, 4, 6}, {root + 8, 4, 10}, {root + 8 + 16, 4, 6}, {6 * 512 + 4, 4, 10},
                  {10 * 512 + 4, 4, 0}});
  EXPECT_EQ(Le32At(b, 10 * 512) + Le32At(b, 6 * 512), 64u);
}

TEST(MdxFile, TagsAreLinkedIntoANameTree) {
  const std::string base = ScratchPath("tree");
  unlink((base + ".mdx").c_str());
  for (const char* name : {"M", "C", "T"}) {
    KeyField f(10);
    ZQDBMdx ix(base.c_str(), name, f.fields, &f.def);
    ASSERT_TRUE(ix.OK());
  }
  Bytes b = ReadFile(base + ".mdx");
  // The left, right and parent links of the tag table's entries 1 to 3.
  ExpectBytes(b, 512 + 32 + 16, {2, 3, 0});
  ExpectBytes(b, 512 + 64 + 16, {0, 0, 1});
  ExpectBytes(b, 512 + 96 + 16, {0, 0, 1});
  EXPECT_EQ(Le32At(b, 544 + 64), 12u);  // the third tag's header block
}

TEST(MdxFile, RefusesWhatWouldShiftItsFields) {
  const std::string base = ScratchPath("limits");
  unlink((base + ".mdx").c_str());
  KeyField f(10);
  EXPECT_FALSE(ZQDBMdx(base.c_str(), "ELEVENCHARS", f.fields, &f.def).OK());
  ZQRecord empty;
  EXPECT_FALSE(ZQDBMdx(base.c_str(), "NOFIELDS", empty, &f.def).OK());
  for (int i = 0; i < 47; ++i) {
    std::string name = "T" + std::to_string(i);
    ASSERT_TRUE(ZQDBMdx(base.c_str(), name.c_str(), f.fields, &f.def).OK()) << i;
  }
  EXPECT_FALSE(ZQDBMdx(base.c_str(), "T47", f.fields, &f.def).OK());
  // The 47 tags are all still there.
  EXPECT_TRUE(ZQDBMdx(base.c_str(), "T46").OK());
}

// The split point: equal keys stay on one side where a run ends near the
// middle, and a run over the whole middle is split there.
TEST(MdxFile, SplitsBesideRunsOfEqualKeysOrInsideThem) {
  // One letter per key, in record order; the keys in the left part once the
  // ninth is in.
  struct Case { const char* keys; uint32_t left; } cases[] = {
      {"AABBBBCDE", 6}, {"ABCCCCCCD", 5}, {"CCCCCCCCC", 6}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.keys);
    std::vector<std::string> keys;  // entries of 124 bytes: 8 keys in a node
    for (const char* k = c.keys; *k != '\0'; ++k) keys.emplace_back(117, *k);
    Bytes b = Made(Form{"NAME", false, false}, "split", 117, keys);
    uint32_t root = Le32At(b, 4 * 512);
    uint32_t left = Le32At(b, root * 512 + 8);
    EXPECT_EQ(Le32At(b, left * 512), c.left);
  }
}

// ---------------------------------------------------------------------------
// The cursor by ordinal

TEST(IndexCursor, MovesOneKeyAtATimeBothWaysWhereTheKindCan) {
  std::vector<std::string> keys;
  for (int i = 0; i < 60; ++i) keys.push_back(Key(59 - i, 10));  // record 0 stored as 1
  for (const Form& form : {Form{"cursor.ndx", false, false}, Form{"NAME", false, false}}) {
    SCOPED_TRACE(form.name);
    Made(form, "cursor", 10, keys);
    Index ix(form, "cursor");
    EXPECT_EQ(ix->GetFirst(), 59);
    EXPECT_EQ(ix->GetRecord(30), 29);
    EXPECT_EQ(ix->GetNext(), 28);
    EXPECT_EQ(ix->GetRecord(59), 0);
    EXPECT_EQ(ix->GetRecord(60), -1);  // past the last key
    // Back to the first: NDX steps back; an MDX tag can't.
    EXPECT_EQ(ix->GetFirst(), form.Tag() ? -1 : 59);
  }
  EXPECT_EQ(Index(Form{"NOSUCH", false, false}, "cursor")->GetRecord(0), -1);
}

// ---------------------------------------------------------------------------
// The tree check

// Numeric keys are doubles: the module keeps them in the order of their
// bytes, dBASE and libxbase64 in the order of their values; a check by
// value judges the second order as a check by bytes judges the first.
TEST(DbaseTreeCheck, JudgesDoubleKeysByTheirBytesOrByTheirValues) {
  std::vector<std::string> keys;
  for (double v : {1.0, 2.0, 3.0}) keys.emplace_back(reinterpret_cast<const char*>(Dbl(v).data()), 8);
  const Form ndx{"values.ndx", false, false};
  // One leaf at block 1: 2.0, 3.0, 1.0, entries of 16 bytes from offset 516.
  Bytes bytes = Made(ndx, "unused", 8, keys);
  Bytes values = bytes;
  // 1.0, 2.0, 3.0
  std::rotate(values.begin() + 516, values.begin() + 516 + 32, values.begin() + 516 + 48);
  for (const Bytes* file : {&bytes, &values}) {
    WriteScratch("values.ndx", *file);
    Index ix(ndx, "unused");
    ZQString byBytes, byValue;
    EXPECT_EQ(ix->CheckTree(byBytes, false), file == &bytes ? 0 : 1) << byBytes.c_str();
    EXPECT_EQ(ix->CheckTree(byValue, true), file == &bytes ? 1 : 0) << byValue.c_str();
  }
}

}  // namespace
