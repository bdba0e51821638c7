#include "host/zqspoke.h"

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <new>

#include "host/zqutil.h"

// ---------------------------------------------------------------------------
// ZQOptionDef

ZQOptionDef::ZQOptionDef(const wchar* name, const wchar* label, const wchar* description, int flags,
                         const char* default_value, const wchar* wide_default, ZQOptionGetter getter,
                         ZQOptionSetter setter, ZQOptionWGetter wgetter, ZQOptionWSetter wsetter,
                         const OptionValueDef* values, int value_count, const char*, const char*, int,
                         int32_t)
    : name_(name),
      label_(label),
      description_(description),
      flags_(flags),
      default_(default_value),
      wide_default_(wide_default),
      getter_(getter),
      setter_(setter),
      wgetter_(wgetter),
      wsetter_(wsetter),
      values_(values),
      value_count_(value_count) {
  FormatMessage(name_text_, u"%s", name_ ? name_ : u"");
}

ZQOptionDef::~ZQOptionDef() = default;

BATCHERR ZQOptionDef::Get(void* block, ZQString& value) const {
  value = "";
  if (getter_ == nullptr) return ZQ_NOT_SUPPORTED;
  return getter_(block, value, nullptr);
}

BATCHERR ZQOptionDef::Set(void* block, const char* value) const {
  bool changed = false;
  if (setter_ == nullptr) return ZQ_NOT_SUPPORTED;
  return setter_(block, value ? value : "", changed, nullptr);
}

// ---------------------------------------------------------------------------
// ZQSpokeOptions

namespace {

BATCHERR GetCodePage(void* block, ZQString& value, const wchar*) {
  char buf[16];
  snprintf(buf, sizeof buf, "%d", static_cast<ZQSpokeOptions*>(block)->CodePage());
  value = buf;
  return 0;
}

BATCHERR SetCodePage(void* block, const char* value, bool& changed, const wchar*) {
  auto* opts = static_cast<ZQSpokeOptions*>(block);
  int cp = atoi(value);
  changed = cp != opts->CodePage();
  opts->CodePage(cp);
  return 0;
}

}  // namespace

ZQOptionDef* ZQSpokeOptions::CodePageOption() {
  static ZQOptionDef def(u"codepage", u"Code Page", u"Code page of the text in the file", 1, "0",
                         nullptr, GetCodePage, SetCodePage, nullptr, nullptr, nullptr, 0, nullptr,
                         nullptr, 0, 0);
  return &def;
}

ZQSpokeOptions::ZQSpokeOptions(SPOKETYPE type, ZQSpoke* spoke) : type_(type), spoke_(spoke) {}
ZQSpokeOptions::ZQSpokeOptions(const ZQSpokeOptions& other) = default;
ZQSpokeOptions& ZQSpokeOptions::operator=(const ZQSpokeOptions& other) = default;
ZQSpokeOptions::~ZQSpokeOptions() = default;

ZQOptionDef** ZQSpokeOptions::OptionList() {
  static ZQOptionDef* list[2];
  list[0] = CodePageOption();
  list[1] = nullptr;
  return list;
}

int ZQSpokeOptions::OptionCount() { return 1; }
void ZQSpokeOptions::InitOptions() {}

// ---------------------------------------------------------------------------
// ZQIndexDef

bool ZQIndexDef::AddSeg(int16_t offset, int16_t length, const ZQDType* type, ZQField* field) {
  if (seg_count_ >= kMaxSegs) return false;
  segs_[seg_count_++] = ZQIndexSeg(offset, length, type, field);
  return true;
}

// ---------------------------------------------------------------------------
// ZQSpoke

ZQSpoke::ZQSpoke(const ZQSpokeDef& def, const char** typedefs, bool) : def_(def), typedefs_(typedefs) {}

ZQSpoke::~ZQSpoke() {
  ClearIndices();
  free(indexes_);
}

ZQSpokeOptions* ZQSpoke::NewOptions() const { return nullptr; }
void ZQSpoke::DeleteOptions(ZQSpokeOptions* opts) const { delete opts; }
bool ZQSpoke::FillOptions(ZQSpokeOptions*) const { return false; }
BATCHERR ZQSpoke::SetOptions(const ZQSpokeOptions*) { return 0; }

BATCHERR ZQSpoke::Log(int level, BATCHERR code, const ZQString& message) {
  last_error_ = message;
  EmitLog(level, code, message.c_str());
  return code;
}

BATCHERR ZQSpoke::LogError(int level, BATCHERR code, const wchar* format, ...) {
  ZQString message;
  va_list ap;
  va_start(ap, format);
  FormatMessageV(message, format, ap);
  va_end(ap);
  return Log(level, code, message);
}

BATCHERR ZQSpoke::LogError(int level, BATCHERR code, const char* format, ...) {
  char buf[1024];
  va_list ap;
  va_start(ap, format);
  vsnprintf(buf, sizeof buf, format ? format : "", ap);
  va_end(ap);
  return Log(level, code, ZQString(buf));
}

const ZQOptionDef* ZQSpoke::FindOptionDef(const char* name) const {
  ZQOptionDef** defs = GetOptionDefs();
  int n = OptionDefCount();
  for (int i = 0; defs != nullptr && i < n && defs[i] != nullptr; ++i)
    if (strcmpi(defs[i]->NameText(), name) == 0) return defs[i];
  return nullptr;
}

