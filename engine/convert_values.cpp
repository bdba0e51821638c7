#include "engine/convert_values.h"

#include <climits>
#include <cmath>
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

static bool IsNumberLetter(char letter) {
  return letter == 'N' || letter == 'F' || letter == 'I' || letter == 'Y';
}

// Digits before the point of a plain decimal text (sign, digits, point,
// digits), leading zeros left out, and the digits behind it in `fraction`;
// -1 for text of another form.
static int32_t PlainIntegerDigits(const char* p, int32_t n, int32_t* fraction) {
  int32_t i = p[0] == '-' || p[0] == '+';
  while (i < n && p[i] == '0') ++i;
  int32_t start = i;
  while (i < n && p[i] >= '0' && p[i] <= '9') ++i;
  int32_t digits = i - start;
  if (i < n && p[i] == '.') ++i;
  int32_t frac_start = i;
  while (i < n && p[i] >= '0' && p[i] <= '9') ++i;
  *fraction = i - frac_start;
  return i == n && n > (p[0] == '-' || p[0] == '+') ? digits : -1;
}

// True when the plain decimal text `p` is, in ten-thousandths rounded on the
// fifth decimal (as a table stores a currency), within 64 bits.
static bool TenThousandthsFit(const char* p, int32_t n) {
  const char* end = p + n;
  if (p < end && (*p == '-' || *p == '+')) ++p;
  uint64_t v = 0;
  int decimals = -1;  // -1: before the point
  bool round_up = false;
  for (; p < end; ++p) {
    if (*p == '.') {
      decimals = 0;
      continue;
    }
    if (decimals >= 4) {
      if (decimals++ == 4) round_up = *p >= '5';
      continue;
    }
    uint64_t digit = uint64_t(*p - '0');
    if (v > (uint64_t{INT64_MAX} - digit) / 10) return false;
    v = v * 10 + digit;
    if (decimals >= 0) ++decimals;
  }
  for (int d = decimals < 0 ? 0 : decimals; d < 4; ++d) {
    if (v > uint64_t{INT64_MAX} / 10) return false;
    v *= 10;
  }
  return v < uint64_t{INT64_MAX} || (v == uint64_t{INT64_MAX} && !round_up);
}

bool NumberFits(ZQField* dst, const FieldCheck& check) {
  if (dst->held() == ZQField::Held::kBlank) return true;
  if (dst->held() == ZQField::Held::kText) {
    const ZQString& s = dst->StringRef();
    int32_t fraction = 0;
    int32_t digits = PlainIntegerDigits(s.c_str(), s.length(), &fraction);
    if (digits < 0) {  // "1e3", " 12 ": stored by its value
      double v = dst->DoubleVal();
      if (!std::isfinite(v)) return false;
      *dst = v;
    } else if (check.letter == 'N' || check.letter == 'F') {
      // The text written: sign, digits (one at least), point and decimals;
      // a carry of the rounding only when decimals are dropped. A negative
      // zero goes the long way, its sign being the writer's to keep or not.
      int32_t point = check.decimals > 0 ? 1 + check.decimals : 0;
      bool negative = s.c_str()[0] == '-';
      if (fraction <= check.decimals && (digits > 0 || !negative))
        return negative + (digits > 0 ? digits : 1) + point <= (check.width < 255 ? check.width : 255);
      if (digits + 2 + point <= check.width) return true;
    } else if (check.letter == 'Y') {
      return digits <= 14 || TenThousandthsFit(s.c_str(), s.length());
    }
  }
  double v = dst->DoubleVal();
  if (!std::isfinite(v)) return false;
  switch (check.letter) {
    case 'I': return v == std::trunc(v) && v >= INT32_MIN && v <= INT32_MAX;
    case 'Y': return std::fabs(v) < 922337203685477.0;
    default: {
      static ZQString text;  // scratch: no allocation per value
      dst->RenderText(text, 0);
      return text.length() <= (check.width < 255 ? check.width : 255);
    }
  }
}

static bool IsLogicalText(const ZQString& s) {
  static const char* const kWords[] = {"t", "true", "y", "yes", "f", "false", "n", "no", "?", ""};
  std::string v = Lower(std::string(s.c_str(), size_t(s.length())));
  while (!v.empty() && v.back() == ' ') v.pop_back();
  for (const char* w : kWords)
    if (v == w) return true;
  return false;
}

// True when assigning text held by `src` to `dst` keeps it byte for byte:
// `dst` takes any text as it is, or both hold numbers, whose text the source
// field has already trimmed.
static bool KeepsText(const ZQField* dst, const ZQField* src) {
  switch (dst->FieldType()) {
    case FT_DATE:
    case FT_BOOLEAN: return false;
    case FT_NUMERIC:
    case FT_INTEGER:
    case FT_FLOAT:
    case FT_CURRENCY: return IsNumericType(src->FieldType());
    default: return true;
  }
}

bool CopyValue(ZQField* dst, ZQField* src, FieldCheck* check, bool move) {
  switch (src->held()) {
    case ZQField::Held::kText: {
      FIELDTYPE t = dst->FieldType();
      const ZQString& s = src->StringRef();
      if (IsNumericType(t) && !IsNumberText(s)) return false;
      if (t == FT_BOOLEAN && !IsLogicalText(s)) return false;
      if (t == FT_DATE) {
        dst->AssignText(s.c_str(), s.length());
        return dst->held() != ZQField::Held::kText;
      }
      bool cut = check->letter == 'C' && s.length() > check->width;
      if (cut) ++check->cut;
      bool checked = check->widths && IsNumberLetter(check->letter);
      // The source's text is taken over rather than copied when nothing
      // below may still need it for a message (a cut, a number's check).
      if (move && !cut && !checked && KeepsText(dst, src)) {
        dst->TakeText(*src);
        return true;
      }
      dst->AssignText(s.c_str(), s.length());
      return !checked || NumberFits(dst, *check);
    }
    case ZQField::Held::kBlank:
      dst->Blank();
      if (check->letter == 'L') ++check->blank_logicals;
      return true;
    case ZQField::Held::kLong:
      dst->SetLong(src->LongVal());
      return !check->widths || !IsNumberLetter(check->letter) || NumberFits(dst, *check);
    case ZQField::Held::kDouble:
      *dst = src->DoubleVal();
      return !check->widths || !IsNumberLetter(check->letter) || NumberFits(dst, *check);
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
