// The field plan of a transfer: which source field feeds each target field,
// and the check of each value on its way (convert_values.h). The target's
// layout is made with it: a new one from the source's fields, in names and
// types the target accepts (convert_layout.h), or an existing table's own,
// fed by the source fields of the same names.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "engine/convert_values.h"
#include "host/zqspoke.h"

// One target field.
struct FieldRoute {
  int from;           // the source field that feeds it; -1: left blank
  std::string name;   // the target field's name
  FieldCheck check;   // its type letter and width, and what its values lost
  bool sole = false;  // no other target field is fed by `from`
};

// The positions in `layout` of the fields `names` (any case), in that
// order. False with `error` naming the first unknown name and listing the
// layout's fields.
bool SelectFieldsByName(const ZQRecord& layout, const std::vector<std::string>& names, std::vector<int>* out,
                        std::string* error);

class FieldPlan {
 public:
  // Lays out layout 0 of `target` for the records of `in`: with `existing`,
  // the fields of the file `path` (records added to it), else fields made
  // from the source's. Each change on the way (a name changed, a type
  // mapped, a field left out) is warned of. False with `error` set.
  // `select` (--fields) names the source fields that go, in their order;
  // empty: all of them.
  bool Make(ZQRecord& in, ZQExport* target, const std::string& path, bool existing, const std::vector<int>& select,
            std::string* error);

  // The target fields named by `names` (by a source or a target field's
  // name), for update mode's key. False with `error` set.
  bool FindKey(const std::vector<std::string>& names, std::vector<int>* key, std::string* error) const;

  // The code page the target stores text in (0: none): memo text is
  // converted to it here (the target converts the other text itself), and
  // characters it can't hold are counted, or refused with `strict`.
  void SetTextCodePage(int codepage, bool strict);
  // Whether numbers are checked against their fields' widths: for a table,
  // not for text that has no widths.
  void CheckWidths(bool check);

  // Fills the target's record from the source's current one. False when a
  // value doesn't fit its target field, with `error` naming record `n`
  // (0-based), the field and the value. `again`: the record was filled
  // before, so what it loses is not counted twice. `move`: the source's
  // record is read no more before the next one, so text that a target field
  // keeps as it stands is taken from it rather than copied.
  bool Fill(int32_t n, std::string* error, bool again = false, bool move = false);

  // Warns of the values changed on the way: text cut to its field, blank
  // logicals written as F when the target keeps no blank, and characters
  // that the target's code page can't hold.
  void WarnLosses(bool keeps_blank_logicals) const;

  // Forgets what the values lost so far (after a pass that only checked them).
  void ResetCounts();

  ZQRecord& out() const { return *out_; }

 private:
  void Match(ZQExport* target);
  bool Plan(ZQExport* target, std::string* error);

  bool CheckText(int32_t n, FieldRoute& r, ZQField* f, bool again, int64_t cut_before, std::string* error);

  std::vector<int> select_;  // the source fields that go, in order
  ZQRecord* in_ = nullptr;
  ZQRecord* out_ = nullptr;
  std::vector<FieldRoute> routes_;
  int codepage_ = 0;  // of the target's text; 0: UTF-8, as held
  bool strict_ = false;
  int64_t unmappable_ = 0;                   // characters written as '?'
  std::string first_unmappable_;             // "field F of record R"
  ZQString scratch_;
};
