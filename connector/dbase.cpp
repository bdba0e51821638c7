// The table object: opening a table, building the layout, and decoding
// records into the host's fields.
#include "connector/dbase.h"

#include <cstdio>
#include <cstring>

#include "host/bytescan.h"
#include "host/endian.h"
#include "host/zqdate.h"
#include "host/zqglob.h"
#include "host/zqutil.h"
#include "table/memo.h"

ZQDbase::ZQDbase(ZQSpoke* spoke) : ZQDbaseOptions(spoke, DIALECT_DBASE4) {
  BinaryLong.MSBFirst(false);
}

ZQDbase::~ZQDbase() {
  ZQGlob::freebuf(RecordBuffer);
  DropIndexes();
}

BATCHERR ZQDbase::DBOpenFile(const char* name, bool writable) {
  size_t n = strlen(name);
  if (n < sizeof BasePath) {
    char base[sizeof BasePath];
    strcpy(BasePath, name);
    ZQGlob::sepfile(BasePath, base, nullptr);
    ZQGlob::appndnam(BasePath, base);
  } else {
    BasePath[0] = '\0';
  }
  Table = n < sizeof BasePath ? dbopen(OwnerSpoke()->GetNotifier(), name, FieldList, &VersionNumber, writable)
                              : nullptr;
  if (Table == nullptr) {
    ZQWString wide;
    wide.Assign(name, 0, -1);
    return OwnerSpoke()->LogError(4, ZQ_OPEN_ERROR, lgettext(u"Error opening data file %s"), wide.c_str());
  }
  if (Table->memofailed && MemoPolicy == 0)
    return OwnerSpoke()->LogError(4, ZQ_MEMO_OPEN_ERROR, lgettext(u"Could not open memo file, or wrong version"));
  return 0;
}

BATCHERR ZQDbase::MakeFields(ZQRecord& layout, const ZQConnTarget& target) {
  const char* opened = "";
  if (Table == nullptr) {
    if (target.path.length() == 0) return ZQ_NO_FILENAME;
    opened = target.path.c_str();
    if (BATCHERR rc = DBOpenFile(opened, false); rc != 0) {
      // A table left open behind a memo failure gets no layout and no
      // buffer: what an earlier table left must not be read against it.
      layout.ClearFields();
      ZQGlob::freebuf(RecordBuffer);
      RecordBuffer = nullptr;
      RecordBufferSize = 0;
      return rc;
    }
  }
  // 16 bytes of room behind the record let the decoding read whole blocks.
  if (!ZQGlob::growbuf(Table->reclen + kRecordSlack, RecordBuffer, RecordBufferSize, nullptr)) return ZQ_NO_MEMORY;
  memset(RecordBuffer + Table->reclen, 0, kRecordSlack);
  layout.ClearFields();
  ZQSpoke* spoke = OwnerSpoke();
  for (int i = 0; i < Table->fieldcount; ++i) {
    const ZQDBFIELD* fd = FieldList[i];
    // Visual FoxPro's hidden last column of null bits becomes no field; its
    // bytes stay behind all the others in the record.
    if (i == Table->fieldcount - 1 && Table->dialect == DIALECT_VFOXPRO &&
        ZQGlob::stricmp(fd->name, "_NullFlags") == 0)
      break;
    ZQDType type = spoke->TypeByUsage(fd->type);
    if (fd->type == 'N' && fd->length == 1) type.Signed(false);
    type.DecimalPlaces(fd->decimals);
    type.Length(fd->length);
    if (IsMemoType(fd->type)) type.Length(255);
    if (type.Usage() == spoke->GetDType(0).Usage()) type.Picture(DatePicture());
    if (type.Usage() == spoke->GetDType(1).Usage()) type.Picture(BooleanPicture());
    ZQField* field = layout.NewField(type, nullptr);
    if (field == nullptr) return ZQ_NO_MEMORY;
    field->Name(fd->name);
  }
  if (opened[0] != '\0' && DescribeOnOpen) DescribeIndices(opened);
  RecordMap.Reset();
  // Nothing read yet: a first request for record 1 must not take physical
  // record 0 for logical record 0 unread (it may be deleted).
  CurrentLogical = CurrentPhysical = -1;
  HighRecord = -1;
  DeletedSkipped = 0;
  return 0;
}

