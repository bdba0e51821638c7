#include "engine/endpoints.h"

#include <cerrno>
#include <cstring>

#include "engine/text_util.h"

namespace {

// The formats. Tables come last: their row takes any name the others leave.
const Endpoint kEndpoints[] = {
    {"csv", ".csv", OpenCsvSource, MakeCsvTarget, nullptr},
    {"jsonl", ".jsonl .json", nullptr, MakeJsonlTarget, nullptr},
    {"sqlite", ".sqlite .sqlite3 .db3", OpenSqliteSource, MakeSqliteTarget, ReadSqliteLayout},
    {"pgsql", ".sql .pgsql", nullptr, MakePgsqlTarget, nullptr},
    {"dbf", "", OpenTableSource, MakeTableTarget, ReadTableLayout},
};

bool Claims(const Endpoint& e, const std::string& path) {
  std::string name = Lower(path);
  const char* p = e.extensions;
  while (*p != '\0') {
    const char* end = strchr(p, ' ');
    size_t n = end ? size_t(end - p) : strlen(p);
    if (n > 0 && name.size() >= n && name.compare(name.size() - n, n, p, n) == 0) return true;
    p += n + (end != nullptr);
  }
  return false;
}

const Endpoint& ByName(const std::string& path, bool source) {
  for (const Endpoint& e : kEndpoints)
    if ((source ? e.open_source != nullptr : e.make_target != nullptr) && Claims(e, path)) return e;
  return *FindEndpoint("dbf");
}

}  // namespace

const Endpoint& SourceEndpoint(const std::string& path) { return ByName(path, true); }
const Endpoint& TargetEndpoint(const std::string& path) { return ByName(path, false); }

const Endpoint* FindEndpoint(const std::string& name) {
  for (const Endpoint& e : kEndpoints)
    if (name == e.name) return &e;
  return nullptr;
}

std::vector<const Endpoint*> Endpoints() {
  std::vector<const Endpoint*> all;
  for (const Endpoint& e : kEndpoints) all.push_back(&e);
  return all;
}

bool Target::Open(std::string* error) {
  ZQConnTarget t;
  t.path = work_.c_str();
  if (spoke_->_OpenOutput(t) == 0) return true;
  std::string message = spoke_->LastErrorMessage();
  // A scratch path means nothing to the user.
  size_t at = message.find(work_);
  if (work_ != path_ && at != std::string::npos) message.replace(at, work_.size(), path_);
  if (message.empty()) message = "cannot create " + path_ + (errno ? std::string(": ") + strerror(errno) : "");
  *error = message;
  return false;
}
