// Index files from fuzzed bytes: an NDX file, an MDX file's first tag, an IDX
// file, or the tags of a CDX file (through its tag list). Each index is
// opened, its tree's structure checked, walked forwards whole, searched,
// walked backwards where the kind can, and given keys on the scratch copy.
// Input: one byte whose two low bits pick the kind (0 NDX, 1 MDX, 2 IDX,
// 3 CDX), then the file.
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string>

#include "fuzz/scratch_file.h"
#include "index/foxidx.h"
#include "index/mdx.h"

namespace {

constexpr int kMaxSteps = 200000;  // each walk, beyond what any seed holds
constexpr int kMaxTags = 8;

void Exercise(ZQDBIndexBase& ix) {
  if (!ix.OK()) return;
  ZQString faults, key, first;
  ix.CheckTree(faults, false);
  ix.CheckTree(faults, true);
  int steps = 0;
  for (int32_t r = ix.FirstKey(key); r != -1 && steps < kMaxSteps; r = ix.NextKey(key), ++steps)
    if (steps == 0) first = key;
  ix.FindKey(first, true);
  ix.FindKey(first, false);
  ix.NextKey(key);
  steps = 0;
  for (int32_t r = ix.LastKey(key); r != -1 && steps < kMaxSteps; r = ix.PrevKey(key)) ++steps;
  // Keys beside the first, then enough others to split nodes, with record
  // numbers that outgrow a compact leaf's narrowest widths.
  for (int32_t i = 0; i < 40; ++i) {
    ZQString k = first;
    if (i < 3) {
      k += char('A' + i);
    } else {
      char digits[8];
      snprintf(digits, sizeof digits, "%07d", i * 7919 % 1000);
      k = ZQString(digits, 7);
    }
    if (!ix.AddKey(k, 70000 * i)) break;
  }
  ix.FirstKey(key);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1 || size > (1u << 18)) return 0;
  const int kind = data[0] & 3;
  const char* ext[] = {".ndx", ".mdx", ".idx", ".cdx"};
  const std::string base = fuzz::ScratchDir("indexfuzz") + "/t", path = base + ext[kind];
  if (!fuzz::WriteScratch(path, data + 1, size - 1)) return 0;
  ZQDBFoxIndex* taglist = nullptr;
  if (kind < 3) {
    char name[12] = "NAME";  // an MDX file's first tag, as the file names it
    if (size > 1 + 548 + 11) memcpy(name, data + 1 + 548, 11);
    std::unique_ptr<ZQDBIndexBase> ix;
    if (kind == 2) ix.reset(new ZQDBFoxIndex(base.c_str(), path.c_str(), taglist));
    else ix.reset(new ZQDBMdx(base.c_str(), kind == 0 ? path.c_str() : name));
    Exercise(*ix);
  } else {
    // The tags the list names, each opened through the list and walked.
    std::string names[kMaxTags];
    int count = 0;
    {
      ZQDBFoxIndex list(path.c_str());
      ZQString key;
      for (int32_t r = list.FirstKey(key); r != -1 && count < kMaxTags; r = list.NextKey(key))
        names[count++] = std::string(key.c_str(), size_t(key.length()));
    }
    for (int i = 0; i < count; ++i) {
      ZQDBFoxIndex ix(base.c_str(), names[i].c_str(), taglist);
      Exercise(ix);
    }
  }
  delete taglist;
  unlink(path.c_str());
  return 0;
}
