#include "engine/convert_layout.h"

#include <cctype>
#include <cstring>

#include "engine/text_util.h"

std::string TargetName(ZQExport* target, const std::string& source, TakenNames* taken) {
  ZQString first, second;
  target->FieldNameCharSet(first, second);
  size_t max = size_t(target->FieldNameMaxLength());
  std::string name = source;
  if (first.length() > 0) {
    std::string all = std::string(first.c_str()) + second.c_str();
    for (char& c : name) {
      c = char(toupper(static_cast<unsigned char>(c)));
      if (all.find(c) == std::string::npos) c = '_';
    }
    if (name.empty() || strchr(first.c_str(), name[0]) == nullptr) name = "_" + name;
  }
  if (name.size() > max) name.resize(max);
  if (taken == nullptr) return name;
  // NAME_2, NAME_3, ...: the count goes on where the last name of this base
  // stopped, so that n equal names cost n tries, not n * n.
  std::string base = name;
  int& next = taken->next[Lower(base)];
  if (next < 2) next = 2;
  for (int k = next; taken->Has(name) && k < 100000; ++k) {
    std::string suffix = "_" + std::to_string(k);
    name = base.substr(0, max > suffix.size() ? max - suffix.size() : 0) + suffix;
    next = k + 1;
  }
  taken->Add(name);
  return name;
}

static const ZQDType* ValidType(ZQExport* target, char letter, FIELDTYPE family) {
  const ZQDType* const* valid = target->GetValidTypes();
  for (int i = 0; valid != nullptr && valid[i] != nullptr; ++i)
    if (valid[i]->Usage() == letter && (family == FT_TEXT || valid[i]->Family() == family)) return valid[i];
  return nullptr;
}


bool PlanType(ZQExport* target, const ZQField* src, Planned* out) {
  const ZQDType& st = src->DataType();
  char letter = char(st.Usage());
  int32_t len = src->Length();
  int16_t dec = st.DecimalPlaces();
  auto take = [&](char l, FIELDTYPE fam, int32_t length, int16_t decimals, const char* change) {
    const ZQDType* t = ValidType(target, l, fam);
    if (t == nullptr) return false;
    out->type = *t;
    if (length > 0) out->type.Length(length);
    out->type.DecimalPlaces(decimals);
    out->change = change;
    return true;
  };
  constexpr int32_t kText = 255;  // the longest C of every dialect (Clipper's longer ones aside)
  switch (letter) {
    case 'C':
      if (len <= kText) return take('C', FT_TEXT, len, 0, "");
      return take('M', FT_TEXT, 0, 0, "text longer than 255 bytes stored as a memo") ||
             take('C', FT_TEXT, kText, 0, "text cut to 255 bytes: this dialect has no memo fields");
    case 'M':
      return take('M', FT_TEXT, 0, 0, "") ||
             take('C', FT_TEXT, kText, 0, "memo folded to text of 255 bytes: this dialect has no memo fields");
    case 'G':
      return take('G', FT_BINARY, 0, 0, "") || take('M', FT_TEXT, 0, 0, "binary memo stored as a memo") ||
             take('C', FT_TEXT, kText, 0, "binary memo folded to text of 255 bytes");
    case 'B':
      if (st.Family() == FT_FLOAT)
        return take('B', FT_FLOAT, 8, 0, "") || take('F', FT_NUMERIC, 20, 6, "double stored as F(20,6)") ||
               take('N', FT_NUMERIC, 20, 6, "double stored as N(20,6)");
      return take('B', FT_BINARY, 0, 0, "") || take('G', FT_BINARY, 0, 0, "binary memo stored as G") ||
             take('M', FT_TEXT, 0, 0, "binary memo stored as a memo") ||
             take('C', FT_TEXT, kText, 0, "binary memo folded to text of 255 bytes");
    case 'N': return take('N', FT_NUMERIC, len, dec, "");
    case 'F': return take('F', FT_NUMERIC, len, dec, "") || take('N', FT_NUMERIC, len, dec, "float stored as N");
    case 'D': return take('D', FT_DATE, 0, 0, "");
    case 'L': return take('L', FT_BOOLEAN, 0, 0, "");
    case 'I': return take('I', FT_INTEGER, 4, 0, "") || take('N', FT_NUMERIC, 11, 0, "integer stored as N(11)");
    case 'Y':
      return take('Y', FT_CURRENCY, 8, 4, "") || take('N', FT_NUMERIC, 20, 4, "currency stored as N(20,4)");
    case 'T':
      return take('T', FT_DATETIME, 8, 0, "") ||
             take('C', FT_TEXT, 19, 0, "date-time stored as text (YYYY-MM-DDTHH:MM:SS)");
    default:
      return take('C', FT_TEXT, len > 0 && len <= kText ? len : kText, 0,
                  len > kText ? "field of an unknown type stored as text of 255 bytes" : "");
  }
}
