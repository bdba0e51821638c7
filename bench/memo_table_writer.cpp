// Writes a table with memos through the plain functions alone: dbcreat,
// dbopen (writable), putmemo, dbput, dbclose. The memo bench times it.
//
//   memo_table_writer OUT.dbf DIALECT N --append   appends N records with one
//       memo each of 0 to 2,000 bytes; prints nothing
//
// DIALECT is the table's dialect number (1 dBASE III+, 2 dBASE IV, 4 dBASE III,
// 6 FoxPro, 7 Enable OA, 8 Clipper, 9 Visual dBASE). Exit 0, 1 when a plain
// function fails (named on stderr), 2 on bad arguments.
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "host/endian.h"
#include "table/dbf.h"
#include "table/memo.h"
#include "table/memo_format.h"

namespace {

// The record, flag byte left out (dbput's form):
//   OFFSET SIZE  FIELD
//      0    20   NAME C(20)
//     20     8   QTY  N(8,2)
//     28     8   BORN D
//     36     1   OK   L
//     37    10   NOTE M: ten digits, or the SMT pointer
constexpr int kName = 0, kNameLen = 20, kQty = 20, kQtyLen = 8, kBorn = 28, kOk = 36, kNote = 37;
constexpr int kRecord = 47;
constexpr int kFieldCount = 5;

// Writes the memo pointer of `block` into the record at `dest`, in the form
// the memo kind keeps in records. An empty memo is blanks or ten zero digits
// (both mean none; `zeros` picks one), and ten zero bytes for SMT.
void PutPointer(char* dest, const ZQDBFILE* t, uint32_t block, size_t length, bool zeros) {
  if (t->memokind == MEMO_SMT) {
    uint8_t b[kSmtPtrSize] = {0};
    if (block != 0) {
      b[kSmtPtrMark] = 1;
      PutLe32(b + kSmtPtrLength, uint32_t(length));  // little-endian, as the pointer holds it
      PutLe32(b + kSmtPtrBlock, block);
    }
    memcpy(dest, b, kSmtPtrSize);
    return;
  }
  if (block == 0 && !zeros) {
    memset(dest, ' ', ZQMemoBlockNumber::string_length);
    return;
  }
  char digits[ZQMemoBlockNumber::string_length + 1];
  ZQMemoBlockNumber::NumbertoBuf(digits, block);
  memcpy(dest, digits, ZQMemoBlockNumber::string_length);
}

// The plain fields of record `i` into `rec`. Every seventh date and every
// fifth logical is blank.
void FillRecord(int i, char* rec) {
  memset(rec, ' ', kRecord);
  char buf[64];
  int n = snprintf(buf, sizeof buf, "name %d", i);
  memcpy(rec + kName, buf, size_t(n < kNameLen ? n : kNameLen));
  double qty = (i % 2 ? -1 : 1) * (i * 1.25);
  snprintf(buf, sizeof buf, "%8.2f", qty);
  memcpy(rec + kQty, buf, kQtyLen);
  int year = 1990 + i % 30, month = 1 + i % 12, day = 1 + i % 28;
  bool blank_date = i % 7 == 6, blank_flag = i % 5 == 4;
  if (!blank_date) {
    snprintf(buf, sizeof buf, "%04d%02d%02d", year, month, day);
    memcpy(rec + kBorn, buf, 8);
  }
  rec[kOk] = blank_flag ? '?' : i % 2 ? 'T' : 'F';
}

// Stores `text` as a new memo. The block, or 0 with the failure reported.
uint32_t Store(ZQDBFILE* t, const ZQString& text, int i) {
  uint32_t block = putmemo(t, 0, text);
  if (block == 0) fprintf(stderr, "memo_table_writer: putmemo failed at record %d\n", i);
  return block;
}

// The append bench: N records, memos of 0 to 2,000 bytes cut from one text
// made once into one reused string, so that the driver's own work stays
// small beside the appending it times.
bool AppendRecords(ZQDBFILE* t, int n) {
  std::string source;
  for (int k = 0; source.size() < 2200; ++k) source += "bench memo text " + std::to_string(k) + (k % 5 == 4 ? "\r\n" : " ");
  ZQString text;
  if (!text.Allocate(2001)) return false;
  char rec[kRecord];
  for (int i = 0; i < n; ++i) {
    FillRecord(i, rec);
    int32_t len = int32_t((int64_t{i} * 7919) % 2001);
    uint32_t block = 0;
    if (len > 0) {
      text.CopyN(source.data(), len, i % 97);
      if ((block = Store(t, text, i)) == 0) return false;
    }
    PutPointer(rec + kNote, t, block, size_t(len), false);
    if (dbput(t, rec, i, 1) != 0) {
      fprintf(stderr, "memo_table_writer: dbput failed at record %d\n", i);
      return false;
    }
  }
  return true;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 5 || strcmp(argv[4], "--append") != 0) {
    fprintf(stderr, "usage: memo_table_writer OUT.dbf DIALECT N --append\n");
    return 2;
  }
  const char* path = argv[1];
  int dialect = atoi(argv[2]);
  int n = atoi(argv[3]);
  if (n < 0) {
    fprintf(stderr, "memo_table_writer: bad record count %s\n", argv[3]);
    return 2;
  }

  const struct {
    const char* name;
    char type;
    uint8_t len, dec;
  } kFields[kFieldCount] = {{"NAME", 'C', kNameLen, 0}, {"QTY", 'N', kQtyLen, 2}, {"BORN", 'D', 8, 0}, {"OK", 'L', 1, 0},
                            {"NOTE", 'M', 10, 0}};
  ZQDBFIELD descriptors[kFieldCount] = {};
  ZQDBFIELD* fields[kMaxFields] = {};
  for (int i = 0; i < kFieldCount; ++i) {
    strcpy(descriptors[i].name, kFields[i].name);
    descriptors[i].type = int8_t(kFields[i].type);
    descriptors[i].length = kFields[i].len;
    descriptors[i].decimals = kFields[i].dec;
    fields[i] = &descriptors[i];
  }
  if (dbcreat(path, kFieldCount, fields, dialect | 0x8000, false) != 0) {
    fprintf(stderr, "memo_table_writer: dbcreat failed\n");
    return 1;
  }
  ZQDBFIELD* open_fields[kMaxFields] = {};
  int version = dialect;
  ZQDBFILE* t = dbopen(nullptr, path, open_fields, &version, true);
  if (t == nullptr || t->memofailed || t->reclen != kRecord + 1) {
    fprintf(stderr, "memo_table_writer: dbopen failed or opened another shape\n");
    return 1;
  }
  bool ok = AppendRecords(t, n);
  if (dbclose(open_fields, t) != 0) {
    fprintf(stderr, "memo_table_writer: dbclose failed\n");
    return 1;
  }
  return ok ? 0 : 1;
}
