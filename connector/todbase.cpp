// The target spoke: opening output, type rules, record encoding, the update
// cursor and closing.
#include "connector/todbase.h"

#include <cmath>
#include <cstdio>
#include <cstring>
#include <new>

#include "host/bytescan.h"
#include "host/endian.h"
#include "host/zqdate.h"
#include "host/zqglob.h"
#include "host/zqutil.h"
#include "table/memo.h"

namespace {

bool IsMemoLetter(char c) { return c == 'M' || c == 'G' || c == 'B'; }

// Visual FoxPro keeps these letters in binary forms of fixed width: memo
// pointers "M" and "G" as 4-byte block numbers, "I" as a 32-bit integer,
// "B" (a double there), "T" and "Y" in 8 bytes. 0 for the letters that are
// text in the record.
int32_t VfpWidth(char letter) {
  switch (letter) {
    case 'M':
    case 'G':
    case 'I': return 4;
    case 'B':
    case 'T':
    case 'Y': return 8;
    default: return 0;
  }
}

}  // namespace

ZQToDbase::ZQToDbase(const ZQSpokeDef& def) : ZQExport(def, ZQDbase::GetModifiedTypedefs(), false) {}

ZQToDbase::~ZQToDbase() {
  if (dbase.Table != nullptr) dbase.CloseFile(nullptr);
  CloseIndexes();
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
  dbase.DescribeOnOpen = false;
  BATCHERR rc = dbase.MakeFields(record, target);
  dbase.DescribeOnOpen = true;
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
    if (dbase.GetVersion() == DIALECT_VFOXPRO && VfpWidth(letter) != 0) {
      length = VfpWidth(letter);
      // "B" is a double here, yet the table's open looks for a memo file
      // whenever a "B" field is there: the table gets an empty one.
      memo = memo || IsMemoLetter(letter);
    } else if (IsMemoLetter(letter)) {
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
  return CreateIndexes(path);
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
    // The binary forms of a Visual FoxPro record are written in their fixed
    // widths; a table whose descriptor says otherwise would be misread.
    if (!differs && dbase.Table->dialect == DIALECT_VFOXPRO && VfpWidth(letter) != 0)
      differs = fd->length != VfpWidth(letter);
    if (differs) {
      LogError(2, ZQ_LAYOUT_DIFFERS, lgettext(u"Field type mismatch on field %s"), f->FieldName());
      return false;
    }
  }
  return true;
}

BATCHERR ZQToDbase::FieldsFitRecord() {
  const ZQDBFILE* t = dbase.Table;
  // Not even the flag byte: a table without fields can have this too.
  if (t->reclen == 0) return LogError(4, ZQ_READ_ERROR, lgettext(u"The header gives a record length of 0"));
  int32_t end = 0;
  for (int i = 0; i < t->fieldcount; ++i) {
    end += dbase.FieldList[i]->length;
    if (end > int32_t(t->reclen) - 1)
      return LogError(4, ZQ_READ_ERROR, lgettext(u"Field %d extends beyond end of record"), i);
  }
  return 0;
}

