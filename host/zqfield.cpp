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

void ZQField::AssignText(const char* p, int32_t n) {
  switch (type_.Family()) {
    case FT_NUMERIC:
    case FT_INTEGER:
    case FT_FLOAT:
    case FT_CURRENCY: AssignNumberText(p, n); return;
    case FT_DATE: AssignDateText(p, n); return;
    case FT_BOOLEAN: AssignBoolText(p, n); return;
    default:
      text_.CopyN(p, n, 0);
      held_ = Held::kText;
      return;
  }
}

void ZQField::AssignNumberText(const char* p, int32_t n) {
  // Numbers keep their digits: leading blanks go, the rest is parsed on demand.
  int32_t lead = int32_t(bytescan::SkipLeft(p, size_t(n), ' '));
  p += lead;
  n -= lead;
  n = int32_t(bytescan::TrimRight(p, size_t(n), ' '));
  if (n == 0) {
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

void ZQField::RenderText(ZQString& out, int flag) {
  char buf[64];
  switch (held_) {
    case Held::kBlank: out = ""; return;
    case Held::kText: out = text_; return;
    case Held::kLong: snprintf(buf, sizeof buf, "%lld", static_cast<long long>(long_)); break;
    case Held::kDouble:
      if (!std::isfinite(double_)) snprintf(buf, sizeof buf, "%s", "");
      else if (flag == 1 && type_.Family() == FT_NUMERIC)
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
