#include "engine/table_output.h"

#include "engine/dbf_source.h"
#include "engine/report.h"
#include "host/journal.h"

#include <dirent.h>
#include <signal.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {

// The owner's process id of a scratch entry named ".zqdb-PID-...", or 0.
pid_t StagingOwner(const char* name) {
  if (strncmp(name, kStagingPrefix, strlen(kStagingPrefix)) != 0) return 0;
  char* end = nullptr;
  long pid = strtol(name + strlen(kStagingPrefix), &end, 10);
  return pid > 0 && *end == '-' ? pid_t(pid) : 0;
}

// Removes a scratch directory and the files in it (it holds no directories).
void RemoveScratch(const std::string& dir) {
  if (DIR* d = opendir(dir.c_str())) {
    while (struct dirent* e = readdir(d))
      if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0) unlink((dir + "/" + e->d_name).c_str());
    closedir(d);
  }
  rmdir(dir.c_str());
}

}  // namespace

bool VerifyTable(const std::string& path, const TableConnector& c, const std::string& dialect,
                 const TableWriteOptions& opts, int64_t expected, std::string* message, int64_t* end_mark) {
  SourcePtr check = NewTableSource(c);
  if (!check) return *message = "out of memory", false;
  ApplyDialect(check.get(), dialect);
  check->SetOption("codepage", std::to_string(ModuleCodePage(opts.codepage)).c_str());
  check->SetOption("ignorememoerr", std::to_string(opts.memo_policy).c_str());
  ZQConnTarget t;
  t.path = path.c_str();
  BATCHERR rc = check->SetUserInfo(t);
  if (rc == 0) rc = check->MakeFields();
  int64_t count = rc == 0 ? check->EstimateRecordCount() : -1;
  // Where the end mark stands: header length plus count times record length.
  int64_t end = -1;
  if (rc == 0) {
    ZQString text;
    check->ReportFacts(text);
    std::string facts(text.c_str(), size_t(text.length()));
    int64_t header = FactNumber(facts, "header"), record = FactNumber(facts, "record");
    if (header >= 0 && record >= 0 && count >= 0) end = header + count * record;
  }
  if (end_mark != nullptr) *end_mark = end;
  // The last record by number, which is the last one written unless the
  // table holds deleted records (then there are fewer live ones: 1 is fine).
  if (rc == 0 && count == expected && expected > 0) {
    rc = check->GetRecord(int32_t(expected - 1));
    if (rc == ZQ_END) rc = 0;
  }
  check->ConnectionClose();
  if (rc == 0 && count == expected) return true;
  *message = "the table was not written whole (" + std::to_string(count) + " of " + std::to_string(expected) +
             " records readable): the disk may be full or the file too large";
  return false;
}

void RemoveDeadStaging(const std::string& dst) {
  size_t slash = dst.rfind('/');
  std::string dir = slash == std::string::npos ? "." : dst.substr(0, slash == 0 ? 1 : slash);
  DIR* d = opendir(dir.c_str());
  if (d == nullptr) return;
  std::vector<std::string> dead;
  while (struct dirent* e = readdir(d)) {
    pid_t owner = StagingOwner(e->d_name);
    // ESRCH: no such process. A process of another user (EPERM) is alive.
    if (owner != 0 && owner != getpid() && kill(owner, 0) != 0 && errno == ESRCH) dead.push_back(e->d_name);
  }
  closedir(d);
  for (const std::string& name : dead) {
    struct stat st;
    std::string full = dir + "/" + name;
    if (lstat(full.c_str(), &st) == 0 && S_ISDIR(st.st_mode)) RemoveScratch(full);
  }
}

bool TrimToEndMark(const std::string& path, int64_t end) {
  struct stat st;
  if (end < 0 || stat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode) || st.st_size <= end + 1) return true;
  FILE* f = fopen(path.c_str(), "rb");
  int mark = f != nullptr && fseek(f, long(end), SEEK_SET) == 0 ? fgetc(f) : EOF;
  if (f != nullptr) fclose(f);
  return mark != 0x1A || truncate(path.c_str(), off_t(end + 1)) == 0;
}

bool Staging::Begin(const std::string& dst, std::string* work, std::string* error) {
  size_t slash = dst.rfind('/');
  dir_ = slash == std::string::npos ? "." : dst.substr(0, slash == 0 ? 1 : slash);
  std::string base = slash == std::string::npos ? dst : dst.substr(slash + 1);
  std::string tmpl = dir_ + "/" + kStagingPrefix + std::to_string(getpid()) + "-XXXXXX";
  std::vector<char> buf(tmpl.begin(), tmpl.end());
  buf.push_back('\0');
  if (mkdtemp(buf.data()) == nullptr) {
    *error = "cannot create " + dst + ": " + strerror(errno);
    return false;
  }
  staging_ = buf.data();
  name_ = base;
  *work = staging_ + "/" + base;
  return true;
}

