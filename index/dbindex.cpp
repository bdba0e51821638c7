// Key expressions, key bytes, and the cursor shared by every index kind.
#include "index/dbindex.h"

#include <cerrno>
#include <cstdlib>

#include "host/platform.h"

namespace {

bool IsWordByte(char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '_';
}

const char* SkipBlanksAndCommas(const char* p) {
  while (*p == ' ' || *p == ',') ++p;
  return p;
}

// A segment's index type: entry 0 of the list is the date type, 1 the numeric
// type, 2 the text type.
constexpr int kDateType = 0, kNumericType = 1, kTextType = 2;

// Most keys any index kind packs into 512 bytes of file: a compact leaf
// entry takes at least one byte.
constexpr int64_t kKeysPer512 = 512;

}  // namespace

// ---------------------------------------------------------------------------
// ZQDBIndexBase

ZQDBIndexBase::ZQDBIndexBase() = default;

ZQDBIndexBase::ZQDBIndexBase(const char* path) { fd = _open(path, kRtReadWrite | kRtBinary); }

ZQDBIndexBase::~ZQDBIndexBase() {
  delete root;
  if (fd != -1) _close(fd);
}

bool ZQDBIndexBase::Step() {
  if (steps < 0) return false;
  ++steps;
  if (steps < 4096) return true;  // any walk this short is bounded anyway
  int32_t size = fd == -1 ? -1 : _lseek(fd, 0, 2);
  if (size >= 0 && steps <= (int64_t(size) / 512 + 1) * kKeysPer512) return true;
  steps = -1;  // spent: the walk is broken off, and says so
  return false;
}

void ZQDBIndexBase::ResetSteps() {
  steps = 0;
  for (ZQDBNodeBase* n = root; n != nullptr; n = n->Child()) n->ClearLostWay();
}

bool ZQDBIndexBase::Broken() const {
  if (steps < 0) return true;
  for (ZQDBNodeBase* n = root; n != nullptr; n = n->Child())
    if (n->LostWay()) return true;
  return false;
}

int32_t ZQDBIndexBase::GetRecord(int32_t n) {
  if (root == nullptr) return -1;
  ZQString key;
  if (position == n) return root->CurrentKey(key);
  int32_t result = -1;
  while (position < n) {
    if (!Step()) return -1;
    result = root->NextKey(key);
    ++position;
    if (result == -1) return -1;
  }
  while (position > n) {
    if (!Step()) return -1;
    result = root->PrevKey(key);
    --position;
    if (result == -1) return -1;
  }
  return result;
}

int32_t ZQDBIndexBase::GetFirst() {
  ResetSteps();
  int32_t r = GetRecord(0);
  if (r != -1) position = 0;
  return r;
}

int32_t ZQDBIndexBase::GetNext() { return GetRecord(position + 1); }

void ZQDBIndexBase::OpenExisting(const char* path) {
  fd = _open(path, kRtReadWrite | kRtBinary);
  readOnly = fd < 0 && (errno == EACCES || errno == EROFS || errno == EPERM);
  if (readOnly) fd = _open(path, kRtReadOnly | kRtBinary);
}

bool ZQDBIndexBase::AddKey(ZQString& key, int32_t record) {
  if (root == nullptr || readOnly) return false;
  dirty = true;
  return root->AddKey(key, record + 1);
}

int32_t ZQDBIndexBase::FindKey(const ZQString& key, bool exact) {
  ResetSteps();
  return root != nullptr ? root->FindKey(key, exact) : -1;
}

int32_t ZQDBIndexBase::NextKey(ZQString& key) {
  if (root == nullptr || !Step()) return -1;
  return root->NextKey(key);
}

int32_t ZQDBIndexBase::CurrentKey(ZQString& key) { return root != nullptr ? root->CurrentKey(key) : -1; }

int32_t ZQDBIndexBase::FirstKey(ZQString& key) {
  ResetSteps();
  return root != nullptr ? root->FirstKey(key) : -1;
}

int32_t ZQDBIndexBase::LastKey(ZQString& key) {
  ResetSteps();
  return root != nullptr ? root->LastKey(key) : -1;
}

int32_t ZQDBIndexBase::PrevKey(ZQString& key) {
  if (root == nullptr || !Step()) return -1;
  return root->PrevKey(key);
}

const char* ZQDBIndexBase::GetToken(const char* p, ZQString& token) {
  token = "";
  while (*p == ' ') ++p;
  const char* start = p;
  while (IsWordByte(*p)) ++p;
  token.Append(start, int32_t(p - start));
  while (*p == ' ') ++p;
  return p;
}

