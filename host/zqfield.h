// Fields and records of the host.
//
// A ZQField holds one value of its ZQDType's family. Text assigned to a field
// is parsed by the field's type and picture: numbers keep their text (parsed
// on demand by DoubleVal), dates of the picture "yyyymmdd" become a date (a
// text that is no date is kept as it stands, so nothing is lost), logicals take
// their first letter. Assignment reuses the field's buffers, so a record loop
// allocates nothing once the buffers have grown.
#pragma once

#include <cstdint>

#include "host/zqdate.h"
#include "host/zqdtype.h"
#include "host/zqstring.h"

// One extra block a field may carry for its connector; the field owns it.
class ZQFieldInfo {
 public:
  virtual ~ZQFieldInfo();
};

class ZQField {
 public:
  // What the field holds now.
  enum class Held : uint8_t { kBlank, kText, kLong, kDouble, kDate, kDateTime, kBool };

  ZQField(const ZQDType& type, const char* name);
  virtual ~ZQField();
  ZQField(const ZQField&) = delete;
  ZQField& operator=(const ZQField&) = delete;

  void operator=(const ZQString& text);
  // The same as assigning a ZQString of those bytes, without building one.
  // Inline: the record loops of the modules call it for every field.
  void AssignText(const char* p, int32_t n) {
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
  void operator=(int32_t value);
  void operator=(double value);
  void operator=(const ZQDateTime& value);
  void SetDate(int32_t year, int32_t month, int32_t day);
  void SetBool(bool value);
  void SetLong(int64_t value);
  // Blanks the value; the text buffer keeps its room for the next value.
  void Blank() { held_ = Held::kBlank; }
  // Takes the text that `src` holds (REQUIRES: src.held() == Held::kText)
  // as it stands, without copying it: the two fields exchange their text
  // buffers and `src` is left blank. For a record loop that moves each value
  // on, when assigning the text would keep it byte for byte.
  void TakeText(ZQField& src) {
    text_.Swap(src.text_);
    held_ = Held::kText;
    src.held_ = Held::kBlank;
  }

  void Name(const char* name);
  const char* Name() const { return name_.c_str(); }
  const wchar* FieldName() const { return wide_name_.c_str(); }
  const ZQDType& DataType() const { return type_; }
  void DataType(const ZQDType& type) { type_ = type; }
  int32_t Length() const { return type_.Length(); }
  // 8 for the picture "yyyymmdd", 1 for "T.F", else the length.
  int32_t DisplayLength() const;
  int DecLen() const { return type_.DecimalPlaces(); }
  FIELDTYPE FieldType() const { return type_.Family(); }

  Held held() const { return held_; }
  bool IsBlank() const;
  double DoubleVal() const;
  int64_t LongVal() const;
  bool BoolVal() const { return held_ == Held::kBool && bool_; }
  const ZQDate& DateRef();
  const ZQDateTime& DateTimeRef() const { return datetime_; }
  // The value's text form (by RenderText with flag 1); for text and numbers
  // held as text, the text itself.
  const ZQString& StringRef() {
    if (held_ != Held::kText) RenderInto(text_);
    return text_;
  }

  ZQFieldInfo* GetFieldInfo() const { return info_; }
  // Takes `info` over; the caller deletes the old one first.
  void SetFieldInfo(ZQFieldInfo* info) { info_ = info; }

  // Puts the value's text form into `out`: flag 0 the plain number form,
  // flag 1 the form by the field's picture.
  virtual void RenderText(ZQString& out, int flag);
  virtual void SetPicture(const char* picture) { type_.Picture(picture); }

 private:
  void RenderInto(ZQString& text);
  void AssignNumberText(const char* p, int32_t n);
  void AssignDateText(const char* p, int32_t n);
  void AssignBoolText(const char* p, int32_t n);

  ZQDType type_;
  ZQString name_;
  ZQWString wide_name_;
  ZQString text_;
  ZQDate date_{0, 0, 0};
  ZQDateTime datetime_;
  double double_ = 0;
  int64_t long_ = 0;
  bool bool_ = false;
  Held held_ = Held::kBlank;
  ZQFieldInfo* info_ = nullptr;
};

// An ordered list of fields. Fields made by NewField are owned; fields placed
// by InstallField are borrowed and outlive ClearFields.
class ZQRecord {
 public:
  ZQRecord();
  ZQRecord(const ZQRecord& other);
  ~ZQRecord();
  bool operator=(const ZQRecord& other);

  int FieldCount() const { return count_; }
  ZQField* GetFieldbyPos(int pos) const { return pos >= 0 && pos < count_ ? fields_[pos] : nullptr; }
  ZQField* operator[](int pos) const { return GetFieldbyPos(pos); }
  // Exact name first, then without regard to case; NULL if none.
  ZQField* GetFieldbyName(const char* name) const;
  // NULL when memory runs out.
  ZQField* NewField(const ZQDType& type, const char* name);
  void ClearFields();
  void BlankFields();
  // Places a borrowed field at `pos` (0..FieldCount()); false when out of memory.
  bool InstallField(int pos, ZQField* field);

 private:
  bool Grow();

  ZQField** fields_ = nullptr;
  bool* owned_ = nullptr;
  int count_ = 0;
  int cap_ = 0;
};
