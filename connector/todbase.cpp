// The target spoke: opening output, type rules, record encoding, the update
// cursor and closing.
#include "connector/todbase.h"

#include <cmath>
#include <cstdio>
#include <cstring>
#include <new>

#include "host/bytescan.h"
#include "host/endian.h"
#include "host/zqglob.h"
#include "host/zqutil.h"
#include "table/memo.h"

namespace {

bool IsMemoLetter(char c) { return c == 'M' || c == 'G' || c == 'B'; }

}  // namespace

ZQToDbase::ZQToDbase(const ZQSpokeDef& def) : ZQExport(def, ZQDbase::GetModifiedTypedefs(), false) {}

ZQToDbase::~ZQToDbase() {
  if (dbase.Table != nullptr) dbase.CloseFile(nullptr);
}

ZQSpokeOptions* ZQToDbase::NewOptions() const {
  return new (std::nothrow) ZQDbaseOptions(const_cast<ZQToDbase*>(this), dbase.GetVersion());
}
void ZQToDbase::DeleteOptions(ZQSpokeOptions* opts) const { delete opts; }
bool ZQToDbase::FillOptions(ZQSpokeOptions* opts) const { return dbase.GetOptions(opts); }
BATCHERR ZQToDbase::SetOptions(const ZQSpokeOptions* opts) { return dbase.SetOptions(opts); }
void ZQToDbase::LoadOptions(ZQString& text) { dbase.LoadOptions(text, false); }
int ZQToDbase::OptionDefCount() const { return ZQDbaseOptions::ImportOptionCount(); }
ZQOptionDef** ZQToDbase::GetOptionDefs() const { return ZQDbaseOptions::ImportOptionList(); }
ZQSpokeOptions* ZQToDbase::GetOptions() const { return &dbase; }
void ZQToDbase::SaveOptions(ZQString& text) const { dbase.SaveOptions(text, false); }

const ZQConnTargetInfo* ZQToDbase::GetTargetInfo() const {
  static const ZQConnTargetInfo info = {{1, 0, 0, 0, 1}, u"Target File/URI"};
  return &info;
}

// ---------------------------------------------------------------------------
// Type rules

int ZQToDbase::MaxFieldCount() {
  switch (dbase.GetVersion()) {
    case DIALECT_DBASE2: return 32;
    case DIALECT_DBASE3P:
    case DIALECT_ENABLE:
    case DIALECT_DBASE3:
    case DIALECT_ENABLEOA: return 128;
    case DIALECT_DBASE4:
    case DIALECT_FOXPRO: return 256;
    case DIALECT_CLIPPER: return 1000;
    case DIALECT_VDBASE:
    case DIALECT_VFOXPRO: return 1024;
    default: return 32;
  }
}

int ZQToDbase::CreateFieldCap() const {
  // A new table keeps what its own open reads back: the narrow header has
  // room for 32 descriptors (more would make the form that is opened as a
  // table with a memo file), Enable OA reads 128, Visual FoxPro 256.
  switch (dbase.GetVersion()) {
    case DIALECT_DBASE4:
    case DIALECT_FOXPRO:
    case DIALECT_VFOXPRO: return 256;
    case DIALECT_DBASE3P:
    case DIALECT_DBASE3:
    case DIALECT_ENABLEOA: return 128;
    case DIALECT_CLIPPER: return 1000;
    case DIALECT_VDBASE: return 1024;
    default: return 32;  // 0, 3 and anything else
  }
}

void ZQToDbase::FieldNameCharSet(ZQString& first, ZQString& second) {
  first = "_ABCDEFGHIJKLMNOPQRSTUVWXYZ";
  second = "0123456789";
}

char ZQToDbase::DTypeToDbase(ZQDType type) {
  int v = dbase.GetVersion();
  if (type.Usage() == 'F') {
    bool has_float = v == 2 || v == 6 || v == 7 || v == 9 || v == 10;
    return has_float ? 'F' : 'N';
  }
  if (type.Usage() != 0) return char(type.Usage());
  const ZQDType* const* valid = GetValidTypes();
  for (int i = 0; valid != nullptr && valid[i] != nullptr; ++i)
    if (strcmp(valid[i]->Alias(), type.Alias()) == 0 && type.Alias()[0] != '\0') return char(valid[i]->Usage());
  return char(MapDType(type).Usage());
}

