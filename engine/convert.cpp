#include "engine/convert.h"

#include <unistd.h>

#include <climits>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string>

#include "engine/check.h"
#include "engine/dbf_source.h"
#include "engine/aliases.h"
#include "engine/field_plan.h"
#include "engine/report.h"
#include "engine/target_path.h"
#include "engine/table_lock.h"
#include "engine/table_output.h"
#include "host/journal.h"
#include "engine/transfer.h"

namespace {

// The file a failed write was to, as the user knows it: a file of the
// scratch directory by the name it was to take, one of the current directory
// without its path; `dst` when the file is unknown or is zqdb's own.
std::string WrittenFile(const std::string& dst) {
  std::string file = journal::LastWriteFile();
  size_t slash = file.rfind('/');
  if (file.empty() || slash == std::string::npos || file.find(kStagingPrefix, slash) == slash + 1) return dst;
  size_t scratch = file.rfind(std::string("/") + kStagingPrefix, slash - 1);
  if (scratch != std::string::npos && scratch < slash) file.erase(scratch, slash - scratch);
  char cwd[PATH_MAX];
  if (getcwd(cwd, sizeof cwd) != nullptr && file.compare(0, strlen(cwd) + 1, std::string(cwd) + "/") == 0)
    file.erase(0, strlen(cwd) + 1);
  return file;
}

}  // namespace

