// Test helpers for the read path: a capture of logged
// messages, a table opened with dbopen, and a source spoke driven the way the
// engine drives it (factory, options, SetUserInfo, MakeFields, GetRecord
// until 1, ConnectionClose, DeleteFromDbase).
#pragma once

#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "connector/frdbase.h"
#include "host/zqutil.h"
#include "table/dbf.h"
#include "tests/support/dbf_builder.h"

namespace tests {

// A table opened with dbopen (read-only unless `writable`), and its descriptors; closed when it
// goes unless Close came first.
struct OpenedTable {
  ZQDBFIELD* fields[kMaxFields] = {};
  ZQDBFILE* db = nullptr;
  int version;  // the caller's dialect, as dbopen leaves it

  OpenedTable(const std::string& path, int dialect, bool writable = false) : version(dialect) {
    db = dbopen(nullptr, path.c_str(), fields, &version, writable);
  }
  ~OpenedTable() { Close(); }
  OpenedTable(const OpenedTable&) = delete;
  OpenedTable& operator=(const OpenedTable&) = delete;
  int Close() {
    int rc = db != nullptr ? dbclose(fields, db) : -1;
    db = nullptr;
    return rc;
  }
};

// Collects what the host's log sink receives while the object lives.
class LogCapture {
 public:
  struct Entry {
    int level;
    BATCHERR code;
    std::string message;
  };
  LogCapture() { SetLogSink(&Sink, this); }
  ~LogCapture() { SetLogSink(nullptr, nullptr); }
  LogCapture(const LogCapture&) = delete;
  LogCapture& operator=(const LogCapture&) = delete;

  const std::vector<Entry>& entries() const { return entries_; }
  std::string Last() const { return entries_.empty() ? "" : entries_.back().message; }
  void Clear() { entries_.clear(); }

 private:
  static void Sink(void* context, int level, BATCHERR code, const char* message) {
    static_cast<LogCapture*>(context)->entries_.push_back({level, code, message ? message : ""});
  }
  std::vector<Entry> entries_;
};

// A source spoke with the dialect, memo policy and code page set through the
// host's option calls.
class Source {
 public:
  explicit Source(int dialect = 2, int memo_policy = 0, int codepage = 0) : spoke_(NewFromDbase(ZQSpokeDef{})) {
    spoke_->SetOption("version", std::to_string(dialect).c_str());
    spoke_->SetOption("ignorememoerr", std::to_string(memo_policy).c_str());
    if (codepage != 0) spoke_->SetOption("codepage", std::to_string(codepage).c_str());
  }
  ~Source() {
    spoke_->ConnectionClose();
    DeleteFromDbase(spoke_);
  }
  Source(const Source&) = delete;
  Source& operator=(const Source&) = delete;

  ZQFromDbase* operator->() const { return spoke_; }
  ZQFromDbase* spoke() const { return spoke_; }

  // SetUserInfo then MakeFields; the result of MakeFields.
  BATCHERR Open(const std::string& path) {
    ZQConnTarget target;
    target.path = path.c_str();
    if (BATCHERR rc = spoke_->SetUserInfo(target); rc != 0) return rc;
    return spoke_->MakeFields();
  }

  ZQRecord& Layout() const { return *spoke_->GetLayout(0); }
  int FieldCount() const { return Layout().FieldCount(); }
  ZQField* Field(int i) const { return Layout().GetFieldbyPos(i); }
  std::string Name(int i) const { return Field(i)->Name(); }
  // The field's value in its text form.
  std::string Text(int i) const {
    const ZQString& s = Field(i)->StringRef();
    return std::string(s.c_str(), size_t(s.length()));
  }
  // Field `field`'s text of record `n`, or "#<result>" when GetRecord fails
  // (`End()` for ZQ_END).
  std::string At(int32_t n, int field = 0) {
    BATCHERR rc = spoke_->GetRecord(n);
    return rc == 0 ? Text(field) : "#" + std::to_string(rc);
  }
  static std::string End() { return "#" + std::to_string(ZQ_END); }
  // Field 0's text of every record from 0 until GetRecord stops; `rc` gets
  // the result that stopped it.
  std::vector<std::string> FirstColumn(BATCHERR* rc = nullptr, int limit = 1000000) {
    std::vector<std::string> out;
    BATCHERR r = 0;
    for (int n = 0; n < limit; ++n) {
      r = spoke_->GetRecord(n);
      if (r != 0) break;
      out.push_back(Text(0));
    }
    if (rc) *rc = r;
    return out;
  }

 private:
  ZQFromDbase* spoke_;
};

}  // namespace tests
