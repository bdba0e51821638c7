#include "engine/field_plan.h"

#include <algorithm>
#include <unordered_map>

#include "engine/codepages.h"
#include "engine/convert_layout.h"
#include "engine/report.h"
#include "engine/text_util.h"
#include "host/bytescan.h"
#include "host/codepage.h"
#include "host/zqglob.h"

bool SelectFieldsByName(const ZQRecord& layout, const std::vector<std::string>& names, std::vector<int>* out,
                        std::string* error) {
  for (const std::string& name : names) {
    int found = -1;
    for (int i = 0; i < layout.FieldCount() && found < 0; ++i)
      if (Lower(layout[i]->Name()) == Lower(name)) found = i;
    if (found < 0) {
      *error = "--fields: no field " + name + "; the fields are";
      for (int i = 0; i < layout.FieldCount(); ++i) *error += (i ? ", " : " ") + std::string(layout[i]->Name());
      return false;
    }
    out->push_back(found);
  }
  return true;
}

bool FieldPlan::Make(ZQRecord& in, ZQExport* target, const std::string& path, bool existing,
                     const std::vector<int>& select, std::string* error) {
  in_ = &in;
  select_ = select;
  if (select_.empty())
    for (int i = 0; i < in.FieldCount(); ++i) select_.push_back(i);
  out_ = target->GetLayout(0);
  out_->ClearFields();
  routes_.clear();
  if (existing) {
    ZQConnTarget t;
    t.path = path.c_str();
    if (target->MakeFields(*out_, t) != 0) {
      std::string message = target->LastErrorMessage();
      *error = message.empty() ? "cannot read the layout of " + path : message;
      return false;
    }
    Match(target);
  } else if (!Plan(target, error)) {
    return false;
  }
  for (FieldRoute& r : routes_)
    r.sole = r.from >= 0 && std::count_if(routes_.begin(), routes_.end(),
                                           [&](const FieldRoute& o) { return o.from == r.from; }) == 1;
  int bad_field = -1;
  if (target->ValidateLocalRecord(*out_, bad_field) != 0) {
    *error = std::string("records are too long for the target from field ") +
             (bad_field >= 0 && bad_field < out_->FieldCount() ? (*out_)[bad_field]->Name() : "?") + " on";
    return false;
  }
  return true;
}

// Each field of the existing layout takes the first unused source field of
// its name, or of the name the target would give it.
void FieldPlan::Match(ZQExport* target) {
  ZQRecord& in = *in_;
  ZQRecord& out = *out_;
  // Fields not selected count as used: they feed nothing.
  std::vector<bool> used(size_t(in.FieldCount()), true);
  // The source fields by each of their two names, in the order selected, so
  // that a wide source is matched in time linear in its fields.
  std::unordered_map<std::string, std::vector<int>> by_name;
  for (int i : select_) {
    used[size_t(i)] = false;
    std::string own = Lower(in[i]->Name()), given = Lower(TargetName(target, in[i]->Name(), nullptr));
    by_name[own].push_back(i);
    if (given != own) by_name[given].push_back(i);
  }
  for (int j = 0; j < out.FieldCount(); ++j) {
    ZQField* f = out[j];
    target->FormatSpokeField(f, nullptr);
    int match = -1;
    auto it = by_name.find(Lower(f->Name()));
    if (it != by_name.end())
      for (int i : it->second)
        if (!used[size_t(i)]) {
          match = i;
          break;
        }
    if (match < 0) WarnOf("field of the table has no source field and is left blank",
                          "fields of the table have no source field and are left blank", f->Name());
    else used[size_t(match)] = true;
    routes_.push_back(FieldRoute{match, f->Name(), FieldCheck{char(f->DataType().Usage()), f->Length(),
                                                               int16_t(f->DecLen())}});
  }
  for (int i : select_)
    if (!used[size_t(i)])
      WarnOf("source field is left out: the table has no such field",
             "source fields are left out: the table has no such fields", in[i]->Name());
}

// A new layout: each source field in a name and the nearest type the target
// has, as many as the target keeps.
bool FieldPlan::Plan(ZQExport* target, std::string* error) {
  ZQRecord& in = *in_;
  int cap = std::min(target->MaxFieldCount(), target->MaxNewFieldCount());
  TakenNames names;
  for (int i : select_) {
    ZQField* s = in[i];
    if (int(routes_.size()) == cap) {
      Warn(std::string("field ") + s->Name() + " and those behind it are left out: the target keeps " +
           std::to_string(cap) + " fields");
      break;
    }
    Planned plan;
    if (!PlanType(target, s, &plan)) {
      WarnOf("field is left out: the target has no type for it", "fields are left out: the target has no type for them",
             s->Name());
      continue;
    }
    std::string name = TargetName(target, s->Name(), &names);
    if (name != s->Name()) {
      if (Upper(s->Name()) == name) WarnOf("field name was upper-cased", "field names were upper-cased", s->Name() + (" -> " + name));
      else WarnOf("field name was changed", "field names were changed", s->Name() + (" -> " + name));
    }
    if (!plan.change.empty()) WarnOf("field type was changed", "field types were changed", s->Name() + (": " + plan.change));
    ZQField* f = out_->NewField(plan.type, name.c_str());
    if (f == nullptr) return *error = "out of memory", false;
    target->FormatSpokeField(f, s);
    routes_.push_back(FieldRoute{i, name, FieldCheck{char(plan.type.Usage()), f->Length(), int16_t(f->DecLen())}});
  }
  return true;
}

