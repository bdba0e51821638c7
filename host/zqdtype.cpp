#include "host/zqdtype.h"

#include <cstdlib>
#include <cstring>

#include "host/endian.h"

namespace {

struct BaseType {
  const char* name;
  DATATYPE kind;
  FIELDTYPE family;
  int32_t length;
};

// The base names the host knows, with the kind and value family they imply.
// Dates and dBASE numbers are doubles in binary form (their index keys are
// 8-byte doubles); their table form is text all the same.
constexpr BaseType kBaseTypes[] = {
    {"Text", DT_TEXT, FT_TEXT, 0},          {"Memo", DT_TEXT, FT_TEXT, 0},
    {"Binary", DT_TEXT, FT_BINARY, 0},      {"Date", DT_DOUBLE, FT_DATE, 8},
    {"DateTime", DT_TEXT, FT_DATETIME, 8},  {"Boolean", DT_TEXT, FT_BOOLEAN, 1},
    {"dBASE Numeric", DT_DOUBLE, FT_NUMERIC, 0}, {"Integer", DT_LONG, FT_INTEGER, 4},
    {"Float", DT_DOUBLE, FT_FLOAT, 8},
};

bool IsTrue(const char* v) {
  return v[0] == '\0' || v[0] == '1' || v[0] == 't' || v[0] == 'T' || v[0] == 'y' || v[0] == 'Y';
}

int32_t ToNumber(const char* v) { return int32_t(strtol(v, nullptr, 0)); }

}  // namespace

ZQDType::ZQDType() = default;

ZQDType::ZQDType(DATATYPE kind) : kind_(kind) {
  length_ = BinaryWidth();
  if (kind == DT_DOUBLE) family_ = FT_FLOAT;
  if (kind == DT_SHORT || kind == DT_LONG) family_ = FT_INTEGER;
}

ZQDType::~ZQDType() = default;

void ZQDType::Define(const char* definition) {
  if (definition == nullptr) return;
  *this = ZQDType();
  const char* p = definition;
  bool first = true;
  while (*p != '\0') {
    const char* end = strchr(p, ';');
    size_t n = end ? size_t(end - p) : strlen(p);
    char seg[256];
    if (n >= sizeof seg) n = sizeof seg - 1;
    memcpy(seg, p, n);
    seg[n] = '\0';
    p = end ? end + 1 : p + strlen(p);
    if (first) {
      first = false;
      name_ = seg;
      for (const BaseType& b : kBaseTypes) {
        if (strcmp(b.name, seg) == 0) {
          kind_ = b.kind;
          family_ = b.family;
          length_ = b.length;
        }
      }
      continue;
    }
    char* eq = strchr(seg, '=');
    const char* value = "";
    if (eq != nullptr) {
      *eq = '\0';
      value = eq + 1;
    }
    if (strcmp(seg, "usage") == 0) usage_ = int16_t(ToNumber(value));
    else if (strcmp(seg, "alias") == 0) alias_ = value;
    else if (strcmp(seg, "picture") == 0) picture_ = value;
    else if (strcmp(seg, "picture_settable") == 0) picture_settable_ = IsTrue(value);
    else if (strcmp(seg, "decsep") == 0) decsep_ = value[0] ? value[0] : '.';
    else if (strcmp(seg, "length") == 0) length_ = ToNumber(value);
    else if (strcmp(seg, "maxlength") == 0) max_length_ = ToNumber(value);
    else if (strcmp(seg, "maxprecision") == 0) max_precision_ = ToNumber(value);
    else if (strcmp(seg, "currency") == 0) {
      currency_ = true;
      family_ = FT_CURRENCY;
    } else if (strcmp(seg, "length_invalid") == 0) length_invalid_ = true;
    else if (strcmp(seg, "padchar_invalid") == 0) pad_ = '\0';
    else if (strcmp(seg, "varlen_invalid") == 0) varlen_invalid_ = true;
  }
}