int RunConvert(const std::string& src, const std::string& named, const ConvertOptions& opts) {
  const Endpoint& to = opts.target != nullptr ? *opts.target
                       : named != "-"        ? TargetEndpoint(named)
                                             : *FindEndpoint(opts.stdout_jsonl ? "jsonl" : "csv");
  std::string dst, error;
  if (!ResolveTargetPath(named, strcmp(to.name, "dbf") == 0, &dst, &error)) return Fail(error);
  const Endpoint& from = SourceEndpoint(src);
  bool table_source = strcmp(from.name, "dbf") == 0, table_target = strcmp(to.name, "dbf") == 0;
  std::vector<std::string> index_files;  // --index NAME=EXPR with a file name
  for (const IndexOption& o : opts.write.table.indexes)
    if (o.name.find('.') != std::string::npos) index_files.push_back(o.name);
  if (!CheckNoAlias(src, table_source, dst, table_target, index_files, &error)) return Fail(error);
  // The tables are locked for the whole run, before anything of them is
  // read: the target exclusively, a table source shared.
  TableLocks locks;
  if (table_source) locks.Add(src, false);
  if (table_target) locks.Add(dst, true);
  if (!locks.Take(opts.wait, &error)) return Fail(error);
  // A table the user may not write is neither replaced nor added to, as cp
  // refuses it (the directory would let a replace through).
  if (table_target && access(dst.c_str(), F_OK) == 0 && access(dst.c_str(), W_OK) != 0)
    return Fail("cannot write " + dst + ": " + strerror(errno));
  // A run on this table that was killed left its journal: put back first.
  if (table_target && !RecoverInterrupted(dst, &error)) return Fail(error);
  // Declared before the spokes, so that the files are closed before it
  // restores them.
  UndoRun undo;
  ReadOptions read = opts.read;
  WriteOptions write = opts.write;
  // A table's code page is chosen once, here: a new table written from it
  // keeps it unless --to-codepage says otherwise.
  if (table_source) read.table.codepage = ChooseCodePage(src, read.table.codepage).codepage;
  if (write.table.codepage == kCodePageUnset && (write.mode == 0 || access(dst.c_str(), F_OK) != 0))
    write.table.codepage = table_source ? read.table.codepage : 0;
  if (write.mode != 0 && to.read_layout != nullptr)
    read.into = [&](ZQRecord* layout) { return to.read_layout(dst, write, layout); };
  SourcePtr source;
  if (!from.open_source(src, read, &source, &error)) return Fail(error);
  std::vector<int> select;
  if (!SelectFieldsByName(*source->GetLayout(0), opts.fields, &select, &error)) {
    fprintf(stderr, "zqdb: %s (zqdb --help shows the usage)\n", error.c_str());
    return 2;
  }
  std::unique_ptr<Target> target = to.make_target(dst, write, source.get(), &error);
  if (!target) return Fail(error);
  ZQExport* spoke = target->spoke();
  auto mode = ZQSpoke::SpokeMode(opts.write.mode);
  if (!spoke->SupportMode(mode)) return Fail("the target does not support this mode");
  spoke->SetMode(mode);

  FieldPlan plan;
  if (!plan.Make(*source->GetLayout(0), spoke, dst, target->AddsToExisting(), select, &error)) return Fail(error);
  plan.SetTextCodePage(target->TextCodePage(), write.table.strict);
  plan.CheckWidths(strcmp(to.name, "dbf") == 0);
  std::vector<int> key;
  if (!plan.FindKey(opts.key, &key, &error)) return Fail(error);
  if (opts.write.mode == 2 && key.empty()) return Fail("update mode needs --key");
  // Under --strict a warning of the layout stops the run before any output.
  if (WarningsFail()) return FlushWarnings(), Fail("nothing was written: --strict makes the warnings above errors");
  // Append and update change a table in place: every value is checked
  // before the first byte is written, so that a bad one leaves the table,
  // its memo file and its index files as they were.
  if (target->AddsToExisting() && !CheckValues(source.get(), plan, &error)) return Fail(error);

  // (A SQLite database keeps its own journal.)
  if (table_target && target->AddsToExisting() && !undo.Begin(dst, &error)) return Fail(error);
  if (!target->Open(&error)) return Fail(error);
  std::unique_ptr<KeyedRecords> keyed;
  if (opts.write.mode == 2) {
    keyed = std::make_unique<KeyedRecords>(key);
    if (!keyed->Load(spoke, plan.out(), &error)) {
      spoke->_CloseOutput(true);
      return Fail(error);
    }
  }
  TransferCounts counts;
  bool ok = Transfer(source.get(), spoke, plan, keyed.get(), opts.progress, &counts, &error);
  if (!ok && std::string(from.name) == "dbf") error = ExplainTableError(src, error);
  // Values changed on the way are told before the output is kept, so that
  // --strict can refuse it.
  if (ok) plan.WarnLosses(target->KeepsBlankLogicals());
  if (ok && WarningsFail()) {
    ok = false;
    error = "nothing was written: --strict makes the warnings above errors";
    FlushWarnings();
  }
  if (spoke->_CloseOutput(ok) != 0 && ok) {
    ok = false;
    error = spoke->LastErrorMessage();
  }
  source->ConnectionClose();
  if (ok) ok = target->Finish(counts.added, &error);
  if (!ok) {
    // A write that failed says why (the module only counts it).
    if (int e = journal::LastWriteError()) error = "cannot write " + WrittenFile(dst) + ": " + strerror(e);
    std::string undo_error;
    if (!undo.Restore(&undo_error)) error += "; and restoring it failed: " + undo_error;
    else if (target->AddsToExisting()) error += " (the table was left as it was before the run)";
    return Fail(error);
  }
  undo.Commit();
  if (opts.write.mode == 2)
    fprintf(stderr, "zqdb: %lld records updated, %lld added\n", static_cast<long long>(counts.updated),
            static_cast<long long>(counts.added));
  if (opts.write.mode == 2 && counts.updated > 0 && &to == FindEndpoint("dbf")) {
    // A record replaced in place gets its new key beside the old one in each
    // tag, and the old key would go on finding it: the tags are built again
    // from the records.
    SourceOptions table;
    table.type = opts.write.table.type;
    table.dialect = opts.write.table.dialect;
    table.codepage = opts.write.table.codepage;
    std::string rebuilt;
    if (!RebuildTags(dst, table, &rebuilt, &error))
      return Fail("the records are written, but the indexes could not be rebuilt: " + error);
    if (!rebuilt.empty()) fprintf(stderr, "zqdb: %s (an update leaves each replaced record's old key behind)\n", rebuilt.c_str());
  }
  return 0;
}
