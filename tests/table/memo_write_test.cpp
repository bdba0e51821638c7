// Storing, replacing and freeing memos in every kind, with the bytes each
// leaves in the memo file, and damaged files that must not be made worse.
#include <gtest/gtest.h>

#include <string>

#include "table/dbf.h"
#include "table/memo.h"
#include "tests/support/memo_builder.h"

namespace {

using tests::Bytes;
using tests::MemoBytes;
using tests::MemoTable;
using tests::Text;

uint32_t Le32At(const Bytes& b, size_t off) { return off + 4 <= b.size() ? GetLe32(&b[off]) : 0xDEADBEEF; }
uint32_t Be32At(const Bytes& b, size_t off) { return off + 4 <= b.size() ? GetBe32(&b[off]) : 0xDEADBEEF; }
Bytes Slice(const Bytes& b, size_t off, size_t n) {
  return off + n <= b.size() ? Bytes(b.begin() + long(off), b.begin() + long(off + n)) : Bytes();
}

TEST(MemoWrite, Db3StoresInPlaceWhileItFitsAndAppendsPastTheExtent) {
  MemoTable t("w3", 0x83, 1, "dbt", tests::Db3Header(1));
  ASSERT_EQ(t.db->memofailed, 0);
  std::string a(100, 'a');
  EXPECT_EQ(t.Put(0, a), 1u);
  Bytes m = t.MemoFile();
  ASSERT_EQ(m.size(), 1024u);
  EXPECT_EQ(Le32At(m, 0), 2u);  // the header moved from 1 to 2
  EXPECT_EQ(Slice(m, 512, 101), tests::Db3Block(a));
  EXPECT_EQ(Slice(m, 613, 411), Bytes(411, 0));  // zeros behind the 0x1A, not blanks

  // The same text, and the same text with trailing blanks: nothing written.
  EXPECT_EQ(t.Put(1, a), 1u);
  EXPECT_EQ(t.Put(1, a + "    "), 1u);
  EXPECT_EQ(t.MemoFile(), m);

  // Growing within the old extent rewrites in place; the header stays.
  EXPECT_EQ(t.Put(1, std::string(300, 'b')), 1u);
  m = t.MemoFile();
  EXPECT_EQ(Le32At(m, 0), 2u);
  EXPECT_EQ(t.Get(1), std::string(300, 'b'));

  // Growing past it leaves the old blocks behind and appends.
  EXPECT_EQ(t.Put(1, std::string(600, 'c')), 2u);
  m = t.MemoFile();
  EXPECT_EQ(Le32At(m, 0), 4u);
  EXPECT_EQ(m.size(), 2048u);
  EXPECT_EQ(t.Get(1), std::string(300, 'b'));
  EXPECT_EQ(t.Get(2), std::string(600, 'c'));
}

TEST(MemoWrite, TrailingBlanksNeverRunIntoTheNextMemo) {
  MemoTable t("wblank", 0x83, 1, "dbt", tests::Db3Header(1));
  EXPECT_EQ(t.Put(0, "short"), 1u);
  EXPECT_EQ(t.Put(0, "neighbour"), 2u);
  // Trimmed, the text fits the old block; written whole, it needs three. The
  // decision counts what is written, so it moves to the end.
  std::string padded = "longer" + std::string(1100, ' ');
  EXPECT_EQ(t.Put(1, padded), 3u);
  EXPECT_EQ(t.Get(2), "neighbour");
  EXPECT_EQ(t.Get(3), padded);  // stored whole, blanks included
  EXPECT_EQ(Le32At(t.MemoFile(), 0), 6u);
}

TEST(MemoWrite, Db4MemoOf504BytesTakesTwoBlocks) {
  MemoTable t("w4", 0x8B, 2, "dbt", tests::Db4Header(1, 0x0101, 512));
  std::string z(504, 'z');
  EXPECT_EQ(t.Put(0, z), 1u);
  Bytes m = t.MemoFile();
  ASSERT_EQ(m.size(), 1536u);
  EXPECT_EQ(Le32At(m, 0), 3u);
  EXPECT_EQ(Slice(m, 512, 8), (Bytes{0xFF, 0xFF, 0x08, 0x00, 0x00, 0x02, 0x00, 0x00}));
  EXPECT_EQ(Slice(m, 520, 504), Bytes(504, 'z'));
  EXPECT_EQ(Slice(m, 1024, 512), Bytes(512, 0));
  EXPECT_EQ(t.Get(1), z);

  // Freeing in the plain form marks the memo empty and loses its blocks.
  EXPECT_EQ(deloldm(t.db, 1, 1), 0);
  m = t.MemoFile();
  EXPECT_EQ(Le32At(m, 516), 8u);
  EXPECT_EQ(Le32At(m, 0), 3u);
  EXPECT_EQ(t.Get(1), "");
  // Past the 32,000 bytes of the dBASE III form, whole.
  std::string big(40000, 'q');
  uint32_t at = t.Put(0, big);
  EXPECT_EQ(at, 3u);
  EXPECT_EQ(t.Get(at), big);
}

TEST(MemoWrite, FreeChainStaysInAscendingOrder) {
  MemoTable t("wfree", 0x8B, 2, "dbt", tests::Db4Header(1, 0x0102, 512));
  ASSERT_EQ(t.db->memokind, MEMO_DB4FREE);
  EXPECT_EQ(t.Put(0, std::string(10, 'a')), 1u);
  EXPECT_EQ(t.Put(0, std::string(600, 'b')), 2u);  // blocks 2 and 3
  EXPECT_EQ(t.Put(0, std::string(10, 'c')), 4u);
  // Shrinking by a block frees the old run and moves the text to the end.
  EXPECT_EQ(t.Put(2, std::string(10, 'B')), 5u);
  Bytes m = t.MemoFile();
  EXPECT_EQ(Le32At(m, 0), 2u);
  EXPECT_EQ(Slice(m, 2 * 512, 8), tests::FreeEntry(6, 2));
  EXPECT_EQ(t.Get(5), std::string(10, 'B'));

  EXPECT_EQ(deloldm(t.db, 1, 1), 0);  // below the head: the new first run
  EXPECT_EQ(deloldm(t.db, 4, 1), 0);  // between 2 and the end
  EXPECT_EQ(deloldm(t.db, 2, 2), 0);  // already free: nothing changes
  m = t.MemoFile();
  EXPECT_EQ(Le32At(m, 0), 1u);
  EXPECT_EQ(Slice(m, 1 * 512, 8), tests::FreeEntry(2, 1));
  EXPECT_EQ(Slice(m, 2 * 512, 8), tests::FreeEntry(4, 2));
  EXPECT_EQ(Slice(m, 4 * 512, 8), tests::FreeEntry(6, 1));
  // New memos go to the chain's last entry, the end of the file.
  EXPECT_EQ(t.Put(0, "new"), 6u);
  EXPECT_EQ(Le32At(t.MemoFile(), 4 * 512), 7u);
}

TEST(MemoWrite, DamagedFreeChainsAreLeftAloneAndMemosGoToTheEnd) {
  struct Case {
    const char* stem;
    Bytes memo;
  } cases[] = {
      // Block 1 links to itself.
      {"loop", MemoBytes(tests::Db4Header(1, 0x0102, 512))
                   .At(1, tests::FreeEntry(1, 1), 512)
                   .At(2, tests::Db4Block("keep"), 512)
                   .Build()},
      // The head points far past the file.
      {"past", MemoBytes(tests::Db4Header(1000, 0x0102, 512)).At(2, tests::Db4Block("keep"), 512).Build()},
      // The head is the header itself.
      {"zero", MemoBytes(tests::Db4Header(0, 0x0102, 512)).At(2, tests::Db4Block("keep"), 512).Build()},
      // A link that goes back down.
      {"down", MemoBytes(tests::Db4Header(1, 0x0102, 512))
                   .At(1, tests::FreeEntry(2, 1), 512)
                   .At(2, tests::FreeEntry(1, 1), 512)
                   .At(3, tests::Db4Block("keep"), 512)
                   .Build()},
  };
  for (const Case& c : cases) {
    MemoTable t(std::string("wd") + c.stem, 0x8B, 2, "dbt", c.memo);
    ASSERT_EQ(t.db->memokind, MEMO_DB4FREE) << c.stem;
    uint32_t end = uint32_t(c.memo.size() / 512);
    EXPECT_EQ(t.Put(0, "fresh"), end) << c.stem;
    EXPECT_EQ(t.Get(end), "fresh");
    EXPECT_EQ(deloldm(t.db, end, 1), 0) << c.stem;  // ends; the run is lost, not linked
    Bytes m = t.MemoFile();
    EXPECT_EQ(Slice(m, 0, c.memo.size()), c.memo) << c.stem;  // the old bytes untouched
    EXPECT_EQ(t.Get(end - 1), "keep") << c.stem;
  }
}

TEST(MemoWrite, RunEndedBy0xFFFFIsUsedOnlyWhenItHoldsTheMemo) {
  Bytes memo = MemoBytes(tests::Db4Header(1, 0x0102, 512))
                   .At(1, tests::FreeEntry(0xFFFF, 3), 512)
                   .At(4, tests::Db4Block("live"), 512)
                   .Build();
  MemoTable t("wffff", 0x8B, 2, "dbt", memo);
  EXPECT_EQ(t.Put(0, "one"), 1u);  // one block of the three; the rest stays free
  Bytes m = t.MemoFile();
  EXPECT_EQ(Le32At(m, 0), 2u);
  EXPECT_EQ(Slice(m, 2 * 512, 8), tests::FreeEntry(0xFFFF, 2));
  EXPECT_EQ(t.Put(0, std::string(1200, 'x')), 5u);  // three blocks don't fit in two
  EXPECT_EQ(t.Put(0, std::string(600, 'y')), 2u);   // two do, and use the run up
  EXPECT_EQ(Le32At(t.MemoFile(), 0), 0xFFFFu);
  EXPECT_EQ(t.Get(4), "live");
}

TEST(MemoWrite, FptFirstMemoLiesInsideTheHeader) {
  // A new FoxPro memo file: next block 1 of 128 bytes, big-endian.
  MemoTable t("wfpt", 0xF5, 6, "fpt", tests::FptHeader(1, 128));
  ASSERT_EQ(t.db->memofailed, 0);
  EXPECT_EQ(t.Put(0, "hello"), 1u);
  EXPECT_EQ(t.Put(0, std::string(200, 'w')), 2u);  // 2 blocks
  EXPECT_EQ(t.Put(0, "x"), 4u);
  Bytes m = t.MemoFile();
  ASSERT_EQ(m.size(), 640u);
  EXPECT_EQ(Be32At(m, 0), 5u);
  EXPECT_EQ(Slice(m, 128, 13), (Bytes{0, 0, 0, 1, 0, 0, 0, 5, 'h', 'e', 'l', 'l', 'o'}));
  EXPECT_EQ(Slice(m, 141, 115), Bytes(115, 0));

  // An old block that isn't text can't be replaced: 0, and memostat 0.
  MemoTable pic("wfptpic", 0xF5, 6, "fpt",
                MemoBytes(tests::FptHeader(9, 64)).At(8, tests::FptBlock("gif", 2), 64).Build());
  EXPECT_EQ(pic.Put(8, "text"), 0u);
  EXPECT_EQ(pic.db->memostat, 0);
}

TEST(MemoWrite, SmtAdvancesByTheTextAloneAndKeepsLengthsInThePointer) {
  MemoTable t("wsmt", 0xE5, 8, "smt", tests::SmtHeader(8, 64));  // a new Clipper memo file
  ASSERT_EQ(t.db->memokind, MEMO_SMT);
  std::string t128(128, 's');
  EXPECT_EQ(t.Put(0, t128), 8u);
  Bytes m = t.MemoFile();
  ASSERT_EQ(m.size(), 512u + 192u);  // three blocks written
  EXPECT_EQ(Le32At(m, 0), 10u);     // two counted
  EXPECT_EQ(Slice(m, 640, 64), Bytes(64, 0));
  EXPECT_EQ(t.Put(0, "abc"), 10u);  // on the zero block
  EXPECT_EQ(t.Get(8, 128), t128);
  EXPECT_EQ(t.Get(10, 3), "abc");
}

TEST(MemoWrite, DamagedOldMemosAndHeadersAreNotWrittenOver) {
  // An old memo whose length runs off the file: left as it is, new text
  // appended.
  Bytes bad = tests::Db4Block("old");
  PutLe32(&bad[4], 0x00100000);
  Bytes memo = MemoBytes(tests::Db4Header(2, 0x0101, 512)).At(1, bad, 512).Build();
  MemoTable t("wdmg", 0x8B, 2, "dbt", memo);
  EXPECT_EQ(t.Put(1, "fresh"), 2u);
  EXPECT_EQ(Slice(t.MemoFile(), 0, 4), (Bytes{3, 0, 0, 0}));
  EXPECT_EQ(Slice(t.MemoFile(), 512, 1024 - 512), Slice(memo, 512, 512));
  // A head past the end of the file (or 0) is replaced by the file's end.
  MemoTable far("wfar", 0x83, 1, "dbt", tests::Db3Header(77));
  EXPECT_EQ(far.Put(0, "text"), 1u);
  EXPECT_EQ(Le32At(far.MemoFile(), 0), 2u);
  // With a block size of 16, block 1 lies on the header's fields: refused.
  MemoTable tiny("wtiny", 0x8B, 2, "dbt", tests::Db4Header(1, 0x0101, 16));
  Bytes before = tiny.MemoFile();
  EXPECT_EQ(tiny.Put(0, "text"), 0u);
  EXPECT_EQ(tiny.MemoFile(), before);
}

}  // namespace
