#include "host/zqhash.h"

#include <cstdlib>
#include <cstring>

ZQHashTable::ZQHashTable(int size) {
  // At least a few thousand checkpoints: random access then rereads at most
  // 1/capacity of the table.
  capacity_ = size < 512 ? 4096 : size * 8;
}

ZQHashTable::~ZQHashTable() { free(entries_); }

void ZQHashTable::Reset() {
  count_ = 0;
  stride_ = 1;
}

void ZQHashTable::AddRec(int32_t key, int64_t value, int32_t extra) {
  if (key < 0 || key % stride_ != 0) return;  // between checkpoints
  if (entries_ == nullptr) {
    entries_ = static_cast<ZQHashEntry*>(malloc(sizeof(ZQHashEntry) * size_t(capacity_)));
    if (entries_ == nullptr) return;  // no map: callers scan from the start
  }
  // Find the slot (appending is the usual case).
  int32_t pos = count_;
  while (pos > 0 && entries_[pos - 1].key > key) --pos;
  if (pos > 0 && entries_[pos - 1].key == key) {
    entries_[pos - 1] = ZQHashEntry{int32_t(value), extra, key, value};
    return;
  }
  if (count_ == capacity_) {
    // Full: keep the keys on twice the stride.
    stride_ *= 2;
    int32_t kept = 0;
    for (int32_t i = 0; i < count_; ++i)
      if (entries_[i].key % stride_ == 0) entries_[kept++] = entries_[i];
    count_ = kept;
    if (key % stride_ != 0) return;
    pos = count_;
    while (pos > 0 && entries_[pos - 1].key > key) --pos;
  }
  memmove(entries_ + pos + 1, entries_ + pos, sizeof(ZQHashEntry) * size_t(count_ - pos));
  entries_[pos] = ZQHashEntry{int32_t(value), extra, key, value};
  ++count_;
}

const ZQHashEntry* ZQHashTable::FindRec(int32_t key, int32_t& found) const {
  found = -1;
  int32_t lo = 0, hi = count_;  // first entry with a key above `key`
  while (lo < hi) {
    int32_t mid = lo + (hi - lo) / 2;
    if (entries_[mid].key <= key) lo = mid + 1;
    else hi = mid;
  }
  if (lo == 0) return nullptr;
  found = entries_[lo - 1].key;
  return &entries_[lo - 1];
}
