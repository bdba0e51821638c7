// The transfer loop: every record of a source, through a field plan, into a
// target whose output is open, the way the integration engine moves them.
#pragma once

#include <cstdint>
#include <string>
#include <unordered_map>
#include <vector>

#include "engine/field_plan.h"
#include "host/zqspoke.h"

// Update mode: the records of the open target by their key.
class KeyedRecords {
 public:
  explicit KeyedRecords(std::vector<int> key) : key_(std::move(key)) {}
  // One pass over the target maps each key to its position. False with
  // `error` set.
  bool Load(ZQExport* target, const ZQRecord& layout, std::string* error);
  // The position of the record with the key of `record`, or -1; a key not
  // found is taken as the next record's.
  int64_t Find(ZQRecord& record);

 private:
  std::vector<int> key_;
  std::unordered_map<std::string, int64_t> positions_;
  int64_t live_ = 0;
  std::string scratch_;
};

struct TransferCounts {
  int32_t read = 0;  // source records read
  int64_t added = 0, updated = 0;
};

// Reads every record of `source` through `plan` without writing one: true
// when each value fits its target field, else false with `error` naming the
// first that doesn't (or the source's own error). A run that changes a table
// in place calls it first, so that a bad value leaves the table as it was.
bool CheckValues(ZQImport* source, FieldPlan& plan, std::string* error);

// Moves each record of `source` into `target`: added, or with `keyed`
// (update mode) put in place of the target's record of the same key when
// there is one. True when every record went; else false with `error` set.
bool Transfer(ZQImport* source, ZQExport* target, FieldPlan& plan, KeyedRecords* keyed, bool progress,
              TransferCounts* counts, std::string* error);
