// Memo files of every kind: opening them and reading memos, good and damaged;
// storing, replacing and freeing memos, with the bytes each leaves in the
// memo file, and damaged files that must not be made worse.
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

// A read of a memo: its block and length, the text and the result expected.
struct Read {
  uint32_t block, length;
  std::string text;
  bool ok;
};
void ExpectReads(MemoTable& t, std::initializer_list<Read> reads) {
  for (const Read& r : reads) {
    bool ok = !r.ok;
    EXPECT_EQ(t.Get(r.block, r.length, &ok), r.text) << "block " << r.block;
    EXPECT_EQ(ok, r.ok) << "block " << r.block;
  }
}

TEST(MemoOpen, ChoosesKindAndBlockSizeFromTheFiles) {
  // The plainer kinds (dBASE III, FPT of 64-byte blocks, dBASE IV with a free
  // chain) show theirs in the reads and writes below.
  struct Case {
    const char* stem;
    uint8_t version;
    int dialect;
    const char* ext;
    Bytes header;
    uint8_t kind;
    int blksize;
  } cases[] = {
      {"open4", 0x8B, 2, "dbt", tests::Db4Header(1, 0x0101, 1024), MEMO_DB4, 1024},
      {"openoa", 0x8B, 7, "dbt", tests::Db3Header(1), MEMO_DB3, 512},  // 0x8B under Enable OA: dBASE III
      {"opensmt", 0xE5, 8, "smt", tests::SmtHeader(8, 0x00010040), MEMO_SMT, 64},  // the low 16 bits count
      // The extension in upper case is tried when the lower-case one is missing.
      {"openup", 0x83, 1, "DBT", tests::Db3Header(1), MEMO_DB3, 512},
  };
  for (const Case& c : cases) {
    MemoTable t(c.stem, c.version, c.dialect, c.ext, c.header);
    ASSERT_NE(t.db, nullptr) << c.stem;
    EXPECT_EQ(t.db->memofailed, 0) << c.stem;
    EXPECT_EQ(t.db->memokind, c.kind) << c.stem;
    EXPECT_EQ(t.db->memoblksize, c.blksize) << c.stem;
    EXPECT_EQ(t.db->memooff, 0) << c.stem;
  }
}

TEST(MemoOpen, RefusesBadHeadersButKeepsTheTable) {
  Bytes off = tests::Db4Header(1, 0x0101, 512);
  off[22] = 1;  // memo handling switched off
  MemoTable memooff("hdroff", 0x8B, 2, "dbt", off);
  EXPECT_EQ(memooff.db->memofailed, 0);
  EXPECT_EQ(memooff.db->memooff, 1);

  struct Case {
    const char* stem;
    uint8_t version;
    int dialect;
    const char* ext;
    Bytes memo;
  } cases[] = {
      {"badver", 0x8B, 2, "dbt", tests::Db4Header(1, 0x0201, 512)},  // unknown version word
      {"zero4", 0x8B, 2, "dbt", tests::Db4Header(1, 0x0101, 0)},     // block size 0
      {"zerofpt", 0xF5, 6, "fpt", tests::FptHeader(1, 0)},
      {"zerosmt", 0xE5, 8, "smt", tests::SmtHeader(8, 0x00010000)},  // low 16 bits 0
      {"cut4", 0x8B, 2, "dbt", Bytes(19, 0)},                        // ends in the version word
      {"cutfpt", 0xF5, 6, "fpt", Bytes(7, 0)},
      {"missing", 0x83, 1, "", Bytes()},
  };
  for (const Case& c : cases) {
    MemoTable t(c.stem, c.version, c.dialect, c.ext, c.memo);
    ASSERT_NE(t.db, nullptr) << c.stem;
    EXPECT_EQ(t.db->memofailed, 1) << c.stem;
    EXPECT_FALSE(t.db->memofile.isOpen()) << c.stem;
    bool ok = true;
    // No memo file: the block number comes back as text, and false.
    EXPECT_EQ(t.Get(42, 5, &ok), "        42") << c.stem;
    EXPECT_FALSE(ok);
  }
}

