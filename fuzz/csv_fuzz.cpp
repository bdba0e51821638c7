// Fuzzes the CSV reader and the CSV source's type inference: any bytes as a
// CSV file, read whole, then as a source spoke with inferred types.
#include <cstddef>
#include <cstdint>
#include <string>

#include "engine/csv_reader.h"
#include "engine/csv_source.h"
#include "fuzz/scratch_file.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const std::string path = fuzz::ScratchDir("csvfuzz") + "/t.csv";
  if (!fuzz::WriteScratch(path, data, size)) return 0;
  CsvReader r;
  std::string error;
  if (r.Open(path, &error)) {
    for (int i = 0; i < 100000 && r.Next(); ++i)
      for (size_t k = 0; k < r.FieldCount(); ++k) (void)r.FieldLength(k);
  }
  ZQFromCsv source;
  ZQConnTarget t;
  t.path = path.c_str();
  source.SetUserInfo(t);
  if (source.MakeFields() == 0)
    for (int32_t n = 0; n < 100000 && source.GetRecord(n) == 0; ++n) {
    }
  return 0;
}
