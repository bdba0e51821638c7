// ZQTreeCheck: the shared part of the structure checks of index trees.
#include "index/tree_check.h"

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <new>

#include "host/endian.h"

ZQTreeCheck::ZQTreeCheck(ZQString& out, int32_t fileSize, int32_t keyLength, bool byValue)
    : out_(out), units_(fileSize > 0 ? fileSize / kUnit : 0), keyLength_(keyLength), byValue_(byValue && keyLength == 8) {
  from_ = new (std::nothrow) int32_t[size_t(units_) + 1];
  if (from_ == nullptr) {
    Fault(-1, "not enough memory to walk the tree");
    return;
  }
  for (int32_t i = 0; i <= units_; ++i) from_[i] = -2;
}

ZQTreeCheck::~ZQTreeCheck() { delete[] from_; }

void ZQTreeCheck::Fault(int32_t block, const char* format, ...) {
  if (++faults_ > kMaxLines) return;
  char line[512];
  int n = block >= 0 ? snprintf(line, sizeof line, "block %d: ", block) : 0;
  va_list args;
  va_start(args, format);
  vsnprintf(line + n, sizeof line - size_t(n), format, args);
  va_end(args);
  out_ += line;
  out_ += "\n";
}

bool ZQTreeCheck::Reach(int32_t block, int32_t parent) {
  if (from_ == nullptr || block < 0 || block > units_) return false;
  int32_t first = from_[block];
  if (first == -2) {
    from_[block] = parent;
    return true;
  }
  char before[32];
  if (first < 0) snprintf(before, sizeof before, "the header");
  else snprintf(before, sizeof before, "block %d", first);
  if (parent < 0) Fault(block, "reached a second time (from %s and the header)", before);
  else Fault(block, "reached a second time (from %s and block %d)", before, parent);
  return false;
}

bool ZQTreeCheck::Leaf(int32_t block, int depth) {
  if (leafDepth_ < 0) leafDepth_ = depth;
  if (depth == leafDepth_) return true;
  Fault(block, "a leaf %d level%s below the root, where the first leaf lies %d level%s below it (a level is missing or added)",
        depth, depth == 1 ? "" : "s", leafDepth_, leafDepth_ == 1 ? "" : "s");
  return false;
}

// One writer (Perl XBase) fills the tail of a short key in an interior entry
// of a CDX with NUL bytes, where the leaf keys below it end in blanks (a
// compact leaf's trailing count stands for blanks). A bound that ends in NUL
// bytes is therefore also read with blanks there, and a key is outside it
// only when it is outside by both readings.
const uint8_t* ZQTreeCheck::Blanked(const uint8_t* key, ZQString& out) {
  int32_t n = keyLength_;
  while (n > 0 && key[n - 1] == 0) --n;
  if (n == keyLength_ || byValue_ || (out.Capacity() < keyLength_ && !out.Allocate(keyLength_))) return key;
  uint8_t* p = reinterpret_cast<uint8_t*>(out.GetBuffer());
  memcpy(p, key, size_t(n));
  memset(p + n, ' ', size_t(keyLength_ - n));
  return p;
}

void ZQTreeCheck::Keys(int32_t block, int count, const uint8_t* first, int32_t stride, Bound lo, Bound hi) {
  const uint8_t* loBlanked = lo.key != nullptr ? Blanked(lo.key, loBlanked_) : nullptr;
  const uint8_t* hiBlanked = hi.key != nullptr ? Blanked(hi.key, hiBlanked_) : nullptr;
  bool order = true, low = true, high = true;
  for (int i = 0; i < count; ++i) {
    const uint8_t* key = first + int64_t(i) * stride;
    if (order && i > 0 && Compare(key - stride, key) > 0) {
      order = false;
      Fault(block, "key %d %s is less than key %d %s before it: the keys are out of order", i, Shown(key, 0), i - 1,
            Shown(key - stride, 1));
    }
    if (low && lo.key != nullptr && Compare(key, lo.key) < 0 && Compare(key, loBlanked) < 0) {
      low = false;
      Fault(block, "key %d %s is less than %s, the key that block %d holds before this block", i, Shown(key, 0),
            Shown(lo.key, 1), lo.block);
    }
    if (high && hi.key != nullptr && Compare(key, hi.key) > 0 && Compare(key, hiBlanked) > 0) {
      high = false;
      Fault(block, "key %d %s is greater than %s, the highest key that block %d holds for this block", i,
            Shown(key, 0), Shown(hi.key, 1), hi.block);
    }
  }
}

