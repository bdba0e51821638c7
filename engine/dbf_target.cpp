// Tables as targets: the module's target spoke, in the dialect asked for or
// the one the records come in, built in a scratch directory when it replaces
// a table, and read back once written.
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <cstdlib>
#include <string>
#include <vector>

#include "engine/endpoints.h"
#include "engine/indexes.h"
#include "engine/report.h"
#include "engine/table_output.h"

namespace {

class TableTarget : public Target {
 public:
  TableTarget(TargetPtr spoke, const std::string& path, const TableConnector& connector, const WriteOptions& opts)
      : Target(std::move(spoke), path),
        connector_(connector),
        opts_(opts),
        existing_(opts.mode != 0 && access(path.c_str(), F_OK) == 0) {}

  ~TableTarget() override {
    // A run that didn't finish leaves no index file it made outside the
    // scratch directory (NDX and IDX files go where they are named).
    if (!finished_)
      for (const std::string& made : made_index_files_) unlink(made.c_str());
  }

  bool AddsToExisting() const override { return existing_; }
  bool KeepsBlankLogicals() const override { return false; }
  int TextCodePage() const override { return opts_.table.codepage; }

  bool Open(std::string* error) override {
    RemoveDeadStaging(path_);
    if (existing_) before_ = CountRecords();
    if (!AddIndexDefinitions(spoke_.get(), opts_.table, existing_, error)) return false;
    for (const IndexOption& o : opts_.table.indexes)
      if (o.name.find('.') != std::string::npos && access(o.name.c_str(), F_OK) != 0) made_index_files_.push_back(o.name);
    if (existing_) WarnStaleIndexes();
    // A new table is built aside in every mode. An append or update that
    // makes the table moves it into place only if no other run made it
    // meanwhile: two appends to a table that didn't exist would otherwise
    // each make it, and the second would replace the first's records.
    if (!existing_ && !staging_.Begin(path_, &work_, error)) return false;
    return Target::Open(error);
  }

  bool Finish(int64_t added, std::string* error) override {
    ZQString v;
    spoke_->GetOption("version", v);
    int64_t end = -1;
    if (!VerifyTable(work_, connector_, v.c_str(), opts_.table, before_ + added, error, &end)) return false;
    if (existing_) {
      if (!TrimToEndMark(work_, end)) return *error = "cannot cut " + path_ + " at its end mark: " + strerror(errno), false;
      // A table added to gets a .cpg file when it has none, like a new one.
      if (opts_.table.codepage != 0 && !HasSibling(path_, "cpg") && !WriteCpg(path_, opts_.table.codepage, error))
        return false;
      return finished_ = true;
    }
    // The code page is named in a .cpg file beside the table, moved into
    // place with it; an old one would name another code page.
    if (opts_.table.codepage != 0 && !WriteCpg(work_, opts_.table.codepage, error)) return false;
    bool staged_mdx = HasSibling(work_, "mdx"), staged_cdx = HasSibling(work_, "cdx");
    if (!staging_.Commit(opts_.mode != 0, error)) return false;
    // An MDX or CDX file of the target's name that the new table didn't
    // bring indexed the table just replaced: left there, it would be taken
    // for this table's and get its keys added to the old ones.
    if (!staged_mdx) RemoveOld("mdx", "the index file");
    if (!staged_cdx) RemoveOld("cdx", "the index file");
    if (opts_.table.codepage == 0) RemoveOld("cpg", "the code page file");
    return finished_ = true;
  }

 private:
  // The records the table holds before the run, to check the count after it.
  int64_t CountRecords() {
    int64_t count = 0;
    SourcePtr old = NewTableSource(connector_);
    ZQString v;
    spoke_->GetOption("version", v);
    if (old) {
      ApplyDialect(old.get(), v.c_str());
      old->SetOption("ignorememoerr", "2");
      ZQConnTarget o;
      o.path = path_.c_str();
      if (old->SetUserInfo(o) == 0 && old->MakeFields() == 0) count = old->EstimateRecordCount();
      old->ConnectionClose();
    }
    return count;
  }

  // Removes the file of the target's name with the extension `ext`, which
  // belonged to the table just replaced (`what` it was, for the warning).
  void RemoveOld(const char* ext, const char* what) {
    std::string base = path_;
    size_t dot = base.rfind('.');
    if (dot != std::string::npos && base.find('/', dot) == std::string::npos) base.resize(dot);
    std::string upper = ext;
    for (char& c : upper) c = char(toupper(static_cast<unsigned char>(c)));
    for (const std::string& old : {base + "." + ext, base + "." + upper})
      if (access(old.c_str(), F_OK) == 0 && unlink(old.c_str()) == 0)
        Warn("removed " + old + ", " + what + " of the table this one replaced");
  }

