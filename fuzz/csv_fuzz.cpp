// Fuzzes the CSV reader and the CSV source's type inference: any bytes as a
// CSV file, read whole, then as a source spoke with inferred types.
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <string>

#include "engine/csv_reader.h"
#include "engine/csv_source.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  static const std::string path = "/tmp/zqdb-csv-fuzz-" + std::to_string(getpid()) + ".csv";
  FILE* f = fopen(path.c_str(), "wb");
  if (f == nullptr) return 0;
  fwrite(data, 1, size, f);
  fclose(f);
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