bool FieldPlan::FindKey(const std::vector<std::string>& names, std::vector<int>* key, std::string* error) const {
  for (const std::string& k : names) {
    int found = -1;
    for (size_t i = 0; i < routes_.size(); ++i) {
      int from = routes_[i].from;
      if ((from >= 0 && Lower((*in_)[from]->Name()) == Lower(k)) || Lower(routes_[i].name) == Lower(k))
        found = int(i);
    }
    if (found < 0) return *error = "--key names no field: " + k, false;
    key->push_back(found);
  }
  return true;
}

void FieldPlan::SetTextCodePage(int codepage, bool strict) {
  codepage_ = ModuleCodePage(codepage);
  strict_ = strict;
}

void FieldPlan::CheckWidths(bool check) {
  for (FieldRoute& r : routes_) r.check.widths = check;
}

bool FieldPlan::Fill(int32_t n, std::string* error, bool again, bool move) {
  ZQRecord& in = *in_;
  ZQRecord& out = *out_;
  for (size_t i = 0; i < routes_.size(); ++i) {
    FieldRoute& r = routes_[i];
    ZQField* f = out[int(i)];
    if (r.from < 0) {
      f->Blank();
    } else if (int64_t cut = r.check.cut; !CopyValue(f, in[r.from], &r.check, move && r.sole)) {
      const ZQString& v = in[r.from]->StringRef();
      std::string type(1, r.check.letter);
      if (r.check.letter == 'N' || r.check.letter == 'F')
        type += "(" + std::to_string(r.check.width) +
                (r.check.decimals > 0 ? "," + std::to_string(r.check.decimals) : std::string()) + ")";
      *error = "record " + std::to_string(n + 1) + ", field " + r.name + ": \"" +
               std::string(v.c_str(), size_t(v.length() < 40 ? v.length() : 40)) + "\" doesn't fit a " + type +
               " field";
      return false;
    } else if (codepage_ != 0 && (r.check.letter == 'C' || r.check.letter == 'M') &&
               f->held() == ZQField::Held::kText && !CheckText(n, r, f, again, cut, error)) {
      return false;
    } else if (r.check.cut > cut && Warnings() == WarnMode::kStrict) {
      const ZQString& v = in[r.from]->StringRef();
      *error = "record " + std::to_string(n + 1) + ", field " + r.name + ": \"" +
               std::string(v.c_str(), size_t(v.length() < 40 ? v.length() : 40)) + "\" would be cut to " +
               std::to_string(r.check.width) + " bytes (--strict)";
      return false;
    }
  }
  return true;
}

// Text on its way into a code page: characters the code page lacks are
// counted (or refused), and the text is converted here, since the target
// takes bytes as they are to be stored. A character field's width counts
// those bytes: `cut_before` is the count of values cut before this one.
bool FieldPlan::CheckText(int32_t n, FieldRoute& r, ZQField* f, bool again, int64_t cut_before, std::string* error) {
  const ZQString& s = f->StringRef();
  if (!bytescan::HasHighBit(s.c_str(), size_t(s.length()))) return true;
  int32_t lost = Utf8Unmappable(codepage_, s.c_str(), s.length());
  if (lost > 0) {
    std::string where = "record " + std::to_string(n + 1) + ", field " + r.name;
    if (strict_) {
      *error = where + ": \"" + std::string(s.c_str(), size_t(s.length() < 40 ? s.length() : 40)) +
               "\" has characters that code page " + std::to_string(codepage_) + " can't hold";
      return false;
    }
    if (!again) {
      if (unmappable_ == 0) first_unmappable_ = where;
      unmappable_ += lost;
    }
  }
  scratch_ = s;
  ZQGlob::InternalToExternal(codepage_, scratch_);
  f->AssignText(scratch_.c_str(), scratch_.length());
  if (r.check.letter == 'C') r.check.cut = cut_before + (scratch_.length() > r.check.width ? 1 : 0);
  return true;
}

void FieldPlan::ResetCounts() {
  for (FieldRoute& r : routes_) r.check.cut = r.check.blank_logicals = 0;
  unmappable_ = 0;
  first_unmappable_.clear();
}

void FieldPlan::WarnLosses(bool keeps_blank_logicals) const {
  for (const FieldRoute& r : routes_)
    if (r.check.cut > 0)
      WarnOf("field had values cut to its width", "fields had values cut to their width",
             r.name + ": " + std::to_string(r.check.cut) + " longer than " + std::to_string(r.check.width) + " bytes");
  if (unmappable_ > 0)
    Warn(std::to_string(unmappable_) + " characters that code page " + std::to_string(codepage_) +
         " can't hold were written as ? (the first in " + first_unmappable_ + "; --strict refuses them)");
  for (const FieldRoute& r : routes_)
    if (r.check.blank_logicals > 0 && !keeps_blank_logicals)
      WarnOf("logical field had blanks written as F", "logical fields had blanks written as F",
             r.name + ": " + std::to_string(r.check.blank_logicals));
}
