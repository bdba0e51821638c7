#include "engine/text_target.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "engine/endpoints.h"
#include "engine/text_types.h"

ZQToText::ZQToText(OutputFormat format, const std::string& table)
    : ZQExport(ZQSpokeDef{}, nullptr, false), format_(format), table_(table) {
  ReplaceValidTypes(const_cast<const ZQDType**>(TextTypes::Get().list));
}

ZQToText::~ZQToText() { _CloseOutput(false); }

BATCHERR ZQToText::_OpenOutput(const ZQConnTarget& target) {
  inserted_count_ = 0;
  if (target.path.length() == 0) return ZQ_NO_FILENAME;
  final_path_ = target.path.c_str();
  struct stat st;
  temp_path_.clear();
  if (final_path_ == "-") {
    fd_ = dup(STDOUT_FILENO);
  } else if (stat(final_path_.c_str(), &st) == 0 && !S_ISREG(st.st_mode)) {
    fd_ = open(final_path_.c_str(), O_WRONLY | O_CLOEXEC);  // a device or FIFO: no file to rename
  } else {
    temp_path_ = final_path_ + ".zqdb-part";
    fd_ = open(temp_path_.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
  }
  if (fd_ < 0) return LogError(4, ZQ_CREATE_ERROR, "cannot create %s: %s", final_path_.c_str(), strerror(errno));
  out_ = std::make_unique<OutBuf>(fd_);
  writer_ = MakeWriter(format_, *out_, table_);
  writer_->Begin(*GetLayout(0));
  target_.path = target.path;
  return 0;
}

BATCHERR ZQToText::GenerateDetailRecord(int layout) {
  if (layout != 0) return ZQ_INDEX_ERROR;
  if (!writer_) return ZQ_NOT_OPEN;
  writer_->Row(*GetLayout(0));
  if (out_->failed()) return LogError(4, ZQ_WRITE_ERROR, "cannot write %s: %s", final_path_.c_str(), strerror(errno));
  ++inserted_count_;
  return 0;
}

BATCHERR ZQToText::_CloseOutput(bool keep) {
  if (fd_ < 0) return 0;
  writer_->End();
  bool ok = out_->Flush();
  int why = out_->error();
  writer_.reset();
  out_.reset();
  if (close(fd_) != 0 && ok) ok = false, why = errno;
  fd_ = -1;
  const char* reason = strerror(why != 0 ? why : EIO);
  if (temp_path_.empty())
    return keep && !ok ? LogError(4, ZQ_WRITE_ERROR, "cannot write %s: %s", final_path_.c_str(), reason) : 0;
  if (keep && ok && rename(temp_path_.c_str(), final_path_.c_str()) == 0) return 0;
  if (keep && ok) reason = strerror(errno);
  unlink(temp_path_.c_str());
  if (keep) return LogError(4, ZQ_WRITE_ERROR, "cannot write %s: %s", final_path_.c_str(), reason);
  return 0;
}

namespace {

void DeleteText(void*, ZQExport* s) { delete s; }

std::unique_ptr<Target> MakeTextTarget(OutputFormat format, const std::string& path, const WriteOptions& opts,
                                       std::string* error) {
  if (opts.mode != 0) {
    *error = "append and update modes need a table or a SQLite database as the target";
    return nullptr;
  }
  return std::make_unique<Target>(TargetPtr(new ZQToText(format, opts.table_name), TargetDeleter{DeleteText}), path);
}

}  // namespace

std::unique_ptr<Target> MakeCsvTarget(const std::string& path, const WriteOptions& opts, ZQImport*,
                                      std::string* error) {
  return MakeTextTarget(OutputFormat::kCsv, path, opts, error);
}

std::unique_ptr<Target> MakeJsonlTarget(const std::string& path, const WriteOptions& opts, ZQImport*,
                                        std::string* error) {
  return MakeTextTarget(OutputFormat::kJsonl, path, opts, error);
}

std::unique_ptr<Target> MakePgsqlTarget(const std::string& path, const WriteOptions& opts, ZQImport*,
                                        std::string* error) {
  return MakeTextTarget(OutputFormat::kPgsql, path, opts, error);
}