bool Staging::Commit(bool new_only, std::string* error) {
  std::vector<std::string> names = Entries();
  // The table first: with `new_only` its link decides whether anything moves.
  std::stable_partition(names.begin(), names.end(), [&](const std::string& n) { return n == name_; });
  // Checked before the first rename: a destination that is a directory, or
  // a file the user may not write (as cp refuses it), stops the move with
  // nothing moved.
  for (const std::string& name : names) {
    std::string to = dir_ + "/" + name;
    struct stat st;
    if (lstat(to.c_str(), &st) != 0) continue;
    if (S_ISDIR(st.st_mode)) {
      *error = "cannot replace " + to + ": it is a directory";
    } else if (access(to.c_str(), W_OK) != 0) {
      *error = "cannot replace " + to + ": " + strerror(errno);
    } else {
      // A replaced file keeps its mode.
      chmod((staging_ + "/" + name).c_str(), st.st_mode & 07777);
      continue;
    }
    Discard();
    return false;
  }
  // Each file replaced is kept as a hard link in the scratch directory until
  // all are moved, so that a rename that fails half-way is undone.
  struct Moved {
    std::string to, kept;
  };
  std::vector<Moved> moved;
  bool ok = true;
  for (const std::string& name : names) {
    std::string from = staging_ + "/" + name, to = dir_ + "/" + name, kept = staging_ + "/.old-" + name;
    if (new_only && name == name_) {
      if (link(from.c_str(), to.c_str()) != 0) {
        *error = errno == EEXIST ? (dir_ == "." ? name : to) + " was made by another program while this run wrote it; nothing was added "
                                       "(run again to add to it)"
                                 : "cannot move " + name + " into " + dir_ + ": " + strerror(errno);
        ok = false;
        break;
      }
      moved.push_back({to, ""});
      continue;
    }
    bool had = link(to.c_str(), kept.c_str()) == 0;
    if (rename(from.c_str(), to.c_str()) != 0) {
      *error = "cannot move " + name + " into " + dir_ + ": " + strerror(errno);
      if (had) unlink(kept.c_str());
      ok = false;
      break;
    }
    moved.push_back({to, had ? kept : ""});
  }
  if (!ok)
    for (const Moved& m : moved) {
      if (m.kept.empty()) unlink(m.to.c_str());
      else rename(m.kept.c_str(), m.to.c_str());
    }
  Discard();
  return ok;
}

void Staging::Discard() {
  if (staging_.empty()) return;
  RemoveScratch(staging_);
  staging_.clear();
}

std::vector<std::string> Staging::Entries() const {
  std::vector<std::string> names;
  if (DIR* d = opendir(staging_.c_str())) {
    while (struct dirent* e = readdir(d))
      if (strcmp(e->d_name, ".") != 0 && strcmp(e->d_name, "..") != 0) names.push_back(e->d_name);
    closedir(d);
  }
  return names;
}

namespace {

// The directory and file name of `path`.
void DirAndName(const std::string& path, std::string* dir, std::string* name) {
  size_t slash = path.rfind('/');
  *dir = slash == std::string::npos ? "." : path.substr(0, slash == 0 ? 1 : slash);
  *name = slash == std::string::npos ? path : path.substr(slash + 1);
}

const char kJournalTag[] = "-journal-";

}  // namespace

bool UndoRun::Begin(const std::string& table, std::string* error) {
  std::string dir, name;
  DirAndName(table, &dir, &name);
  std::string path = dir + "/" + kStagingPrefix + std::to_string(getpid()) + kJournalTag + name;
  if (!journal::Begin(path)) return *error = "cannot write " + dir + ": " + strerror(errno), false;
  active_ = true;
  return true;
}

bool UndoRun::Restore(std::string* error) {
  if (!active_) return true;
  active_ = false;
  std::string e;
  if (journal::RestoreActive(&e)) return true;
  if (error != nullptr) *error = e;
  return false;
}

void UndoRun::Commit() {
  if (active_) journal::Commit();
  active_ = false;
}

std::vector<std::string> InterruptedJournals(const std::string& table) {
  std::string dir, name;
  DirAndName(table, &dir, &name);
  std::vector<std::string> found;
  DIR* d = opendir(dir.c_str());
  if (d == nullptr) return found;
  while (struct dirent* e = readdir(d)) {
    pid_t owner = StagingOwner(e->d_name);
    const char* tag = owner != 0 ? strstr(e->d_name, kJournalTag) : nullptr;
    if (tag == nullptr || name != tag + strlen(kJournalTag)) continue;
    if (owner != getpid() && kill(owner, 0) != 0 && errno == ESRCH) found.push_back(dir + "/" + e->d_name);
  }
  closedir(d);
  return found;
}

bool RecoverInterrupted(const std::string& table, std::string* error) {
  for (const std::string& j : InterruptedJournals(table)) {
    if (!journal::Restore(j, error)) return false;
    Warn(table + " was restored to what it was before a run that was interrupted");
  }
  return true;
}
