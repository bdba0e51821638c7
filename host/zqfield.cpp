#include "host/zqfield.h"

#include "host/bytescan.h"

#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>
#include <strings.h>

ZQFieldInfo::~ZQFieldInfo() = default;

ZQField::ZQField(const ZQDType& type, const char* name) : type_(type) { Name(name); }

ZQField::~ZQField() { delete info_; }

void ZQField::Name(const char* name) {
  name_ = name ? name : "";
  wide_name_.Assign(name_.c_str(), 0, name_.length());
}

int32_t ZQField::DisplayLength() const {
  const char* pic = type_.GetPicture();
  if (strcmp(pic, "yyyymmdd") == 0) return 8;
  if (strcmp(pic, "T.F") == 0) return 1;
  return type_.Length();
}

void ZQField::operator=(const ZQString& text) { AssignText(text.c_str(), text.length()); }

void ZQField::AssignNumberText(const char* p, int32_t n) {
  // Numbers keep their digits: leading blanks go, the rest is parsed on demand.
  int32_t lead = int32_t(bytescan::SkipLeft(p, size_t(n), ' '));
  p += lead;
  n -= lead;
  n = int32_t(bytescan::TrimRight(p, size_t(n), ' '));
  // A field of asterisks is how dBASE marks a number that didn't fit and
  // other writers mark a number left empty: no value either way.
  if (n == 0 || (p[0] == '*' && bytescan::SkipLeft(p, size_t(n), '*') == size_t(n))) {
    Blank();
    return;
  }
  text_.CopyN(p, n, 0);
  held_ = Held::kText;
}

void ZQField::AssignDateText(const char* p, int32_t n) {
  if (n == 8) {  // the usual case first: eight digits of a real date
    uint32_t v[8];
    bool digits = true;
    for (int i = 0; i < 8; ++i) {
      v[i] = uint32_t(uint8_t(p[i]) - '0');
      digits = digits && v[i] <= 9;
    }
    int32_t y = int32_t(v[0] * 1000 + v[1] * 100 + v[2] * 10 + v[3]);
    int32_t m = int32_t(v[4] * 10 + v[5]);
    int32_t d = int32_t(v[6] * 10 + v[7]);
    if (digits && IsValidDate(y, m, d)) {
      SetDate(y, m, d);
      return;
    }
  }
  if (n == 10 && p[4] == '-' && p[7] == '-') {  // ISO 8601, as text files write dates
    char digits[8] = {p[0], p[1], p[2], p[3], p[5], p[6], p[8], p[9]};
    bool ok = true;
    for (char c : digits) ok = ok && c >= '0' && c <= '9';
    if (ok) {
      AssignDateText(digits, 8);
      if (held_ == Held::kDate) return;
    }
  }
  bool empty = true;
  for (int32_t i = 0; i < n; ++i)
    if (p[i] != ' ' && p[i] != '0' && p[i] != '\0') empty = false;
  if (empty) {  // blanks and an all-zero date both mean "no date"
    Blank();
    return;
  }
  // Not a date: keep the bytes so that nothing is lost.
  text_.CopyN(p, n, 0);
  held_ = Held::kText;
}

void ZQField::AssignBoolText(const char* p, int32_t n) {
  char c = n > 0 ? p[0] : ' ';
  if (c == 'T' || c == 't' || c == 'Y' || c == 'y') SetBool(true);
  else if (c == 'F' || c == 'f' || c == 'N' || c == 'n') SetBool(false);
  else Blank();  // '?' and blank: not set
}

void ZQField::operator=(int32_t value) {
  long_ = value;
  held_ = Held::kLong;
}

void ZQField::SetLong(int64_t value) {
  long_ = value;
  held_ = Held::kLong;
}

void ZQField::operator=(double value) {
  double_ = value;
  held_ = Held::kDouble;
}

void ZQField::operator=(const ZQDateTime& value) {
  // Julian day 0 at midnight is what a date-time of zero bytes decodes to:
  // no value, not a day in 4713 BC.
  if (int64_t{value.Days()} + kZQEpochJulianDay == 0 && value.Seconds() == 0) {
    Blank();
    return;
  }
  datetime_ = value;
  held_ = Held::kDateTime;
}