BATCHERR ZQDbase::ReadRecord(int32_t n) {
  int32_t logical, physical;
  int live = 0;
  if (n == 0) {
    logical = physical = -1;
  } else if (CurrentLogical == n - 1) {
    logical = CurrentLogical;
    physical = CurrentPhysical;
  } else if (HighRecord >= 0 && n <= HighRecord) {
    const ZQHashEntry* e = RecordMap.FindRec(n, logical);
    if (e == nullptr) {  // no checkpoint at or below n: start from the top
      logical = physical = -1;
    } else {
      physical = e->value;
      dbget(Table, physical, RecordBuffer, &live);
    }
  } else {
    logical = HighRecord;
    physical = HighRecord + DeletedSkipped;
  }
  int32_t count = TableCount(Table);
  int32_t deleted = 0;
  while (logical < n) {
    ++physical;
    if (physical >= count) return ZQ_END;
    if (dbget(Table, physical, RecordBuffer, &live) != 0)
      return OwnerSpoke()->LogError(4, ZQ_READ_ERROR, lgettext(u"Error retrieving record %ld"), n);
    // Nothing at all came: the file ended before the count of its header.
    // The records the header still promises are not there, so the table
    // ends here rather than after billions of empty reads.
    if (!live && Table->filepos == -1) return ZQ_END;
    // A record wholly behind the end of the file (dbget gave 0 and dropped
    // its position): so is every later one, and none of them is live. The
    // table ends here rather than after a read for each record the header
    // promises, which may be two billion.
    if (Table->filepos == -1) return ZQ_END;
    if (live) {
      ++logical;
      if (logical > HighRecord) {
        DeletedSkipped += deleted;
        RecordMap.AddRec(logical, physical, 0);
        HighRecord = logical;
      }
      deleted = 0;
    } else {
      ++deleted;
    }
  }
  CurrentLogical = logical;
  CurrentPhysical = physical;
  return 0;
}

// Kept out of line, so that the common path of DecodeText is inlined into
// the record loop.
__attribute__((noinline)) void ZQDbase::DecodeCodePage(ZQField* field, const char* raw, int32_t kept,
                                                       int codepage) {
  FieldText.CopyN(raw, kept, 0);
  ZQGlob::ExternalToInternal(codepage, FieldText);
  *field = FieldText;
}

__attribute__((always_inline)) inline void ZQDbase::DecodeText(ZQField* field, const char* raw, int32_t length, int codepage) {
  // Trailing blanks go; they are cut on the record's bytes, so that the text
  // is copied once, and straight into the field when no code page conversion
  // stands between. ASCII is the same in every code page: only text with
  // other bytes goes through the conversion.
  int32_t kept = int32_t(bytescan::TrimRightWide(raw, size_t(length)));
  if (codepage != 0 && bytescan::HasHighBitWide(raw, size_t(kept))) DecodeCodePage(field, raw, kept, codepage);
  else field->AssignText(raw, kept);
}

