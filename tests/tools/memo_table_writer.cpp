// Writes a table with memos through the plain functions alone: dbcreat,
// dbopen (writable), putmemo, dbput, dbclose. The interop test plain_memo.py
// reads what it writes with other programs; the memo bench times its append.
//
//   memo_table_writer OUT.dbf DIALECT N            writes N records and prints
//       each as a JSON line: the values a reader must give back
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

// Memo lengths of the written test table, record by record: empty, one byte,
// both sides of the 512-byte block edge (504 fills a dBASE IV or FoxPro block
// with its 8-byte head), and a memo that spans ten blocks.
constexpr size_t kTestLengths[] = {0, 1, 511, 512, 513, 5000, 40, 504, 1000};
constexpr size_t kTestLengthCount = sizeof kTestLengths / sizeof kTestLengths[0];

// Multi-line text of `len` bytes for record `i`: numbered words, a CR LF
// after every third and a bare LF after every seventh. Other readers strip
// blanks at the ends of a memo, so its ends are letters.
std::string TestText(int i, size_t len) {
  std::string s;
  for (size_t k = 0; s.size() < len; ++k) {
    s += "line " + std::to_string(i) + "." + std::to_string(k);
    s += k % 7 == 6 ? "\n" : k % 3 == 2 ? "\r\n" : " ";
  }
  s.resize(len);
  if (!s.empty()) s.front() = 'm', s.back() = 'x';
  return s;
}

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

void AppendJson(const std::string& s, std::string* out) {
  *out += '"';
  for (char c : s) {
    if (c == '"' || c == '\\') *out += '\\', *out += c;
    else if (c == '\n') *out += "\\n";
    else if (c == '\r') *out += "\\r";
    else *out += c;
  }
  *out += '"';
}

// The plain fields of record `i` into `rec`; their values as JSON members
// (NAME to OK) into `json`. Every seventh date and every fifth logical is
// blank, which readers give as null.
void FillRecord(int i, char* rec, std::string* json) {
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
  if (json == nullptr) return;
  *json = "{\"NAME\":\"name " + std::to_string(i) + "\"";
  snprintf(buf, sizeof buf, ",\"QTY\":%.2f,\"BORN\":", qty);
  *json += buf;
  if (blank_date) {
    *json += "null";
  } else {
    snprintf(buf, sizeof buf, "\"%04d-%02d-%02d\"", year, month, day);
    *json += buf;
  }
  *json += ",\"OK\":";
  *json += blank_flag ? "null" : i % 2 ? "true" : "false";
}

// Stores `text` replacing the memo at `old` (0: none). The block, or 0 with
// the failure reported.
uint32_t Store(ZQDBFILE* t, uint32_t old, const ZQString& text, int i) {
  uint32_t block = putmemo(t, old, text);
  if (block == 0) fprintf(stderr, "memo_table_writer: putmemo failed at record %d\n", i);
  return block;
}

// The test table: the lengths of kTestLengths in turn; every fourth memo is
// then replaced by a shorter text (which stays in its blocks) and that by a
// longer one (which outgrows them), as an update of the record would.
bool WriteTestRecords(ZQDBFILE* t, int n) {
  char rec[kRecord];
  std::string line;
  for (int i = 0; i < n; ++i) {
    FillRecord(i, rec, &line);
    std::string memo = TestText(i, kTestLengths[size_t(i) % kTestLengthCount]);
    uint32_t block = 0;
    if (!memo.empty() && (block = Store(t, 0, ZQString(memo.data(), int32_t(memo.size())), i)) == 0) return false;
    PutPointer(rec + kNote, t, block, memo.size(), i % 2 == 1);
    if (dbput(t, rec, i, 1) != 0) {
      fprintf(stderr, "memo_table_writer: dbput failed at record %d\n", i);
      return false;
    }
    if (i % 4 == 3 && block != 0) {
      std::string shorter = memo.substr(0, memo.size() / 2) + "x";
      std::string longer = shorter + std::string(700, 'y') + "\r\nx";
      if ((block = Store(t, block, ZQString(shorter.data(), int32_t(shorter.size())), i)) == 0) return false;
      if ((block = Store(t, block, ZQString(longer.data(), int32_t(longer.size())), i)) == 0) return false;
      memo = longer;
      PutPointer(rec + kNote, t, block, memo.size(), false);
      if (dbput(t, rec, i, 1) != 0) {
        fprintf(stderr, "memo_table_writer: dbput of a replacement failed at record %d\n", i);
        return false;
      }
    }
    line += ",\"NOTE\":";
    if (memo.empty()) line += "null";
    else AppendJson(memo, &line);
    line += "}\n";
    fputs(line.c_str(), stdout);
  }
  return true;
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
    FillRecord(i, rec, nullptr);
    int32_t len = int32_t((int64_t{i} * 7919) % 2001);
    uint32_t block = 0;
    if (len > 0) {
      text.CopyN(source.data(), len, i % 97);
      if ((block = Store(t, 0, text, i)) == 0) return false;
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
  bool append = argc == 5 && strcmp(argv[4], "--append") == 0;
  if (argc != 4 && !append) {
    fprintf(stderr, "usage: memo_table_writer OUT.dbf DIALECT N [--append]\n");
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
  bool ok = append ? AppendRecords(t, n) : WriteTestRecords(t, n);
  if (dbclose(open_fields, t) != 0) {
    fprintf(stderr, "memo_table_writer: dbclose failed\n");
    return 1;
  }
  return ok ? 0 : 1;
}