void ZQField::SetDate(int32_t year, int32_t month, int32_t day) {
  date_.Set(year, month, day);
  held_ = Held::kDate;
}

void ZQField::SetBool(bool value) {
  bool_ = value;
  held_ = Held::kBool;
}

bool ZQField::IsBlank() const {
  return held_ == Held::kBlank || (held_ == Held::kText && text_.length() == 0);
}

double ZQField::DoubleVal() const {
  switch (held_) {
    case Held::kLong: return double(long_);
    case Held::kDouble: return double_;
    case Held::kBool: return bool_ ? 1 : 0;
    case Held::kDate: return double(JulianDayFromDate(date_.Year(), date_.Month(), date_.Day()));
    case Held::kDateTime: return double(datetime_.Days()) + datetime_.Seconds() / 86400.0;
    case Held::kText: return strtod(text_.c_str(), nullptr);
    default: return 0;
  }
}

int64_t ZQField::LongVal() const {
  if (held_ == Held::kLong) return long_;
  double d = DoubleVal();
  if (!(d > -9.2e18 && d < 9.2e18)) return 0;
  return int64_t(d);
}

const ZQDate& ZQField::DateRef() {
  if (held_ != Held::kDate) date_.Set(0, 0, 0);
  return date_;
}

void ZQField::RenderInto(ZQString& text) {
  // The value's text form replaces the buffer; the value itself stays held.
  ZQString out;
  RenderText(out, 1);
  text = out;
}

namespace {

// Writes the number text `p` with exactly `dec` decimals (rounded half away
// from zero) into `out`; false when `p` isn't a plain decimal number.
bool FixDecimals(const char* p, int32_t n, int dec, ZQString& out) {
  int32_t i = 0;
  bool neg = false;
  if (i < n && (p[i] == '-' || p[i] == '+')) neg = p[i++] == '-';
  int32_t int_start = i;
  while (i < n && p[i] >= '0' && p[i] <= '9') ++i;
  int32_t int_end = i, frac_start = i, frac_end = i;
  if (i < n && p[i] == '.') {
    frac_start = ++i;
    while (i < n && p[i] >= '0' && p[i] <= '9') ++i;
    frac_end = i;
  }
  if (i != n || (int_end == int_start && frac_end == frac_start)) return false;
  // Already in the form: no plus sign, no leading zero, the decimals wanted.
  bool has_point = frac_start != int_end;
  if ((p[0] != '+') && int_end > int_start && (p[int_start] != '0' || int_end - int_start == 1) &&
      (dec > 0 ? has_point && frac_end - frac_start == dec : !has_point) &&
      !(neg && int_end - int_start == 1 && p[int_start] == '0')) {
    out.CopyN(p, n, 0);
    return true;
  }
  // Digits: the integer part, then exactly `dec` fraction digits.
  char digits[400];
  int32_t k = 0;
  for (int32_t j = int_start; j < int_end && k < 300; ++j) digits[k++] = p[j];
  if (k == 0) digits[k++] = '0';
  int32_t int_len = k;
  for (int d = 0; d < dec && k < 399; ++d) {
    int32_t j = frac_start + d;
    digits[k++] = j < frac_end ? p[j] : '0';
  }
  if (frac_start + dec < frac_end && p[frac_start + dec] >= '5') {
    int32_t j = k - 1;
    while (j >= 0 && digits[j] == '9') digits[j--] = '0';
    if (j >= 0) {
      ++digits[j];
    } else {  // 9.99 -> 10.0: one more integer digit
      memmove(digits + 1, digits, size_t(k));
      digits[0] = '1';
      ++k;
      ++int_len;
    }
  }
  // Leading zeros of the integer part go, but one digit stays.
  int32_t lead = 0;
  while (lead < int_len - 1 && digits[lead] == '0') ++lead;
  bool zero = true;
  for (int32_t j = lead; j < k; ++j) zero = zero && digits[j] == '0';
  out = "";
  if (neg && !zero) out += '-';
  out.Append(digits + lead, int_len - lead);
  if (dec > 0) {
    out += '.';
    out.Append(digits + int_len, k - int_len);
  }
  return true;
}

}  // namespace

