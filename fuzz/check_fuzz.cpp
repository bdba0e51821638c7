// `zqdb check` over a table, its memo file and its production index, all
// from fuzzed bytes: the three are written as scratch files beside each other
// and checked in this process by the function the command calls, with the
// findings going to /dev/null. Input:
//   byte 0     the kind: even a dBASE table with a .dbt memo and an .mdx
//              file, odd a FoxPro table with an .fpt memo and a .cdx file
//   bytes 1-2  the table's length in bytes, little-endian
//   bytes 3-4  the memo file's length
//   then       the table, the memo file, and the index file (the rest)
// Lengths that run past the input are cut to it.
//
// The seeds in fuzz/corpus/check/ are tables with a memo and a production
// MDX or CDX written by zqdb itself: fuzz/gen_check_seeds.py makes them.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>

#include "engine/check.h"
#include "engine/modules.h"
#include "fuzz/scratch_file.h"
#include "host/endian.h"

constexpr size_t kHead = 5;  // the kind and two lengths

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  // The module that reads the table, as built beside this target.
  SetModulePath(ZQ_FUZZ_MODULE_DIR);
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < kHead || size > (1u << 18)) return 0;
  const bool fox = (data[0] & 1) != 0;
  size_t left = size - kHead;
  const size_t table = std::min<size_t>(GetLe16(data + 1), left);
  left -= table;
  const size_t memo = std::min<size_t>(GetLe16(data + 3), left);
  const uint8_t* p = data + kHead;
  const std::string base = fuzz::ScratchDir("checkfuzz") + "/t";
  for (const char* ext : {".dbt", ".fpt", ".mdx", ".cdx"}) unlink((base + ext).c_str());
  if (!fuzz::WriteScratch(base + ".dbf", p, table) ||
      !fuzz::WriteScratch(base + (fox ? ".fpt" : ".dbt"), p + table, memo) ||
      !fuzz::WriteScratch(base + (fox ? ".cdx" : ".mdx"), p + table + memo, left - memo))
    return 0;
  static const int sink = open("/dev/null", O_WRONLY);
  CheckRunOptions opts;
  opts.out = sink;
  RunCheck(base + ".dbf", SourceOptions{}, opts);
  return 0;
}
