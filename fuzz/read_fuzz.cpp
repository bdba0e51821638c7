// libFuzzer target over the whole read path of the source spoke.
//
// The input is a table file as it stands. It is written to a scratch file
// and opened the way the engine opens a source: option calls, SetUserInfo,
// MakeFields, then GetRecord from 0 until the result isn't 0, every field's
// text taken, then a few records again out of order. The dialects tried come
// from the first byte (which is also the table's version byte): the one that
// byte belongs to, dBASE IV (the default), and one more picked by its value,
// so that bytes are also read under dialects they don't fit. The passes vary
// the memo policy and the code page.

#include <cstddef>
#include <cstdint>
#include <string>

#include "connector/frdbase.h"
#include "fuzz/scratch_file.h"
#include "host/zqutil.h"

namespace {

constexpr size_t kMaxInput = 1 << 20;
constexpr int32_t kMaxRecords = 100000;

void Quiet(void*, int, BATCHERR, const char*) {}

void ReadAll(const char* path, int dialect, int memo_policy, int codepage) {
  ZQFromDbase* spoke = NewFromDbase(ZQSpokeDef{});
  if (spoke == nullptr) return;
  spoke->SetOption("version", std::to_string(dialect).c_str());
  spoke->SetOption("ignorememoerr", std::to_string(memo_policy).c_str());
  spoke->SetOption("codepage", std::to_string(codepage).c_str());
  ZQConnTarget target;
  target.path = path;
  if (spoke->SetUserInfo(target) == 0 && spoke->MakeFields() == 0) {
    ZQRecord* layout = spoke->GetLayout(0);
    int32_t n = 0;
    for (; n < kMaxRecords; ++n) {
      if (spoke->GetRecord(n) != 0) break;
      for (int i = 0; i < layout->FieldCount(); ++i) {
        ZQField* f = layout->GetFieldbyPos(i);
        (void)f->StringRef();
        (void)f->DoubleVal();
      }
    }
    (void)spoke->EstimateRecordCount();
    // Out of order: through the record map and on from it.
    for (int32_t k : {n / 2, 0, n - 1, n / 3 + 1, n, n + 7}) spoke->GetRecord(k);
  }
  spoke->ConnectionClose();
  DeleteFromDbase(spoke);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size > kMaxInput) return 0;
  SetLogSink(Quiet, nullptr);
  static const std::string path = fuzz::ScratchDir("read") + "/t.dbf";
  if (!fuzz::WriteScratch(path, data, size)) return 0;

  uint8_t first = size > 0 ? data[0] : 0;
  int natural = fuzz::NaturalDialect(first);
  int picked = (first >> 3) % 11;
  ReadAll(path.c_str(), natural, 1, 0);
  if (natural != 2) ReadAll(path.c_str(), 2, 0, 850);
  if (picked != natural && picked != 2) ReadAll(path.c_str(), picked, 2, 1252);
  return 0;
}