  // Appends keep the table's MDX tags (dBASE) or CDX tags (FoxPro) current;
  // other index files of the table's name beside it, and any production
  // index of a dialect without index files, stay as they were: one line
  // says so before records are added.
  void WarnStaleIndexes() {
    ZQString v;
    spoke_->GetOption("version", v);
    IndexKind kind = IndexKindOf(atoi(v.c_str()));
    std::string found;
    for (const char* ext : {"mdx", "cdx", "ndx", "ntx", "idx"}) {
      if ((kind == IndexKind::kDbase && ext[0] == 'm') || (kind == IndexKind::kFox && ext[0] == 'c')) continue;
      if (HasSibling(path_, ext)) found += std::string(found.empty() ? "" : ", ") + "." + ext;
    }
    unsigned char header[32] = {};
    FILE* f = fopen(path_.c_str(), "rb");
    bool production = kind == IndexKind::kNone && f != nullptr && fread(header, 1, sizeof header, f) == sizeof header &&
                      (header[28] & 1) != 0;
    if (f != nullptr) fclose(f);
    if (found.empty() && !production) return;
    Warn(path_ + " has " + (found.empty() ? std::string("a production index") : "index files (" + found + ")") +
         " that this dialect doesn't keep: they will be out of date");
  }

  TableConnector connector_;
  WriteOptions opts_;
  std::vector<std::string> made_index_files_;
  bool finished_ = false;
  bool existing_;
  int64_t before_ = 0;
  Staging staging_;
};

}  // namespace

std::unique_ptr<Target> MakeTableTarget(const std::string& path, const WriteOptions& opts, ZQImport* source,
                                        std::string* error) {
  TableConnector connector;
  if (!ResolveConnector(opts.table.type, &connector, error)) return nullptr;
  TargetPtr spoke = NewTableTarget(connector);
  if (!spoke) return *error = "out of memory", nullptr;
  // The dialect: the one asked for, else the definition's, else an existing
  // table's own when records are added to it, else the source's.
  std::string dialect = opts.table.dialect;
  if (dialect.empty() && !connector.def->option_text.empty()) {
    ZQString v;
    spoke->GetOption("version", v);
    dialect = v.c_str();
  }
  if (dialect.empty() && opts.mode != 0 && access(path.c_str(), F_OK) == 0)
    dialect = std::to_string(TableDialect(path));
  if (dialect.empty()) {
    ZQString v;  // a source that is no table has no version: dBASE IV
    dialect = source->GetOption("version", v) == 0 ? v.c_str() : "2";
  }
  if (!ApplyDialect(spoke.get(), dialect)) return *error = "unknown dialect: " + dialect, nullptr;
  WriteOptions resolved = opts;
  // The code page: the one asked for, else an existing table's own when
  // records are added to it; else none (RunConvert passes the source's).
  if (resolved.table.codepage == kCodePageUnset)
    resolved.table.codepage =
        opts.mode != 0 && access(path.c_str(), F_OK) == 0 ? ChooseCodePage(path, kCodePageUnset).codepage : 0;
  // Text reaches the module already in the table's code page (the field
  // plan converts it): the index keys the module builds from the record are
  // then the bytes the record holds, as other programs build them, and the
  // update's keys of the records read back compare in the same bytes.
  spoke->SetOption("codepage", "0");
  char buf[16];
  snprintf(buf, sizeof buf, "%d", opts.table.memo_policy);
  spoke->SetOption("ignorememoerr", buf);
  return std::make_unique<TableTarget>(std::move(spoke), path, connector, resolved);
}

bool ReadTableLayout(const std::string& path, const WriteOptions& opts, ZQRecord* out) {
  if (access(path.c_str(), F_OK) != 0) return false;
  TableConnector c;
  std::string error;
  if (!ResolveConnector(opts.table.type, &c, &error)) return false;
  TargetPtr probe = NewTableTarget(c);
  if (!probe) return false;
  if (!opts.table.dialect.empty()) ApplyDialect(probe.get(), opts.table.dialect);
  ZQConnTarget d;
  d.path = path.c_str();
  return probe->MakeFields(*out, d) == 0;
}