BATCHERR ZQSpoke::SetOption(const char* name, const char* value) {
  const ZQOptionDef* def = FindOptionDef(name);
  ZQSpokeOptions* block = GetOptions();
  if (def == nullptr || block == nullptr) return ZQ_NOT_SUPPORTED;
  return def->Set(block, value);
}

BATCHERR ZQSpoke::GetOption(const char* name, ZQString& value) const {
  const ZQOptionDef* def = FindOptionDef(name);
  ZQSpokeOptions* block = GetOptions();
  if (def == nullptr || block == nullptr) return ZQ_NOT_SUPPORTED;
  return def->Get(block, value);
}

void ZQSpoke::LoadOptions(ZQString&) {}
void ZQSpoke::SaveOptions(ZQString&) const {}

ZQDType ZQSpoke::MapDType(const ZQDType& foreign) {
  for (int i = 0; valid_types_[i] != nullptr; ++i)
    if (valid_types_[i]->Family() == foreign.Family()) return *valid_types_[i];
  return TypeByUsage(0);
}

ZQRecord* ZQSpoke::GetLayout(int n) const { return n == 0 ? &layout_ : nullptr; }

namespace {
// What TypeByUsage gives for a letter no type has: plain text, so that a
// column of an unknown type still reads, as its bytes.
const ZQDType& FallbackType() {
  static ZQDType text = [] {
    ZQDType t;
    t.Define("Text;usage=0");
    return t;
  }();
  return text;
}
}  // namespace

const ZQDType& ZQSpoke::TypeByUsage(int16_t usage) const {
  for (int i = 0; valid_types_[i] != nullptr; ++i)
    if (valid_types_[i]->Usage() == usage) return *valid_types_[i];
  return FallbackType();
}

const ZQDType& ZQSpoke::GetDType(int i) const {
  for (int k = 0; k <= i; ++k)
    if (valid_types_[k] == nullptr) return FallbackType();
  return *valid_types_[i];
}

const ZQDType& ZQSpoke::GetIdxType(int i) const {
  for (int k = 0; k <= i; ++k)
    if (index_types_[k] == nullptr) return FallbackType();
  return *index_types_[i];
}

void ZQSpoke::ReplaceValidTypes(const ZQDType** list) {
  int n = 0;
  for (; list != nullptr && list[n] != nullptr && n < kMaxTypes; ++n) valid_types_[n] = list[n];
  valid_types_[n] = nullptr;
}

void ZQSpoke::ReplaceIndexTypes(const ZQDType** list) {
  int n = 0;
  for (; list != nullptr && list[n] != nullptr && n < kMaxTypes; ++n) index_types_[n] = list[n];
  index_types_[n] = nullptr;
}

ZQIndexDef* const* ZQSpoke::IndexList() { return index_count_ ? indexes_ : nullptr; }

void ZQSpoke::ClearIndices() {
  for (int i = 0; i < index_count_; ++i) delete indexes_[i];
  index_count_ = 0;
  if (indexes_) indexes_[0] = nullptr;
}

bool ZQSpoke::AddIndex(ZQIndexDef* def) {
  if (def == nullptr) return false;
  auto* grown = static_cast<ZQIndexDef**>(realloc(indexes_, sizeof(ZQIndexDef*) * size_t(index_count_ + 2)));
  if (grown == nullptr) {
    delete def;
    return false;
  }
  indexes_ = grown;
  indexes_[index_count_++] = def;
  indexes_[index_count_] = nullptr;
  return true;
}

// ---------------------------------------------------------------------------

ZQImport::ZQImport(const ZQSpokeDef& def, const char** typedefs, bool flag) : ZQSpoke(def, typedefs, flag) {}
ZQImport::~ZQImport() = default;

BATCHERR ZQImport::SetUserInfo(const ZQConnTarget& target) {
  target_.path = target.path;
  return ReFormatData();
}

ZQExport::ZQExport(const ZQSpokeDef& def, const char** typedefs, bool flag) : ZQSpoke(def, typedefs, flag) {}
ZQExport::~ZQExport() = default;

BATCHERR ZQExport::SetUserInfo(const ZQConnTarget& target) {
  target_.path = target.path;
  return 0;
}
BATCHERR ZQExport::MakeFields(ZQRecord&, const ZQConnTarget&) { return ZQ_NOT_SUPPORTED; }
void ZQExport::FormatSpokeField(ZQField*, const ZQField*) const {}
BATCHERR ZQExport::DeleteRecord(int, const wchar*) { return ZQ_NOT_SUPPORTED; }
BATCHERR ZQExport::GenerateDetailRecord(int) { return ZQ_NOT_SUPPORTED; }
BATCHERR ZQExport::_CloseOutput(bool) { return 0; }
BATCHERR ZQExport::_OpenOutput(const ZQConnTarget& target) {
  target_.path = target.path;
  return 0;
}
BATCHERR ZQExport::GetRecord(ZQRecord&, int64_t*) { return ZQ_NOT_SUPPORTED; }
BATCHERR ZQExport::GetandDeleteRecord(ZQRecord&) { return ZQ_NOT_SUPPORTED; }
BATCHERR ZQExport::SetFilePosition(int64_t) { return ZQ_NOT_SUPPORTED; }
void ZQExport::FieldNameCharSet(ZQString& first, ZQString& second) {
  first = "";
  second = "";
}
BATCHERR ZQExport::ValidateLocalRecord(const ZQRecord&, int& field) {
  field = -1;
  return 0;
}
