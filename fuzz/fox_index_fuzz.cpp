// FoxPro index files from fuzzed bytes: an IDX file, or a CDX file with its
// tag list and tags. Each index is opened, its tree's structure checked, and
// walked forwards whole, searched, walked backwards, and given a few keys on
// the scratch copy. Input: one byte that picks the kind (even: IDX, odd:
// CDX), then the file.
#include <cstddef>
#include <cstdint>
#include <string>

#include "fuzz/scratch_file.h"
#include "index/foxidx.h"

namespace {

constexpr int kMaxSteps = 200000;  // each walk, beyond what any seed holds
constexpr int kMaxTags = 8;

void Exercise(ZQDBFoxIndex& ix) {
  if (!ix.OK()) return;
  ZQString faults;
  ix.CheckTree(faults, false);
  ix.CheckTree(faults, true);
  ZQString key, first;
  int steps = 0;
  for (int32_t r = ix.FirstKey(key); r != -1 && steps < kMaxSteps; r = ix.NextKey(key), ++steps)
    if (steps == 0) first = key;
  ix.FindKey(first, true);
  ix.FindKey(first, false);
  ix.NextKey(key);
  steps = 0;
  for (int32_t r = ix.LastKey(key); r != -1 && steps < kMaxSteps; r = ix.PrevKey(key)) ++steps;
  for (int32_t i = 0; i < 3; ++i) {
    ZQString k = first;
    k += char('A' + i);
    if (!ix.AddKey(k, 70000 * i)) break;
  }
  ix.FirstKey(key);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 1 || size > (1u << 18)) return 0;
  bool cdx = (data[0] & 1) != 0;
  std::string base = fuzz::ScratchDir("foxfuzz") + "/t";
  std::string path = base + (cdx ? ".cdx" : ".idx");
  if (!fuzz::WriteScratch(path, data + 1, size - 1)) return 0;
  ZQDBFoxIndex* taglist = nullptr;
  if (!cdx) {
    ZQDBFoxIndex ix(base.c_str(), path.c_str(), taglist);
    Exercise(ix);
    return 0;
  }
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
  delete taglist;
  return 0;
}