BATCHERR ZQToDbase::ValidateLocalRecord(const ZQRecord& record, int& field) {
  int v = dbase.GetVersion();
  int32_t limit = v == 8 || v == 9 || v == 10 ? 32767 : 4000;
  int32_t sum = 0;
  for (int i = 0; i < record.FieldCount(); ++i) {
    const ZQDType& t = record[i]->DataType();
    if (dbase.IsMemoType(t.Usage())) sum += v == DIALECT_VFOXPRO ? 4 : 10;
    else sum += t.Length();
    if (sum > limit) {
      field = i;
      return ZQ_RECORD_TOO_LONG;
    }
  }
  return 0;
}

BATCHERR ZQToDbase::MakeFields(ZQRecord& record, const ZQConnTarget& target) {
  BATCHERR rc = dbase.MakeFields(record, target);
  dbase.CloseFile(nullptr);
  return rc;
}

void ZQToDbase::FormatSpokeField(ZQField* field, const ZQField*) const {
  if (field->FieldType() == FT_DATE) field->SetPicture(dbase.DatePicture());
  else if (field->FieldType() == FT_BOOLEAN) field->SetPicture(dbase.BooleanPicture());
}

// ---------------------------------------------------------------------------
// Opening

BATCHERR ZQToDbase::DBCreateFile(const char* path, ZQIndexDef* const* indexes) {
  ZQRecord* layout = GetLayout(0);
  int count = layout->FieldCount();
  if (count > CreateFieldCap()) count = CreateFieldCap();
  bool memo = false;
  auto free_fields = [&](int n) {
    for (int i = 0; i < n; ++i) {
      delete dbase.FieldList[i];
      dbase.FieldList[i] = nullptr;
    }
  };
  for (int i = 0; i < count; ++i) {
    ZQDBFIELD* fd = new (std::nothrow) ZQDBFIELD();
    if (fd == nullptr) {
      free_fields(i);
      return ZQ_NO_MEMORY;
    }
    dbase.FieldList[i] = fd;
    ZQField* f = (*layout)[i];
    char letter = DTypeToDbase(f->DataType());
    if (letter == 0) {
      free_fields(i + 1);
      return ZQ_CREATE_ERROR;
    }
    fd->type = int8_t(letter);
    fd->decimals = 0;
    int32_t length;
    if (IsMemoLetter(letter)) {
      length = 10;
      memo = true;
    } else if (letter == 'F' || letter == 'N') {
      length = f->Length();
      fd->decimals = uint8_t(f->DecLen());
    } else {
      length = f->DisplayLength();
    }
    // The descriptor holds the width in one byte: a wider field would
    // disagree with its own records, so the table is refused.
    if (length < 1 || length > 255) {
      free_fields(i + 1);
      ZQWString name;
      name.Assign(f->Name(), 0, -1);
      return LogError(4, ZQ_CREATE_ERROR, lgettext(u"Field %s has a width of %d, outside 1 to 255"), name.c_str(),
                      length);
    }
    fd->length = uint8_t(length);
    memset(fd->name, 0, sizeof fd->name);
    strncpy(fd->name, f->Name(), 10);
  }
  if (count < kMaxFields) dbase.FieldList[count] = nullptr;
  int version = dbase.GetVersion() | (memo ? 0x8000 : 0);
  bool production = false;
  for (int i = 0; indexes != nullptr && indexes[i] != nullptr; ++i) {
    const char* name = indexes[i]->Name();
    size_t n = strlen(name);
    if (n < 4 || name[n - 4] != '.') production = true;
  }
  int rc = dbcreat(path, count, dbase.FieldList, version, production);
  free_fields(count);
  if (rc != 0) return ZQ_CREATE_ERROR;
  // Index objects of the new table hook in here.
  return 0;
}