char ZQDType::GetPadChar(char* out) const {
  if (out != nullptr) *out = pad_;
  return pad_;
}

int32_t ZQDType::BinaryWidth() const {
  switch (kind_) {
    case DT_SHORT: return 2;
    case DT_LONG: return 4;
    case DT_DOUBLE: return 8;
    default: return 0;
  }
}

bool ZQDType::ReadRaw(const ZQString& s, int32_t offset, uint64_t& raw) const {
  int32_t w = BinaryWidth();
  raw = 0;
  if (w == 0 || offset < 0 || offset > s.length() - w) return false;
  const auto* p = reinterpret_cast<const uint8_t*>(s.c_str()) + offset;
  switch (w) {
    case 2: raw = msb_first_ ? GetBe16(p) : GetLe16(p); break;
    case 4: raw = msb_first_ ? GetBe32(p) : GetLe32(p); break;
    default: raw = msb_first_ ? GetBe64(p) : GetLe64(p); break;
  }
  return true;
}

int32_t ZQDType::WriteRaw(ZQString& s, uint64_t raw) const {
  uint8_t b[8];
  int32_t w = BinaryWidth();
  switch (w) {
    case 2: msb_first_ ? PutBe16(b, uint16_t(raw)) : PutLe16(b, uint16_t(raw)); break;
    case 4: msb_first_ ? PutBe32(b, uint32_t(raw)) : PutLe32(b, uint32_t(raw)); break;
    case 8: msb_first_ ? PutBe64(b, raw) : PutLe64(b, raw); break;
    default: return 0;
  }
  return s.Append(reinterpret_cast<const char*>(b), w) ? w : 0;
}

static double RawToDouble(uint64_t raw) {
  double d;
  memcpy(&d, &raw, sizeof d);
  return d;
}

static uint64_t DoubleToRaw(double d) {
  uint64_t raw;
  memcpy(&raw, &d, sizeof raw);
  return raw;
}

// Decodes `raw` of `width` bytes as the number the kind stands for.
static double RawValue(uint64_t raw, int32_t width, bool is_signed) {
  switch (width) {
    case 2: return is_signed ? double(int16_t(raw)) : double(uint16_t(raw));
    case 4: return is_signed ? double(int32_t(raw)) : double(uint32_t(raw));
    case 8: return RawToDouble(raw);
    default: return 0;
  }
}

int32_t ZQDType::Input(const ZQString& s, int32_t offset, int16_t& out) const {
  uint64_t raw;
  out = 0;
  if (!ReadRaw(s, offset, raw)) return 0;
  out = int16_t(RawValue(raw, BinaryWidth(), signed_));
  return BinaryWidth();
}

int32_t ZQDType::Input(const ZQString& s, int32_t offset, int32_t& out) const {
  uint64_t raw;
  out = 0;
  if (!ReadRaw(s, offset, raw)) return 0;
  int32_t w = BinaryWidth();
  if (w == 4) out = int32_t(uint32_t(raw));  // unsigned 32-bit wraps, as the bytes say
  else out = int32_t(RawValue(raw, w, signed_));
  return w;
}

int32_t ZQDType::Input(const ZQString& s, int32_t offset, double& out) const {
  uint64_t raw;
  out = 0;
  if (!ReadRaw(s, offset, raw)) return 0;
  out = RawValue(raw, BinaryWidth(), signed_);
  return BinaryWidth();
}

int32_t ZQDType::Output(ZQString& s, int16_t v) const { return Output(s, int32_t(v)); }

int32_t ZQDType::Output(ZQString& s, int32_t v) const {
  if (kind_ == DT_DOUBLE) return WriteRaw(s, DoubleToRaw(double(v)));
  return WriteRaw(s, uint64_t(uint32_t(v)));
}

int32_t ZQDType::Output(ZQString& s, double v) const {
  if (kind_ == DT_DOUBLE) return WriteRaw(s, DoubleToRaw(v));
  return WriteRaw(s, uint64_t(uint32_t(int32_t(v))));
}
