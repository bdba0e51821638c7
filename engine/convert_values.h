// Values on their way from a source field to a target field.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "host/zqfield.h"

// Per target field: how many values did not fit and were cut.
struct FieldCheck {
  char letter;
  int32_t width;
  int64_t cut = 0;
  int64_t blank_logicals = 0;  // a table's logical has no blank: they become F
};

// Copies a value; false when the target's field can't hold it (text that is
// no number for a number, no date for a date, no logical for a logical), so
// that nothing is stored as something else or lost without a word.
bool CopyValue(ZQField* dst, ZQField* src, FieldCheck* check);

// The text that identifies a record by its key fields, in one form for any
// spoke: numbers by value, dates as yyyymmdd, text without trailing blanks.
void KeyOf(ZQRecord& record, const std::vector<int>& key, std::string* out);
