// FoxPro indexes (IDX files, CDX tags): the files as made and grown, byte for
// byte, compact keys as other programs read them, record numbers of any size,
// split points, tags, and files that are missing or no index. Trees of
// every shape are walked, and damaged, in trees_test.cpp.
#include <algorithm>
#include <cstring>
#include <string>
#include <vector>

#include "tests/index/index_harness.h"
#include "tests/support/todbase_harness.h"

namespace {

using namespace tests;

// ---------------------------------------------------------------------------
// New files

TEST(FoxFiles, NewFilesAreLaidOutByteForByte) {
  // A name with an extension is an IDX file, else a CDX tag; the file's size,
  // where the index's header and root lie, its first 16 bytes and the root's
  // first 24.
  struct Case {
    const char* name;
    int width;
    bool compress, unique, numeric;
    size_t size, header, root;
    std::vector<uint8_t> head, leaf;
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
    const Form form{c.name, true, c.compress};
    const std::string path = ScratchPath(form.File("layout"));
    {
      Index ix(form, "layout", &f);
      ASSERT_TRUE(ix->OK()) << ix.Fox().Reason();
      EXPECT_EQ(ix.Fox().Unique(), c.unique);
    }
    Bytes b = ReadIndexFile(path);
    ASSERT_EQ(b.size(), c.size);
    ExpectBytes(b, c.header, c.head);
    ExpectBytes(b, c.root, c.leaf);
    bool compact = c.head[15] == 1;
    if (compact) {  // 10, 1, 0, the expression's length with its NUL, the expression in lower case
      ExpectBytes(b, c.header + 504, {10, 0, 1, 0, 0, 0, 5, 0, 'n', 'a', 'm', 'e', 0});
    } else {
      ExpectBytes(b, c.header + 16, {'N', 'A', 'M', 'E', 0});
    }
    if (form.Tag()) {
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
      Index again(form, "layout");
      ASSERT_TRUE(again->OK()) << again.Fox().Reason();
      ZQString expr;
      again.Fox().Expression(expr);
      EXPECT_STREQ(expr.c_str(), compact ? "name" : "NAME");
    }
    EXPECT_EQ(ReadIndexFile(path), b);
  }
}

// ---------------------------------------------------------------------------
// Compact leaves

// Keys in one compact leaf, the bytes they take, and what comes back. The
// trailing count stands for trailing blanks only, so that every reader gets
// the key whole; a duplicate count never reaches into the previous key's
// trailing blanks (a reader may fill those with NULs).
TEST(FoxCompactLeaf, HoldsKeysAsOtherProgramsReadThem) {
  // The keys, added as records 1, 2, ...; the leaf's free bytes, its entries,
  // and the packed key bytes at the end of the block.
  struct Case {
    const char* what;
    int width;
    std::vector<std::string> keys;
    int freeBytes;
    std::vector<uint8_t> entries;
    std::string stored;
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
    const Form leaf{"leaf.idx", true, true};
    Bytes b = Made(leaf, "unused", c.width, c.keys);
    ASSERT_EQ(b.size(), 1536u);
    EXPECT_EQ(GetLe16(&b[1024 + 2]), c.keys.size());
    EXPECT_EQ(GetLe16(&b[1024 + 12]), c.freeBytes);
    ExpectBytes(b, 1024 + 24, c.entries);
    // Zeros from the end of the entries up to the stored keys.
    std::string tail(b.begin() + long(1024 + 24 + c.entries.size()), b.end());
    EXPECT_EQ(tail, std::string(tail.size() - c.stored.size(), '\0') + c.stored);
    // Read back whole, blank-filled, in key order.
    std::vector<std::string> want = c.keys;
    for (std::string& k : want) k.resize(size_t(c.width), ' ');
    std::stable_sort(want.begin(), want.end());
    Index ix(leaf, "unused");
    ZQString key;
    std::vector<std::string> got;
    for (int32_t r = ix->FirstKey(key); r != -1; r = ix->NextKey(key)) got.push_back(Text(key));
    EXPECT_EQ(got, want);
  }
}

// A leaf whose record numbers outgrow its record bits takes wider entries,
// then fewer count bits, and never cuts a record number.
TEST(FoxCompactLeaf, WidensItsRecordBitsSoAnyRecordFits) {
  // The last record added (from 0), and the leaf's widths then.
  struct Step { int32_t record; uint8_t recordBits, countBits, entryBytes; } steps[] = {
      {65534, 16, 4, 3},        // record 65,535: the widths by key length
      {65535, 24, 4, 4},        // 65,536: four entry bytes
      {20000000, 26, 3, 4},     // beyond 2^24: fewer count bits
      {2000000000, 32, 0, 4},   // beyond 2^30: record numbers alone
  };
  KeyField f(10, true);
  const Form wide{"wide.idx", true, true};
  std::vector<int32_t> records;
  {
    Index ix(wide, "unused", &f);
    ASSERT_TRUE(ix->OK());
    for (const Step& s : steps) {
      SCOPED_TRACE(s.record);
      for (int32_t r = s.record - 4; r <= s.record; ++r) {  // up to the step's record
        ASSERT_TRUE(AddKey(*ix, Key(r % 1000, 10), r));
        records.push_back(r);
      }
      ASSERT_TRUE(ix.Fox().Flush());
      Bytes b = ReadIndexFile(ScratchPath(wide.name));
      ExpectBytes(b, 1024 + 20, {s.recordBits, s.countBits, s.countBits, s.entryBytes});
    }
  }
  Index ix(wide, "unused");
  ZQString key;
  std::vector<int32_t> got;
  for (int32_t r = ix->FirstKey(key); r != -1; r = ix->NextKey(key)) got.push_back(r);
  std::sort(got.begin(), got.end());
  std::sort(records.begin(), records.end());
  EXPECT_EQ(got, records);
}

// ---------------------------------------------------------------------------
// Splits

// A non-compact leaf of key length 50 holds 9 keys; the tenth splits the
// root (a new root at 1024) and then the old root (its lower half to 1536).
TEST(FoxSplit, FallsBesideARunOfEqualKeysOrInsideIt) {
  // Nine keys, then the tenth; the keys in the blocks at 1536 and 512.
  struct Case { const char* what; std::vector<std::string> keys; int lower, upper; } cases[] = {
      {"key 5 differs from key 4: five keys below", {"A0", "A1", "A2", "A3", "A4", "A5", "A6", "A7", "A8", "Z"}, 5, 5},
      {"key 5 equals key 4, key 3 differs: four below", {"A0", "A1", "A2", "A3", "A4", "A4", "A6", "A7", "A8", "Z"}, 4, 6},
      {"all equal: split at n / 2, the run in both", {"A", "A", "A", "A", "A", "A", "A", "A", "A", "A"}, 5, 5},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    Bytes b = Made(Form{"split.idx", true, false}, "unused", 50, c.keys);
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
// Tags

TEST(FoxTags, AreAddedFoundInAnyCaseAndListed) {
  tests::Target t(6);
  t.Add('C', "NAME", 10);
  t.Add('C', "CITY", 4);
  const std::string base = ScratchPath("tags");
  unlink((base + ".cdx").c_str());
  ZQDBFoxIndex* taglist = nullptr;
  // The tag, the field its key is over (one the table has, or not), whether it is made.
  struct NewTag { const char *tag, *field; bool made; } tags[] = {
      {"LONGERNAME", "NAME", true},
      {"AB", "CITY", true},           // comes back without the tail of LONGERNAME
      {"ORPHAN", "GONE", true},       // its expression names no field of the table
      {"ab", "NAME", false},          // a tag of that name exists already
      {"ELEVENCHARS", "NAME", false}, // a tag name has at most 10 characters
  };
  for (const NewTag& n : tags) {
    SCOPED_TRACE(n.tag);
    KeyField f(10, true, false, false, n.field);
    ZQDBFoxIndex ix(base.c_str(), n.tag, f.fields, f.def, taglist);
    ASSERT_EQ(ix.OK(), n.made) << ix.Reason();
    ASSERT_NE(taglist, nullptr);
  }
  delete taglist;
  taglist = nullptr;
  // Each tag began where the file ended: the later ones left the first alone.
  Bytes b = ReadIndexFile(base + ".cdx");
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
  const std::string base = ScratchPath("many");
  unlink((base + ".cdx").c_str());
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
    ASSERT_TRUE(AddKey(ix, Key(made, 10), made));
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

}  // namespace