void ZQField::RenderText(ZQString& out, int flag) {
  char buf[64];
  switch (held_) {
    case Held::kBlank: out = ""; return;
    case Held::kText:
      // The plain form of a number has the type's decimals; a number held
      // as text is brought to them without going through a double, so that
      // long numbers keep all their digits.
      if (flag == 0 && type_.Family() == FT_NUMERIC &&
          FixDecimals(text_.c_str(), text_.length(), type_.DecimalPlaces(), out))
        return;
      out = text_;
      return;
    case Held::kLong: snprintf(buf, sizeof buf, "%lld", static_cast<long long>(long_)); break;
    case Held::kDouble:
      if (!std::isfinite(double_)) snprintf(buf, sizeof buf, "%s", "");
      else if (type_.Family() == FT_NUMERIC)
        snprintf(buf, sizeof buf, "%.*f", int(type_.DecimalPlaces()), double_);
      else snprintf(buf, sizeof buf, "%.17g", double_);
      break;
    case Held::kBool:
      buf[0] = bool_ ? 'T' : 'F';
      buf[1] = '\0';
      break;
    case Held::kDate: {
      const char* pic = type_.GetPicture();
      date_.Print(out, flag == 1 && pic[0] ? pic : "yyyymmdd");
      return;
    }
    case Held::kDateTime: datetime_.PrintIso(out); return;
  }
  out = buf;
}

// ---------------------------------------------------------------------------

ZQRecord::ZQRecord() = default;

ZQRecord::ZQRecord(const ZQRecord& other) { *this = other; }

ZQRecord::~ZQRecord() {
  ClearFields();
  free(fields_);
  free(owned_);
}

bool ZQRecord::operator=(const ZQRecord& other) {
  if (this == &other) return true;
  ClearFields();
  for (int i = 0; i < other.count_; ++i) {
    ZQField* src = other.fields_[i];
    ZQField* f = NewField(src->DataType(), src->Name());
    if (f == nullptr) return false;
  }
  return true;
}

bool ZQRecord::Grow() {
  if (count_ < cap_) return true;
  int want = cap_ ? cap_ * 2 : 16;
  auto* f = static_cast<ZQField**>(realloc(fields_, sizeof(ZQField*) * size_t(want)));
  if (f == nullptr) return false;
  fields_ = f;
  auto* o = static_cast<bool*>(realloc(owned_, sizeof(bool) * size_t(want)));
  if (o == nullptr) return false;
  owned_ = o;
  cap_ = want;
  return true;
}

ZQField* ZQRecord::GetFieldbyName(const char* name) const {
  if (name == nullptr) return nullptr;
  for (int i = 0; i < count_; ++i)
    if (strcmp(fields_[i]->Name(), name) == 0) return fields_[i];
  for (int i = 0; i < count_; ++i)
    if (strcasecmp(fields_[i]->Name(), name) == 0) return fields_[i];
  return nullptr;
}

ZQField* ZQRecord::NewField(const ZQDType& type, const char* name) {
  if (!Grow()) return nullptr;
  ZQField* f = new (std::nothrow) ZQField(type, name);
  if (f == nullptr) return nullptr;
  fields_[count_] = f;
  owned_[count_] = true;
  ++count_;
  return f;
}

void ZQRecord::ClearFields() {
  for (int i = 0; i < count_; ++i)
    if (owned_[i]) delete fields_[i];
  count_ = 0;
}

void ZQRecord::BlankFields() {
  for (int i = 0; i < count_; ++i) fields_[i]->Blank();
}

bool ZQRecord::InstallField(int pos, ZQField* field) {
  if (field == nullptr || pos < 0 || pos > count_ || !Grow()) return false;
  memmove(fields_ + pos + 1, fields_ + pos, sizeof(ZQField*) * size_t(count_ - pos));
  memmove(owned_ + pos + 1, owned_ + pos, sizeof(bool) * size_t(count_ - pos));
  fields_[pos] = field;
  owned_[pos] = false;
  ++count_;
  return true;
}