bool ZQToDbase::LayoutsMatch() {
  ZQRecord* layout = GetLayout(0);
  int n = layout->FieldCount() < dbase.Table->fieldcount ? layout->FieldCount() : dbase.Table->fieldcount;
  for (int i = 0; i < n; ++i) {
    ZQField* f = (*layout)[i];
    const ZQDBFIELD* fd = dbase.FieldList[i];
    char letter = char(f->DataType().Usage());
    bool differs = letter != fd->type;
    if (!differs && !dbase.IsMemoType(letter) && (letter == 'C' || letter == 'N' || letter == 'F'))
      differs = f->Length() != fd->length;
    if (differs) {
      LogError(2, ZQ_LAYOUT_DIFFERS, lgettext(u"Field type mismatch on field %s"), f->FieldName());
      return false;
    }
  }
  return true;
}

BATCHERR ZQToDbase::_OpenOutput(const ZQConnTarget& target) {
  inserted_count_ = 0;
  if (mode_ == kUpdate) deleted_count_ = updated_count_ = 0;
  IndexObjects = nullptr;  // index objects come with the index layer
  if (target.path.length() == 0) return ZQ_NO_FILENAME;
  if (dbase.Table != nullptr) dbase.CloseFile(nullptr);
  ZQIndexDef* const* indexes = IndexList();
  const char* path = target.path.c_str();
  if (mode_ == kReplace || !ZQFileProxy::fileExists(path)) {
    if (BATCHERR rc = DBCreateFile(path, indexes); rc != 0) return rc;
  }
  if (BATCHERR rc = dbase.DBOpenFile(path, true); rc != 0) {
    dbase.CloseFile(nullptr);
    return rc;
  }
  if (mode_ != kReplace && !LayoutsMatch()) {
    dbase.CloseFile(nullptr);
    return ZQ_LAYOUT_DIFFERS;
  }
  if (!ZQGlob::growbuf(dbase.Table->reclen, dbase.RecordBuffer, dbase.RecordBufferSize, nullptr)) {
    dbase.CloseFile(nullptr);
    return ZQ_NO_MEMORY;
  }
  // Logical positions start afresh for this table.
  dbase.RecordMap.Reset();
  dbase.HighRecord = -1;
  dbase.DeletedSkipped = 0;
  dbase.CurrentLogical = dbase.CurrentPhysical = 0;
  if (mode_ == kAppend) Unwind();
  else _Rewind();
  target_.path = target.path;
  return 0;
}

// ---------------------------------------------------------------------------
// Record encoding

int32_t ZQToDbase::PhysicalForWrite() {
  // Positions count live records, as GetRecord gives them; a write goes to
  // the physical record behind that live one, so a table with deleted
  // records is never written in the wrong place. The record count itself
  // (Unwind) and the first position behind the last live record append.
  ZQDBFILE* t = dbase.Table;
  int32_t count = TableCount(t);
  if (CurrentRecord >= count) return CurrentRecord == count ? count : -1;
  BATCHERR rc = dbase.ReadRecord(CurrentRecord);
  if (rc == 0) return dbase.CurrentPhysical;
  if (rc == ZQ_END && CurrentRecord == dbase.HighRecord + 1) return count;
  return -1;
}

namespace {

// Digits before the point of a plain decimal number text, leading zeros not
// counted; -1 when the text is no plain decimal number.
int32_t IntegerDigits(const ZQString& s) {
  const char* p = s.c_str();
  int32_t n = s.length(), i = 0;
  if (i < n && (p[i] == '-' || p[i] == '+')) ++i;
  while (i < n && p[i] == '0') ++i;
  int32_t start = i;
  while (i < n && p[i] >= '0' && p[i] <= '9') ++i;
  int32_t digits = i - start;
  if (i < n && p[i] == '.') {
    ++i;
    while (i < n && p[i] >= '0' && p[i] <= '9') ++i;
  }
  return i == n ? digits : -1;
}

}  // namespace

