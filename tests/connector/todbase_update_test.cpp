// The target spoke on existing tables: the update cursor (positions count
// live records, writes land on the physical record behind them), memo blocks
// kept or given up on rewrite, appending, counters by mode, closing without
// keeping, and a file that can't grow.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "tests/support/todbase_harness.h"

namespace {

using tests::Bytes;
using tests::LogCapture;
using tests::ScratchPath;
using tests::Target;
using tests::Written;
using Lines = std::vector<std::string>;

// A target of `mode` on a new PHYS C(6) table of `count` records "p<n>" (see
// NumberedTable), those in `deleted` deleted; `opened` is the result of opening it.
struct Phys : Target {
  std::string path;
  BATCHERR opened;
  Phys(const std::string& name, int mode, int count, const std::vector<int>& deleted)
      : Target(2, mode), path(tests::WriteScratch(name, tests::NumberedTable(count, deleted))) {
    Add('C', "PHYS", 6);
    opened = Open(path);
  }
  // Reads on from the position until a read fails: "<position>:<value>" of
  // each record read, and in `rc` the result that stopped it.
  Lines Scan(BATCHERR* rc = nullptr) {
    ZQRecord r(Layout());
    Lines read;
    int64_t pos = -1;
    BATCHERR last;
    while ((last = (*this)->GetRecord(r, &pos)) == 0)
      read.push_back(std::to_string(pos) + ":" + r[0]->StringRef().c_str());
    if (rc != nullptr) *rc = last;
    return read;
  }
  // The records written as "<flag><value>", trailing blanks cut (the table closed first).
  Lines Rows() {
    Close();
    Written w(path);
    Lines out;
    for (int n = 0; n < w.count; ++n) {
      std::string r = w.Record(n);
      out.push_back(r.erase(r.find_last_not_of(' ') + 1));
    }
    return out;
  }
};

TEST(ToDbaseUpdateTest, PositionsCountLiveRecords) {
  // Live physical 0 2 4 5 are logical 0 1 2 3.
  Phys t("upd_map.dbf", 2, 6, {1, 3});
  ASSERT_EQ(t.opened, 0);
  EXPECT_EQ(t->Position(), 0);
  t->SetFilePosition(1);
  ASSERT_EQ(t.Put({"L1"}), 0);
  EXPECT_EQ(t->Position(), 2);
  // A read goes on from the write: logical 2 is physical 4.
  EXPECT_EQ(t.Scan(), (Lines{"2:p4", "3:p5"}));
  t->SetFilePosition(3);
  ASSERT_EQ(t.Put({"L3"}), 0);
  // In a row from the start: every write on the next live record.
  t->_Rewind();
  for (const char* v : {"a0", "a1", "a2", "a3", "a4", "a5"}) ASSERT_EQ(t.Put({v}), 0) << v;
  EXPECT_EQ(t->UpdatedRecordCount(), 8);
  EXPECT_EQ(t->InsertedRecordCount(), 0);
  EXPECT_EQ(t.Rows(), (Lines{" a0", "*p1", " a1", "*p3", " a2", " a3", " a4", " a5"}));

  // A scan to the end first, as an update by key does, then writes by the
  // positions that the scan gave.
  Phys u("upd_scan.dbf", 2, 7, {0, 3, 4});
  ASSERT_EQ(u.opened, 0);
  BATCHERR rc;
  EXPECT_EQ(u.Scan(&rc), (Lines{"0:p1", "1:p2", "2:p5", "3:p6"}));
  EXPECT_EQ(rc, ZQ_END);
  EXPECT_EQ(u->Position(), 4);
  for (int64_t p : {int64_t{2}, int64_t{0}, int64_t{3}}) {
    ASSERT_NE(u.Reread(p)[0], '#');
    ASSERT_EQ(u.Put({("u" + std::to_string(p)).c_str()}), 0);
  }
  EXPECT_EQ(u.Rows(), (Lines{"*p0", " u0", " p2", "*p3", "*p4", " u2", " u3"}));
}

TEST(ToDbaseUpdateTest, AppendingBehindTheLastRecord) {
  LogCapture log;
  // Deleted records at the end: one past the last live record appends, and
  // so does the next position; one further fails and changes nothing.
  Phys tail("upd_tail.dbf", 2, 3, {1, 2});
  ASSERT_EQ(tail.opened, 0);
  tail->SetFilePosition(2);  // between the live count and the file's count
  EXPECT_EQ(tail.Put({"bad"}), ZQ_WRITE_ERROR);
  EXPECT_EQ(log.Last(), "Error -1 returned from dbput");
  EXPECT_EQ(tail->Position(), 3);  // moves on all the same
  tail->SetFilePosition(1);
  ASSERT_EQ(tail.Put({"n1"}), 0);
  ASSERT_EQ(tail.Put({"n2"}), 0);
  EXPECT_EQ(tail.Rows(), (Lines{" p0", "*p1", "*p2", " n1", " n2"}));

  // A record appended in this run is found again by its logical number and
  // rewritten in place (an update that meets the same key twice).
  Phys again("upd_again.dbf", 2, 2, {0});
  ASSERT_EQ(again.opened, 0);
  again.Scan();
  again->Unwind();
  ASSERT_EQ(again.Put({"new"}), 0);
  EXPECT_EQ(again.Reread(1), "new");
  ASSERT_EQ(again.Put({"again"}), 0);
  EXPECT_EQ(again.Rows(), (Lines{"*p0", " p1", " again"}));

  // Append mode starts behind the last record; Unwind goes there again, and
  // SetFilePosition to the record count appends; one further fails.
  Phys t("upd_append.dbf", 1, 3, {});
  ASSERT_EQ(t.opened, 0);
  EXPECT_EQ(t->Position(), 3);
  ASSERT_EQ(t.Put({"a3"}), 0);
  t->_Rewind();
  t->Unwind();
  EXPECT_EQ(t->Position(), 4);
  t->SetFilePosition(5);
  EXPECT_EQ(t.Put({"gap"}), ZQ_WRITE_ERROR);
  EXPECT_EQ(log.Last(), "Error -1 returned from dbput");
  t->SetFilePosition(4);
  ASSERT_EQ(t.Put({"a4"}), 0);
  EXPECT_EQ(t->InsertedRecordCount(), 2);
  // Reading: the last record leaves the position at the count; then 1.
  t->SetFilePosition(4);
  BATCHERR rc;
  EXPECT_EQ(t.Scan(&rc), (Lines{"4:a4"}));
  EXPECT_EQ(rc, ZQ_END);
  EXPECT_EQ(t->Position(), 5);
  EXPECT_EQ(t.Rows(), (Lines{" p0", " p1", " p2", " a3", " a4"}));
}

// Memo block numbers as the record holds them, one kind per dialect.
uint32_t Pointer(const std::string& record, int dialect) {
  if (dialect == 8) return GetLe32(reinterpret_cast<const uint8_t*>(record.data()) + 6);
  return uint32_t(std::stoul(record));
}

TEST(ToDbaseUpdateTest, MemoBlocksOnRewrite) {
  const std::string long_text(700, 'w');  // two blocks of 512
  for (int dialect : {1, 2, 6, 8}) {
    SCOPED_TRACE(dialect);
    const std::string stem = ScratchPath("memo_upd_" + std::to_string(dialect)), path = stem + ".dbf";
    const std::string memo_path = stem + (dialect == 6 ? ".fpt" : dialect == 8 ? ".smt" : ".dbt");
    auto open = [&](Target& t) {
      t.Add('C', "ID", 2);
      t.Add('M', "NOTE");
      return t.Open(path);
    };
    {
      Target t(dialect, 0);
      ASSERT_EQ(open(t), 0);
      ASSERT_EQ(t.Put({"a", "hello"}), 0);
      ASSERT_EQ(t.Put({"b", long_text.c_str()}), 0);
    }
    Bytes memo_before = tests::ReadFile(memo_path);
    uint32_t first = Pointer(Written(path).Record(0).substr(3), dialect);
    ASSERT_NE(first, 0u);
    ASSERT_NE(Pointer(Written(path).Record(1).substr(3), dialect), 0u);
    {
      Target t(dialect, 2);
      ASSERT_EQ(open(t), 0);
      // The same text again: the block is kept and the memo file unchanged
      // (SMT memos are always stored anew).
      EXPECT_EQ(t.Reread(0, 1), "hello");
      ASSERT_EQ(t.Write(), 0);
      // A blank memo gives the old blocks up and stores ten digits 0.
      t->SetFilePosition(1);
      ASSERT_EQ(t->DeleteRecord(), 0);
      ASSERT_EQ(t.Put({"b", nullptr}), 0);
      EXPECT_EQ(t->DeletedRecordCount(), 1);
      EXPECT_EQ(t->UpdatedRecordCount(), 2);
      EXPECT_EQ(t->InsertedRecordCount(), 0);
    }
    Written w(path);
    ASSERT_EQ(w.count, 2);
    EXPECT_EQ(Pointer(w.Record(0).substr(3), dialect) == first, dialect != 8);
    EXPECT_EQ(w.Record(1).substr(3), dialect == 8 ? std::string(10, '\0') : "0000000000");
    if (dialect == 1 || dialect == 6) {
      EXPECT_EQ(tests::ReadFile(memo_path), memo_before);
    }
    tests::Source s(dialect);
    ASSERT_EQ(s.Open(path), 0);
    EXPECT_EQ(s.At(0, 1), "hello");
    EXPECT_EQ(s.At(1, 1), "");
  }
}

TEST(ToDbaseUpdateTest, BlankMemoGivesDbase4BlocksUp) {
  // Three memos of 600 bytes take two blocks of 512 each: blocks 1, 3, 5.
  // Record 1 is rewritten with a blank memo, then a record is added.
  const std::string text(600, 'q');
  const std::string path = ScratchPath("memo_free.dbf"), memo_path = ScratchPath("memo_free.dbt");
  for (bool chain : {false, true}) {
    SCOPED_TRACE(chain ? "free chain" : "plain");
    {
      Target t(2, 0);
      t.Add('M', "NOTE");
      ASSERT_EQ(t.Open(path), 0);
      for (int i = 0; i < 3; ++i) ASSERT_EQ(t.Put({(text + std::to_string(i)).c_str()}), 0);
    }
    ASSERT_EQ(Pointer(Written(path).Record(1).substr(1), 2), 3u);
    Bytes memo = tests::ReadFile(memo_path);
    ASSERT_EQ(GetLe32(&memo[0]), 7u);  // next free block
    if (chain) {  // the header's version word of a file with a free chain
      PutLe16(&memo[18], 0x0102);
      tests::WriteScratch("memo_free.dbt", memo);
    }
    {
      Target t(2, 2);
      t.Add('M', "NOTE");
      ASSERT_EQ(t.Open(path), 0);
      t->SetFilePosition(1);
      ASSERT_EQ(t->DeleteRecord(), 0);
      ASSERT_EQ(t.Put({nullptr}), 0);
      t->Unwind();
      ASSERT_EQ(t.Put({"new"}), 0);
    }
    Written w(path);
    ASSERT_EQ(w.count, 4);
    EXPECT_EQ(w.Record(1).substr(1), "0000000000");
    EXPECT_EQ(Pointer(w.Record(3).substr(1), 2), 7u);  // new memos go to the end
    memo = tests::ReadFile(memo_path);
    ASSERT_GE(memo.size(), 8u * 512);
    // With a chain, block 3 heads it, a run of 2 blocks whose next word
    // followed the new memo at the chain's end from 7 to 8; without one the
    // block says it holds no text.
    EXPECT_EQ(GetLe32(&memo[0]), chain ? 3u : 8u);
    if (chain) {
      EXPECT_EQ(GetLe32(&memo[3 * 512]), 8u);
    }
    EXPECT_EQ(GetLe32(&memo[3 * 512 + 4]), chain ? 2u : 8u);
    tests::Source s(2);
    ASSERT_EQ(s.Open(path), 0);
    EXPECT_EQ(s.FirstColumn(), (Lines{text + "0", "", text + "2", "new"}));
  }
}

TEST(ToDbaseUpdateTest, CountersAndDeleteWithoutMemo) {
  Phys t("counters.dbf", 2, 2, {});
  ASSERT_EQ(t.opened, 0);
  EXPECT_EQ(t->DeleteRecord(), 0);  // no memo file: nothing read, nothing counted
  EXPECT_EQ(t->DeletedRecordCount(), 0);
  EXPECT_EQ(t->DeleteRecord(0, u"PHYS = 'p0'"), ZQ_NOT_SUPPORTED);
  ASSERT_EQ(t.Put({"x"}), 0);
  t->Unwind();
  ASSERT_EQ(t.Write(), 0);  // an append in mode 2 counts as an update too
  EXPECT_EQ(t->InsertedRecordCount(), 0);
  t.Close();
  EXPECT_EQ(t->UpdatedRecordCount(), 2);  // counters outlive the close
  // Append mode sets only the inserted counter back.
  t->SetMode(ZQSpoke::kAppend);
  ASSERT_EQ(t.Open(t.path), 0);
  ASSERT_EQ(t.Write(), 0);
  EXPECT_EQ(t->InsertedRecordCount(), 1);
  EXPECT_EQ(t->UpdatedRecordCount(), 2);
  EXPECT_EQ(t->GenerateDetailRecord(1), ZQ_INDEX_ERROR);
  // Closing without keeping: an appended table stays with what was written.
  EXPECT_EQ(t.Close(false), 0);
  EXPECT_EQ(t.Rows(), (Lines{" x", " p1", " x", " x"}));
}

TEST(ToDbaseUpdateTest, CloseWithoutKeeping) {
  // Replace mode: neither the table nor its memo file stays.
  std::string path = ScratchPath("nokeep.dbf");
  Target t(2, 0);
  t.Add('M', "NOTE");
  EXPECT_EQ(t.Open(""), ZQ_NO_FILENAME);
  EXPECT_EQ(t.Close(false), 0);  // a failed open leaves nothing to close
  ASSERT_EQ(t.Open(path), 0);
  ASSERT_EQ(t.Put({"text"}), 0);
  EXPECT_EQ(t.Close(false), 0);
  EXPECT_EQ(t.Close(false), 0);  // a second close does nothing
  EXPECT_FALSE(ZQFileProxy::fileExists(path.c_str()));
  EXPECT_FALSE(ZQFileProxy::fileExists(ScratchPath("nokeep.dbt").c_str()));
}

// Runs `body` in a child process whose files can't grow past `limit` bytes;
// the child's exit status.
template <typename F>
int WithFileSizeLimit(rlim_t limit, F body) {
  fflush(nullptr);
  pid_t pid = fork();
  if (pid == 0) {
    signal(SIGXFSZ, SIG_IGN);  // a write past the limit fails instead of killing
    struct rlimit rl = {limit, limit};
    setrlimit(RLIMIT_FSIZE, &rl);
    _exit(body());
  }
  int status = 0;
  waitpid(pid, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 100 + WTERMSIG(status);
}

TEST(ToDbaseUpdateTest, FileThatCannotGrow) {
  // The table, or first the memo file, stops growing and the write that
  // meets it fails with the error of the part that failed; no crash, no hang.
  struct Case {
    char letter;
    int width, length;  // the field, and the length of each value written
    const char* message;
  };
  for (Case c : {Case{'C', 200, 21, "Error -1 returned from dbput"},
                 Case{'M', 0, 3000, "Error adding memo"}}) {
    SCOPED_TRACE(c.message);
    int status = WithFileSizeLimit(20000, [&] {
      Target t(2, 0);
      LogCapture log;
      t.Add(c.letter, "F", c.width);
      if (t.Open(ScratchPath("full.dbf")) != 0) return 2;
      const std::string text(size_t(c.length), 'm');
      for (int i = 0; i < 5000; ++i) {
        BATCHERR rc = t.Put({text.c_str()});
        if (rc != 0) return rc == ZQ_WRITE_ERROR && log.Last() == c.message ? 0 : 3;
      }
      return 4;  // never failed
    });
    EXPECT_EQ(status, 0);
  }
}

}  // namespace
