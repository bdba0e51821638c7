// Index trees of every form (NDX, MDX, compact and plain IDX, CDX): trees of
// any shape walked whole, damaged files refused or walked to an end, and the
// tree check finding each fault of structure once.
#include <algorithm>
#include <functional>
#include <numeric>
#include <random>

#include "tests/index/index_harness.h"

namespace {

using namespace tests;

// Walks the whole index: each record once with its own key, keys in order
// (equal keys of a FoxPro index in record order), and backwards alike where
// the form can; an exact search finds each sampled key, at the first of its
// equals (a FoxPro index is searched without the keys' trailing blanks);
// the first key comes back after the searches.
void CheckWalk(ZQDBIndexBase& ix, const Form& form, const std::vector<std::string>& keyOf) {
  const size_t n = keyOf.size();
  std::vector<char> seen(n, 0);
  ZQString key;
  std::string last;
  int32_t lastRecord = -1;
  size_t count = 0;
  for (int32_t r = ix.FirstKey(key); r != -1; r = ix.NextKey(key), ++count) {
    ASSERT_TRUE(r >= 0 && size_t(r) < n && !seen[size_t(r)]) << r;
    seen[size_t(r)] = 1;
    ASSERT_EQ(Text(key), keyOf[size_t(r)]);
    ASSERT_LE(last, Text(key));
    ASSERT_TRUE(!form.fox || last != Text(key) || r > lastRecord) << r;
    last = Text(key);
    lastRecord = r;
  }
  ASSERT_EQ(count, n);
  for (int32_t r = form.Backwards() ? ix.LastKey(key) : -1; r != -1; r = ix.PrevKey(key), --count) {
    ASSERT_TRUE(r >= 0 && size_t(r) < n && seen[size_t(r)] == 1) << r;
    seen[size_t(r)] = 2;
    ASSERT_GE(last, Text(key));
    last = Text(key);
  }
  ASSERT_EQ(count, form.Backwards() ? 0 : n);
  const int32_t searched = form.fox ? 8 : int32_t(keyOf[0].size());
  for (size_t i = 0; i < n; i += 2 + n / 997) {  // a step prime to 7: every run is sampled
    int32_t r = ix.FindKey(ZQString(keyOf[i].data(), searched), true);
    ASSERT_NE(r, -1) << keyOf[i];
    ASSERT_EQ(keyOf[size_t(r)], keyOf[i]);
    ZQString before;
    ASSERT_TRUE(!form.Backwards() || ix.PrevKey(before) == -1 || Text(before) < keyOf[i]) << i;
  }
  ASSERT_NE(ix.FirstKey(key), -1);
  EXPECT_EQ(Text(key), *std::min_element(keyOf.begin(), keyOf.end()));
}

TEST(IndexTrees, HoldEveryKeyInAnyOrderOfArrival) {
  // Keys: rising or falling in runs of 7 equal keys, random with repeats,
  // 0 to 6 over and over, all different; records arrive rising, falling or
  // shuffled. Under the sanitizers a smaller tree still has three levels and
  // every kind of split; the large ones run in the optimised build.
  enum Keys { kRuns, kFallingRuns, kRandom, kCycle, kUnique };
  enum Arrival { kRising, kFalling, kShuffled };
  struct Run { Form form; Keys keys; Arrival arrival; int width, n; };
  const int n = kSanitized ? 20000 : 100000, m = 1000000;
  std::vector<Run> runs = {
      {kMdx, kCycle, kRising, 10, n},     {kMdx, kCycle, kFalling, 10, n},
      {kMdx, kUnique, kShuffled, 10, n},  {kNdx, kCycle, kRising, 10, n},
      {kNdx, kCycle, kFalling, 10, n},    {kNdx, kUnique, kShuffled, 10, n},
      {kCdx, kRuns, kRising, 10, n},      {kCdx, kFallingRuns, kRising, 30, n},
      {kCdx, kRandom, kRising, 10, n},    {kIdx, kRuns, kRising, 30, n},
      {kIdx, kFallingRuns, kRising, 10, n}, {kIdx, kRandom, kRising, 30, n},
      {kPlainIdx, kRuns, kRising, 10, n}, {kPlainIdx, kFallingRuns, kRising, 30, n},
      {kPlainIdx, kRandom, kRising, 10, n}};
  if (!kSanitized)  // a million keys: each dBASE form in each order, each FoxPro form once
    runs.insert(runs.end(), {{kMdx, kCycle, kRising, 30, m}, {kMdx, kCycle, kFalling, 30, m},
                             {kMdx, kUnique, kShuffled, 30, m}, {kNdx, kCycle, kRising, 30, m},
                             {kNdx, kCycle, kFalling, 30, m}, {kNdx, kUnique, kShuffled, 30, m},
                             {kCdx, kRandom, kRising, 30, m}, {kIdx, kRuns, kRising, 10, m},
                             {kPlainIdx, kFallingRuns, kRising, 30, m}});
  for (const Run& run : runs) {
    SCOPED_TRACE(std::to_string(run.n) + " " + run.form.name + (run.form.fox ? " fox" : "") +
                 " keys " + std::to_string(run.keys) + " arrival " + std::to_string(run.arrival) +
                 " width " + std::to_string(run.width));
    std::vector<std::string> keyOf(size_t(run.n));
    std::mt19937 random(11);
    for (int r = 0; r < run.n; ++r) {
      const int v[] = {r / 7, (run.n - 1 - r) / 7, int(random() % uint32_t(run.n / 2)), r % 7, r};
      keyOf[size_t(r)] = Key(v[run.keys], run.width);
    }
    std::vector<int32_t> records(keyOf.size());
    std::iota(records.begin(), records.end(), 0);
    if (run.arrival == kFalling) std::reverse(records.begin(), records.end());
    if (run.arrival == kShuffled) std::shuffle(records.begin(), records.end(), std::mt19937(7));
    KeyField f(run.width, run.form.compress);
    {
      Index ix(run.form, "tree", &f);
      ASSERT_TRUE(ix->OK());
      for (int32_t r : records) ASSERT_TRUE(AddKey(*ix, keyOf[size_t(r)], r)) << r;
      CheckWalk(*ix, run.form, keyOf);
    }
    Index ix(run.form, "tree");
    ASSERT_TRUE(ix->OK());
    ZQString faults;
    ASSERT_EQ(ix->CheckTree(faults, false), 0) << faults.c_str();
    CheckWalk(*ix, run.form, keyOf);
  }
}

// `n` different keys of `width` bytes in a scrambled order.
std::vector<std::string> Scrambled(int n, int width) {
  std::vector<int> order(size_t(n), 0);
  std::iota(order.begin(), order.end(), 0);
  std::shuffle(order.begin(), order.end(), std::mt19937(5));
  std::vector<std::string> keys;
  for (int v : order) keys.push_back(Key(v, width));
  return keys;
}

// One number of a good file set wrong: the index is refused with its reason,
// or every walk, search and insert ends.
TEST(IndexDamage, IsRefusedOrEndsTheWalkNeverAHang) {
  const Bytes ndx = Made(kNdx, "damage", 10, Scrambled(2000, 10));
  const Bytes idx = Made(kIdx, "damage", 10, Scrambled(6000, 10));
  const size_t nroot = GetLe32(&ndx[0]) * 512, root = GetLe32(&idx[0]);
  ASSERT_EQ(idx[root] & 2, 0);                       // the root is interior
  size_t child = GetBe32(&idx[root + 12 + 10 + 4]);  // its first child
  size_t leaf = child;
  while ((idx[leaf] & 2) == 0) leaf = GetBe32(&idx[leaf + 12 + 10 + 4]);
  // At `at` the number `to` of `size` bytes, little-endian (-4: big-endian).
  struct Case { const Form* form; const char* what; size_t at; uint32_t to; int size; } cases[] = {
      {&kNdx, "root past the end", 0, 99999, 4}, {&kNdx, "root in the header", 0, 0, 4},
      {&kNdx, "key length 0", 12, 0, 2}, {&kNdx, "key length beyond a block", 12, 600, 2},
      {&kNdx, "entry size below the key", 18, 8, 2},
      {&kNdx, "key count beyond a block", nroot, 5000, 4},
      {&kNdx, "a child that is its parent", nroot + 4, uint32_t(nroot / 512), 4},
      {&kNdx, "a child past the end", nroot + 4, 0x7FFFFFF, 4},
      {&kIdx, "root past the end", 0, 0x7FFFFE00, 4}, {&kIdx, "root in the header", 0, 0, 4},
      {&kIdx, "root not on a block", 0, uint32_t(root + 3), 4}, {&kIdx, "key length 0", 12, 0, 2},
      {&kIdx, "key length beyond a block", 12, 600, 2},
      {&kIdx, "key count beyond a block", root + 2, 5000, 2},
      {&kIdx, "negative key count", root + 2, 0xFFFF, 2},
      {&kIdx, "a child that is its parent", root + 12 + 14, uint32_t(root), -4},
      {&kIdx, "a child past the end", root + 12 + 14, 0x7FFFFE00, -4},
      {&kIdx, "a leaf where an interior block belongs", child, 2, 2},
      {&kIdx, "a leaf that is its own right sibling", leaf + 8, uint32_t(leaf), 4},
      {&kIdx, "a leaf that is its own left sibling", leaf + 4, uint32_t(leaf), 4},
      {&kIdx, "record bits beyond the entry", leaf + 20, 40, 1},
      {&kIdx, "a record mask that doesn't match its bits", leaf + 14, 0x00FFFFFF, 4},
      {&kIdx, "entry bytes 0", leaf + 23, 0, 1},
      {&kIdx, "more entries than the area holds", leaf + 2, 200, 2},
      {&kIdx, "a first key with a duplicate count", leaf + 24, 0x00FF0001, 4},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.form->name) + ": " + c.what);
    Bytes bad = c.form->fox ? idx : ndx;
    if (c.size == 4) PutLe32(&bad[c.at], c.to);
    else if (c.size == -4) PutBe32(&bad[c.at], c.to);
    else if (c.size == 2) PutLe16(&bad[c.at], uint16_t(c.to));
    else bad[c.at] = uint8_t(c.to);
    WriteScratch(c.form->name, bad);
    Index ix(*c.form, "damage");
    if (!ix->OK()) {
      EXPECT_TRUE(!c.form->fox || *static_cast<ZQDBFoxIndex&>(*ix).Reason() != '\0');
      continue;
    }
    ZQString key;
    int steps = 0;
    for (int32_t r = ix->FirstKey(key); r != -1 && steps < 1000000; r = ix->NextKey(key)) ++steps;
    EXPECT_LT(steps, 1000000);
    steps = 0;
    for (int32_t r = ix->LastKey(key); r != -1 && steps < 1000000; r = ix->PrevKey(key)) ++steps;
    EXPECT_LT(steps, 1000000);
    ix->FindKey(ZQString(Key(5, 10).c_str(), 10), true);
    AddKey(*ix, Key(7, 10), 7);  // may fail, must not break anything
  }
}

