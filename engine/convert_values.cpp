#include "engine/convert_values.h"

#include <cstdio>
#include <cstdlib>

#include "engine/text_util.h"

// A text that reads whole as a number (blanks around it allowed).
static bool IsNumberText(const ZQString& s) {
  const char* p = s.c_str();
  while (*p == ' ') ++p;
  if (*p == '\0') return true;  // blank
  // The usual form first, without a conversion: sign, digits, point, digits.
  const char* q = p + (*p == '-' || *p == '+');
  const char* digits = q;
  while (*q >= '0' && *q <= '9') ++q;
  if (*q == '.') ++q;
  while (*q >= '0' && *q <= '9') ++q;
  if (q > digits && !(q == digits + 1 && *digits == '.')) {
    while (*q == ' ') ++q;
    if (*q == '\0') return true;
  }
  char* end = nullptr;
  strtod(p, &end);
  if (end == p) return false;
  while (*end == ' ') ++end;
  return *end == '\0';
}

static bool IsLogicalText(const ZQString& s) {
  static const char* const kWords[] = {"t", "true", "y", "yes", "f", "false", "n", "no", "?", ""};
  std::string v = Lower(std::string(s.c_str(), size_t(s.length())));
  while (!v.empty() && v.back() == ' ') v.pop_back();
  for (const char* w : kWords)
    if (v == w) return true;
  return false;
}

bool CopyValue(ZQField* dst, ZQField* src, FieldCheck* check) {
  if (src->held() == ZQField::Held::kText) {
    FIELDTYPE t = dst->FieldType();
    const ZQString& s = src->StringRef();
    bool numeric = t == FT_NUMERIC || t == FT_INTEGER || t == FT_FLOAT || t == FT_CURRENCY;
    if (numeric && !IsNumberText(s)) return false;
    if (t == FT_BOOLEAN && !IsLogicalText(s)) return false;
    if (t == FT_DATE) {
      dst->AssignText(s.c_str(), s.length());
      return dst->held() != ZQField::Held::kText;
    }
  }
  switch (src->held()) {
    case ZQField::Held::kBlank:
      dst->Blank();
      if (check->letter == 'L') ++check->blank_logicals;
      return true;
    case ZQField::Held::kText: {
      const ZQString& s = src->StringRef();
      if ((check->letter == 'C' || check->letter == 'N' || check->letter == 'F') && s.length() > check->width)
        ++check->cut;
      dst->AssignText(s.c_str(), s.length());
      return true;
    }
    case ZQField::Held::kLong: dst->SetLong(src->LongVal()); return true;
    case ZQField::Held::kDouble: *dst = src->DoubleVal(); return true;
    case ZQField::Held::kDate: {
      const ZQDate& d = src->DateRef();
      dst->SetDate(d.Year(), d.Month(), d.Day());
      return true;
    }
    case ZQField::Held::kDateTime: *dst = src->DateTimeRef(); return true;
    case ZQField::Held::kBool: dst->SetBool(src->BoolVal()); return true;
  }
  return true;
}

void KeyOf(ZQRecord& record, const std::vector<int>& key, std::string* out) {
  out->clear();
  for (int i : key) {
    ZQField* f = record[i];
    if (f->IsBlank()) {
      *out += '\x1f';
      continue;
    }
    switch (f->FieldType()) {
      case FT_NUMERIC:
      case FT_INTEGER:
      case FT_FLOAT:
      case FT_CURRENCY: {
        char buf[40];
        snprintf(buf, sizeof buf, "%.15g", f->DoubleVal());
        *out += buf;
        break;
      }
      default: {
        ZQString text;
        f->RenderText(text, 1);
        text.StripChars(false, true, ' ');
        out->append(text.c_str(), size_t(text.length()));
      }
    }
    *out += '\x1f';
  }
}
