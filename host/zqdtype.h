// Data types of the host: kind, length, precision, decimals, picture, usage
// code, alias and byte order. A connector describes its types by definition
// strings of the form "Name;key=value;flag;..." and the host parses them with
// Define. The base name (the first segment) says what family of value a field
// of the type holds: "Text", "Memo", "Binary", "Date", "DateTime", "Boolean",
// "dBASE Numeric", "Integer", "Float". Copyable value class.
#pragma once

#include <cstdint>

#include "host/zqstring.h"
#include "host/zqtypes.h"

class ZQDType {
 public:
  ZQDType();
  explicit ZQDType(DATATYPE kind);
  ZQDType(const ZQDType&) = default;
  ZQDType& operator=(const ZQDType&) = default;
  ~ZQDType();

  // Parses "Name;key=value;..." (keys: usage, alias, picture, picture_settable,
  // decsep, length, maxlength, maxprecision, currency, length_invalid,
  // padchar_invalid, varlen_invalid). Unknown keys are ignored.
  void Define(const char* definition);

  const char* Name() const { return name_.c_str(); }
  DATATYPE Kind() const { return kind_; }
  FIELDTYPE Family() const { return family_; }
  int16_t Usage() const { return usage_; }
  const char* Alias() const { return alias_.c_str(); }
  int32_t Length() const { return length_; }
  int32_t Length(int32_t n) { return length_ = n; }
  int32_t MaxLength() const { return max_length_; }
  int32_t MaxLength(int32_t n) { return max_length_ = n; }
  int32_t Precision() const { return precision_ ? precision_ : length_; }
  int32_t MaxPrecision() const { return max_precision_; }
  int16_t DecimalPlaces() const { return decimals_; }
  int16_t DecimalPlaces(int16_t n) { return decimals_ = n; }
  void Signed(bool s) { signed_ = s; }
  bool IsSigned() const { return signed_; }
  void Picture(const char* picture) { picture_ = picture ? picture : ""; }
  const char* GetPicture() const { return picture_.c_str(); }
  void MSBFirst(bool msb) { msb_first_ = msb; }
  bool IsMSBFirst() const { return msb_first_; }
  bool IsCurrency() const { return currency_; }
  bool LengthInvalid() const { return length_invalid_; }
  char DecimalSeparator() const { return decsep_; }
  // The pad character, 0 for none. `out` may be NULL.
  char GetPadChar(char* out) const;

  // Binary numbers in the type's width (2, 4 or 8 bytes by kind) and byte
  // order at `offset` of `s`. The result is the number of bytes used; 0 when
  // `s` has too few bytes there, and then `out` is 0.
  int32_t Input(const ZQString& s, int32_t offset, int16_t& out) const;
  int32_t Input(const ZQString& s, int32_t offset, int32_t& out) const;
  int32_t Input(const ZQString& s, int32_t offset, double& out) const;
  // Appends a number in the type's own width and byte order, whatever the
  // width of the argument: a 32-bit type given a short still appends 4 bytes.
  int32_t Output(ZQString& s, int16_t v) const;
  int32_t Output(ZQString& s, int32_t v) const;
  int32_t Output(ZQString& s, double v) const;

  // Width in bytes of a binary kind: 2, 4, 8; 0 for text.
  int32_t BinaryWidth() const;

 private:
  bool ReadRaw(const ZQString& s, int32_t offset, uint64_t& raw) const;
  int32_t WriteRaw(ZQString& s, uint64_t raw) const;

  ZQString name_;
  ZQString alias_;
  ZQString picture_;
  DATATYPE kind_ = DT_TEXT;
  FIELDTYPE family_ = FT_TEXT;
  int16_t usage_ = 0;
  int16_t decimals_ = 0;
  int32_t length_ = 0;
  int32_t max_length_ = 0;
  int32_t precision_ = 0;
  int32_t max_precision_ = 0;
  char decsep_ = '.';
  char pad_ = ' ';
  bool signed_ = true;
  bool msb_first_ = false;
  bool currency_ = false;
  bool length_invalid_ = false;
  bool picture_settable_ = true;
  bool varlen_invalid_ = false;
};
