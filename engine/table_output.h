// Making a table as a conversion's target: the check after close, and the
// scratch directory a replaced table is built in.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "engine/endpoints.h"

// Reopens a table just written and checks that it holds `expected` records
// and that the last of them reads: a write that failed only when the last
// buffered bytes reached the disk (a full disk, a file size limit) shows
// here, since closing a table reports nothing.
// `end_mark`, when given, gets the offset the end mark stands at (-1 when
// the table didn't open).
bool VerifyTable(const std::string& path, const TableConnector& c, const std::string& dialect,
                 const TableWriteOptions& opts, int64_t expected, std::string* message,
                 int64_t* end_mark = nullptr);

// A table that records were added to ends at its end mark: bytes behind it
// (the records of a run that was killed before it wrote the header's count)
// would be read as records by programs that go by the file's length, and
// would outlive every later append. Cuts the file behind the 0x1A at `end`;
// a file without the mark there is left as it is. False when the cut failed.
bool TrimToEndMark(const std::string& path, int64_t end);

// Scratch directories and files are named ".zqdb-PID-...", PID the process
// that made them.
constexpr char kStagingPrefix[] = ".zqdb-";

// Removes the scratch directories beside `dst` whose process is gone (a
// killed run leaves its own behind).
void RemoveDeadStaging(const std::string& dst);

// A replaced table is built in a scratch directory beside the target and
// moved into place when it is whole, so that a failed run leaves the old
// table and its memo file as they were.
class Staging {
 public:
  ~Staging() { Discard(); }
  // Makes the scratch directory; `work` is the path to build the table at.
  bool Begin(const std::string& dst, std::string* work, std::string* error);
  // Moves every file made into the target's directory. With `new_only` the
  // table must not exist there by then (it is moved first, by a link that
  // fails on an existing file), and nothing is moved if it does.
  bool Commit(bool new_only, std::string* error);
  void Discard();

 private:
  std::vector<std::string> Entries() const;
  std::string dir_, name_, staging_;
};

// The undo journal of a run that changes a table in place (append, update):
// the table, memo and index files get back their bytes and lengths of before
// the run when it fails or is killed. The journal lies beside the table as
// ".zqdb-PID-journal-NAME".
class UndoRun {
 public:
  UndoRun() = default;
  ~UndoRun() { Restore(nullptr); }
  UndoRun(const UndoRun&) = delete;
  UndoRun& operator=(const UndoRun&) = delete;
  bool Begin(const std::string& table, std::string* error);
  // Puts the files back, once they are closed. False with `error` set when
  // that failed (the journal then stays for the next run).
  bool Restore(std::string* error);
  void Commit();

 private:
  bool active_ = false;
};

// Restores `table` from the journal of a run whose process is gone, if one
// lies beside it; a warning says so. False with `error` set when the journal
// couldn't be put back.
bool RecoverInterrupted(const std::string& table, std::string* error);
// The journals of runs on `table` whose process is gone.
std::vector<std::string> InterruptedJournals(const std::string& table);
