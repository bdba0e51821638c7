#include "engine/table_output.h"

#include <dirent.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

bool VerifyTable(const std::string& path, const TableConnector& c, const std::string& dialect,
                 const TableWriteOptions& opts, int64_t expected, std::string* message) {
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

bool Staging::Begin(const std::string& dst, std::string* work, std::string* error) {
  size_t slash = dst.rfind('/');
  dir_ = slash == std::string::npos ? "." : dst.substr(0, slash == 0 ? 1 : slash);
  std::string base = slash == std::string::npos ? dst : dst.substr(slash + 1);
  std::string tmpl = dir_ + "/.zqdb-XXXXXX";
  std::vector<char> buf(tmpl.begin(), tmpl.end());
  buf.push_back('\0');
  if (mkdtemp(buf.data()) == nullptr) {
    *error = "cannot create " + dst + ": " + strerror(errno);
    return false;
  }
  staging_ = buf.data();
  *work = staging_ + "/" + base;
  return true;
}

bool Staging::Commit(std::string* error) {
  bool ok = true;
  for (const std::string& name : Entries())
    if (rename((staging_ + "/" + name).c_str(), (dir_ + "/" + name).c_str()) != 0) {
      *error = "cannot move " + name + " into " + dir_ + ": " + strerror(errno);
      ok = false;
    }
  Discard();
  return ok;
}

void Staging::Discard() {
  if (staging_.empty()) return;
  for (const std::string& name : Entries()) unlink((staging_ + "/" + name).c_str());
  rmdir(staging_.c_str());
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