TEST(MemoRead, Db3TextEndsAtTheMarkTheEndOfFileOrThe32000Cap) {
  Bytes memo = MemoBytes(tests::Db3Header(200))
                   .At(1, tests::Db3Block("hello\x1A" "after"), 512)
                   .At(2, tests::Db3Block(std::string(40000, 'x')), 512)
                   .At(100, Text("runs to the end"), 512)
                   .Build();
  memo.resize(100 * 512 + 15);  // block 100 has no 0x1A: the file ends inside it
  MemoTable t("read3", 0x83, 1, "dbt", memo);
  ExpectReads(t, {{0, 0, "", true},
                  {1, 0, "hello", true},
                  {2, 0, std::string(32000, 'x'), true},
                  {100, 0, "runs to the end", true},
                  // A block at or past the end of the file is a damaged
                  // pointer; so is one whose offset 32 bits can't hold (it
                  // never wraps onto another memo).
                  {101, 0, "", false},
                  {0x00800001, 0, "", false}});
  EXPECT_EQ(t.db->memostat, 1);
}

TEST(MemoRead, Db4CountsTheTextByTheLengthWordsAndTrustsNoLength) {
  std::string big(40000, 'y');
  Bytes odd = tests::Db4Block("abcde", 16);  // offset word 16: text still at 8
  Bytes below = tests::Db4Block("zz");
  PutLe32(&below[4], 3);  // total length below the offset word
  Bytes huge = tests::Db4Block("tail");
  PutLe32(&huge[4], 0x7FFFFFF0);  // far more than the file holds
  Bytes memo = MemoBytes(tests::Db4Header(90, 0x0102, 512))
                   .At(1, tests::Db4Block("hello"), 512)
                   .At(2, odd, 512)
                   .At(3, below, 512)
                   .At(4, tests::Db4Block(big), 512)
                   .At(89, huge, 512)
                   .Build();
  memo.resize(89 * 512 + 12);  // the file ends inside the last memo
  MemoTable t("read4", 0x8B, 2, "dbt", memo);
  ExpectReads(t, {{1, 0, "hello", true},
                  {2, 0, "abcde", true},
                  {4, 0, big, true},  // no 32,000 cap outside the dBASE III form
                  {3, 0, "", false},
                  {89, 0, "tail", false}});  // the read ends at the end of the file
  EXPECT_EQ(t.db->memostat, 1);
}

TEST(MemoRead, FptReadsTextBlocksOnlyAndTrustsNoLength) {
  Bytes huge = tests::FptBlock("abc");
  PutBe32(&huge[4], 0xFFFFFFFF);
  Bytes memo = MemoBytes(tests::FptHeader(12, 64))
                   .At(8, tests::FptBlock("fox text"), 64)
                   .At(9, tests::FptBlock("picture", 0), 64)
                   .At(10, huge, 64)
                   .Build();
  MemoTable t("readfpt", 0xF5, 6, "fpt", memo);
  ExpectReads(t, {{8, 0, "fox text", true}, {9, 0, "", false}});
  EXPECT_EQ(t.db->memostat, 0);  // not text: the caller shows a blank field
  bool ok = true;
  t.Get(10, 0, &ok);
  EXPECT_FALSE(ok);
  EXPECT_EQ(t.db->memostat, 1);  // damage, not "no text"
}

TEST(MemoRead, SmtTakesTheLengthFromThePointer) {
  Bytes memo = MemoBytes(tests::SmtHeader(10, 64)).At(8, Text("clipper memo text"), 64).Build();
  MemoTable t("readsmt", 0xE5, 8, "smt", memo);
  ExpectReads(t, {{8, 7, "clipper", true},
                  {12345, 0, "", true},  // length 0: no memo, no file access
                  // A length past the end reads what is there.
                  {8, 1000, "clipper memo text" + std::string(64 - 17, '\0'), false}});
}

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
  EXPECT_EQ(Le32At(t.MemoFile(), 0), 2u);
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
  EXPECT_EQ(Slice(m, 512, 512), tests::Db4Block(z));  // 0xFFFF, offset 8, total length 512
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
  EXPECT_EQ(t.Put(0, big), 3u);
  EXPECT_EQ(t.Get(3), big);
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
    EXPECT_EQ(Slice(t.MemoFile(), 0, c.memo.size()), c.memo) << c.stem;  // the old bytes untouched
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