TEST(IndexDamage, AMissingFileOrTagIsNotOk) {
  // Not OK, and a CDX that is missing keeps no tag list.
  for (const Form& form : {kNdx, kMdx, kIdx, kCdx}) {
    unlink(ScratchPath(form.File("missing")).c_str());
    Index ix(form, "missing");
    EXPECT_FALSE(ix->OK()) << form.name;
    EXPECT_EQ(ix.TagList(), nullptr);
  }
  Made(kMdx, "missing", 10, {});
  EXPECT_FALSE(Index(Form{"OTHER", false, false}, "missing")->OK());
  EXPECT_TRUE(Index(Form{"tree", false, false}, "missing")->OK());  // names are found in any case
  // A CDX that is no index at all: not OK, and no tag list is kept.
  WriteScratch("missing.cdx", Bytes(100, 0x41));
  Index junk(kCdx, "missing");
  EXPECT_FALSE(junk->OK());
  EXPECT_EQ(junk.TagList(), nullptr);
  KeyField wide(ZQDBFoxIndex::kMaxKeyLength + 1, true);
  EXPECT_FALSE(Index(kIdx, "missing", &wide)->OK());
}

// An index's tree read from its file's bytes as its form lays it out, its
// blocks named by their number of 512-byte units as the checks name them. A
// dBASE interior block has n keys and n + 1 children, the last where entry n
// would begin (in an MDX block the word behind its last entry); a FoxPro
// one has n keys and n children, each a big-endian byte offset at the end of
// its entry.
struct Tree {
  Bytes b;
  bool fox, mdx;
  uint32_t entry, header, keyAt, room, root;
  Tree(Bytes bytes, const Form& form, uint32_t width)
      : b(std::move(bytes)), fox(form.fox), mdx(!form.fox && form.Tag()) {
    if (fox) {
      entry = width + (form.compress ? 8 : 4), header = 12, keyAt = 0;
      root = GetLe32(&b[form.Tag() ? 1536 : 0]) / 512;
    } else {
      entry = (width + (mdx ? 7 : 11)) & ~3u, header = mdx ? 8 : 4, keyAt = mdx ? 4 : 8;
      root = mdx ? GetLe32(&b[GetLe32(&b[544]) * 512]) : GetLe32(&b[0]);
    }
    room = ((mdx ? 1024 : 512) - header - 4) / entry;
  }
  uint32_t Count(uint32_t blk) const {
    return fox ? GetLe16(&b[blk * 512 + 2]) : GetLe32(&b[blk * 512]);
  }
  void SetCount(uint32_t blk, uint32_t n) {
    if (fox) PutLe16(&b[blk * 512 + 2], uint16_t(n));
    else PutLe32(&b[blk * 512], n);
  }
  uint32_t Last(uint32_t blk) const { return fox ? Count(blk) - 1 : Count(blk); }  // last child
  size_t Entry(uint32_t blk, uint32_t i) const { return blk * 512 + header + i * entry; }
  size_t ChildAt(uint32_t blk, uint32_t i) const { return Entry(blk, i) + (fox ? entry - 4 : 0); }
  uint32_t Child(uint32_t blk, uint32_t i) const {
    return fox ? GetBe32(&b[ChildAt(blk, i)]) / 512 : GetLe32(&b[ChildAt(blk, i)]);
  }
  void SetChild(uint32_t blk, uint32_t i, uint32_t v) {
    if (fox) PutBe32(&b[ChildAt(blk, i)], v * 512);
    else PutLe32(&b[ChildAt(blk, i)], v);
  }
  bool Leaf(uint32_t blk) const {
    return fox ? (b[blk * 512] & 2) != 0 : Child(blk, mdx ? Count(blk) : 0) == 0;
  }
  uint8_t* Key(uint32_t blk, uint32_t i) { return &b[Entry(blk, i) + keyAt]; }
};

