// libFuzzer target over the write side of the target spoke: a damaged
// existing table, and memo file, as the target of an append and of an update
// of a few records.
//
// Input: a 4-byte little-endian length n, then n bytes of the table file, and
// the rest as its memo file (written under each memo extension, so that any
// version byte finds it). The table's layout is taken from the table itself
// (MakeFields), as zqdb takes it for append and update; every field gets a
// value (text, a number, a date, a logical, a memo longer than a block), three
// records are appended, then the first records are read, prepared for
// replacement and written over, blank and not. Dialects as in read_fuzz: the
// one the version byte belongs to and dBASE IV.

#include <cstddef>
#include <cstdint>
#include <string>

#include "connector/todbase.h"
#include "fuzz/scratch_file.h"
#include "host/endian.h"
#include "host/zqutil.h"

namespace {

constexpr size_t kMaxInput = 1 << 20;

void Quiet(void*, int, BATCHERR, const char*) {}

// One value for every field: which one goes by the field's type and `round`.
void Fill(ZQRecord& layout, int round) {
  static const std::string memo(700, 'm');
  for (int i = 0; i < layout.FieldCount(); ++i) {
    ZQField* f = layout.GetFieldbyPos(i);
    if (round == 2) {
      f->Blank();
      continue;
    }
    switch (f->DataType().Usage()) {
      case 'N': case 'F': case 'I': case 'Y': case 'B': f->AssignText(round ? "-12.5" : "42", round ? 5 : 2); break;
      case 'D': case 'T': f->AssignText("20240229", 8); break;
      case 'L': f->AssignText("T", 1); break;
      case 'M': case 'G': f->AssignText(memo.data(), int32_t(round ? memo.size() : 5)); break;
      default: f->AssignText("text value", 10); break;
    }
  }
}

void Run(const std::string& path, int dialect, int mode) {
  ZQToDbase* spoke = NewToDbase(ZQSpokeDef{});
  if (spoke == nullptr) return;
  spoke->SetOption("version", std::to_string(dialect).c_str());
  spoke->SetMode(ZQSpoke::SpokeMode(mode));
  ZQConnTarget target;
  target.path = path.c_str();
  ZQRecord& layout = *spoke->GetLayout(0);
  if (spoke->MakeFields(layout, target) == 0 && spoke->_OpenOutput(target) == 0) {
    if (mode == 1) {
      for (int round = 0; round < 3; ++round) {
        Fill(layout, round);
        spoke->GenerateDetailRecord(0);
      }
    } else {
      ZQRecord scan(layout);
      int64_t pos = 0;
      for (int n = 0; n < 4 && spoke->GetRecord(scan, &pos) == 0; ++n) {
      }
      for (int64_t at : {int64_t{0}, int64_t{1}, int64_t{2}}) {
        spoke->SetFilePosition(at);
        if (at == 1) spoke->DeleteRecord();
        else spoke->GetandDeleteRecord(layout);
        Fill(layout, int(at));
        spoke->GenerateDetailRecord(0);
      }
    }
  }
  spoke->_CloseOutput(true);
  DeleteToDbase(spoke);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size > kMaxInput || size < 4) return 0;
  SetLogSink(Quiet, nullptr);
  size_t n = GetLe32(data);
  if (n > size - 4) n = size - 4;
  const uint8_t* table = data + 4;
  const uint8_t* memo = table + n;
  size_t memo_size = size - 4 - n;
  const std::string& dir = fuzz::ScratchDir("write");
  const std::string path = dir + "/t.dbf";
  uint8_t first = n > 0 ? table[0] : 0;
  int natural = fuzz::NaturalDialect(first);
  for (int mode : {1, 2})
    for (int dialect : {natural, 2}) {
      // Each run starts from the input's files: the one before changed them.
      fuzz::WriteScratch(path, table, n);
      for (const char* ext : {"dbt", "fpt", "smt"}) fuzz::WriteScratch(dir + "/t." + ext, memo, memo_size);
      Run(path, dialect, mode);
    }
  return 0;
}