int ZQTreeCheck::Compare(const uint8_t* a, const uint8_t* b) const {
  if (!byValue_) return memcmp(a, b, size_t(keyLength_));
  double x, y;
  uint64_t bits = GetLe64(a);
  memcpy(&x, &bits, sizeof x);
  bits = GetLe64(b);
  memcpy(&y, &bits, sizeof y);
  return x < y ? -1 : x > y ? 1 : 0;  // NaN is out of order with nothing
}

uint8_t* ZQTreeCheck::Buffer(int depth, int32_t bytes) {
  if (depth < 0 || depth > kLevels) return nullptr;
  ZQString& b = levels_[depth];
  if (b.Capacity() < bytes && !b.Allocate(bytes)) return nullptr;
  return reinterpret_cast<uint8_t*>(b.GetBuffer());
}

void ZQTreeCheck::Siblings(int depth, int32_t at, int32_t left, int32_t right) {
  if (depth < 0 || depth > kLevels) return;
  Level& l = order_[depth];
  if (l.known && l.at < 0 && left != -1) {
    Fault(at / kUnit, "its left sibling is %s, where it is the first block of its level (none)", Place(left, 0));
  } else if (l.known && l.at >= 0) {
    if (left != l.at)
      Fault(at / kUnit, "its left sibling is %s, where the block before it at its level is %s", Place(left, 0),
            Place(l.at, 1));
    if (l.right != at)
      Fault(l.at / kUnit, "its right sibling is %s, where the block after it at its level is %s", Place(l.right, 0),
            Place(at, 1));
  }
  l = Level{at, right, true};
}

void ZQTreeCheck::LoseLevels(int depth) {
  for (int d = depth < 0 ? 0 : depth; d <= kLevels; ++d) order_[d].known = false;
}

int32_t ZQTreeCheck::Finish() {
  for (const Level& l : order_)
    if (l.known && l.at >= 0 && l.right != -1)
      Fault(l.at / kUnit, "its right sibling is %s, where it is the last block of its level (none)", Place(l.right, 0));
  if (faults_ > kMaxLines) {
    char line[96];
    snprintf(line, sizeof line, "and %d more faults of the tree's structure, not listed\n", faults_ - kMaxLines);
    out_ += line;
  }
  return faults_;
}

const char* ZQTreeCheck::Shown(const uint8_t* key, int slot) {
  char* out = shown_[slot];
  size_t n = size_t(keyLength_);
  while (n > 0 && key[n - 1] == ' ') --n;
  size_t at = 0;
  out[at++] = '\'';
  for (size_t i = 0; i < n && at + 6 < sizeof shown_[0]; ++i) {
    uint8_t c = key[i];
    if (c >= 0x20 && c < 0x7F && c != '\\') out[at++] = char(c);
    else at += size_t(snprintf(out + at, 5, "\\x%02X", c));
  }
  out[at++] = '\'';
  out[at] = '\0';
  return out;
}

const char* ZQTreeCheck::Place(int32_t at, int slot) {
  char* out = place_[slot];
  if (at == -1) snprintf(out, sizeof place_[0], "none");
  else if (at >= 0 && at % kUnit == 0) snprintf(out, sizeof place_[0], "block %d", at / kUnit);
  else snprintf(out, sizeof place_[0], "offset %d", at);
  return out;
}