bool ZQDBIndexBase::ParseExpr(ZQString& expression, ZQIndexDef* def, ZQSpoke* spoke) {
  const char* p = expression.c_str();
  if (*p == '\0') return true;
  ZQRecord* fields = spoke->GetIndexFields();
  if (fields == nullptr) return false;
  ZQString token;
  ZQString name;
  while (true) {
    const char* before = p;
    p = GetToken(p, token);
    token.ToUpper();
    if (*p == '(') {
      ZQField* field = nullptr;
      int16_t offset = 0;
      int16_t length = 0;
      if (token == "SUBSTR") {
        p = GetToken(p + 1, name);  // the field as written, not upper-cased
        field = fields->GetFieldbyName(name.c_str());
        if (field == nullptr) return false;
        p = GetToken(SkipBlanksAndCommas(p), name);
        offset = int16_t(atoi(name.c_str()));
        p = SkipBlanksAndCommas(p);
        length = int16_t(field->Length() - offset);
        if (*p != ')') {
          p = GetToken(p, name);
          length = int16_t(atoi(name.c_str()));
        }
      } else if (token == "STR") {
        p = GetToken(p + 1, name);
        name.ToUpper();
        field = fields->GetFieldbyName(name.c_str());
        if (field == nullptr) return false;
        p = GetToken(SkipBlanksAndCommas(p), name);
        length = int16_t(atoi(name.c_str()));
        p = GetToken(SkipBlanksAndCommas(p), name);  // the decimals: dropped
      } else if (token == "DTOS") {
        p = GetToken(p + 1, name);
        name.ToUpper();
        field = fields->GetFieldbyName(name.c_str());
        if (field == nullptr) return false;
        length = 8;
      } else {
        return false;
      }
      def->AddSeg(offset, length, &spoke->GetIdxType(kTextType), field);
    } else if (*p == ')') {
      ++p;
    } else if (token.length() != 0) {
      ZQField* field = fields->GetFieldbyName(token.c_str());
      if (field == nullptr) return false;
      switch (field->FieldType()) {
        case FT_DATE: def->AddSeg(0, 8, &spoke->GetIdxType(kDateType), field); break;
        case FT_NUMERIC: def->AddSeg(0, 8, &spoke->GetIdxType(kNumericType), field); break;
        default:
          def->AddSeg(0, int16_t(field->Length()), &spoke->GetIdxType(kTextType), field);
          break;
      }
    }
    while (*p == ' ' || *p == '+') ++p;
    if (*p == '\0') return true;
    // A byte that starts no term (a quote, a comma, a minus sign) would stop
    // the scan for ever: such an expression is not understood.
    if (p == before) return false;
  }
}

void ZQDBIndexBase::PrintExpr(ZQString& text, ZQIndexDef* def) {
  for (int i = 0; i < def->SegCount(); ++i) {
    if (i > 0) text += "+";
    text += (*def)[i].Name();
  }
}

int32_t ZQDBIndexBase::KeyFormLength(const ZQIndexDef* def) {
  int32_t n = 0;
  for (int i = 0; i < def->SegCount(); ++i) {
    const ZQIndexSeg& seg = (*def)[i];
    if (seg.Type() != nullptr && seg.Type()->Kind() != DT_TEXT) n += 8;
    else if (seg.IdxField() != nullptr) n += seg.IdxField()->Length();
  }
  return n;
}

void ZQDBIndexBase::BuildKey(ZQString& key, const ZQIndexDef* def) {
  // The module runs on one thread at a time; a plain static keeps the
  // loaded module free of thread-local storage.
  static ZQString scratch;
  ZQDType number(DT_DOUBLE);
  number.MSBFirst(false);
  key = "";
  for (int i = 0; i < def->SegCount(); ++i) {
    const ZQIndexSeg& seg = (*def)[i];
    ZQField* field = seg.IdxField();
    if (field == nullptr) continue;
    if (seg.Type() == nullptr || seg.Type()->Kind() == DT_TEXT) {
      field->RenderText(scratch, 1);
      scratch.Pad(' ', field->Length() - scratch.length());
      key += scratch;
    } else {
      number.Output(key, field->DoubleVal());
    }
  }
}

// ---------------------------------------------------------------------------
// ZQDBNodeBase

ZQDBNodeBase::ZQDBNodeBase(ZQDBNodeBase* parent, int16_t keyLength, int fd, int32_t where)
    : keyLength(keyLength), fd(fd), where(where), parent(parent) {}

ZQDBNodeBase::~ZQDBNodeBase() { delete child; }

ZQDBNodeBase* ZQDBNodeBase::FindLeaf() {
  ZQDBNodeBase* n = this;
  while (n->child != nullptr) n = n->child;
  return n;
}

int ZQDBNodeBase::Depth() const {
  int d = 0;
  for (const ZQDBNodeBase* n = parent; n != nullptr && d <= kMaxDepth; n = n->parent) ++d;
  return d;
}

int32_t ZQDBNodeBase::CurrentKey(ZQString& key) {
  key = "";
  return -1;
}
int32_t ZQDBNodeBase::NextKey(ZQString& key) {
  key = "";
  return -1;
}
int32_t ZQDBNodeBase::PrevKey(ZQString& key) {
  key = "";
  return -1;
}
int32_t ZQDBNodeBase::FindKey(const ZQString&, bool) { return -1; }
int32_t ZQDBNodeBase::FirstKey(ZQString&) { return -1; }
int32_t ZQDBNodeBase::LastKey(ZQString& key) {
  key = "";
  return -1;
}