BATCHERR ZQToDbase::_OpenOutput(const ZQConnTarget& target) {
  inserted_count_ = 0;
  if (mode_ == kUpdate) deleted_count_ = updated_count_ = 0;
  CloseIndexes();
  if (target.path.length() == 0) return ZQ_NO_FILENAME;
  if (dbase.Table != nullptr) dbase.CloseFile(nullptr);
  ZQIndexDef* const* indexes = IndexList();
  const char* path = target.path.c_str();
  if (mode_ == kReplace || !ZQFileProxy::fileExists(path)) {
    if (BATCHERR rc = DBCreateFile(path, indexes); rc != 0) return rc;
  } else if (BATCHERR rc = OpenIndexes(path); rc != 0) {
    return rc;
  }
  if (BATCHERR rc = dbase.DBOpenFile(path, true); rc != 0) {
    dbase.CloseFile(nullptr);
    return rc;
  }
  // A damaged header (a record length of 0, fields that run past the
  // record) is refused as the read side refuses it, before any byte is
  // encoded: the record buffer is sized by that length.
  if (BATCHERR rc = FieldsFitRecord(); rc != 0) {
    dbase.CloseFile(nullptr);
    return rc;
  }
  if (mode_ != kReplace && !LayoutsMatch()) {
    dbase.CloseFile(nullptr);
    return ZQ_LAYOUT_DIFFERS;
  }
  if (!ZQGlob::growbuf(dbase.Table->reclen + ZQDbase::kRecordSlack, dbase.RecordBuffer, dbase.RecordBufferSize,
                       nullptr)) {
    dbase.CloseFile(nullptr);
    return ZQ_NO_MEMORY;
  }
  memset(dbase.RecordBuffer + dbase.Table->reclen, 0, ZQDbase::kRecordSlack);
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
  const bool vfp = t->dialect == DIALECT_VFOXPRO;
  int32_t offset = 0;
  for (int i = 0; i < n && offset < room; ++i) {
    ZQField* f = (*layout)[i];
    char letter = char(f->DataType().Usage());
    char* dest = buf + offset;
    int32_t left = room - offset;
    int32_t width;
    if (vfp && VfpWidth(letter) != 0) {
      // Visual FoxPro: binary forms of fixed width; the memo pointer is a
      // 4-byte block number (FormatDBMemo writes it in that form).
      width = VfpWidth(letter);
      if (width <= left) {
        BATCHERR rc = letter == 'M' || letter == 'G' ? FormatDBMemo(dest, f) : EncodeVfpValue(dest, f, letter);
        if (rc != 0) return rc;
      }
    } else switch (letter) {
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
  if (BATCHERR ik = AddIndexKeys(); ik != 0) return ik;
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
    PutMemoPointer(dest, 0);
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
      PutMemoPointer(dest, block);
      return 0;
    }
    if (policy == 1) return 0;
    return LogError(4, ZQ_WRITE_ERROR, lgettext(u"Error adding memo"));
  }
  if (old == 0) {
    PutMemoPointer(dest, 0);
    return 0;
  }
  // A blank value replaces an old memo: its blocks are given up.
  if (!ReadOldMemo(old) || t->memoblksize == 0) return policy == 0 ? ZQ_READ_ERROR : 0;
  if (deloldm(t, old, MemoScratch.length() / t->memoblksize + 1) == 0) {
    PutMemoPointer(dest, 0);
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

void ZQToDbase::PutMemoPointer(char* dest, uint32_t block) {
  if (dbase.Table->dialect == DIALECT_VFOXPRO) {
    PutLe32(reinterpret_cast<uint8_t*>(dest), block);
    return;
  }
  char digits[12];
  ZQMemoBlockNumber::NumbertoBuf(digits, block);
  memcpy(dest, digits, 10);
}

namespace {

// The number a field holds; false for text that is no number. Blank is 0.
bool VfpNumber(ZQField* field, double* v) {
  *v = 0;
  if (field->IsBlank()) return true;
  if (field->held() != ZQField::Held::kText) {
    *v = field->DoubleVal();
    return true;
  }
  const char* p = field->StringRef().c_str();
  while (*p == ' ') ++p;
  if (*p == '\0') return true;  // blanks only: no value
  char* end = nullptr;
  *v = strtod(p, &end);
  while (end != p && *end == ' ') ++end;
  return end != p && *end == '\0';
}

// A plain decimal text ("-12.3456", blanks around allowed) as ten-thousandths,
// rounded half away from zero on the fifth decimal, without going through a
// double. False for any other form, or a value that 64 bits can't hold.
bool TenThousandths(const ZQString& text, int64_t* out) {
  const char* p = text.c_str();
  const char* end = p + text.length();
  while (p < end && *p == ' ') ++p;
  while (end > p && end[-1] == ' ') --end;
  bool neg = p < end && *p == '-';
  if (p < end && (*p == '-' || *p == '+')) ++p;
  uint64_t v = 0;
  int digits = 0, decimals = 0;
  bool point = false, round_up = false;
  for (; p < end; ++p) {
    if (*p == '.' && !point) {
      point = true;
      continue;
    }
    if (*p < '0' || *p > '9') return false;
    ++digits;
    if (point && decimals >= 4) {
      if (decimals++ == 4) round_up = *p >= '5';  // only the fifth decimal counts
      continue;
    }
    uint64_t digit = uint64_t(*p - '0');
    if (v > (uint64_t{INT64_MAX} - digit) / 10) return false;  // exact: INT64_MAX itself fits
    v = v * 10 + digit;
    if (point) ++decimals;
  }
  if (digits == 0) return false;
  for (; decimals < 4; ++decimals) {
    if (v > uint64_t{INT64_MAX} / 10) return false;
    v *= 10;
  }
  if (round_up && v == uint64_t{INT64_MAX}) return false;
  if (round_up) ++v;
  *out = neg ? -int64_t(v) : int64_t(v);
  return true;
}

// "YYYY-MM-DD" or "YYYYMMDD", then optionally "T" or a blank and "HH:MM" or
// "HH:MM:SS": the Julian day and the milliseconds since midnight.
bool VfpDateTimeText(const ZQString& text, int32_t* jdn, int32_t* ms) {
  const char* p = text.c_str();
  int32_t n = text.length();
  while (n > 0 && p[n - 1] == ' ') --n;
  auto num = [&](int32_t at, int32_t count, int32_t* value) {
    if (at + count > n) return false;
    *value = 0;
    for (int32_t i = at; i < at + count; ++i) {
      if (p[i] < '0' || p[i] > '9') return false;
      *value = *value * 10 + (p[i] - '0');
    }
    return true;
  };
  int32_t y, m, d, at;
  if (n >= 10 && p[4] == '-' && p[7] == '-') {
    if (!num(0, 4, &y) || !num(5, 2, &m) || !num(8, 2, &d)) return false;
    at = 10;
  } else {
    if (!num(0, 4, &y) || !num(4, 2, &m) || !num(6, 2, &d)) return false;
    at = 8;
  }
  if (!IsValidDate(y, m, d)) return false;
  int32_t h = 0, mi = 0, sec = 0;
  if (at < n) {
    if ((p[at] != 'T' && p[at] != ' ') || !num(at + 1, 2, &h) || at + 3 >= n || p[at + 3] != ':' ||
        !num(at + 4, 2, &mi))
      return false;
    at += 6;
    if (at < n && (p[at] != ':' || !num(at + 1, 2, &sec) || (at += 3) != n)) return false;
    if (at != n || h > 23 || mi > 59 || sec > 59) return false;
  }
  *jdn = JulianDayFromDate(y, m, d);
  *ms = (h * 3600 + mi * 60 + sec) * 1000;
  return true;
}

}  // namespace

BATCHERR ZQToDbase::EncodeVfpValue(char* dest, ZQField* field, char letter) {
  auto* out = reinterpret_cast<uint8_t*>(dest);
  bool ok = true;
  switch (letter) {
    case 'I': {
      // A whole number within 32 bits; anything else would be stored as
      // another number.
      double v;
      ok = VfpNumber(field, &v) && v == std::trunc(v) && v >= INT32_MIN && v <= INT32_MAX;
      if (ok) PutLe32(out, uint32_t(int32_t(v)));
      break;
    }
    case 'B': {
      double v;
      ok = VfpNumber(field, &v);
      uint64_t bits;
      memcpy(&bits, &v, sizeof bits);
      if (ok) PutLe64(out, bits);
      break;
    }
    case 'Y': {
      // The value times 10000, rounded to the nearest: a double such as
      // 1.15 is 1.1499999... and must not become 1.1499. Text is taken by
      // its digits.
      int64_t stored = 0;
      if (field->IsBlank()) {
      } else if (field->held() == ZQField::Held::kText) {
        ok = TenThousandths(field->StringRef(), &stored);
      } else {
        double v = field->DoubleVal() * 10000;
        ok = std::isfinite(v) && std::fabs(v) < 9.2e18;
        if (ok) stored = std::llround(v);
      }
      if (ok) PutLe64(out, uint64_t(stored));
      break;
    }
    case 'T': {
      // Julian day, then milliseconds since midnight; no value is 8 zero
      // bytes, which the read side takes for blank.
      int32_t jdn = 0, ms = 0;
      switch (field->held()) {
        case ZQField::Held::kBlank: break;
        case ZQField::Held::kDateTime: {
          const ZQDateTime& dt = field->DateTimeRef();
          int64_t day = int64_t{dt.Days()} + kZQEpochJulianDay;
          ok = day > 0 && day <= INT32_MAX && dt.Seconds() >= 0 && dt.Seconds() < 86400;
          jdn = int32_t(day);
          ms = dt.Seconds() * 1000;
          break;
        }
        case ZQField::Held::kDate: {
          const ZQDate& d = field->DateRef();
          ok = IsValidDate(d.Year(), d.Month(), d.Day());
          if (ok) jdn = JulianDayFromDate(d.Year(), d.Month(), d.Day());
          break;
        }
        case ZQField::Held::kText:
          ok = field->IsBlank() || VfpDateTimeText(field->StringRef(), &jdn, &ms);
          break;
        default: ok = false; break;
      }
      if (ok) {
        PutLe32(out, uint32_t(jdn));
        PutLe32(out + 4, uint32_t(ms));
      }
      break;
    }
    default: break;
  }
  if (ok) return 0;
  ZQWString value;
  const ZQString& text = field->StringRef();
  value.Assign(text.c_str(), 0, text.length() < 40 ? text.length() : 40);
  return LogError(4, ZQ_WRITE_ERROR, lgettext(u"Field %s can't hold the value %s"), field->FieldName(), value.c_str());
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
  // Visual FoxPro: the pointer is a 4-byte block number, and every field
  // takes its descriptor's width (the binary forms have no text width).
  const bool vfp = dbase.Table->dialect == DIALECT_VFOXPRO;
  int32_t offset = 0;
  for (int i = 0; i < layout->FieldCount() && i < dbase.Table->fieldcount; ++i) {
    const ZQDBFIELD* fd = dbase.FieldList[i];
    ZQField* f = (*layout)[i];
    if (fd->type == 'M' && offset + fd->length <= room) {
      const char* at = dbase.RecordBuffer + offset;
      delete f->GetFieldInfo();
      if (vfp) {
        uint32_t block = fd->length >= 4 ? GetLe32(reinterpret_cast<const uint8_t*>(at)) : 0;
        f->SetFieldInfo(new (std::nothrow) ZQMemoBlockNumber(block, 0));
      } else {
        f->SetFieldInfo(new (std::nothrow) ZQMemoBlockNumber(ZQString(at, fd->length), 0));
      }
    }
    if (vfp) {
      offset += fd->length;
      continue;
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
  CloseIndexes();
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
