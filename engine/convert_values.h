// Values on their way from a source field to a target field.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "host/zqfield.h"

// The field types that hold numbers (N, I, F, Y).
inline bool IsNumericType(FIELDTYPE t) {
  return t == FT_NUMERIC || t == FT_INTEGER || t == FT_FLOAT || t == FT_CURRENCY;
}

// Per target field: how many values did not fit and were cut.
struct FieldCheck {
  char letter;
  int32_t width;
  int16_t decimals = 0;
  bool widths = true;  // the target stores numbers in a width (a table), so they are checked
  int64_t cut = 0;
  int64_t blank_logicals = 0;  // a table's logical has no blank: they become F
};

// Copies a value; false when the target's field can't hold it (text that is
// no number for a number, no date for a date, no logical for a logical, a
// number too wide for its field), so that nothing is stored as something else
// or lost without a word. With `move`, text may be taken from `src` instead
// of copied, leaving `src` blank (ZQField::TakeText).
bool CopyValue(ZQField* dst, ZQField* src, FieldCheck* check, bool move = false);

// True when a table stores the number now in `dst` whole in a field of
// `check`: N and F within their width at their decimals (never with the high
// digits, the sign or an exponent form in place of digits), I within 32 bits,
// Y within 64 bits of ten-thousandths. A number held as text in another form
// than plain digits ("1e3") is put in `dst` as its value.
bool NumberFits(ZQField* dst, const FieldCheck& check);

// The text that identifies a record by its key fields, in one form for any
// spoke: numbers by value, dates as yyyymmdd, text without trailing blanks.
void KeyOf(ZQRecord& record, const std::vector<int>& key, std::string* out);