void ZQToDbase::EncodeNumber(char* dest, int32_t room, ZQField* field) {
  const ZQDType& t = field->DataType();
  int dialect = dbase.Table->dialect;
  bool plain = dialect == 0 || dialect == 1 || dialect == 4 || dialect == 6 || dialect == 10;
  double v = 0;
  if (!plain) {
    int32_t l = t.Length();
    if (t.DecimalPlaces() != 0) l -= 1 + t.DecimalPlaces();
    // |v| below 10^l, the common case, is plain whatever else holds; a number
    // held as text tells that by its digits, without being parsed.
    int32_t digits = field->held() == ZQField::Held::kText ? IntegerDigits(field->StringRef()) : -1;
    if (digits >= 0 && digits <= l) {
      plain = true;
    } else {
      v = field->DoubleVal();
      double a = std::fabs(v);
      if (v == 0 || (a > 0.000001 && a < 1)) plain = true;
      else plain = std::log10(a) < l;
    }
  }
  char out[400];
  int32_t w;
  if (plain) {
    field->RenderText(FieldScratch, 0);
    w = field->Length();
    if (w > 255) w = 255;
    const char* s = FieldScratch.c_str();
    int32_t n = FieldScratch.length();
    if (n > w) {  // the high digits and the sign are the ones lost
      s += n - w;
      n = w;
    }
    // Right-justified in w bytes, blanks on the left.
    int32_t take = w < room ? w : room;
    int32_t lead = w - n;
    for (int32_t k = 0; k < take; ++k) dest[k] = k < lead ? ' ' : s[k - lead];
    return;
  } else {
    v = field->DoubleVal();
    w = t.Length();
    if (w > 255) w = 255;
    int32_t p = t.Precision();
    if (w - 6 < p) p = w - 6 < 0 ? 0 : w - 6;
    snprintf(out, sizeof out, "%*.*G", int(w), int(p), v);
  }
  if (w > room) w = room;
  memcpy(dest, out, size_t(w));
}

BATCHERR ZQToDbase::GenerateDetailRecord(int layout_number) {
  if (layout_number != 0) return ZQ_INDEX_ERROR;
  if (dbase.Table == nullptr || dbase.RecordBuffer == nullptr) return ZQ_NOT_OPEN;
  ZQDBFILE* t = dbase.Table;
  int32_t physical = PhysicalForWrite();  // before the buffer is filled: it reads
  const int32_t room = int32_t(t->reclen) - 1;
  char* buf = dbase.RecordBuffer;
  memset(buf, 0, size_t(room));
  ZQRecord* layout = GetLayout(0);
  int n = layout->FieldCount() < t->fieldcount ? layout->FieldCount() : t->fieldcount;
  int32_t offset = 0;
  for (int i = 0; i < n && offset < room; ++i) {
    ZQField* f = (*layout)[i];
    char letter = char(f->DataType().Usage());
    char* dest = buf + offset;
    int32_t left = room - offset;
    int32_t width;
    switch (letter) {
      case 'B':
      case 'G':
      case 'M': {
        width = int32_t(ZQMemoBlockNumber::StringLength());
        if (width > left) break;
        if (BATCHERR rc = FormatDBMemo(dest, f); rc != 0) return rc;
        break;
      }
      case 'D': {
        width = 8;
        f->DateRef().Print(FieldScratch, "yyyymmdd");
        if (FieldScratch.length() < 8) FieldScratch.Pad(' ', 8 - FieldScratch.length());
        memcpy(dest, FieldScratch.c_str(), size_t(width < left ? width : left));
        break;
      }
      case 'L':
        width = 1;
        dest[0] = f->BoolVal() ? 'T' : 'F';
        break;
      case 'Y': {
        width = 8;
        double v = f->DoubleVal();
        int64_t whole = std::isfinite(v) && std::fabs(v) < 9.2e14 ? int64_t(v) : 0;
        double frac = std::fmod(v * 10000, 10000);
        int64_t stored = whole * 10000 + (std::isfinite(frac) ? int32_t(frac) : 0);
        uint8_t b[8];
        PutLe64(b, uint64_t(stored));
        memcpy(dest, b, size_t(width < left ? width : left));
        break;
      }
      case 'F':
      case 'N':
        // Plain and exponent forms both take the field's length (the
        // field's and its type's are one and the same here).
        EncodeNumber(dest, left, f);
        width = f->Length();
        break;
      default: {
        width = f->Length();
        // Text goes in as it is held; other values by their text form.
        const ZQString* text = &FieldScratch;
        if (f->held() == ZQField::Held::kText) text = &f->StringRef();
        else f->RenderText(FieldScratch, 1);
        // Only text with bytes beyond ASCII changes in a code page (padding
        // is blanks, which never do).
        if (dbase.CodePage() != 0 && bytescan::HasHighBit(text->c_str(), size_t(text->length()))) {
          if (text != &FieldScratch) FieldScratch = *text;
          ZQGlob::InternalToExternal(dbase.CodePage(), FieldScratch);
          text = &FieldScratch;
        }
        // At most the width, cut on the right; the copy stops at a NUL byte
        // of the text and the rest stays zero; a shorter text is padded.
        int32_t take = width < left ? width : left;
        int32_t n = text->length() < take ? text->length() : take;
        const char* s = text->c_str();
        const void* nul = memchr(s, 0, size_t(n));
        memcpy(dest, s, nul ? size_t(static_cast<const char*>(nul) - s) : size_t(n));
        if (nul == nullptr && n < take) {
          char pad = f->DataType().GetPadChar(nullptr);
          memset(dest + n, pad ? pad : ' ', size_t(take - n));
        }
        break;
      }
    }
    if (width < 0) width = 0;
    offset += width;
    if (offset < room) buf[offset] = '\0';
  }
  int rc = physical < 0 ? -1 : dbput(t, buf, physical, 1);
  ++CurrentRecord;
  if (rc != 0) return LogError(4, ZQ_WRITE_ERROR, lgettext(u"Error %d returned from dbput"), rc);
  // Index keys are added here once the index layer is in.
  if (mode_ == kUpdate) ++updated_count_;
  else ++inserted_count_;
  return 0;
}

