// Test helpers for the target spoke: a ZQToDbase driven the way the engine
// drives it (factory, options, mode, layout 0, _OpenOutput, one
// GenerateDetailRecord per record, _CloseOutput), and a reader of the written
// bytes that knows nothing of the code under test.
#pragma once

#include <cstring>
#include <string>
#include <vector>

#include "connector/todbase.h"
#include "host/endian.h"
#include "tests/support/dbf_builder.h"
#include "tests/support/read_harness.h"

namespace tests {

class Target {
 public:
  explicit Target(int dialect, int mode = 0, int memo_policy = 0, int codepage = 0)
      : spoke_(NewToDbase(ZQSpokeDef{})) {
    spoke_->SetOption("version", std::to_string(dialect).c_str());
    spoke_->SetOption("ignorememoerr", std::to_string(memo_policy).c_str());
    if (codepage != 0) spoke_->SetOption("codepage", std::to_string(codepage).c_str());
    spoke_->SetMode(ZQSpoke::SpokeMode(mode));
  }
  ~Target() {
    if (spoke_->TableHandle() != nullptr) spoke_->_CloseOutput(true);
    DeleteToDbase(spoke_);
  }
  Target(const Target&) = delete;
  Target& operator=(const Target&) = delete;

  ZQToDbase* operator->() const { return spoke_; }
  ZQRecord& Layout() const { return *spoke_->GetLayout(0); }
  ZQField* operator[](int i) const { return Layout()[i]; }

  // The connector's type of `letter`: from its valid list, else from its
  // full list of definitions (a letter that the dialect doesn't offer).
  ZQDType TypeOf(char letter) const {
    const ZQDType* const* valid = spoke_->GetValidTypes();
    for (int i = 0; valid != nullptr && valid[i] != nullptr; ++i)
      if (valid[i]->Usage() == letter) return *valid[i];
    const char** defs = ZQDbase::GetModifiedTypedefs();
    for (int i = 0; defs[i] != nullptr; ++i) {
      ZQDType t;
      t.Define(defs[i]);
      if (t.Usage() == letter) return t;
    }
    return ZQDType();
  }

  // Adds a field to layout 0 as a host designs one: the type, its length
  // and decimals, then the spoke's pictures.
  ZQField* Add(char letter, const char* name, int length = 0, int decimals = 0) {
    return AddType(TypeOf(letter), name, length, decimals);
  }
  ZQField* AddType(ZQDType t, const char* name, int length = 0, int decimals = 0) {
    if (length > 0) t.Length(length);
    else if (t.Usage() == 'D') t.Length(8);
    else if (t.Usage() == 'L') t.Length(1);
    t.DecimalPlaces(int16_t(decimals));
    ZQField* f = Layout().NewField(t, name);
    spoke_->FormatSpokeField(f, nullptr);
    return f;
  }

  BATCHERR Open(const std::string& path) {
    ZQConnTarget target;
    target.path = path.c_str();
    return spoke_->_OpenOutput(target);
  }
  BATCHERR Write() { return spoke_->GenerateDetailRecord(0); }
  BATCHERR Close(bool keep = true) { return spoke_->_CloseOutput(keep); }

  // Sets field i to text, or blanks it for nullptr.
  void Set(int i, const char* text) {
    if (text == nullptr) Layout()[i]->Blank();
    else Layout()[i]->AssignText(text, int32_t(strlen(text)));
  }
  // Sets fields 0, 1, ... to `values` (nullptr blanks one) and writes the record.
  BATCHERR Put(std::initializer_list<const char*> values) {
    int i = 0;
    for (const char* v : values) Set(i++, v);
    return Write();
  }
  // The record at SetFilePosition(n) read back through GetandDeleteRecord; its
  // field `field` as text, or "#<result>".
  std::string Reread(int64_t n, int field = 0) {
    spoke_->SetFilePosition(n);
    BATCHERR rc = spoke_->GetandDeleteRecord(Layout());
    return rc == 0 ? std::string(Layout()[field]->StringRef().c_str()) : "#" + std::to_string(rc);
  }

 private:
  ZQToDbase* spoke_;
};

// A table file as bytes, decoded by the test itself: header fields and the
// records with their flag bytes. Knows the narrow header (0x02, 0xFE) and the
// wide one.
struct Written {
  Bytes bytes;
  bool narrow = false;
  int32_t count = 0, hdrlen = 0, reclen = 0;

  explicit Written(const std::string& path) : bytes(ReadFile(path)) {
    if (bytes.size() < 12) return;
    narrow = bytes[0] == 0x02 || bytes[0] == 0xFE;
    count = narrow ? GetLe16(&bytes[1]) : int32_t(GetLe32(&bytes[4]));
    hdrlen = narrow ? 521 : GetLe16(&bytes[8]);
    reclen = GetLe16(&bytes[narrow ? 6 : 10]);
  }
  uint8_t version() const { return bytes.empty() ? 0 : bytes[0]; }
  // Record n with its flag byte; "" when it lies outside the file.
  std::string Record(int n) const {
    size_t at = size_t(hdrlen) + size_t(n) * size_t(reclen);
    if (reclen <= 0 || at + size_t(reclen) > bytes.size()) return "";
    return std::string(bytes.begin() + long(at), bytes.begin() + long(at + size_t(reclen)));
  }
  // Descriptors of the wide header: type letter and length.
  int FieldCount() const { return narrow ? 0 : (hdrlen - 33) / 32; }
  char Type(int i) const { return char(bytes[size_t(32 + 32 * i + 11)]); }
  int Length(int i) const { return bytes[size_t(32 + 32 * i + 16)]; }
};

}  // namespace tests
