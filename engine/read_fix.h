// What zqdb does to a table's values as they are read, on top of the source
// spoke: memo text converted from the table's code page like its other text
// (the spoke hands memos over as they are stored), and character fields
// padded with NUL bytes trimmed like those padded with blanks, a field of
// NULs only being blank.
#pragma once

#include <vector>

#include "host/zqspoke.h"

class TableReadFix {
 public:
  // For the records of `source`; does nothing for a source that is no table.
  explicit TableReadFix(ZQImport* source);
  // Mends the record just read, in place.
  void Apply(ZQRecord& record) {
    if (!text_.empty() || !memos_.empty()) Mend(record);
  }

 private:
  void Mend(ZQRecord& record);

  int codepage_ = 0;
  std::vector<int> text_;   // character fields
  std::vector<int> memos_;  // text memo fields, when there is a code page
  ZQString scratch_;
};
