#include "engine/transfer.h"

#include <unistd.h>

#include <chrono>
#include <cstdio>

#include "engine/convert_values.h"
#include "engine/read_fix.h"

namespace {

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

}  // namespace

bool KeyedRecords::Load(ZQExport* target, const ZQRecord& layout, std::string* error) {
  ZQRecord scan(layout);
  target->_Rewind();
  int64_t pos = 0;
  BATCHERR rc;
  while ((rc = target->GetRecord(scan, &pos)) == 0) {
    KeyOf(scan, key_, &scratch_);
    positions_.emplace(scratch_, pos);
    ++live_;
  }
  if (rc == ZQ_END) return true;
  *error = target->LastErrorMessage();
  return false;
}

int64_t KeyedRecords::Find(ZQRecord& record) {
  KeyOf(record, key_, &scratch_);
  auto it = positions_.find(scratch_);
  if (it != positions_.end()) return it->second;
  positions_.emplace(scratch_, live_++);
  return -1;
}

bool CheckValues(ZQImport* source, FieldPlan& plan, std::string* error) {
  TableReadFix fix(source);
  for (int32_t n = 0;; ++n) {
    BATCHERR rc = source->GetRecord(n);
    if (rc == ZQ_END) break;
    if (rc != 0) {
      *error = source->LastErrorMessage();
      if (error->empty()) *error = "cannot read record " + std::to_string(n + 1) + " of the source";
      return false;
    }
    fix.Apply(*source->GetLayout(0));
    if (!plan.Fill(n, error)) return false;
    if (n == INT32_MAX) break;
  }
  plan.ResetCounts();
  return true;
}

bool Transfer(ZQImport* source, ZQExport* target, FieldPlan& plan, KeyedRecords* keyed, bool progress,
              TransferCounts* counts, std::string* error) {
  Progress shown(progress);
  TableReadFix fix(source);
  BATCHERR rc = 0;
  int32_t n = 0;
  std::string bad_value;
  for (;; ++n) {
    rc = source->GetRecord(n);
    if (rc != 0) break;
    fix.Apply(*source->GetLayout(0));
    // An update fills the record twice from the source's: it is copied.
    if (!plan.Fill(n, &bad_value, false, keyed == nullptr)) {
      rc = ZQ_WRITE_ERROR;
      break;
    }
    int64_t at = keyed != nullptr ? keyed->Find(plan.out()) : -1;
    if (at >= 0) {
      // Bring the old memo block numbers onto the fields, then the new values.
      target->SetFilePosition(at);
      if ((rc = target->GetandDeleteRecord(plan.out())) != 0) break;
      plan.Fill(n, &bad_value, true);  // the values were checked above
      ++counts->updated;
    } else {
      if (keyed != nullptr) target->Unwind();
      ++counts->added;
    }
    if ((rc = target->GenerateDetailRecord(0)) != 0) break;
    shown.Tick(n);
  }
  counts->read = n;
  if (rc == ZQ_END) return true;
  *error = bad_value;
  if (error->empty())
    *error = source->LastErrorMessage()[0] && target->LastErrorMessage()[0] == 0 ? source->LastErrorMessage()
                                                                                   : target->LastErrorMessage();
  if (error->empty()) *error = "the conversion stopped at record " + std::to_string(n);
  return false;
}
