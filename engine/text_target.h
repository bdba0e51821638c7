// CSV and JSON-lines files as target spokes. A file is written beside its
// final name and renamed into place when the run is kept, so a failed run
// never leaves a half-written file under that name. "-" is standard output,
// and a device or FIFO is written into as the records come.
#pragma once

#include <memory>
#include <string>

#include "engine/outbuf.h"
#include "engine/writers.h"
#include "host/zqspoke.h"

class ZQToText : public ZQExport {
 public:
  // `table` names the table of a script (pgsql).
  ZQToText(OutputFormat format, const std::string& table);
  ~ZQToText() override;

  bool SupportMode(SpokeMode mode) const override { return mode == kReplace; }
  int MaxFieldCount() override { return 100000; }
  int FieldNameMaxLength() override { return 1024; }
  BATCHERR _OpenOutput(const ZQConnTarget& target) override;
  BATCHERR GenerateDetailRecord(int layout) override;
  BATCHERR _CloseOutput(bool keep) override;

 private:
  OutputFormat format_;
  std::string table_;
  std::string final_path_, temp_path_;  // temp_path_ "": written in place
  int fd_ = -1;
  std::unique_ptr<OutBuf> out_;
  std::unique_ptr<RecordWriter> writer_;
};
