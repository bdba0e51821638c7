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
using tests::DbfBuilder;
using tests::LogCapture;
using tests::ScratchPath;
using tests::Target;
using tests::Written;

std::string Numbered(const std::string& name, int count, const std::vector<int>& deleted) {
  return tests::WriteScratch(name, tests::NumberedTable(count, deleted));
}

using Lines = std::vector<std::string>;

// The records of a table as "<flag><value>" with trailing blanks cut.
Lines Rows(const std::string& path) {
  Written w(path);
  Lines out;
  for (int n = 0; n < w.count; ++n) {
    std::string r = w.Record(n);
    r.erase(r.find_last_not_of(' ') + 1);
    out.push_back(r);
  }
  return out;
}

Lines LiveColumn(const std::string& path) {
  tests::Source s(2);
  EXPECT_EQ(s.Open(path), 0);
  return s.FirstColumn();
}

TEST(ToDbaseUpdateTest, PositionsCountLiveRecords) {
  // Live physical 0 2 4 5 are logical 0 1 2 3.
  std::string path = Numbered("upd_map.dbf", 6, {1, 3});
  {
    Target t(2, 2);
    t.Add('C', "PHYS", 6);
    ASSERT_EQ(t.Open(path), 0);
    EXPECT_EQ(t->Position(), 0);
    t->SetFilePosition(1);
    ASSERT_EQ(t.Put({"L1"}), 0);
    EXPECT_EQ(t->Position(), 2);
    // A read goes on from the write: logical 2 is physical 4.
    ZQRecord r(t.Layout());
    int64_t pos = -1;
    ASSERT_EQ(t->GetRecord(r, &pos), 0);
    EXPECT_EQ(pos, 2);
    EXPECT_EQ(std::string(r[0]->StringRef().c_str()), "p4");
    t->SetFilePosition(3);
    ASSERT_EQ(t.Put({"L3"}), 0);
    // In a row from the start: every write on the next live record.
    t->_Rewind();
    for (const char* v : {"a0", "a1", "a2", "a3", "a4", "a5"}) ASSERT_EQ(t.Put({v}), 0) << v;
    EXPECT_EQ(t->UpdatedRecordCount(), 8);
    EXPECT_EQ(t->InsertedRecordCount(), 0);
    t.Close();
  }
  EXPECT_EQ(Rows(path), (Lines{" a0", "*p1", " a1", "*p3", " a2", " a3", " a4", " a5"}));

  // A scan to the end first, as an update by key does, then writes by the
  // positions that the scan gave.
  path = Numbered("upd_scan.dbf", 7, {0, 3, 4});
  {
    Target t(2, 2);
    t.Add('C', "PHYS", 6);
    ASSERT_EQ(t.Open(path), 0);
    ZQRecord scan(t.Layout());
    std::vector<int64_t> positions;
    int64_t pos = -1;
    BATCHERR rc;
    while ((rc = t->GetRecord(scan, &pos)) == 0) positions.push_back(pos);
    EXPECT_EQ(rc, ZQ_END);
    EXPECT_EQ(positions, (std::vector<int64_t>{0, 1, 2, 3}));
    EXPECT_EQ(t->Position(), 4);
    for (int64_t p : {int64_t{2}, int64_t{0}, int64_t{3}}) {
      ASSERT_NE(t.Reread(p)[0], '#');
      ASSERT_EQ(t.Put({("u" + std::to_string(p)).c_str()}), 0);
    }
    t.Close();
  }
  EXPECT_EQ(Rows(path), (Lines{"*p0", " u0", " p2", "*p3", "*p4", " u2", " u3"}));
}