BATCHERR ZQDbase::GetRecord(ZQRecord& record, int32_t n, int64_t* position, bool withInfo) {
  // A table whose memo file failed under policy 0 has no layout and no
  // buffer yet: treat it as no table.
  if (Table == nullptr || RecordBuffer == nullptr) return ZQ_NOT_OPEN;
  record.BlankFields();
  if (BATCHERR rc = ReadRecord(n); rc != 0) return rc;
  const int32_t room = int32_t(Table->reclen) - 1;
  const int codepage = CodePage();
  const bool vfp = Table->dialect == DIALECT_VFOXPRO;
  int32_t offset = 0;
  int count = record.FieldCount();
  for (int i = 0; i < count && i < Table->fieldcount; ++i) {
    ZQField* field = record.GetFieldbyPos(i);
    const ZQDBFIELD* fd = FieldList[i];
    const int32_t length = fd->length;
    if (offset + length > room)
      return OwnerSpoke()->LogError(4, ZQ_READ_ERROR, lgettext(u"Field %d extends beyond end of record"), i);
    const char* raw = RecordBuffer + offset;
    const auto* bytes = reinterpret_cast<const uint8_t*>(raw);
    const char type = char(fd->type);
    if (type == 'C' || type == 'N' || type == 'D' || type == 'L' || type == 'F') {
      // The plain letters, by far the most frequent, are tested first: one
      // well-predicted branch instead of a jump through a table per field.
      DecodeText(field, raw, length, codepage);
      offset += length;
      continue;
    }
    switch (fd->type) {
      case 'M':
      case 'G':
      memo:
        FieldText.CopyN(raw, length, 0);
        if (BATCHERR rc = GetMemoField(field, FieldText, withInfo); rc != 0) return rc;
        break;
      case 'B':
        if (!vfp) goto memo;
        {
          double d;
          FieldText.CopyN(raw, length, 0);
          field->DataType().Input(FieldText, 0, d);
          *field = d;
        }
        break;
      case 'T': {
        int32_t day = 0, ms = 0;
        FieldText.CopyN(raw, length, 0);
        BinaryLong.Input(FieldText, 0, day);
        BinaryLong.Input(FieldText, 4, ms);
        // Widened so that a damaged day number can't overflow.
        int64_t days = int64_t{day} - kZQEpochJulianDay;
        *field = ZQDateTime(int32_t(days), int32_t((int64_t{ms} + 1) / 1000), 0);
        break;
      }
      case 'I': {
        int32_t v = 0;
        FieldText.CopyN(raw, length, 0);
        // A dialect without the Integer type (dialect 5 reading a Visual
        // FoxPro table) gives the column a text type, which reads no binary
        // number: the bytes are a 32-bit little-endian integer all the same.
        const ZQDType& own = field->DataType();
        (own.BinaryWidth() == 4 ? own : BinaryLong).Input(FieldText, 0, v);
        *field = v;
        break;
      }
      case 'Y': {
        int32_t take = length < 8 ? length : 8;
        uint64_t raw = 0;
        for (int32_t k = 0; k < take; ++k) raw |= uint64_t{bytes[k]} << (8 * k);
        if (take > 0 && take < 8 && (bytes[take - 1] & 0x80)) raw |= ~uint64_t{0} << (8 * take);
        // The value as its exact decimal text, not a double: beyond 2^53
        // ten-thousandths (about 9 * 10^11) a double drops the last digits.
        // Trailing zeros of the fraction go, as a number's shortest form.
        bool neg = int64_t(raw) < 0;
        uint64_t mag = neg ? uint64_t(0) - raw : raw;
        char text[32];
        int n = snprintf(text, sizeof text, "%s%llu.%04u", neg ? "-" : "", static_cast<unsigned long long>(mag / 10000),
                         unsigned(mag % 10000));
        while (text[n - 1] == '0') --n;
        if (text[n - 1] == '.') --n;
        field->AssignText(text, n);
        break;
      }
      default:
        DecodeText(field, raw, length, codepage);
        break;
    }
    offset += length;
  }
  if (position != nullptr) *position = n;
  return 0;
}

void ZQDbase::CloseFile(const ZQConnTarget* target) {
  if (Table == nullptr) return;
  bool hasmemo = Table->hasmemo != 0;
  char memokind = char(Table->memokind);
  dbclose(FieldList, Table);
  Table = nullptr;
  if (target != nullptr) dbdelete(target->path.c_str(), hasmemo, memokind);
}

bool ZQDbase::IsMemoType(int type) const {
  int dialect = Table != nullptr ? Table->dialect : VersionNumber;
  return type == 'M' || type == 'G' || (type == 'B' && dialect != DIALECT_VFOXPRO);
}

BATCHERR ZQDbase::GetMemoField(ZQField* field, const ZQString& pointer, bool withInfo) {
  if (MemoPolicy == 2 || Table->memooff) return 0;
  uint32_t block, length = 0;
  const auto* p = reinterpret_cast<const uint8_t*>(pointer.c_str());
  if (Table->dialect == DIALECT_VFOXPRO) {
    block = pointer.length() >= 4 ? GetLe32(p) : 0;
  } else if (Table->memokind == MEMO_SMT) {
    length = pointer.length() >= 6 ? GetLe32(p + 2) : 0;
    block = pointer.length() >= 10 ? GetLe32(p + 6) : 0;
  } else {
    block = ZQMemoBlockNumber::StringtoNumber(pointer);
  }
  if (block == 0) return 0;
  Table->memostat = 1;
  bool ok = getmemo(Table, block, length, MemoText);
  if (!ok && Table->memostat == 1) {
    if (MemoPolicy == 0) return OwnerSpoke()->LogError(4, ZQ_READ_ERROR, lgettext(u"Memo problem"));
    return 0;
  }
  if (Table->memostat == 0) {  // the block holds no text
    Table->memostat = 1;
    return 0;
  }
  *field = MemoText;
  if (field->DataType().Length() < MemoText.length()) {
    ZQDType grown = field->DataType();
    grown.Length(MemoText.length());
    field->DataType(grown);
  }
  if (withInfo) {
    delete field->GetFieldInfo();
    field->SetFieldInfo(new ZQMemoBlockNumber(block, uint32_t(MemoText.length())));
  }
  return 0;
}
