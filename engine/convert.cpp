#include "engine/convert.h"

#include <dirent.h>
#include <unistd.h>

#include <cerrno>

#include <cctype>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <unordered_map>
#include <vector>

#include "engine/convert_layout.h"
#include "engine/convert_values.h"
#include "engine/csv_source.h"
#include "engine/text_target.h"
#include "engine/table_output.h"
#include "engine/text_types.h"
#include "engine/text_util.h"
#include "host/zqutil.h"

namespace {

bool EndsWith(const std::string& s, const std::string& tail) {
  return s.size() >= tail.size() && Lower(s.substr(s.size() - tail.size())) == tail;
}

void Warn(const std::string& message) { fprintf(stderr, "zqdb: warning: %s\n", message.c_str()); }

int Fail(const std::string& message) {
  fprintf(stderr, "zqdb: %s\n", message.c_str());
  return 1;
}

// Progress on standard error, only on a terminal and only once a run has
// taken a second.
class Progress {
 public:
  explicit Progress(bool enabled) : enabled_(enabled && isatty(STDERR_FILENO)) {}
  void Tick(int64_t n) {
    if (!enabled_ || (n & 4095) != 0) return;
    auto now = std::chrono::steady_clock::now();
    if (now - start_ < std::chrono::seconds(1) || now - last_ < std::chrono::milliseconds(250)) return;
    last_ = now;
    shown_ = true;
    fprintf(stderr, "\r%lld records", static_cast<long long>(n));
  }
  ~Progress() {
    if (shown_) fprintf(stderr, "\r\033[K");
  }

 private:
  bool enabled_;
  bool shown_ = false;
  std::chrono::steady_clock::time_point start_ = std::chrono::steady_clock::now(), last_ = start_;
};

void DeleteImport(ZQImport* s) { delete s; }
void DeleteExport(ZQExport* s) { delete s; }

}  // namespace