bool ZQToDbase::ReadOldMemo(uint32_t block) {
  // The old memo is read as the memo engine reads any memo; only its length
  // matters here. A block of another FPT type has no text to measure.
  MemoRead r = readmemo(dbase.Table, block, 0, MemoScratch);
  if (r == MemoRead::kNotText) dbase.Table->memostat = 0;
  return r == MemoRead::kOk;
}

BATCHERR ZQToDbase::FormatDBMemo(char* dest, ZQField* field) {
  ZQDBFILE* t = dbase.Table;
  if (t->memokind == MEMO_SMT) return FormatClipperMemo(dest, field);
  int policy = dbase.IgnoreMemoFile();
  if (policy == 2) {
    memset(dest, '0', 10);
    return 0;
  }
  uint32_t old = 0;
  if (ZQFieldInfo* info = field->GetFieldInfo()) {
    auto* mb = dynamic_cast<ZQMemoBlockNumber*>(info);
    if (mb != nullptr) old = mb->Number();
    delete info;
    field->SetFieldInfo(nullptr);
  }
  if (!field->IsBlank() && t->memooff == 0) {
    uint32_t block = putmemo(t, old, field->StringRef());
    if (block != 0) {
      char digits[12];
      ZQMemoBlockNumber::NumbertoBuf(digits, block);
      memcpy(dest, digits, 10);
      return 0;
    }
    if (policy == 1) return 0;
    return LogError(4, ZQ_WRITE_ERROR, lgettext(u"Error adding memo"));
  }
  if (old == 0) {
    memset(dest, '0', 10);
    return 0;
  }
  // A blank value replaces an old memo: its blocks are given up.
  if (!ReadOldMemo(old) || t->memoblksize == 0) return policy == 0 ? ZQ_READ_ERROR : 0;
  if (deloldm(t, old, MemoScratch.length() / t->memoblksize + 1) == 0) {
    memset(dest, '0', 10);
    return 0;
  }
  if (policy == 1) return 0;
  return LogError(4, ZQ_WRITE_ERROR, lgettext(u"Error deleting old memo"));
}