TEST(ToDbaseUpdateTest, AppendingBehindTheLastRecord) {
  // Deleted records at the end: one past the last live record appends, and
  // so does the next position; one further fails and changes nothing.
  std::string path = Numbered("upd_tail.dbf", 3, {1, 2});
  {
    Target t(2, 2);
    LogCapture log;
    t.Add('C', "PHYS", 6);
    ASSERT_EQ(t.Open(path), 0);
    t->SetFilePosition(2);  // between the live count and the file's count
    EXPECT_EQ(t.Put({"bad"}), ZQ_WRITE_ERROR);
    EXPECT_EQ(log.Last(), "Error -1 returned from dbput");
    EXPECT_EQ(t->Position(), 3);  // moves on all the same
    t->SetFilePosition(1);
    ASSERT_EQ(t.Put({"n1"}), 0);
    ASSERT_EQ(t.Put({"n2"}), 0);
    t.Close();
  }
  EXPECT_EQ(Rows(path), (Lines{" p0", "*p1", "*p2", " n1", " n2"}));
  EXPECT_EQ(LiveColumn(path), (Lines{"p0", "n1", "n2"}));

  // A record appended in this run is found again by its logical number and
  // rewritten in place (an update that meets the same key twice).
  path = Numbered("upd_again.dbf", 2, {0});
  {
    Target t(2, 2);
    t.Add('C', "PHYS", 6);
    ASSERT_EQ(t.Open(path), 0);
    ZQRecord scan(t.Layout());
    int64_t pos;
    while (t->GetRecord(scan, &pos) == 0) {
    }
    t->Unwind();
    ASSERT_EQ(t.Put({"new"}), 0);
    EXPECT_EQ(t.Reread(1), "new");
    ASSERT_EQ(t.Put({"again"}), 0);
    t.Close();
  }
  EXPECT_EQ(Rows(path), (Lines{"*p0", " p1", " again"}));

  // Append mode starts behind the last record; Unwind goes there again, and
  // SetFilePosition to the record count appends; one further fails.
  path = Numbered("upd_append.dbf", 3, {});
  {
    Target t(2, 1);
    LogCapture log;
    t.Add('C', "PHYS", 6);
    ASSERT_EQ(t.Open(path), 0);
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
    ZQRecord r(t.Layout());
    t->SetFilePosition(4);
    int64_t pos = -1;
    ASSERT_EQ(t->GetRecord(r, &pos), 0);
    EXPECT_EQ(pos, 4);
    EXPECT_EQ(t->Position(), 5);
    EXPECT_EQ(t->GetRecord(r, &pos), ZQ_END);
    EXPECT_EQ(t->Position(), 5);
    t.Close();
  }
  EXPECT_EQ(Rows(path), (Lines{" p0", " p1", " p2", " a3", " a4"}));
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
    std::string path = ScratchPath("memo_upd_" + std::to_string(dialect) + ".dbf");
    {
      Target t(dialect, 0);
      t.Add('C', "ID", 2);
      t.Add('M', "NOTE");
      ASSERT_EQ(t.Open(path), 0);
      ASSERT_EQ(t.Put({"a", "hello"}), 0);
      ASSERT_EQ(t.Put({"b", long_text.c_str()}), 0);
      t.Close();
    }
    const char* ext = dialect == 6 ? "fpt" : dialect == 8 ? "smt" : "dbt";
    std::string memo_path = ScratchPath("memo_upd_" + std::to_string(dialect) + "." + ext);
    Bytes memo_before = tests::ReadFile(memo_path);
    uint32_t first = Pointer(Written(path).Record(0).substr(3), dialect);
    ASSERT_NE(first, 0u);
    ASSERT_NE(Pointer(Written(path).Record(1).substr(3), dialect), 0u);
    {
      Target t(dialect, 2);
      t.Add('C', "ID", 2);
      t.Add('M', "NOTE");
      ASSERT_EQ(t.Open(path), 0);
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
      t.Close();
    }
    Written w(path);
    ASSERT_EQ(w.count, 2);
    std::string r0 = w.Record(0).substr(3), r1 = w.Record(1).substr(3);
    EXPECT_EQ(Pointer(r0, dialect) == first, dialect != 8);
    EXPECT_EQ(r1, dialect == 8 ? std::string(10, '\0') : "0000000000");
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
  for (bool chain : {false, true}) {
    SCOPED_TRACE(chain ? "free chain" : "plain");
    std::string path = ScratchPath("memo_free.dbf"), memo_path = ScratchPath("memo_free.dbt");
    {
      Target t(2, 0);
      t.Add('M', "NOTE");
      ASSERT_EQ(t.Open(path), 0);
      for (int i = 0; i < 3; ++i) ASSERT_EQ(t.Put({(text + std::to_string(i)).c_str()}), 0);
      t.Close();
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
      t.Close();
    }
    Written w(path);
    ASSERT_EQ(w.count, 4);
    EXPECT_EQ(w.Record(1).substr(1), "0000000000");
    EXPECT_EQ(Pointer(w.Record(3).substr(1), 2), 7u);  // new memos go to the end
    memo = tests::ReadFile(memo_path);
    ASSERT_GE(memo.size(), 8u * 512);
    if (chain) {  // block 3 heads the chain, a run of 2 blocks; its next word
                  // followed the new memo at the chain's end from 7 to 8
      EXPECT_EQ(GetLe32(&memo[0]), 3u);
      EXPECT_EQ(GetLe32(&memo[3 * 512]), 8u);
      EXPECT_EQ(GetLe32(&memo[3 * 512 + 4]), 2u);
    } else {  // the block says it holds no text
      EXPECT_EQ(GetLe32(&memo[3 * 512 + 4]), 8u);
      EXPECT_EQ(GetLe32(&memo[0]), 8u);
    }
    tests::Source s(2);
    ASSERT_EQ(s.Open(path), 0);
    EXPECT_EQ(s.FirstColumn(), (Lines{text + "0", "", text + "2", "new"}));
  }
}