int RunConvert(const std::string& src, const std::string& dst, const ConvertOptions& opts) {
  // Source.
  SourcePtr source;
  bool csv_source = EndsWith(src, ".csv");
  if (csv_source) {
    SourcePtr csv(new ZQFromCsv(), SourceDeleter{DeleteImport});
    if (!opts.schema.empty()) {
      std::vector<SchemaField> schema;
      std::string error;
      if (!ParseSchema(opts.schema, &schema, &error)) return Fail(error);
      static_cast<ZQFromCsv*>(csv.get())->SetSchema(schema);
    }
    // Records that go to an existing table take the types of its fields, so
    // that a column is read as what it will be stored as ("y" in a text
    // field stays "y", not a logical).
    bool into_table = !EndsWith(dst, ".csv") && !EndsWith(dst, ".jsonl") && !EndsWith(dst, ".json");
    if (into_table && opts.mode != 0 && access(dst.c_str(), F_OK) == 0) {
      TableConnector c;
      std::string error;
      if (ResolveConnector(opts.source.type, &c, &error)) {
        TargetPtr probe = NewTableTarget(c);
        ZQRecord layout;
        ZQConnTarget d;
        d.path = dst.c_str();
        if (probe && !opts.to.empty()) ApplyDialect(probe.get(), opts.to);
        if (probe && probe->MakeFields(layout, d) == 0) {
          std::vector<SchemaField> hints;
          for (int i = 0; i < layout.FieldCount(); ++i) {
            ZQField* f = layout[i];
            char letter = char(f->DataType().Usage());
            if (letter == 'G' || (letter == 'B' && f->FieldType() != FT_FLOAT)) letter = 'M';
            if (strchr("CNFDLMIYBT", letter) == nullptr || letter == 0) letter = 'C';
            int length = letter == 'C' || letter == 'N' || letter == 'F' ? f->Length() : 0;
            hints.push_back(SchemaField{f->Name(), letter, length, f->DecLen()});
          }
          static_cast<ZQFromCsv*>(csv.get())->SetTypeHints(hints);
        }
      }
    }
    ZQConnTarget t;
    t.path = src.c_str();
    csv->SetUserInfo(t);
    if (csv->MakeFields() != 0) return Fail(csv->LastErrorMessage());
    source = std::move(csv);
  } else {
    std::string error;
    if (OpenSource(src, opts.source, &source, &error) != 0) return Fail(error);
  }
  ZQRecord& in = *source->GetLayout(0);

  // Target.
  TargetPtr target;
  bool dbf_target = true;
  TableConnector connector;
  if (EndsWith(dst, ".csv")) {
    target = TargetPtr(new ZQToText(OutputFormat::kCsv), TargetDeleter{DeleteExport});
    dbf_target = false;
  } else if (EndsWith(dst, ".jsonl") || EndsWith(dst, ".json")) {
    target = TargetPtr(new ZQToText(OutputFormat::kJsonl), TargetDeleter{DeleteExport});
    dbf_target = false;
  } else {
    std::string error;
    if (!ResolveConnector(opts.source.type, &connector, &error)) return Fail(error);
    target = NewTableTarget(connector);
  }
  if (!target) return Fail("out of memory");
  if (dbf_target) {
    std::string dialect = opts.to;
    if (dialect.empty() && !connector.def->option_text.empty()) {
      ZQString v;  // the definition named one
      target->GetOption("version", v);
      dialect = v.c_str();
    }
    // Records added to an existing table go in its own dialect.
    if (dialect.empty() && opts.mode != 0 && access(dst.c_str(), F_OK) == 0) dialect = std::to_string(GuessDialect(dst));
    if (dialect.empty()) {
      ZQString v;
      if (!csv_source && source->GetOption("version", v) == 0) dialect = v.c_str();
      else dialect = "2";
    }
    if (!ApplyDialect(target.get(), dialect)) return Fail("unknown dialect: " + dialect);
    char buf[16];
    snprintf(buf, sizeof buf, "%d", opts.source.codepage);
    target->SetOption("codepage", buf);
    snprintf(buf, sizeof buf, "%d", opts.source.memo_policy);
    target->SetOption("ignorememoerr", buf);
  } else if (opts.mode != 0) {
    return Fail("append and update modes need a table as the target");
  }
  auto mode = ZQSpoke::SpokeMode(opts.mode);
  if (!target->SupportMode(mode)) return Fail("the target does not support this mode");
  target->SetMode(mode);

  // Layout 0 of the target: an existing table's own when records are added
  // to it (source fields go to the fields of the same name), else one built
  // from the source's.
  ZQRecord& out = *target->GetLayout(0);
  out.ClearFields();
  ZQConnTarget t;
  t.path = dst.c_str();
  bool existing = dbf_target && opts.mode != 0 && access(dst.c_str(), F_OK) == 0;
  if (existing && target->MakeFields(out, t) != 0) {
    std::string message = target->LastErrorMessage();
    return Fail(message.empty() ? "cannot read the layout of " + dst : message);
  }
  int cap = target->MaxFieldCount();
  if (opts.mode == 0 || !existing) cap = std::min(cap, target->MaxNewFieldCount());
  std::vector<std::string> names;
  std::vector<FieldCheck> checks;
  std::vector<int> from;  // source field of each target field
  if (existing) {
    std::vector<bool> used(size_t(in.FieldCount()), false);
    for (int j = 0; j < out.FieldCount(); ++j) {
      ZQField* f = out[j];
      target->FormatSpokeField(f, nullptr);
      int match = -1;
      for (int i = 0; i < in.FieldCount() && match < 0; ++i)
        if (!used[size_t(i)] && (Lower(in[i]->Name()) == Lower(f->Name()) ||
                                 Lower(TargetName(target.get(), in[i]->Name(), {})) == Lower(f->Name())))
          match = i;
      if (match < 0) Warn(std::string("field ") + f->Name() + " of the table has no source field: left blank");
      else used[size_t(match)] = true;
      names.push_back(f->Name());
      checks.push_back(FieldCheck{char(f->DataType().Usage()), f->Length()});
      from.push_back(match);
    }
    for (int i = 0; i < in.FieldCount(); ++i)
      if (!used[size_t(i)]) Warn(std::string("field ") + in[i]->Name() + " is left out: the table has no such field");
  }
  for (int i = 0; i < in.FieldCount() && !existing; ++i) {
    ZQField* s = in[i];
    if (int(names.size()) == cap) {
      Warn(std::string("field ") + s->Name() + " and those behind it are left out: the target keeps " +
           std::to_string(cap) + " fields");
      break;
    }
    Planned plan;
    if (!PlanType(target.get(), s, &plan)) {
      Warn(std::string("field ") + s->Name() + " is left out: the target has no type for it");
      continue;
    }
    std::string name = TargetName(target.get(), s->Name(), names);
    if (name != s->Name()) Warn(std::string("field ") + s->Name() + " is named " + name + " in the target");
    if (!plan.change.empty()) Warn(std::string("field ") + s->Name() + ": " + plan.change);
    ZQField* f = out.NewField(plan.type, name.c_str());
    if (f == nullptr) return Fail("out of memory");
    target->FormatSpokeField(f, s);
    names.push_back(name);
    checks.push_back(FieldCheck{char(plan.type.Usage()), f->Length()});
    from.push_back(i);
  }
  int bad_field = -1;
  if (target->ValidateLocalRecord(out, bad_field) != 0)
    return Fail(std::string("records are too long for the target from field ") +
                (bad_field >= 0 && bad_field < out.FieldCount() ? out[bad_field]->Name() : "?") + " on");

  std::vector<int> key;
  for (const std::string& k : opts.key) {
    int found = -1;
    for (size_t i = 0; i < from.size(); ++i)
      if ((from[i] >= 0 && Lower(in[from[i]]->Name()) == Lower(k)) || Lower(names[i]) == Lower(k)) found = int(i);
    if (found < 0) return Fail("--key names no field: " + k);
    key.push_back(found);
  }
  if (opts.mode == 2 && key.empty()) return Fail("update mode needs --key");

  // Records a table holds before the run, to check the count after it.
  int64_t before = 0;
  if (existing) {
    SourcePtr old = NewTableSource(connector);
    ZQString v;
    target->GetOption("version", v);
    if (old) {
      ApplyDialect(old.get(), v.c_str());
      old->SetOption("ignorememoerr", "2");
      ZQConnTarget o;
      o.path = dst.c_str();
      if (old->SetUserInfo(o) == 0 && old->MakeFields() == 0) before = old->EstimateRecordCount();
      old->ConnectionClose();
    }
  }
  Staging staging;
  std::string work = dst;
  if (dbf_target && opts.mode == 0) {
    std::string error;
    if (!staging.Begin(dst, &work, &error)) return Fail(error);
    t.path = work.c_str();
  }
  if (target->_OpenOutput(t) != 0) {
    std::string message = target->LastErrorMessage();
    // The scratch path of a replaced table means nothing to the user.
    size_t at = message.find(work);
    if (work != dst && at != std::string::npos) message.replace(at, work.size(), dst);
    if (message.empty()) message = "cannot create " + dst + (errno ? std::string(": ") + strerror(errno) : "");
    return Fail(message);
  }

  // Update mode: one pass over the table maps each key to its position.
  std::unordered_map<std::string, int64_t> positions;
  int64_t live = 0;
  std::string k;
  if (opts.mode == 2) {
    ZQRecord scan(out);
    target->_Rewind();
    int64_t pos = 0;
    BATCHERR rc;
    while ((rc = target->GetRecord(scan, &pos)) == 0) {
      KeyOf(scan, key, &k);
      positions.emplace(k, pos);
      ++live;
    }
    if (rc != ZQ_END) {
      std::string message = target->LastErrorMessage();
      target->_CloseOutput(true);
      return Fail(message);
    }
  }

  Progress progress(opts.progress);
  BATCHERR rc = 0;
  int32_t n = 0;
  int64_t updated = 0, added = 0;
  std::string bad_value;
  auto fill = [&]() {
    for (size_t i = 0; i < from.size(); ++i) {
      if (from[i] < 0) {
        out[int(i)]->Blank();
      } else if (!CopyValue(out[int(i)], in[from[i]], &checks[i])) {
        const ZQString& v = in[from[i]]->StringRef();
        bad_value = "record " + std::to_string(n + 1) + ", field " + names[i] + ": \"" +
                    std::string(v.c_str(), size_t(v.length() < 40 ? v.length() : 40)) + "\" doesn't fit a " +
                    std::string(1, checks[i].letter) + " field";
        return false;
      }
    }
    return true;
  };
  for (;; ++n) {
    rc = source->GetRecord(n);
    if (rc != 0) break;
    if (!fill()) {
      rc = ZQ_WRITE_ERROR;
      break;
    }
    if (opts.mode == 2) {
      KeyOf(out, key, &k);
      auto it = positions.find(k);
      if (it != positions.end()) {
        // Bring the old memo block numbers onto the fields, then the new values.
        target->SetFilePosition(it->second);
        if ((rc = target->GetandDeleteRecord(out)) != 0) break;
        fill();  // the values were checked above
        ++updated;
      } else {
        target->Unwind();
        positions.emplace(k, live++);
        ++added;
      }
    } else {
      ++added;
    }
    if ((rc = target->GenerateDetailRecord(0)) != 0) break;
    progress.Tick(n);
  }
  bool ok = rc == ZQ_END;
  std::string message = bad_value;
  if (!ok && message.empty()) message = source->LastErrorMessage()[0] && target->LastErrorMessage()[0] == 0
                         ? source->LastErrorMessage()
                         : target->LastErrorMessage();
  if (!ok && message.empty()) message = "the conversion stopped at record " + std::to_string(n);
  if (target->_CloseOutput(ok) != 0 && ok) {
    ok = false;
    message = target->LastErrorMessage();
  }
  source->ConnectionClose();
  if (ok && dbf_target) {
    ZQString v;
    target->GetOption("version", v);
    ok = VerifyTable(work, connector, v.c_str(), opts, before + added, &message);
  }
  if (ok && dbf_target && opts.mode == 0) ok = staging.Commit(&message);
  if (!ok) return Fail(message);
  for (size_t i = 0; i < checks.size(); ++i)
    if (checks[i].cut > 0)
      Warn(std::string("field ") + names[i] + ": " + std::to_string(checks[i].cut) + " values longer than " +
           std::to_string(checks[i].width) + " bytes were cut");
  for (size_t i = 0; i < checks.size(); ++i)
    if (checks[i].blank_logicals > 0 && dbf_target)
      Warn(std::string("field ") + names[i] + ": " + std::to_string(checks[i].blank_logicals) +
           " blank logicals were written as F");
  if (opts.mode == 2)
    fprintf(stderr, "zqdb: %lld records updated, %lld added\n", static_cast<long long>(updated),
            static_cast<long long>(added));
  return 0;
}
