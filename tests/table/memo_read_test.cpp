// Opening memo files and reading memos of every kind, good and damaged.
#include <gtest/gtest.h>

#include <string>

#include "table/dbf.h"
#include "table/memo.h"
#include "tests/support/memo_builder.h"

namespace {

using tests::Bytes;
using tests::MemoBytes;
using tests::Text;

using tests::MemoTable;

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
  struct Case {
    const char* stem;
    uint8_t version;
    int dialect;
    const char* ext;
    Bytes header;
    uint8_t kind;
    int blksize;
  } cases[] = {
      {"open3", 0x83, 1, "dbt", tests::Db3Header(1), MEMO_DB3, 512},
      {"open4", 0x8B, 2, "dbt", tests::Db4Header(1, 0x0101, 1024), MEMO_DB4, 1024},
      {"openfree", 0x8B, 2, "dbt", tests::Db4Header(1, 0x0102, 512), MEMO_DB4FREE, 512},
      {"openoa", 0x8B, 7, "dbt", tests::Db3Header(1), MEMO_DB3, 512},  // 0x8B under Enable OA: dBASE III
      {"openfpt", 0xF5, 6, "fpt", tests::FptHeader(8, 64), MEMO_FPT, 64},
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

TEST(MemoBlockNumber, TextFormOfThePointer) {
  EXPECT_EQ(ZQMemoBlockNumber::StringtoNumber(ZQString("          ")), 0u);
  EXPECT_EQ(ZQMemoBlockNumber::StringtoNumber(ZQString("0000000000")), 0u);
  EXPECT_EQ(ZQMemoBlockNumber::StringtoNumber(ZQString("0000000042")), 42u);
  char buf[11];
  EXPECT_STREQ(ZQMemoBlockNumber::NumbertoBuf(buf, 7), "0000000007");
}

}  // namespace