TEST(ToDbaseUpdateTest, CountersAndDeleteWithoutMemo) {
  std::string path = Numbered("counters.dbf", 2, {});
  Target t(2, 2);
  t.Add('C', "PHYS", 6);
  ASSERT_EQ(t.Open(path), 0);
  EXPECT_EQ(t->DeleteRecord(), 0);  // no memo file: nothing read, nothing counted
  EXPECT_EQ(t->DeletedRecordCount(), 0);
  EXPECT_EQ(t->DeleteRecord(0, u"PHYS = 'p0'"), ZQ_NOT_SUPPORTED);
  ASSERT_EQ(t.Put({"x"}), 0);
  t->Unwind();
  ASSERT_EQ(t.Write(), 0);  // an append in mode 2 counts as an update too
  EXPECT_EQ(t->UpdatedRecordCount(), 2);
  EXPECT_EQ(t->InsertedRecordCount(), 0);
  t.Close();
  EXPECT_EQ(t->UpdatedRecordCount(), 2);  // counters outlive the close
  // Append mode sets only the inserted counter back.
  t->SetMode(ZQSpoke::kAppend);
  ASSERT_EQ(t.Open(path), 0);
  ASSERT_EQ(t.Write(), 0);
  EXPECT_EQ(t->InsertedRecordCount(), 1);
  EXPECT_EQ(t->UpdatedRecordCount(), 2);
  EXPECT_EQ(t.Write(), 0);
  t.Close();
  EXPECT_EQ(t->InsertedRecordCount(), 2);
  EXPECT_EQ(t->GenerateDetailRecord(1), ZQ_INDEX_ERROR);
}

TEST(ToDbaseUpdateTest, CloseWithoutKeeping) {
  // Replace mode: neither the table nor its memo file stays.
  std::string path = ScratchPath("nokeep.dbf");
  {
    Target t(2, 0);
    t.Add('M', "NOTE");
    ASSERT_EQ(t.Open(path), 0);
    ASSERT_EQ(t.Put({"text"}), 0);
    EXPECT_EQ(t.Close(false), 0);
    EXPECT_EQ(t.Close(false), 0);  // a second close does nothing
  }
  EXPECT_FALSE(ZQFileProxy::fileExists(path.c_str()));
  EXPECT_FALSE(ZQFileProxy::fileExists(ScratchPath("nokeep.dbt").c_str()));
  // Append mode: the table stays with what was written.
  path = Numbered("nokeep_append.dbf", 1, {});
  {
    Target t(2, 1);
    t.Add('C', "PHYS", 6);
    ASSERT_EQ(t.Open(path), 0);
    ASSERT_EQ(t.Put({"kept"}), 0);
    EXPECT_EQ(t.Close(false), 0);
  }
  EXPECT_EQ(LiveColumn(path), (Lines{"p0", "kept"}));
  // A failed open leaves nothing to close.
  Target t(2, 0);
  t.Add('C', "PHYS", 6);
  EXPECT_EQ(t.Open(""), ZQ_NO_FILENAME);
  EXPECT_EQ(t.Close(false), 0);
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
  // Records: the table stops growing and the write that meets it fails with
  // dbput's error; no crash, no hang.
  std::string path = ScratchPath("full.dbf");
  int status = WithFileSizeLimit(20000, [&] {
    Target t(2, 0);
    LogCapture log;
    t.Add('C', "TEXT", 200);
    if (t.Open(path) != 0) return 2;
    for (int i = 0; i < 5000; ++i) {
      t.Set(0, "some text of a record");
      BATCHERR rc = t.Write();
      if (rc != 0) return rc == ZQ_WRITE_ERROR && log.Last() == "Error -1 returned from dbput" ? 0 : 3;
    }
    return 4;  // never failed
  });
  EXPECT_EQ(status, 0);
  // Memos: the memo file stops growing first.
  path = ScratchPath("fullmemo.dbf");
  status = WithFileSizeLimit(20000, [&] {
    Target t(2, 0);
    LogCapture log;
    t.Add('M', "NOTE");
    if (t.Open(path) != 0) return 2;
    const std::string text(3000, 'm');
    for (int i = 0; i < 500; ++i) {
      t.Set(0, text.c_str());
      BATCHERR rc = t.Write();
      if (rc != 0) return rc == ZQ_WRITE_ERROR && log.Last() == "Error adding memo" ? 0 : 3;
    }
    return 4;
  });
  EXPECT_EQ(status, 0);
}

}  // namespace
