// The index core and the dBASE indexes (NDX files, MDX tags): expressions and
// key bytes, the files as made and grown, byte for byte, trees of any shape
// walked whole, and damaged files refused.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <functional>
#include <random>
#include <string>
#include <vector>

#include "tests/support/todbase_harness.h"
#include "host/endian.h"
#include "host/platform.h"
#include "index/mdx.h"

namespace {

using tests::Bytes;
using tests::ReadFile;
using tests::ScratchPath;

#if defined(__SANITIZE_ADDRESS__)
constexpr bool kSanitized = true;
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
constexpr bool kSanitized = true;
#else
constexpr bool kSanitized = false;
#endif
#else
constexpr bool kSanitized = false;
#endif

// A spoke whose layout 0 has NAME C(10), CITY C(4), AMOUNT N(10,2), BORN D.
struct Fields {
  tests::Target t{2};
  Fields() {
    t.Add('C', "NAME", 10);
    t.Add('C', "CITY", 4);
    t.Add('N', "AMOUNT", 10, 2);
    t.Add('D', "BORN");
  }
  ZQSpoke* spoke() { return t.operator->(); }
};

// A record of one text field of `width` bytes, and a definition over it.
// Its keys are given by the test, not built.
struct OneField {
  ZQRecord record;
  ZQIndexDef def;
  ZQDType text;
  explicit OneField(int width, bool dups = true) {
    text.Define("Text;usage=0x43");
    text.Length(width);
    def.AddSeg(0, int16_t(width), &text, record.NewField(text, "NAME"));
    def.Name("NAME");
    def.Dups(dups);
  }
};

std::string Base(const std::string& name) {
  std::string base = ScratchPath(name);
  _unlink((base + ".mdx").c_str());
  return base;
}

uint32_t Le32At(const Bytes& b, size_t at) { return GetLe32(&b[at]); }
uint16_t Le16At(const Bytes& b, size_t at) { return GetLe16(&b[at]); }

std::string Key(int v, int width) {
  char buf[256];
  snprintf(buf, sizeof buf, "%0*d", width, v);
  return std::string(buf, size_t(width));
}

bool Add(ZQDBIndexBase& ix, const std::string& key, int32_t record) {
  ZQString k(key.data(), int32_t(key.size()));
  return ix.AddKey(k, record);
}

// ---------------------------------------------------------------------------
// Expressions and keys

TEST(IndexExpression, CompilesTheGrammarAndRefusesTheRest) {
  Fields f;
  struct Case {
    const char* text;
    int segs;              // -1: refused
    int offset0, length0;  // of the first segment
    bool binary0;          // the first segment makes an 8-byte double
  } cases[] = {
      {"", 0, 0, 0, false},
      {"NAME+CITY", 2, 0, 10, false},
      {"NAME + CITY", 2, 0, 10, false},
      {"NAME CITY", 2, 0, 10, false},
      {"name", 1, 0, 10, false},
      {"substr(NAME,1,3)", 1, 1, 3, false},
      {"SUBSTR(NAME,2)", 1, 2, 8, false},
      {"SUBSTR(NAME , 2 , 3)", 1, 2, 3, false},
      {"STR(AMOUNT,10,2)", 1, 0, 10, false},
      {"STR(AMOUNT)", 1, 0, 0, false},
      {"DTOS(BORN)+NAME", 2, 0, 8, false},
      {"BORN", 1, 0, 8, true},
      {"AMOUNT+CITY", 2, 0, 8, true},
      {"UPPER(NAME)", -1, 0, 0, false},
      {"(NAME)", -1, 0, 0, false},
      {"NOSUCH", -1, 0, 0, false},
      // A byte that starts no term ends the parse instead of stopping it for ever.
      {"NAME-CITY", -1, 0, 0, false},
      {"'X'", -1, 0, 0, false},
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
  const uint8_t twelve_and_a_half[8] = {0, 0, 0, 0, 0, 0, 0x29, 0x40};
  ASSERT_EQ(key.length(), 8 + 4 + 10);
  EXPECT_EQ(memcmp(key.c_str(), twelve_and_a_half, 8), 0);
  EXPECT_EQ(std::string(key.c_str() + 8, 14), "ROMEAB        ");
  EXPECT_EQ(ZQDBIndexBase::KeyFormLength(&def), 22);
  ZQString printed;
  ZQDBIndexBase::PrintExpr(printed, &def);
  EXPECT_STREQ(printed.c_str(), "AMOUNT+CITY+NAME");
}

// ---------------------------------------------------------------------------
// NDX

TEST(NdxFile, IsMadeGrownAndClosedAsLaidOut) {
  OneField f(10);
  std::string path = ScratchPath("figures.ndx");
  {
    ZQDBMdx ix("unused", path.c_str(), f.record, &f.def);
    ASSERT_TRUE(ix.OK());
  }
  Bytes fresh = ReadFile(path);
  ASSERT_EQ(fresh.size(), 1024u);
  // root 1, blocks 2, key length 10, 25 keys of 20 bytes, expression NAME
  const uint8_t head[] = {1, 0, 0, 0, 2, 0, 0, 0, 0, 0, 0, 0, 10, 0, 25, 0, 0, 0, 20, 0, 0, 0, 0, 0, 'N', 'A', 'M', 'E', 0};
  EXPECT_EQ(memcmp(fresh.data(), head, sizeof head), 0);
  EXPECT_TRUE(std::all_of(fresh.begin() + 512, fresh.end(), [](uint8_t b) { return b == 0; }));
  {
    ZQDBMdx ix("unused", path.c_str());
    ASSERT_TRUE(ix.OK());
    for (int i = 0; i < 26; ++i) ASSERT_TRUE(Add(ix, Key(i, 10), i));
  }
  Bytes b = ReadFile(path);
  EXPECT_EQ(Le32At(b, 0), 2u);  // the root moved to block 2
  EXPECT_EQ(Le32At(b, 4), 4u);  // header, old root (now the right part), new root, left part
  ASSERT_EQ(b.size(), 4u * 512);
  // The root: one key, the left part (block 3) in its entry, the right part
  // (block 1) in the last child's slot.
  EXPECT_EQ(Le32At(b, 1024), 1u);
  EXPECT_EQ(Le32At(b, 1024 + 4), 3u);
  EXPECT_EQ(Le32At(b, 1024 + 4 + 20), 1u);
  // Left 13 keys, right 13: the middle key of 25 went left with its run.
  EXPECT_EQ(Le32At(b, 1536) + Le32At(b, 512), 26u);
  EXPECT_EQ(Le32At(b, 1536), 13u);
}

TEST(NdxFile, UniqueIsMarkedInTheHeader) {
  OneField f(10, false);
  std::string path = ScratchPath("unique.ndx");
  { ZQDBMdx ix("unused", path.c_str(), f.record, &f.def); }
  EXPECT_EQ(ReadFile(path)[23], 1);
}

// ---------------------------------------------------------------------------
// MDX

TEST(MdxFile, OneTagIsLaidOutAsOtherProgramsReadIt) {
  OneField f(30, false);
  std::string base = Base("figures");
  { ZQDBMdx ix(base.c_str(), "NAME", f.record, &f.def); ASSERT_TRUE(ix.OK()); }
  Bytes b = ReadFile(base + ".mdx");
  ASSERT_EQ(b.size(), 4096u);
  EXPECT_EQ(b[0], 2);
  EXPECT_EQ(std::string(reinterpret_cast<const char*>(&b[4])), "figures");
  EXPECT_EQ(Le16At(b, 20), 2);
  EXPECT_EQ(Le16At(b, 22), 1024);
  EXPECT_EQ(b[25], 48);
  EXPECT_EQ(b[28], 1);            // tags in use
  EXPECT_EQ(Le32At(b, 32), 8u);   // next free block
  EXPECT_EQ(b[512 + 17], 1);      // the head names the first tag
  EXPECT_EQ(Le32At(b, 544), 4u);  // the tag's header block
  EXPECT_EQ(std::string(reinterpret_cast<const char*>(&b[548])), "NAME");
  EXPECT_EQ(b[544 + 15], 0x10);   // over one field
  EXPECT_EQ(b[544 + 19], 2);
  EXPECT_EQ(b[544 + 20], 'C');
  const size_t tag = 4 * 512;
  EXPECT_EQ(Le32At(b, tag), 6u);  // root
  EXPECT_EQ(Le32At(b, tag + 4), 2u);
  EXPECT_EQ(b[tag + 8], 0x40);
  EXPECT_EQ(b[tag + 9], 'C');
  EXPECT_EQ(Le16At(b, tag + 12), 30);
  EXPECT_EQ(Le16At(b, tag + 14), 28);
  EXPECT_EQ(Le16At(b, tag + 18), 36);
  EXPECT_EQ(b[tag + 23], 0x40);
  EXPECT_EQ(std::string(reinterpret_cast<const char*>(&b[tag + 24])), "NAME");
}

TEST(MdxFile, TheRootMovesAndTheHeadersFollowAtClose) {
  OneField f(10);
  std::string base = Base("rootmove");
  {
    ZQDBMdx ix(base.c_str(), "NAME", f.record, &f.def);
    ASSERT_TRUE(ix.OK());
    for (int i = 0; i < 64; ++i) ASSERT_TRUE(Add(ix, Key(i, 10), i));
  }
  Bytes b = ReadFile(base + ".mdx");
  const size_t tag = 4 * 512;
  EXPECT_EQ(Le16At(b, tag + 14), 63);
  EXPECT_EQ(Le32At(b, tag), 8u);       // the 64th key moved the root to block 8
  EXPECT_EQ(Le32At(b, tag + 4), 6u);   // three nodes of two units
  EXPECT_EQ(Le32At(b, 32), 12u);       // next free: the file's end
  ASSERT_EQ(b.size(), 12u * 512);
  // The root: one entry for the left part (block 10); the right part (block
  // 6) is its last child, in the link and again behind the last entry.
  const size_t root = 8 * 512;
  EXPECT_EQ(Le32At(b, root), 1u);
  EXPECT_EQ(Le32At(b, root + 4), 6u);
  EXPECT_EQ(Le32At(b, root + 8), 10u);
  EXPECT_EQ(Le32At(b, root + 8 + 16), 6u);
  // Leaves: the right part (block 6) links to the left part, which links to none.
  EXPECT_EQ(Le32At(b, 6 * 512 + 4), 10u);
  EXPECT_EQ(Le32At(b, 10 * 512 + 4), 0u);
  EXPECT_EQ(Le32At(b, 10 * 512) + Le32At(b, 6 * 512), 64u);
}

TEST(MdxFile, TagsAreLinkedIntoANameTree) {
  std::string base = Base("tree");
  for (const char* name : {"M", "C", "T"}) {
    OneField f(10);
    f.def.Name(name);
    ZQDBMdx ix(base.c_str(), name, f.record, &f.def);
    ASSERT_TRUE(ix.OK());
  }
  Bytes b = ReadFile(base + ".mdx");
  auto links = [&](int entry) {
    size_t at = 512 + 32 * size_t(entry);
    return std::vector<int>{b[at + 16], b[at + 17], b[at + 18]};
  };
  EXPECT_EQ(links(1), (std::vector<int>{2, 3, 0}));
  EXPECT_EQ(links(2), (std::vector<int>{0, 0, 1}));
  EXPECT_EQ(links(3), (std::vector<int>{0, 0, 1}));
  EXPECT_EQ(Le32At(b, 544 + 64), 12u);  // the third tag's header block
}

TEST(MdxFile, RefusesWhatWouldShiftItsFields) {
  std::string base = Base("limits");
  OneField f(10);
  EXPECT_FALSE(ZQDBMdx(base.c_str(), "ELEVENCHARS", f.record, &f.def).OK());
  ZQRecord empty;
  EXPECT_FALSE(ZQDBMdx(base.c_str(), "NOFIELDS", empty, &f.def).OK());
  for (int i = 0; i < 47; ++i) {
    std::string name = "T" + std::to_string(i);
    ASSERT_TRUE(ZQDBMdx(base.c_str(), name.c_str(), f.record, &f.def).OK()) << i;
  }
  EXPECT_FALSE(ZQDBMdx(base.c_str(), "T47", f.record, &f.def).OK());
  // The 47 tags are all still there.
  EXPECT_TRUE(ZQDBMdx(base.c_str(), "T46").OK());
}

// The split point: equal keys stay on one side where a run ends near the
// middle, and a run over the whole middle is split there.
TEST(MdxFile, SplitsBesideRunsOfEqualKeysOrInsideThem) {
  struct Case {
    const char* keys;  // one letter per key, in record order
    uint32_t left;     // keys in the left part once the ninth is in
  } cases[] = {{"AABBBBCDE", 6}, {"ABCCCCCCD", 5}, {"CCCCCCCCC", 6}};
  for (const Case& c : cases) {
    SCOPED_TRACE(c.keys);
    OneField f(117);  // entries of 124 bytes: 8 keys in a node
    std::string base = Base("split");
    {
      ZQDBMdx ix(base.c_str(), "NAME", f.record, &f.def);
      for (int i = 0; c.keys[i] != '\0'; ++i) ASSERT_TRUE(Add(ix, std::string(117, c.keys[i]), i));
    }
    Bytes b = ReadFile(base + ".mdx");
    uint32_t root = Le32At(b, 4 * 512);
    uint32_t left = Le32At(b, root * 512 + 8);
    EXPECT_EQ(Le32At(b, left * 512), c.left);
  }
}

// ---------------------------------------------------------------------------
// The cursor by ordinal

TEST(IndexCursor, MovesOneKeyAtATimeBothWaysWhereTheKindCan) {
  OneField f(10);
  std::string ndx = ScratchPath("cursor.ndx"), base = Base("cursor");
  for (const std::string& tag : {ndx, std::string("NAME")}) {
    SCOPED_TRACE(tag);
    {
      ZQDBMdx ix(base.c_str(), tag.c_str(), f.record, &f.def);
      for (int i = 0; i < 60; ++i) ASSERT_TRUE(Add(ix, Key(59 - i, 10), i));  // record 0 stored as 1
    }
    ZQDBMdx ix(base.c_str(), tag.c_str());
    EXPECT_EQ(ix.GetFirst(), 59);
    EXPECT_EQ(ix.GetRecord(30), 29);
    EXPECT_EQ(ix.GetNext(), 28);
    EXPECT_EQ(ix.GetRecord(59), 0);
    EXPECT_EQ(ix.GetRecord(60), -1);  // past the last key
    // Back to the first: NDX steps back; an MDX tag can't.
    EXPECT_EQ(ix.GetFirst(), ix.IsMdx() ? -1 : 59);
  }
  ZQDBMdx none(base.c_str(), "NOSUCH");
  EXPECT_EQ(none.GetRecord(0), -1);
}

// ---------------------------------------------------------------------------
// Trees of every shape: every record once, in key order, after reopening.

void CheckWalk(ZQDBMdx& ix, int n, int dups, int width, bool backwards) {
  ZQString faults;
  ASSERT_EQ(ix.CheckTree(faults, false), 0) << faults.c_str();
  std::vector<char> seen(static_cast<size_t>(n), 0);
  ZQString key, prev;
  int count = 0;
  for (int32_t r = ix.FirstKey(key); r != -1; r = ix.NextKey(key), ++count) {
    ASSERT_TRUE(r >= 0 && r < n && !seen[size_t(r)]) << r;
    seen[size_t(r)] = 1;
    ASSERT_EQ(std::string(key.c_str(), size_t(key.length())), Key(dups ? r % dups : r, width));
    ASSERT_FALSE(count > 0 && prev > key);
    prev = key;
  }
  ASSERT_EQ(count, n);
  if (!backwards) return;
  count = 0;
  for (int32_t r = ix.LastKey(key); r != -1; r = ix.PrevKey(key), ++count) {
    ASSERT_FALSE(count > 0 && key > prev);
    prev = key;
  }
  ASSERT_EQ(count, n);
  // An exact search finds every key, the highest key of a node included.
  for (int v = 0; v < (dups ? dups : n); v += 1 + n / 997) {
    ZQString q(Key(v, width).c_str(), width);
    ASSERT_NE(ix.FindKey(q, true), -1) << v;
  }
}

TEST(DbaseTrees, HoldEveryKeyInAnyOrderOfArrival) {
  // Under the sanitizers a smaller tree still has three levels and every
  // kind of split; the large ones run in the optimised build.
  std::vector<int> sizes = {kSanitized ? 20000 : 100000};
  if (!kSanitized) sizes.push_back(1000000);
  for (int n : sizes)
    for (const char* name : {"NAME", "TREE.NDX"})
      for (int order = 0; order < 3; ++order) {
        int dups = order == 2 ? 0 : 7;  // rising and falling with runs of equal keys
        int width = n > 100000 ? 30 : 10;
        SCOPED_TRACE(std::to_string(n) + " " + name + " order " + std::to_string(order));
        std::vector<int> records(static_cast<size_t>(n));
        for (int i = 0; i < n; ++i) records[size_t(i)] = i;
        if (order == 1) std::reverse(records.begin(), records.end());
        if (order == 2) std::shuffle(records.begin(), records.end(), std::mt19937(7));
        OneField f(width);
        std::string base = Base("tree");
        std::string tag = std::string(name) == "NAME" ? name : ScratchPath(name);
        {
          ZQDBMdx ix(base.c_str(), tag.c_str(), f.record, &f.def);
          ASSERT_TRUE(ix.OK());
          for (int r : records) ASSERT_TRUE(Add(ix, Key(dups ? r % dups : r, width), r));
        }
        ZQDBMdx ix(base.c_str(), tag.c_str());
        ASSERT_TRUE(ix.OK());
        CheckWalk(ix, n, dups, width, !ix.IsMdx());
      }
}

// ---------------------------------------------------------------------------
// Damage

TEST(DbaseDamage, IsRefusedOrEndsTheWalkNeverAHang) {
  OneField f(10);
  std::string path = ScratchPath("damage.ndx");
  {
    ZQDBMdx ix("unused", path.c_str(), f.record, &f.def);
    for (int i = 0; i < 2000; ++i) ASSERT_TRUE(Add(ix, Key(i * 7919 % 2000, 10), i));
  }
  Bytes good = ReadFile(path);
  uint32_t root = Le32At(good, 0);
  struct Case {
    const char* what;
    size_t at;
    uint32_t value;
    int width;  // 2 or 4 bytes
  } cases[] = {
      {"root past the end", 0, 99999, 4},
      {"root in the header", 0, 0, 4},
      {"key length 0", 12, 0, 2},
      {"key length beyond a block", 12, 600, 2},
      {"entry size below the key", 18, 8, 2},
      {"key count beyond a block", root * 512, 5000, 4},
      {"a child that is its parent", root * 512 + 4, root, 4},
      {"a child past the end", root * 512 + 4, 0x7FFFFFF, 4},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    Bytes bad = good;
    if (c.width == 4) PutLe32(&bad[c.at], c.value);
    else PutLe16(&bad[c.at], uint16_t(c.value));
    std::string damaged = tests::WriteScratch("damaged.ndx", bad);
    ZQDBMdx ix("unused", damaged.c_str());
    if (!ix.OK()) continue;
    ZQString key;
    int steps = 0;
    for (int32_t r = ix.FirstKey(key); r != -1 && steps < 100000; r = ix.NextKey(key)) ++steps;
    EXPECT_LT(steps, 100000);
    ZQString q(Key(5, 10).c_str(), 10);
    ix.FindKey(q, true);
  }
}

TEST(DbaseDamage, AMissingFileOrTagIsNotOk) {
  OneField f(10);
  std::string base = Base("missing");
  EXPECT_FALSE(ZQDBMdx(base.c_str(), "NAME").OK());
  { ZQDBMdx ix(base.c_str(), "NAME", f.record, &f.def); }
  EXPECT_FALSE(ZQDBMdx(base.c_str(), "OTHER").OK());
  EXPECT_TRUE(ZQDBMdx(base.c_str(), "name").OK());  // names are found in any case
  EXPECT_FALSE(ZQDBMdx("unused", ScratchPath("none.ndx").c_str()).OK());
}

// ---------------------------------------------------------------------------
// The tree's structure, checked block by block

// A dBASE tree read from the file's bytes as its layout says. Both kinds keep
// an interior block's last child where entry n would begin: an MDX node in
// the word behind its last entry, an NDX node in its last child's slot.
struct DbaseTree {
  Bytes b;
  bool mdx;
  uint32_t entry, header, keyAt, blockBytes, root = 0;
  DbaseTree(Bytes bytes, bool isMdx, uint32_t keyLength)
      : b(std::move(bytes)), mdx(isMdx), entry(isMdx ? (keyLength + 7) & ~3u : (keyLength + 11) & ~3u),
        header(isMdx ? 8 : 4), keyAt(isMdx ? 4 : 8), blockBytes(isMdx ? 1024 : 512) {
    root = mdx ? Le32At(b, Le32At(b, 544) * 512) : Le32At(b, 0);
  }
  uint32_t Count(uint32_t blk) const { return Le32At(b, blk * 512); }
  size_t Entry(uint32_t blk, uint32_t i) const { return blk * 512 + header + i * entry; }
  uint32_t Child(uint32_t blk, uint32_t i) const { return Le32At(b, Entry(blk, i)); }
  uint32_t LastChild(uint32_t blk) const { return Child(blk, Count(blk)); }
  bool Leaf(uint32_t blk) const { return Child(blk, mdx ? Count(blk) : 0) == 0; }
  void SetChild(uint32_t blk, uint32_t i, uint32_t v) { PutLe32(&b[Entry(blk, i)], v); }
  uint8_t* Key(uint32_t blk, uint32_t i) { return &b[Entry(blk, i) + keyAt]; }
  uint32_t Room() const { return (blockBytes - header - 4) / entry; }
};

TEST(DbaseTreeCheck, FindsEachFaultOfStructureOnceAndNamesItsBlock) {
  const int width = 60, n = 1500;  // 15 keys in an MDX node, 7 in an NDX node
  for (const char* name : {"NAME", "CHECK.NDX"}) {
    SCOPED_TRACE(name);
    const bool mdx = std::string(name) == "NAME";
    OneField f(width);
    std::string base = Base("check");
    std::string tag = mdx ? name : ScratchPath(name);
    std::vector<int> order(n);
    for (int i = 0; i < n; ++i) order[size_t(i)] = i;
    std::shuffle(order.begin(), order.end(), std::mt19937(5));
    {
      ZQDBMdx ix(base.c_str(), tag.c_str(), f.record, &f.def);
      for (int r : order) ASSERT_TRUE(Add(ix, Key(r, width), r));
    }
    const std::string file = mdx ? base + ".mdx" : tag;
    const DbaseTree good(ReadFile(file), mdx, width);
    // The places of the tree: the root's first two children and its last,
    // the first two leaves, their parent and depth, the first leaf below the
    // root's last child. The index opens along its first children, so the
    // damage that would stop that lies beside them.
    const uint32_t R = good.root, X0 = good.Child(R, 0), X1 = good.Child(R, 1);
    uint32_t P = R, depth = 1;
    while (!good.Leaf(good.Child(P, 0))) P = good.Child(P, 0), ++depth;
    const uint32_t L0 = good.Child(P, 0), L1 = good.Child(P, 1);
    uint32_t lastFirst = good.LastChild(R);
    while (!good.Leaf(lastFirst)) lastFirst = good.Child(lastFirst, 0);
    ASSERT_GE(depth, 2u);
    using Fault = std::pair<uint32_t, std::string>;  // the block told, and what is said of it
    auto num = [](uint32_t v) { return std::to_string(v); };
    struct Case {
      const char* what;
      bool mdxOnly;
      std::function<Fault(DbaseTree&)> damage;
    } cases[] = {
        {"a child that is its own parent", false,
         [&](DbaseTree& t) { t.SetChild(X1, 0, R); return Fault{R, "reached a second time (from the header and block " + num(X1) + ")"}; }},
        {"two children naming one block", false,
         [&](DbaseTree& t) {
           t.SetChild(X1, 0, t.Child(X0, 1));
           return Fault{t.Child(X0, 1), "reached a second time (from block " + num(X0) + " and block " + num(X1) + ")"};
         }},
        {"a key count the block can't hold", false,
         [&](DbaseTree& t) { PutLe32(&t.b[L1 * 512], 5000); return Fault{L1, "holds 5000 keys, more than the " + num(t.Room())}; }},
        {"an empty leaf below the root", false,
         [&](DbaseTree& t) { PutLe32(&t.b[L1 * 512], 0); t.SetChild(L1, 0, 0); return Fault{L1, "an empty leaf below the root"}; }},
        {"a level skipped", false,
         [&](DbaseTree& t) {
           t.SetChild(R, t.Count(R), lastFirst);
           return Fault{lastFirst, "a leaf 1 level below the root, where the first leaf lies " + num(depth) + " levels"};
         }},
        {"a child past the end", false,
         [&](DbaseTree& t) { t.SetChild(R, 1, 0x7FFFFF); return Fault{R, "names block 8388607, which lies past the end"}; }},
        {"a child in the header", false,
         [&](DbaseTree& t) { t.SetChild(R, 1, 0); return Fault{R, "names block 0, which lies in the file's header"}; }},
        {"a block off its boundary", true,
         [&](DbaseTree& t) { t.SetChild(R, 1, X1 + 1); return Fault{R, "entry 1 names block " + num(X1 + 1) + ", which is not on a block boundary"}; }},
        {"keys out of order in a leaf", false,
         [&](DbaseTree& t) {
           std::swap_ranges(t.Key(L0, 0), t.Key(L0, 0) + width, t.Key(L0, 1));
           return Fault{L0, "the keys are out of order"};
         }},
        {"a separator below its child's keys", false,  // the parent's key for the first leaf: its lowest key
         [&](DbaseTree& t) {
           memcpy(t.Key(P, 0), t.Key(L0, 0), width);
           return Fault{L0, "the highest key that block " + num(P) + " holds for this block"};
         }},
        {"the next free block inside the tree", true,
         [&](DbaseTree& t) { PutLe32(&t.b[32], 4); return Fault{0, "the file header's next free block 4 lies inside this tag's tree"}; }},
        {"a block count below the tree's", true,
         [&](DbaseTree& t) { PutLe32(&t.b[4 * 512 + 4], 2); return Fault{4, "the tag header counts 2 units of blocks, fewer than"}; }},
    };
    for (Case& c : cases) {
      if (c.mdxOnly && !mdx) continue;
      SCOPED_TRACE(c.what);
      DbaseTree bad = good;
      Fault want = c.damage(bad);
      tests::WriteScratch(mdx ? "check.mdx" : "CHECK.NDX", bad.b);
      ZQDBMdx ix(base.c_str(), tag.c_str());
      ASSERT_TRUE(ix.OK());
      ZQString faults;
      EXPECT_EQ(ix.CheckTree(faults, false), 1) << faults.c_str();
      std::string line(faults.c_str());
      EXPECT_EQ(line.rfind("block " + num(want.first) + ": ", 0), 0u) << line;
      EXPECT_NE(line.find(want.second), std::string::npos) << line;
    }
    tests::WriteScratch(mdx ? "check.mdx" : "CHECK.NDX", good.b);
    ZQDBMdx ix(base.c_str(), tag.c_str());
    ZQString faults;
    EXPECT_EQ(ix.CheckTree(faults, false), 0) << faults.c_str();
  }
}

// Numeric keys are doubles: the module keeps them in the order of their
// bytes, dBASE and libxbase64 in the order of their values; a check by
// value judges the second order as a check by bytes judges the first.
TEST(DbaseTreeCheck, JudgesDoubleKeysByTheirBytesOrByTheirValues) {
  OneField f(8);
  std::string path = ScratchPath("values.ndx");
  {
    ZQDBMdx ix("unused", path.c_str(), f.record, &f.def);
    for (double v : {1.0, 2.0, 3.0}) {
      uint8_t key[8];
      uint64_t bits;
      memcpy(&bits, &v, sizeof bits);
      PutLe64(key, bits);
      ASSERT_TRUE(Add(ix, std::string(reinterpret_cast<char*>(key), 8), int32_t(v)));
    }
  }
  Bytes bytes = ReadFile(path);  // one leaf at block 1: 2.0, 3.0, 1.0, entries of 16 bytes from offset 516
  Bytes values = bytes;
  std::rotate(values.begin() + 516, values.begin() + 516 + 32, values.begin() + 516 + 48);  // 1.0, 2.0, 3.0
  for (const Bytes* file : {&bytes, &values}) {
    tests::WriteScratch("values.ndx", *file);
    ZQDBMdx ix("unused", path.c_str());
    ZQString byBytes, byValue;
    EXPECT_EQ(ix.CheckTree(byBytes, false), file == &bytes ? 0 : 1) << byBytes.c_str();
    EXPECT_EQ(ix.CheckTree(byValue, true), file == &bytes ? 1 : 0) << byValue.c_str();
  }
}

}  // namespace
