// FoxPro indexes (IDX files, CDX tags): the files as made and grown, byte for
// byte, compact keys as other programs read them, record numbers of any size,
// split points, trees of any shape walked both ways, and damaged files.
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
#include "index/foxidx.h"

namespace {

using tests::Bytes;
using tests::ScratchPath;

#if defined(__SANITIZE_ADDRESS__)
constexpr bool kUnderSanitizer = true;
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
constexpr bool kUnderSanitizer = true;
#else
constexpr bool kUnderSanitizer = false;
#endif
#else
constexpr bool kUnderSanitizer = false;
#endif

// The key fields of a new index: one field NAME of `width` bytes, text or
// (numeric) an 8-byte double key.
struct KeyField {
  ZQRecord fields;
  ZQIndexDef def;
  ZQDType type;
  KeyField(int width, bool compress, bool unique = false, bool numeric = false)
      : type(numeric ? DT_DOUBLE : DT_TEXT) {
    type.Length(width);
    def.AddSeg(0, int16_t(numeric ? 8 : width), &type, fields.NewField(type, "NAME"));
    def.Compress(compress);
    def.Dups(!unique);
  }
};

// Scratch path of a table (without extension) whose CDX is gone.
std::string Table(const std::string& name) {
  std::string base = ScratchPath(name);
  _unlink((base + ".cdx").c_str());
  return base;
}

bool Put(ZQDBFoxIndex& ix, const std::string& key, int32_t record) {
  ZQString k(key.data(), int32_t(key.size()));
  return ix.AddKey(k, record);
}

// `v` as eight digits, blank-padded to `width`.
std::string Key(int v, int width) {
  char digits[16];
  snprintf(digits, sizeof digits, "%08d", v);
  std::string k(digits);
  k.resize(size_t(width), ' ');
  return k;
}

// The file as the index objects see it: through the platform layer, whose
// page cache holds what open descriptors wrote and haven't yet put on disk.
Bytes ReadFile(const std::string& path) {
  Bytes b;
  int fd = _open(path.c_str(), kRtReadOnly | kRtBinary);
  if (fd < 0) return b;
  uint8_t chunk[4096];
  for (int32_t n; (n = _read(fd, chunk, sizeof chunk)) > 0;) b.insert(b.end(), chunk, chunk + n);
  _close(fd);
  return b;
}

std::string Text(const ZQString& s) { return std::string(s.c_str(), size_t(s.length())); }

void ExpectBytes(const Bytes& b, size_t at, const std::vector<uint8_t>& want) {
  ASSERT_LE(at + want.size(), b.size());
  EXPECT_EQ(Bytes(b.begin() + long(at), b.begin() + long(at + want.size())), want) << "at " << at;
}

// ---------------------------------------------------------------------------
// New files

TEST(FoxFiles, NewFilesAreLaidOutByteForByte) {
  const std::vector<uint8_t> noSiblings = {0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF};
  struct Case {
    const char* name;  // with an extension an IDX file, else a CDX tag
    int width;
    bool compress, unique, numeric;
    size_t size;
    size_t header, root;                 // where the index's header and root lie
    std::vector<uint8_t> head;           // its first 16 bytes
    std::vector<uint8_t> leaf;           // the root's first 24 bytes
  } cases[] = {
      // Compact, key length 7: 3 entry bytes, 18 record bits, 3 count bits.
      {"k7.idx", 7, true, false, false, 1536, 0, 1024,
       {0, 4, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 7, 0, 0x20, 1},
       {2, 0, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xE8, 1, 0xFF, 0xFF, 3, 0, 7, 7, 18, 3, 3, 3}},
      // Key length 8: 16 record bits, 4 count bits.
      {"k8.idx", 8, true, true, false, 1536, 0, 1024,
       {0, 4, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 8, 0, 0x21, 1},
       {2, 0, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xE8, 1, 0xFF, 0xFF, 0, 0, 15, 15, 16, 4, 4, 3}},
      // Key length 16: 4 entry bytes, 22 record bits, 5 count bits.
      {"k16.idx", 16, true, false, false, 1536, 0, 1024,
       {0, 4, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 16, 0, 0x20, 1},
       {2, 0, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xE8, 1, 0xFF, 0xFF, 0x3F, 0, 31, 31, 22, 5, 5, 4}},
      // A numeric field keys on its 8-byte double, whatever its width.
      {"num.idx", 12, true, false, true, 1536, 0, 1024,
       {0, 4, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 8, 0, 0x20, 1},
       {2, 0, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xE8, 1, 0xFF, 0xFF, 0, 0, 15, 15, 16, 4, 4, 3}},
      // Non-compact: free list -1, file length 1024, an empty 512-byte root.
      {"plain.idx", 10, false, false, false, 1024, 0, 512,
       {0, 2, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF, 0, 4, 0, 0, 10, 0, 0, 0},
       {2, 0, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0}},
      // A CDX tag: tag list header and root, the tag's header at 1536 and
      // root at 2560; Compress false makes a compact tag all the same.
      {"NAME", 10, false, true, false, 3072, 1536, 2560,
       {0, 0x0A, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 10, 0, 0x21, 1},
       {2, 0, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xE8, 1, 0xFF, 0xFF, 0, 0, 15, 15, 16, 4, 4, 3}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    KeyField f(c.width, c.compress, c.unique, c.numeric);
    std::string base = Table("layout");
    bool tag = strchr(c.name, '.') == nullptr;
    std::string name = tag ? c.name : ScratchPath(c.name);
    std::string path = tag ? base + ".cdx" : name;
    ZQDBFoxIndex* taglist = nullptr;
    {
      ZQDBFoxIndex ix(base.c_str(), name.c_str(), f.fields, f.def, taglist);
      ASSERT_TRUE(ix.OK()) << ix.Reason();
      EXPECT_EQ(ix.Unique(), c.unique);
    }
    delete taglist;
    Bytes b = ReadFile(path);
    ASSERT_EQ(b.size(), c.size);
    ExpectBytes(b, c.header, c.head);
    ExpectBytes(b, c.root, c.leaf);
    bool compact = c.head[15] == 1;
    if (compact) {  // 10, 1, 0, the expression's length with its NUL, the expression in lower case
      ExpectBytes(b, c.header + 504, {10, 0, 1, 0, 0, 0, 5, 0, 'n', 'a', 'm', 'e', 0});
    } else {
      ExpectBytes(b, c.header + 16, {'N', 'A', 'M', 'E', 0});
    }
    if (tag) {
      // The tag list: options 0xE0, an empty expression; its root leaf holds
      // the name NAME for record 1536, stored as 4 bytes and 6 trailing blanks.
      ExpectBytes(b, 0, {0, 4, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 10, 0, 0xE0, 1});
      ExpectBytes(b, 504, {10, 0, 1, 0, 0, 0, 1, 0, 0});
      ExpectBytes(b, 1024, {3, 0, 1, 0, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xFF, 0xE1, 1});
      ExpectBytes(b, 1024 + 24, {0x00, 0x06, 0x60, 0});
      ExpectBytes(b, 1536 - 4, {'N', 'A', 'M', 'E'});
    }
    // Opening and closing without keys writes nothing.
    {
      ZQDBFoxIndex* list = nullptr;
      ZQDBFoxIndex again(base.c_str(), name.c_str(), list);
      ASSERT_TRUE(again.OK()) << again.Reason();
      ZQString expr;
      again.Expression(expr);
      EXPECT_STREQ(expr.c_str(), compact ? "name" : "NAME");
      delete list;
    }
    EXPECT_EQ(ReadFile(path), b);
  }
}

// ---------------------------------------------------------------------------
// Compact leaves

// Keys in one compact leaf, the bytes they take, and what comes back. The
// trailing count stands for trailing blanks only, so that every reader gets
// the key whole; a duplicate count never reaches into the previous key's
// trailing blanks (a reader may fill those with NULs).
TEST(FoxCompactLeaf, HoldsKeysAsOtherProgramsReadThem) {
  struct Case {
    const char* what;
    int width;
    std::vector<std::string> keys;  // added as records 1, 2, ...
    int freeBytes;
    std::vector<uint8_t> entries;
    std::string stored;  // the packed key bytes at the end of the block
  } cases[] = {
      {"a first key of full length", 10, {"ABCDEFGHIJ"}, 475, {1, 0, 0}, "ABCDEFGHIJ"},
      {"a key sharing all but its last byte", 10, {"ABCDEFGHIJ", "ABCDEFGHIX"}, 471,
       {1, 0, 0, 2, 0, 9}, "XABCDEFGHIJ"},
      {"an equal key stores no byte", 10, {"ABCDEFGHIJ", "ABCDEFGHIJ"}, 472, {1, 0, 0, 2, 0, 10}, "ABCDEFGHIJ"},
      // Equal last bytes are stored: only blanks count as trailing.
      {"ABCDE then ABXDE", 5, {"ABCDE", "ABXDE"}, 474, {1, 0, 0, 2, 0, 2 << 2}, "XDEABCDE"},
      {"BERLIN then LONDON", 10, {"BERLIN", "LONDON"}, 470, {1, 0, 0x40, 2, 0, 0x40}, "LONDONBERLIN"},
      // A B after A: the shared blank lies in A's trailing blanks, so it is stored.
      {"A then A B", 10, {"A", "A B"}, 479, {1, 0, 0x90, 2, 0, 0x71}, " BA"},
      {"a key put before the first", 10, {"ABCDEFGHIJ", "ABC"}, 472, {2, 0, 0x70, 1, 0, 3}, "DEFGHIJABC"},
      // Counts are held to their 7 bits: 73 bytes of the first key are stored.
      {"counts beyond their masks", 200, {"A", "A"}, 407, {1, 0, 0, 0xFE, 2, 0, 0x24, 0xFF}, "A" + std::string(72, ' ')},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    KeyField f(c.width, true);
    std::string path = ScratchPath("leaf.idx");
    ZQDBFoxIndex* none = nullptr;
    {
      ZQDBFoxIndex ix("unused", path.c_str(), f.fields, f.def, none);
      ASSERT_TRUE(ix.OK()) << ix.Reason();
      for (size_t i = 0; i < c.keys.size(); ++i) ASSERT_TRUE(Put(ix, c.keys[i], int32_t(i)));
    }
    Bytes b = ReadFile(path);
    ASSERT_EQ(b.size(), 1536u);
    EXPECT_EQ(GetLe16(&b[1024 + 2]), c.keys.size());
    EXPECT_EQ(GetLe16(&b[1024 + 12]), c.freeBytes);
    ExpectBytes(b, 1024 + 24, c.entries);
    size_t gap = 1024 + 24 + c.entries.size();
    EXPECT_TRUE(std::all_of(b.begin() + long(gap), b.end() - long(c.stored.size()), [](uint8_t x) { return x == 0; }));
    EXPECT_EQ(std::string(b.end() - long(c.stored.size()), b.end()), c.stored);
    // Read back whole, blank-filled, in key order.
    std::vector<std::string> want = c.keys;
    for (std::string& k : want) k.resize(size_t(c.width), ' ');
    std::stable_sort(want.begin(), want.end());
    ZQDBFoxIndex ix("unused", path.c_str(), none);
    ASSERT_TRUE(ix.OK());
    ZQString key;
    std::vector<std::string> got;
    for (int32_t r = ix.FirstKey(key); r != -1; r = ix.NextKey(key)) got.push_back(Text(key));
    EXPECT_EQ(got, want);
  }
}

// A leaf whose record numbers outgrow its record bits takes wider entries,
// then fewer count bits, and never cuts a record number.
TEST(FoxCompactLeaf, WidensItsRecordBitsSoAnyRecordFits) {
  struct Step {
    int32_t record;  // from 0
    uint8_t recordBits, countBits, entryBytes;
  } steps[] = {
      {65534, 16, 4, 3},        // record 65,535: the widths by key length
      {65535, 24, 4, 4},        // 65,536: four entry bytes
      {20000000, 26, 3, 4},     // beyond 2^24: fewer count bits
      {2000000000, 32, 0, 4},   // beyond 2^30: record numbers alone
  };
  KeyField f(10, true);
  std::string path = ScratchPath("wide.idx");
  ZQDBFoxIndex* none = nullptr;
  std::vector<int32_t> records;
  {
    ZQDBFoxIndex ix("unused", path.c_str(), f.fields, f.def, none);
    ASSERT_TRUE(ix.OK());
    for (const Step& s : steps) {
      SCOPED_TRACE(s.record);
      for (int32_t r = s.record - 4; r <= s.record; ++r) {  // up to the step's record
        ASSERT_TRUE(Put(ix, Key(r % 1000, 10), r));
        records.push_back(r);
      }
      ASSERT_TRUE(ix.Flush());
      Bytes b = ReadFile(path);
      ExpectBytes(b, 1024 + 20, {s.recordBits, s.countBits, s.countBits, s.entryBytes});
    }
  }
  ZQDBFoxIndex ix("unused", path.c_str(), none);
  ASSERT_TRUE(ix.OK());
  ZQString key;
  std::vector<int32_t> got;
  for (int32_t r = ix.FirstKey(key); r != -1; r = ix.NextKey(key)) got.push_back(r);
  std::sort(got.begin(), got.end());
  std::sort(records.begin(), records.end());
  EXPECT_EQ(got, records);
}

// ---------------------------------------------------------------------------
// Splits

// A non-compact leaf of key length 50 holds 9 keys; the tenth splits the
// root (a new root at 1024) and then the old root (its lower half to 1536).
TEST(FoxSplit, FallsBesideARunOfEqualKeysOrInsideIt) {
  struct Case {
    const char* what;
    std::vector<std::string> keys;  // nine, then the tenth
    int lower, upper;               // keys in the blocks at 1536 and 512
  } cases[] = {
      {"key 5 differs from key 4: five keys below", {"A0", "A1", "A2", "A3", "A4", "A5", "A6", "A7", "A8", "Z"}, 5, 5},
      {"key 5 equals key 4, key 3 differs: four below", {"A0", "A1", "A2", "A3", "A4", "A4", "A6", "A7", "A8", "Z"}, 4, 6},
      {"all equal: split at n / 2, the run in both", {"A", "A", "A", "A", "A", "A", "A", "A", "A", "A"}, 5, 5},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    KeyField f(50, false);
    std::string path = ScratchPath("split.idx");
    ZQDBFoxIndex* none = nullptr;
    {
      ZQDBFoxIndex ix("unused", path.c_str(), f.fields, f.def, none);
      ASSERT_TRUE(ix.OK());
      for (size_t i = 0; i < c.keys.size(); ++i) ASSERT_TRUE(Put(ix, c.keys[i], int32_t(i)));
    }
    Bytes b = ReadFile(path);
    ASSERT_EQ(b.size(), 2048u);  // one block for the new root, one for the lower half
    EXPECT_EQ(GetLe32(&b[0]), 1024u);
    ExpectBytes(b, 1024, {1, 0, 2, 0});  // the root: two entries
    EXPECT_EQ(GetBe32(&b[1024 + 12 + 50]), 1536u);
    EXPECT_EQ(GetBe32(&b[1024 + 12 + 54 + 50]), 512u);
    EXPECT_EQ(GetLe16(&b[1536 + 2]), c.lower);
    EXPECT_EQ(GetLe16(&b[512 + 2]), c.upper);
    // Siblings: -1 <- lower (1536) <-> upper (512) -> -1.
    ExpectBytes(b, 1536 + 4, {0xFF, 0xFF, 0xFF, 0xFF, 0, 2, 0, 0});
    ExpectBytes(b, 512 + 4, {0, 6, 0, 0, 0xFF, 0xFF, 0xFF, 0xFF});
  }
}

// ---------------------------------------------------------------------------
// Trees

struct Form {
  const char* name;  // with an extension an IDX file, else a CDX tag
  bool compress;
};

// Walks the whole index both ways: keys in order, each record once with its
// own key; an exact search finds sampled keys; FirstKey comes back after
// searches have moved every level.
void CheckWalk(ZQDBFoxIndex& ix, const std::vector<std::string>& keyOf) {
  size_t n = keyOf.size();
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
    if (last == Text(key)) {
      ASSERT_GT(r, lastRecord);  // equal keys in record order
    }
    last = Text(key);
    lastRecord = r;
  }
  ASSERT_EQ(count, n);
  count = 0;
  for (int32_t r = ix.LastKey(key); r != -1; r = ix.PrevKey(key), ++count) {
    ASSERT_TRUE(r >= 0 && size_t(r) < n && seen[size_t(r)] == 1) << r;
    seen[size_t(r)] = 2;
    ASSERT_GE(last, Text(key));
    last = Text(key);
  }
  ASSERT_EQ(count, n);
  for (size_t i = 0; i < n; i += 1 + n / 500) {
    ZQString q(keyOf[i].data(), 8);  // without its trailing blanks
    int32_t r = ix.FindKey(q, true);
    ASSERT_NE(r, -1) << keyOf[i];
    ASSERT_EQ(keyOf[size_t(r)], keyOf[i]);
    ZQString before;
    if (ix.PrevKey(before) != -1) {
      ASSERT_LT(Text(before), keyOf[i]);  // the first of its equals
    }
  }
  std::string first = *std::min_element(keyOf.begin(), keyOf.end());
  ASSERT_NE(ix.FirstKey(key), -1);
  EXPECT_EQ(Text(key), first);
}

TEST(FoxTrees, HoldEveryKeyInAnyOrderOfArrival) {
  struct Run {
    int n;
    Form form;
    int order;  // 0 rising, 1 falling (both in runs of 7 equal keys), 2 random with repeats
    int width;
  };
  std::vector<Run> runs;
  const Form forms[] = {{"TREE", true}, {"tree.idx", true}, {"plain.idx", false}};
  for (int form = 0; form < 3; ++form)
    for (int order = 0; order < 3; ++order)
      runs.push_back({kUnderSanitizer ? 20000 : 100000, forms[form], order, (form + order) % 2 ? 30 : 10});
  if (!kUnderSanitizer) {  // each form and order once at a million keys
    runs.push_back({1000000, forms[0], 2, 30});
    runs.push_back({1000000, forms[1], 0, 10});
    runs.push_back({1000000, forms[2], 1, 30});
  }
  for (const Run& run : runs) {
    SCOPED_TRACE(std::to_string(run.n) + " " + run.form.name + " order " + std::to_string(run.order) + " width " +
                 std::to_string(run.width));
    int n = run.n;
    std::vector<int> values(static_cast<size_t>(n));
    std::mt19937 random(11);
    for (int r = 0; r < n; ++r)
      values[size_t(r)] = run.order == 0 ? r / 7 : run.order == 1 ? (n - 1 - r) / 7 : int(random() % uint32_t(n / 2));
    std::vector<std::string> keyOf(values.size());
    for (size_t r = 0; r < values.size(); ++r) keyOf[r] = Key(values[r], run.width);
    KeyField f(run.width, run.form.compress);
    std::string base = Table("tree");
    bool tag = strchr(run.form.name, '.') == nullptr;
    std::string name = tag ? run.form.name : ScratchPath(run.form.name);
    ZQDBFoxIndex* taglist = nullptr;
    {
      ZQDBFoxIndex ix(base.c_str(), name.c_str(), f.fields, f.def, taglist);
      ASSERT_TRUE(ix.OK()) << ix.Reason();
      for (int r = 0; r < n; ++r) ASSERT_TRUE(Put(ix, keyOf[size_t(r)], r)) << r;
      CheckWalk(ix, keyOf);
    }
    delete taglist;
    taglist = nullptr;
    ZQDBFoxIndex ix(base.c_str(), name.c_str(), taglist);
    ASSERT_TRUE(ix.OK()) << ix.Reason();
    ZQString faults;
    ASSERT_EQ(ix.CheckTree(faults, false), 0) << faults.c_str();
    CheckWalk(ix, keyOf);
    delete taglist;
  }
}

// ---------------------------------------------------------------------------
// Tags

TEST(FoxTags, AreAddedFoundInAnyCaseAndListed) {
  tests::Target t(6);
  t.Add('C', "NAME", 10);
  t.Add('C', "CITY", 4);
  std::string base = Table("tags");
  ZQDBFoxIndex* taglist = nullptr;
  struct NewTag {
    const char* tag;
    const char* field;  // a field of the table, or one it lacks
    bool made;
  } tags[] = {
      {"LONGERNAME", "NAME", true},
      {"AB", "CITY", true},           // comes back without the tail of LONGERNAME
      {"ORPHAN", "GONE", true},       // its expression names no field of the table
      {"ab", "NAME", false},          // a tag of that name exists already
      {"ELEVENCHARS", "NAME", false}, // a tag name has at most 10 characters
  };
  for (const NewTag& n : tags) {
    SCOPED_TRACE(n.tag);
    ZQRecord fields;
    ZQDType text(DT_TEXT);
    text.Length(10);
    ZQIndexDef def;
    def.AddSeg(0, 10, &text, fields.NewField(text, n.field));
    ZQDBFoxIndex ix(base.c_str(), n.tag, fields, def, taglist);
    ASSERT_EQ(ix.OK(), n.made) << ix.Reason();
    ASSERT_NE(taglist, nullptr);
  }
  delete taglist;
  taglist = nullptr;
  // Each tag began where the file ended: the later ones left the first alone.
  Bytes b = ReadFile(base + ".cdx");
  ASSERT_EQ(b.size(), 1536u * 4);
  for (uint32_t header : {1536u, 3072u, 4608u}) EXPECT_EQ(GetLe32(&b[header]), header + 1024);
  EXPECT_TRUE(ZQDBFoxIndex(base.c_str(), "longername", taglist).OK());
  EXPECT_FALSE(ZQDBFoxIndex(base.c_str(), "LONGER", taglist).OK());
  ZQDBFoxIndex::BuildIndexList((base + ".dbf").c_str(), t.operator->(), taglist);
  ASSERT_NE(taglist, nullptr);
  auto listed = [&t] {
    std::vector<std::string> names;
    ZQIndexDef* const* list = t->IndexList();
    for (int i = 0; list != nullptr && list[i] != nullptr; ++i) names.push_back(list[i]->Name());
    return names;
  };
  EXPECT_EQ(listed(), (std::vector<std::string>{"AB", "LONGERNAME"}));
  delete taglist;
  taglist = nullptr;
  ZQDBFoxIndex::BuildIndexList(ScratchPath("nocdx.dbf").c_str(), t.operator->(), taglist);
  EXPECT_EQ(taglist, nullptr);
  EXPECT_TRUE(listed().empty());
}

// A tag's header offset is a record number of the tag list, which stays
// below 65,536: the tag that would begin beyond is refused, the others stay.
TEST(FoxTags, BeginBelow65536) {
  std::string base = Table("many");
  ZQDBFoxIndex* taglist = nullptr;
  KeyField f(10, true);
  int made = 0;
  for (;; ++made) {
    std::string name = "T" + std::to_string(made);
    ZQDBFoxIndex ix(base.c_str(), name.c_str(), f.fields, f.def, taglist);
    if (!ix.OK()) {
      EXPECT_NE(std::string(ix.Reason()).find("65,536"), std::string::npos) << ix.Reason();
      break;
    }
    ASSERT_TRUE(Put(ix, Key(made, 10), made));
  }
  EXPECT_EQ(made, (65536 - 1536) / 1536 + 1);
  delete taglist;
  taglist = nullptr;
  for (int i = 0; i < made; ++i) {
    std::string name = "T" + std::to_string(i);
    ZQDBFoxIndex ix(base.c_str(), name.c_str(), taglist);
    ASSERT_TRUE(ix.OK()) << name;
    ZQString key;
    EXPECT_EQ(ix.FirstKey(key), i);
  }
  delete taglist;
}

// ---------------------------------------------------------------------------
// Damage

TEST(FoxDamage, IsRefusedOrEndsTheWalkNeverAHang) {
  KeyField f(10, true);
  std::string path = ScratchPath("damage.idx");
  ZQDBFoxIndex* none = nullptr;
  {
    ZQDBFoxIndex ix("unused", path.c_str(), f.fields, f.def, none);
    for (int i = 0; i < 6000; ++i) ASSERT_TRUE(Put(ix, Key(i * 7919 % 6000, 10), i));
  }
  Bytes good = ReadFile(path);
  size_t root = GetLe32(&good[0]);
  ASSERT_EQ(good[root] & 2, 0);                       // the root is interior
  size_t child = GetBe32(&good[root + 12 + 10 + 4]);  // its first child
  size_t leaf = child;
  while ((good[leaf] & 2) == 0) leaf = GetBe32(&good[leaf + 12 + 10 + 4]);
  struct Case {
    const char* what;
    size_t at;
    uint32_t value;
    int width;  // bytes, little-endian (-4: big-endian)
  } cases[] = {
      {"root past the end", 0, 0x7FFFFE00, 4},
      {"root in the header", 0, 0, 4},
      {"root not on a block", 0, uint32_t(root + 3), 4},
      {"key length 0", 12, 0, 2},
      {"key length beyond a block", 12, 600, 2},
      {"key count beyond a block", root + 2, 5000, 2},
      {"negative key count", root + 2, 0xFFFF, 2},
      {"a child that is its parent", root + 12 + 14, uint32_t(root), -4},
      {"a child past the end", root + 12 + 14, 0x7FFFFE00, -4},
      {"a leaf where an interior block belongs", child, 2, 2},
      {"a leaf that is its own right sibling", leaf + 8, uint32_t(leaf), 4},
      {"a leaf that is its own left sibling", leaf + 4, uint32_t(leaf), 4},
      {"record bits beyond the entry", leaf + 20, 40, 1},
      {"a record mask that doesn't match its bits", leaf + 14, 0x00FFFFFF, 4},
      {"entry bytes 0", leaf + 23, 0, 1},
      {"more entries than the area holds", leaf + 2, 200, 2},
      {"a first key with a duplicate count", leaf + 24, 0x00FF0001, 4},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    Bytes bad = good;
    if (c.width == 4) PutLe32(&bad[c.at], c.value);
    else if (c.width == -4) PutBe32(&bad[c.at], c.value);
    else if (c.width == 2) PutLe16(&bad[c.at], uint16_t(c.value));
    else bad[c.at] = uint8_t(c.value);
    std::string damaged = tests::WriteScratch("damaged.idx", bad);
    ZQDBFoxIndex ix("unused", damaged.c_str(), none);
    if (!ix.OK()) {
      EXPECT_STRNE(ix.Reason(), "");
      continue;
    }
    ZQString key;
    int steps = 0;
    for (int32_t r = ix.FirstKey(key); r != -1 && steps < 1000000; r = ix.NextKey(key)) ++steps;
    EXPECT_LT(steps, 1000000);
    steps = 0;
    for (int32_t r = ix.LastKey(key); r != -1 && steps < 1000000; r = ix.PrevKey(key)) ++steps;
    EXPECT_LT(steps, 1000000);
    ZQString q(Key(5, 10).c_str(), 10);
    ix.FindKey(q, true);
    Put(ix, Key(7, 10), 7);  // may fail, must not break anything
  }
}

TEST(FoxDamage, AMissingFileOrTagIsNotOk) {
  std::string base = Table("missing");
  ZQDBFoxIndex* taglist = nullptr;
  EXPECT_FALSE(ZQDBFoxIndex(base.c_str(), "NAME", taglist).OK());
  EXPECT_EQ(taglist, nullptr);
  EXPECT_FALSE(ZQDBFoxIndex("unused", ScratchPath("none.idx").c_str(), taglist).OK());
  KeyField wide(ZQDBFoxIndex::kMaxKeyLength + 1, true);
  EXPECT_FALSE(ZQDBFoxIndex("unused", ScratchPath("wide.idx").c_str(), wide.fields, wide.def, taglist).OK());
  // A CDX that is no index at all: not OK, and no tag list is kept.
  tests::WriteScratch("missing.cdx", Bytes(100, 0x41));
  EXPECT_FALSE(ZQDBFoxIndex(base.c_str(), "NAME", taglist).OK());
  EXPECT_EQ(taglist, nullptr);
}

// ---------------------------------------------------------------------------
// The tree's structure, checked block by block

// A Fox tree read from the file's bytes as its layout says; blocks are named
// by their byte offsets, as the file names them.
struct FoxTree {
  Bytes b;
  uint32_t entry;  // of an interior block
  FoxTree(Bytes bytes, bool compact, uint32_t keyLength) : b(std::move(bytes)), entry(keyLength + (compact ? 8 : 4)) {}
  uint32_t Count(uint32_t at) const { return GetLe16(&b[at + 2]); }
  bool Leaf(uint32_t at) const { return (b[at] & 2) != 0; }
  uint32_t Child(uint32_t at, uint32_t i) const { return GetBe32(&b[at + 12 + i * entry + entry - 4]); }
  void SetChild(uint32_t at, uint32_t i, uint32_t v) { PutBe32(&b[at + 12 + i * entry + entry - 4], v); }
  uint32_t Right(uint32_t at) const { return GetLe32(&b[at + 8]); }
};

TEST(FoxTreeCheck, FindsEachFaultOfStructureOnceAndNamesItsBlock) {
  const int width = 30, n = 3000;
  for (const Form& form : {Form{"TREE", true}, Form{"check.idx", false}}) {
    SCOPED_TRACE(form.name);
    const bool tag = form.compress;
    KeyField f(width, form.compress);
    std::string base = Table("check");
    std::string name = tag ? form.name : ScratchPath(form.name);
    std::vector<int> order(n);
    for (int i = 0; i < n; ++i) order[size_t(i)] = i;
    std::shuffle(order.begin(), order.end(), std::mt19937(5));
    ZQDBFoxIndex* taglist = nullptr;
    {
      ZQDBFoxIndex ix(base.c_str(), name.c_str(), f.fields, f.def, taglist);
      for (int r : order) ASSERT_TRUE(Put(ix, Key(r, width), r));
    }
    delete taglist;
    taglist = nullptr;
    const std::string file = tag ? base + ".cdx" : name;
    const FoxTree good(ReadFile(file), form.compress, width);
    const uint32_t R = GetLe32(&good.b[tag ? 1536 : 0]);  // the root, from the index header
    // The places of the tree, as in the dBASE check above.
    const uint32_t X0 = good.Child(R, 0), X1 = good.Child(R, 1), last = good.Count(R) - 1;
    uint32_t P = R, depth = 1;
    while (!good.Leaf(good.Child(P, 0))) P = good.Child(P, 0), ++depth;
    const uint32_t L0 = good.Child(P, 0), L1 = good.Child(P, 1), L2 = good.Child(P, 2);
    uint32_t lastFirst = good.Child(R, last), lastLeaf = R;
    while (!good.Leaf(lastFirst)) lastFirst = good.Child(lastFirst, 0);
    while (!good.Leaf(lastLeaf)) lastLeaf = good.Child(lastLeaf, good.Count(lastLeaf) - 1);
    ASSERT_GE(depth, 2u);
    using Fault = std::pair<uint32_t, std::string>;  // the block told (a byte offset), and what is said of it
    auto blk = [](uint32_t at) { return "block " + std::to_string(at / 512); };
    struct Case {
      const char* what;
      int forms;  // 1 compact, 2 non-compact, 3 both
      std::function<Fault(FoxTree&)> damage;
    } cases[] = {
        {"a child that is its own parent", 3,
         [&](FoxTree& t) { t.SetChild(X1, 0, R); return Fault{R, "reached a second time (from the header and " + blk(X1) + ")"}; }},
        {"two children naming one block", 3,
         [&](FoxTree& t) {
           t.SetChild(X1, 0, t.Child(X0, 1));
           return Fault{t.Child(X0, 1), "reached a second time (from " + blk(X0) + " and " + blk(X1) + ")"};
         }},
        {"a key count the block can't hold", 3,
         [&](FoxTree& t) { PutLe16(&t.b[L1 + 2], 5000); return Fault{L1, "holds 5000 keys, more than the"}; }},
        {"an interior block with no keys", 3,
         [&](FoxTree& t) { PutLe16(&t.b[X1 + 2], 0); return Fault{X1, "an interior block with no keys"}; }},
        {"a level skipped", 3,
         [&](FoxTree& t) {
           t.SetChild(R, last, lastFirst);
           return Fault{lastFirst, "a leaf 1 level below the root, where the first leaf lies " + std::to_string(depth) + " levels"};
         }},
        {"a right sibling link wrong", 3,
         [&](FoxTree& t) { PutLe32(&t.b[L0 + 8], L2); return Fault{L0, "its right sibling is " + blk(L2) + ", where the block after it at its level is " + blk(L1)}; }},
        {"a first block with a left sibling", 3,
         [&](FoxTree& t) { PutLe32(&t.b[L0 + 4], L1); return Fault{L0, "its left sibling is " + blk(L1) + ", where it is the first block of its level"}; }},
        {"a last block with a right sibling", 3,
         [&](FoxTree& t) { PutLe32(&t.b[lastLeaf + 8], L0); return Fault{lastLeaf, "its right sibling is " + blk(L0) + ", where it is the last block of its level"}; }},
        {"a child past the end", 3,
         [&](FoxTree& t) { t.SetChild(R, 1, 0x7FFFFE00); return Fault{R, "entry 1 names block 4194303, which lies past the end"}; }},
        {"a child off a block boundary", 3,
         [&](FoxTree& t) { t.SetChild(R, 1, X1 + 3); return Fault{R, "entry 1 names offset " + std::to_string(X1 + 3) + ", which is not on a 512-byte block boundary"}; }},
        {"a child in the header", 3,
         [&](FoxTree& t) { t.SetChild(R, 1, 0); return Fault{R, "entry 1 names block 0, which lies in an index header"}; }},
        {"a separator below its child's keys", 3,  // the parent's key for the first leaf: its lowest key
         [&](FoxTree& t) {
           std::string low = Key(0, width);
           memcpy(&t.b[P + 12], low.data(), size_t(width));
           return Fault{L0, "the highest key that " + blk(P) + " holds for this block"};
         }},
        {"keys out of order in a leaf", 2,
         [&](FoxTree& t) { std::swap_ranges(&t.b[L1 + 12], &t.b[L1 + 12 + width], &t.b[L1 + 12 + width + 4]); return Fault{L1, "the keys are out of order"}; }},
        {"a compact leaf that can't be decoded", 1,
         [&](FoxTree& t) { t.b[L1 + 23] = 0; return Fault{L1, "its keys can't be rebuilt"}; }},
        // Tolerated, as Perl XBase writes them: no fault.
        {"a root's links of 0", 3, [&](FoxTree& t) { PutLe32(&t.b[R + 4], 0); PutLe32(&t.b[R + 8], 0); return Fault{0, ""}; }},
        {"an interior key filled with NUL bytes", 3,
         [&](FoxTree& t) { memset(&t.b[P + 12 + 8], 0, size_t(width - 8)); return Fault{0, ""}; }},
    };
    for (Case& c : cases) {
      if ((c.forms & (form.compress ? 1 : 2)) == 0) continue;
      SCOPED_TRACE(c.what);
      FoxTree bad = good;
      Fault want = c.damage(bad);
      tests::WriteScratch(tag ? "check.cdx" : form.name, bad.b);
      ZQString faults;
      {
        ZQDBFoxIndex ix(base.c_str(), name.c_str(), taglist);
        EXPECT_TRUE(ix.OK()) << ix.Reason();
        EXPECT_EQ(ix.CheckTree(faults, false), want.second.empty() ? 0 : 1) << faults.c_str();
      }
      delete taglist;  // its descriptor would keep the file's pages cached
      taglist = nullptr;
      if (want.second.empty()) continue;
      std::string line(faults.c_str());
      EXPECT_EQ(line.rfind(blk(want.first) + ": ", 0), 0u) << line;
      EXPECT_NE(line.find(want.second), std::string::npos) << line;
    }
    tests::WriteScratch(tag ? "check.cdx" : form.name, good.b);
    ZQDBFoxIndex ix(base.c_str(), name.c_str(), taglist);
    ZQString faults;
    EXPECT_EQ(ix.CheckTree(faults, false), 0) << faults.c_str();
    delete taglist;
  }
}

}  // namespace