BATCHERR ZQToDbase::FormatClipperMemo(char* dest, ZQField* field) {
  ZQDBFILE* t = dbase.Table;
  int policy = dbase.IgnoreMemoFile();
  if (policy == 2 || field->IsBlank() || t->memooff != 0) {
    memset(dest, 0, 10);
    return 0;
  }
  const ZQString& text = field->StringRef();
  uint32_t block = putmemo(t, 0, text);
  if (block == 0) {
    if (policy == 1) return 0;
    return LogError(4, ZQ_WRITE_ERROR, lgettext(u"Error adding memo"));
  }
  ZQDType word(DT_LONG);
  word.MSBFirst(false);
  MemoScratch = "";
  MemoScratch += '\x01';
  MemoScratch += '\0';
  word.Output(MemoScratch, int32_t(text.length()));
  word.Output(MemoScratch, int32_t(block));
  memcpy(dest, MemoScratch.c_str(), 10);
  return 0;
}

// ---------------------------------------------------------------------------
// The update cursor and closing

BATCHERR ZQToDbase::_Rewind() {
  CurrentRecord = 0;
  return 0;
}

BATCHERR ZQToDbase::Unwind() {
  CurrentRecord = dbase.Table != nullptr ? TableCount(dbase.Table) : 0;
  return 0;
}

BATCHERR ZQToDbase::SetFilePosition(int64_t position) {
  CurrentRecord = int32_t(uint32_t(uint64_t(position)));
  return 0;
}

BATCHERR ZQToDbase::GetRecord(ZQRecord& record, int64_t* position) {
  BATCHERR rc = dbase.GetRecord(record, CurrentRecord, position, false);
  if (rc == 0) ++CurrentRecord;
  return rc;
}

BATCHERR ZQToDbase::GetandDeleteRecord(ZQRecord& record) {
  return dbase.GetRecord(record, CurrentRecord, nullptr, true);
}

BATCHERR ZQToDbase::DeleteRecord() {
  if (dbase.Table == nullptr || dbase.Table->hasmemo != 1) return 0;
  if (BATCHERR rc = dbase.ReadRecord(CurrentRecord); rc != 0) return rc;
  ZQRecord* layout = GetLayout(0);
  const int32_t room = int32_t(dbase.Table->reclen) - 1;
  int32_t offset = 0;
  for (int i = 0; i < layout->FieldCount() && i < dbase.Table->fieldcount; ++i) {
    const ZQDBFIELD* fd = dbase.FieldList[i];
    ZQField* f = (*layout)[i];
    if (fd->type == 'M' && offset + fd->length <= room) {
      ZQString pointer(dbase.RecordBuffer + offset, fd->length);
      delete f->GetFieldInfo();
      f->SetFieldInfo(new (std::nothrow) ZQMemoBlockNumber(pointer, 0));
    }
    switch (fd->type) {
      case 'B':
      case 'G':
      case 'M': offset += 10; break;
      case 'D': offset += 8; break;
      case 'L': offset += 1; break;
      default: offset += f->Length(); break;
    }
  }
  ++deleted_count_;
  return 0;
}

BATCHERR ZQToDbase::DeleteRecord(int, const wchar*) { return ZQ_NOT_SUPPORTED; }

BATCHERR ZQToDbase::_CloseOutput(bool keep) {
  if (!keep && mode_ == kReplace) dbase.CloseFile(&target_);
  else dbase.CloseFile(nullptr);
  IndexObjects = nullptr;
  ZQRecord* layout = GetLayout(0);
  for (int i = 0; i < layout->FieldCount(); ++i) {
    ZQField* f = (*layout)[i];
    delete f->GetFieldInfo();
    f->SetFieldInfo(nullptr);
  }
  return 0;
}

ZQToDbase* NewToDbase(const ZQSpokeDef& def) { return new (std::nothrow) ZQToDbase(def); }

void DeleteToDbase(ZQToDbase* spoke) { delete spoke; }
