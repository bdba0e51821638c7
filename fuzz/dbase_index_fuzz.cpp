// NDX files and MDX tags from fuzzed bytes: open, check the tree's
// structure, walk every key forwards (and backwards where the kind can),
// search, then add keys to the damaged tree. Input: one byte that picks the kind (even NDX, odd MDX), then the file.
#include <sys/stat.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

#include "fuzz/scratch_file.h"

#include "index/mdx.h"

namespace {

void Exercise(ZQDBMdx& ix, bool backwards) {
  if (!ix.OK()) return;
  ZQString key;
  ZQString faults;
  ix.CheckTree(faults, false);
  ix.CheckTree(faults, true);
  int n = 0;
  for (int32_t r = ix.FirstKey(key); r != -1 && n < 200000; r = ix.NextKey(key)) ++n;
  if (backwards)
    for (int32_t r = ix.LastKey(key); r != -1 && n < 400000; r = ix.PrevKey(key)) ++n;
  ZQString probe("M", 1);
  ix.FindKey(probe, false);
  ix.FindKey(probe, true);
  for (int i = 0; i < 40; ++i) {
    char k[8];
    snprintf(k, sizeof k, "%07d", i * 7919 % 1000);
    ZQString add(k, 7);
    if (!ix.AddKey(add, i)) break;
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1 || size > (1u << 20)) return 0;
  bool mdx = data[0] & 1;
  std::string base = fuzz::ScratchDir("indexfuzz") + "/t";
  std::string path = mdx ? base + ".mdx" : base + ".ndx";
  if (!fuzz::WriteScratch(path, data + 1, size - 1)) return 0;
  if (mdx) {
    // The first tag's name, as the file gives it.
    char name[12] = "NAME";
    if (size > 1 + 548 + 11) {
      memcpy(name, data + 1 + 548, 11);
      name[11] = '\0';
    }
    ZQDBMdx ix(base.c_str(), name);
    Exercise(ix, false);
  } else {
    ZQDBMdx ix(base.c_str(), path.c_str());
    Exercise(ix, true);
  }
  unlink(path.c_str());
  return 0;
}