TEST(IndexTreeCheck, FindsEachFaultOfStructureOnceAndNamesItsBlock) {
  const int width = 60, n = 1500;  // 15 keys in an MDX node, 7 in an NDX node
  constexpr int N = 1, M = 2, P = 4, C = 8, All = N | M | P | C;  // NDX, MDX, plain IDX, CDX
  for (const Form& form : {kMdx, kNdx, kCdx, kPlainIdx}) {
    SCOPED_TRACE(std::string(form.name) + (form.fox ? " fox" : ""));
    const int bit = form.fox ? (form.compress ? C : P) : (form.Tag() ? M : N);
    const Tree good(Made(form, "check", width, Scrambled(n, width)), form, width);
    // The places of the tree: the root R and its first two children, the
    // first leaves L0-L2, their parent Pa and depth, the first leaf LF below
    // the root's last child and the last leaf LN. The index opens along its first children, so
    // the damage that would stop that lies beside them.
    const uint32_t R = good.root, X0 = good.Child(R, 0), X1 = good.Child(R, 1);
    uint32_t Pa = R, depth = 1;
    while (!good.Leaf(good.Child(Pa, 0))) Pa = good.Child(Pa, 0), ++depth;
    const uint32_t L0 = good.Child(Pa, 0), L1 = good.Child(Pa, 1), L2 = good.Child(Pa, 2);
    uint32_t LF = good.Child(R, good.Last(R)), LN = R;
    while (!good.Leaf(LF)) LF = good.Child(LF, 0);
    while (!good.Leaf(LN)) LN = good.Child(LN, good.Last(LN));
    ASSERT_GE(depth, 2u);
    auto blk = [](uint32_t v) { return "block " + std::to_string(v); };
    auto num = [](uint32_t v) { return std::to_string(v); };
    auto link = [](Tree& t, uint32_t at, uint32_t to) { PutLe32(&t.b[at], to * 512); };
    const uint32_t XL = good.Child(X0, 1), off = X1 * 512 + 3;  // X0's second child; an odd offset
    // The forms damaged so, the damage, the block the finding names and what
    // it says of it (empty: no finding).
    struct Case {
      const char* what;
      int forms;
      std::function<void(Tree&)> damage;
      uint32_t block;
      std::string says;
    } cases[] = {
        {"nothing", All, [](Tree&) {}, 0, ""},
        {"a child that is its own parent", All, [&](Tree& t) { t.SetChild(X1, 0, R); }, R,
         "reached a second time (from the header and " + blk(X1) + ")"},
        {"two children naming one block", All, [&](Tree& t) { t.SetChild(X1, 0, XL); }, XL,
         "reached a second time (from " + blk(X0) + " and " + blk(X1) + ")"},
        {"a key count the block can't hold", All, [&](Tree& t) { t.SetCount(L1, 5000); }, L1,
         "holds 5000 keys, more than the" + (form.fox ? "" : " " + num(good.room))},
        {"an empty leaf below the root", N | M,
         [&](Tree& t) { t.SetCount(L1, 0), t.SetChild(L1, 0, 0); }, L1,
         "an empty leaf below the root"},
        {"an interior block with no keys", P | C, [&](Tree& t) { t.SetCount(X1, 0); }, X1,
         "an interior block with no keys"},
        {"a level skipped", All, [&](Tree& t) { t.SetChild(R, t.Last(R), LF); }, LF,
         "a leaf 1 level below the root, where the first leaf lies " + num(depth) + " levels"},
        {"a right sibling link wrong", P | C, [&](Tree& t) { link(t, L0 * 512 + 8, L2); }, L0,
         "its right sibling is " + blk(L2) + ", where the block after it at its level is " + blk(L1)},
        {"a first block with a left sibling", P | C, [&](Tree& t) { link(t, L0 * 512 + 4, L1); }, L0,
         "its left sibling is " + blk(L1) + ", where it is the first block of its level"},
        {"a last block with a right sibling", P | C, [&](Tree& t) { link(t, LN * 512 + 8, L0); },
         LN, "its right sibling is " + blk(L0) + ", where it is the last block of its level"},
        {"a child past the end", All, [&](Tree& t) { t.SetChild(R, 1, 4194303); }, R,
         "names block 4194303, which lies past the end"},
        {"a child in the header", All, [&](Tree& t) { t.SetChild(R, 1, 0); }, R,
         form.fox ? "entry 1 names block 0, which lies in an index header"
                  : "names block 0, which lies in the file's header"},
        {"a child off a block boundary", M, [&](Tree& t) { t.SetChild(R, 1, X1 + 1); }, R,
         "entry 1 names " + blk(X1 + 1) + ", which is not on a block boundary"},
        {"a child off a block boundary", P | C,
         [&](Tree& t) { PutBe32(&t.b[t.ChildAt(R, 1)], off); }, R,
         "entry 1 names offset " + num(off) + ", which is not on a 512-byte block boundary"},
        {"keys out of order in a leaf", N | M | P,
         [&](Tree& t) { std::swap_ranges(t.Key(L1, 0), t.Key(L1, 0) + width, t.Key(L1, 1)); }, L1,
         "the keys are out of order"},
        // The parent's key for the first leaf made that leaf's lowest key.
        {"a separator below its child's keys", All,
         [&](Tree& t) { memcpy(t.Key(Pa, 0), Key(0, width).data(), size_t(width)); }, L0,
         "the highest key that " + blk(Pa) + " holds for this block"},
        {"a compact leaf that can't be decoded", C, [&](Tree& t) { t.b[L1 * 512 + 23] = 0; }, L1,
         "its keys can't be rebuilt"},
        {"the next free block inside the tree", M, [](Tree& t) { PutLe32(&t.b[32], 4); }, 0,
         "the file header's next free block 4 lies inside this tag's tree"},
        {"a block count below the tree's", M, [](Tree& t) { PutLe32(&t.b[4 * 512 + 4], 2); }, 4,
         "the tag header counts 2 units of blocks, fewer than"},
        // Tolerated, as Perl XBase writes them: no finding.
        {"a root's links of 0", P | C,
         [&](Tree& t) { link(t, R * 512 + 4, 0), link(t, R * 512 + 8, 0); }, 0, ""},
        {"an interior key filled with NUL bytes", P | C,
         [&](Tree& t) { memset(t.Key(Pa, 0) + 8, 0, size_t(width - 8)); }, 0, ""},
    };
    for (Case& c : cases) {
      if ((c.forms & bit) == 0) continue;
      SCOPED_TRACE(c.what);
      Tree bad = good;
      c.damage(bad);
      WriteScratch(form.File("check"), bad.b);
      Index ix(form, "check");
      ASSERT_TRUE(ix->OK());
      ZQString faults;
      EXPECT_EQ(ix->CheckTree(faults, false), c.says.empty() ? 0 : 1) << faults.c_str();
      if (c.says.empty()) continue;
      std::string line(faults.c_str());
      EXPECT_EQ(line.rfind(blk(c.block) + ": ", 0), 0u) << line;
      EXPECT_NE(line.find(c.says), std::string::npos) << line;
    }
  }
}

}  // namespace
