// The bookkeeping of a walk over every block of one index tree, shared by
// the CheckTree of each index kind: which blocks were reached and from
// where, the depth of the leaves, the order of the keys within a block and
// against the keys that the blocks above hold for them, and the lines
// "block N: what is wrong". Block numbers count 512-byte units in every kind.
//
// Bounded by the file: one word per 512 bytes of it for the blocks reached,
// one block buffer per level, and no more levels than ZQDBNodeBase::kMaxDepth.
#pragma once

#include <cstdint>

#include "index/dbindex.h"

class ZQTreeCheck {
 public:
  static constexpr int32_t kUnit = 512;
  // Levels below the root that a walk may go; a block deeper is a fault.
  static constexpr int kLevels = ZQDBNodeBase::kMaxDepth;
  // Fault lines written out; the faults beyond are counted in one last line.
  static constexpr int32_t kMaxLines = 1000;

  // A key that bounds the keys below a block, and the block that holds it.
  // `key` null: no bound.
  struct Bound {
    const uint8_t* key = nullptr;
    int32_t block = -1;
  };

  // `out` takes the lines; `fileSize` bytes in the index file. `byValue`:
  // keys of 8 bytes are compared as the little-endian doubles they hold.
  ZQTreeCheck(ZQString& out, int32_t fileSize, int32_t keyLength, bool byValue);
  ~ZQTreeCheck();
  ZQTreeCheck(const ZQTreeCheck&) = delete;
  ZQTreeCheck& operator=(const ZQTreeCheck&) = delete;

  // False when the memory for the walk could not be had (told).
  bool Ready() const { return from_ != nullptr; }
  // Whole 512-byte units in the file.
  int32_t Units() const { return units_; }
  // Appends "block N: " and the text; N < 0 names no block.
  void Fault(int32_t block, const char* format, ...) __attribute__((format(printf, 3, 4)));
  // Marks unit `block` (< Units()) reached from the block `parent`, -1 for
  // the index header. False, told, when it was reached before: two parents
  // name it, or the tree loops.
  bool Reach(int32_t block, int32_t parent);
  // A leaf `depth` levels below the root. False, told, when the first leaf
  // found lay at another depth.
  bool Leaf(int32_t block, int depth);
  // The `count` keys of `block`, the first at `first` and each `stride`
  // bytes after the one before: ascending, and not outside [lo, hi]. The
  // first fault of each kind is told.
  void Keys(int32_t block, int count, const uint8_t* first, int32_t stride, Bound lo, Bound hi);
  // A buffer of `bytes` for the block of level `depth` (< kLevels + 1),
  // kept while the levels below it are walked; null when memory runs out.
  uint8_t* Buffer(int depth, int32_t bytes);
  // The sibling links (byte offsets, -1 none) of the block at byte offset
  // `at`, `depth` levels below the root, the blocks of each level coming in
  // key order: its left link names the block before it at its level, or
  // none for the first, and that block's right link names it.
  void Siblings(int depth, int32_t at, int32_t left, int32_t right);
  // A subtree whose top is `depth` levels below the root wasn't walked: the
  // order of that level and the ones below is lost until their next block.
  void LoseLevels(int depth);
  // Ends the walk: the last block of each level has no right sibling, and a
  // last line counts the faults that weren't listed. The number of faults.
  int32_t Finish();

 private:
  // A key for people, in one of two slots: printable bytes as they are,
  // others as \xHH, trailing blanks cut, quoted.
  const char* Shown(const uint8_t* key, int slot);
  // Two keys in the order of this check: <0, 0, >0.
  int Compare(const uint8_t* a, const uint8_t* b) const;
  // `key` with its trailing NUL bytes read as blanks, in `out` where that
  // changes it.
  const uint8_t* Blanked(const uint8_t* key, ZQString& out);
  // A link for people: "none", "block N", or "offset N" off a block boundary.
  const char* Place(int32_t at, int slot);

  // The block last met at each level, its right link, and whether the
  // level's order is still known.
  struct Level {
    int32_t at = -1;
    int32_t right = -1;
    bool known = true;
  };

  ZQString& out_;
  int32_t units_;
  int32_t keyLength_;
  bool byValue_;
  int32_t faults_ = 0;
  int leafDepth_ = -1;
  // The block each unit was first reached from: -2 not reached, -1 the header.
  int32_t* from_ = nullptr;
  ZQString levels_[kLevels + 1];
  ZQString loBlanked_, hiBlanked_;
  Level order_[kLevels + 1];
  char shown_[2][160];
  char place_[2][32];
};
