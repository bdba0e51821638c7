// A map from record numbers to file positions that stays small.
//
// Keys normally arrive in ascending order (logical record numbers as a table
// is read). The table keeps at most `capacity` entries: when it is full it
// drops every other entry and from then on keeps only keys on a coarser
// stride. FindRec gives the entry with the largest key not above the one asked
// for, and the caller scans forward from there; so memory stays bounded for a
// table of any size while random access costs at most one stride of reads.
#pragma once

#include <cstdint>

struct ZQHashEntry {
  int32_t value;  // the value stored (a physical record number here)
  int32_t extra;
  int32_t key;
  int64_t value64;
};

class ZQHashTable {
 public:
  explicit ZQHashTable(int size);
  ~ZQHashTable();
  ZQHashTable(const ZQHashTable&) = delete;
  ZQHashTable& operator=(const ZQHashTable&) = delete;

  void Reset();
  void AddRec(int32_t key, int64_t value, int32_t extra);
  // The entry with the largest key <= `key`, and that key in `found`; NULL
  // (and `found` -1) when there is none.
  const ZQHashEntry* FindRec(int32_t key, int32_t& found) const;
  int32_t Count() const { return count_; }
  int32_t Stride() const { return stride_; }

 private:
  ZQHashEntry* entries_ = nullptr;  // sorted by key
  int32_t count_ = 0;
  int32_t capacity_ = 0;
  int32_t stride_ = 1;
};
