// Writes a table with memos through the plain functions alone: dbcreat,
// dbopen, putmemo, dbput, dbclose. The interop tests read what it writes with
// other programs; the bench times it.
//
//   plain_writer OUT.dbf DIALECT N          writes N records and prints each
//                                           record as a JSON line (the values
//                                           the table must give back)
//   plain_writer OUT.dbf DIALECT N --bench  appends N records with memos of
//                                           0 to 2,000 bytes, prints nothing
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "host/endian.h"
#include "table/dbf.h"
#include "table/memo.h"

namespace {

// Fields: NAME C(20), QTY N(8,2), BORN D, OK L, NOTE M.
constexpr int kName = 0, kQty = 20, kBorn = 28, kOk = 36, kNote = 37, kRecord = 47;

// The memo of record i: lengths that meet the block edges, empty memos, line
// breaks, a long one.
std::string MemoText(int i, bool bench) {
  size_t len;
  if (bench) {
    // Cut from one long text made once, so that the writer's own work stays
    // small beside the writing it times.
    static const std::string kText = [] {
      std::string t;
      for (int k = 0; t.size() < 2200; ++k) t += "bench memo text " + std::to_string(k) + (k % 5 == 4 ? "\r\n" : " ");
      return t;
    }();
    len = size_t((i * 7919) % 2001);
    return kText.substr(size_t(i % 97), len);
  } else {
    static const size_t kLens[] = {0, 1, 511, 512, 513, 5000, 40, 504, 1000};
    len = kLens[size_t(i) % (sizeof kLens / sizeof kLens[0])];
  }
  std::string s;
  for (size_t k = 0; s.size() < len; ++k) {
    s += "line " + std::to_string(i) + "." + std::to_string(k);
    s += k % 3 == 2 ? "\r\n" : " ";
  }
  s.resize(len);
  // Other readers strip blanks at the ends of memos: keep the ends visible.
  if (!s.empty()) s.back() = 'x', s.front() = 'm';
  return s;
}

void Pointer(char* dest, const ZQDBFILE* t, uint32_t block, size_t length) {
  if (t->memokind == MEMO_SMT) {
    uint8_t b[10] = {0};
    if (block != 0) {
      b[0] = 1;
      PutLe32(b + 2, uint32_t(length));
      PutLe32(b + 6, block);
    }
    memcpy(dest, b, 10);
    return;
  }
  // No memo is ten blanks here (dBASE III's own form; ten zeros mean the same).
  if (block == 0) {
    memset(dest, ' ', 10);
    return;
  }
  char digits[12];
  ZQMemoBlockNumber::NumbertoBuf(digits, block);
  memcpy(dest, digits, 10);
}

void Json(const std::string& s, std::string* out) {
  *out += '"';
  for (char c : s) {
    if (c == '"' || c == '\\') *out += '\\', *out += c;
    else if (c == '\n') *out += "\\n";
    else if (c == '\r') *out += "\\r";
    else *out += c;
  }
  *out += '"';
}

}  // namespace

int main(int argc, char** argv) {
  if (argc < 4) {
    fprintf(stderr, "usage: plain_writer OUT.dbf DIALECT N [--bench]\n");
    return 2;
  }
  const char* path = argv[1];
  int dialect = atoi(argv[2]);
  int n = atoi(argv[3]);
  bool bench = argc > 4 && strcmp(argv[4], "--bench") == 0;

  ZQDBFIELD spec[5] = {};
  const struct {
    const char* name;
    char type;
    int len, dec;
  } kFields[] = {{"NAME", 'C', 20, 0}, {"QTY", 'N', 8, 2}, {"BORN", 'D', 8, 0}, {"OK", 'L', 1, 0}, {"NOTE", 'M', 10, 0}};
  ZQDBFIELD* fields[kMaxFields] = {};
  for (int i = 0; i < 5; ++i) {
    strcpy(spec[i].name, kFields[i].name);
    spec[i].type = int8_t(kFields[i].type);
    spec[i].length = uint8_t(kFields[i].len);
    spec[i].decimals = uint8_t(kFields[i].dec);
    fields[i] = &spec[i];
  }
  if (dbcreat(path, 5, fields, dialect | 0x8000, false) != 0) {
    fprintf(stderr, "plain_writer: dbcreat failed\n");
    return 1;
  }
  ZQDBFIELD* read_fields[kMaxFields] = {};
  int version = dialect;
  ZQDBFILE* t = dbopen(nullptr, path, read_fields, &version, true);
  if (t == nullptr || t->memofailed) {
    fprintf(stderr, "plain_writer: dbopen failed\n");
    return 1;
  }
  char rec[kRecord];
  std::vector<uint32_t> blocks(size_t(n), 0);
  std::string line;
  for (int i = 0; i < n; ++i) {
    memset(rec, ' ', sizeof rec);
    char buf[64];
    snprintf(buf, sizeof buf, "name %d", i);
    memcpy(rec + kName, buf, strlen(buf));
    snprintf(buf, sizeof buf, "%8.2f", (i % 2 ? -1 : 1) * (i * 1.25));
    memcpy(rec + kQty, buf, 8);
    snprintf(buf, sizeof buf, "%04d%02d%02d", 1990 + i % 30, 1 + i % 12, 1 + i % 28);
    memcpy(rec + kBorn, buf, 8);
    rec[kOk] = i % 2 ? 'T' : 'F';
    std::string memo = MemoText(i, bench);
    uint32_t block = memo.empty() ? 0 : putmemo(t, 0, ZQString(memo.data(), int32_t(memo.size())));
    if (!memo.empty() && block == 0) {
      fprintf(stderr, "plain_writer: putmemo failed at record %d\n", i);
      return 1;
    }
    blocks[size_t(i)] = block;
    Pointer(rec + kNote, t, block, memo.size());
    if (dbput(t, rec, i, 1) != 0) {
      fprintf(stderr, "plain_writer: dbput failed at record %d\n", i);
      return 1;
    }
    if (!bench) {
      // Every fourth memo is stored again: shorter (stays), then longer
      // (grows past its blocks), as an update would.
      if (i % 4 == 3 && block != 0 && t->memokind != MEMO_SMT) {
        std::string again = memo.substr(0, memo.size() / 2) + "x";
        uint32_t b2 = putmemo(t, block, ZQString(again.data(), int32_t(again.size())));
        std::string longer = again + std::string(700, 'y') + "x";
        uint32_t b3 = b2 ? putmemo(t, b2, ZQString(longer.data(), int32_t(longer.size()))) : 0;
        if (b3 == 0) {
          fprintf(stderr, "plain_writer: putmemo of a replacement failed at record %d\n", i);
          return 1;
        }
        memo = longer;
        Pointer(rec + kNote, t, b3, memo.size());
        if (dbput(t, rec, i, 1) != 0) return 1;
      }
      line = "{\"NAME\":";
      Json("name " + std::to_string(i), &line);
      snprintf(buf, sizeof buf, ",\"QTY\":%.2f,\"BORN\":\"%04d-%02d-%02d\",\"OK\":%s,\"NOTE\":", (i % 2 ? -1 : 1) * (i * 1.25),
               1990 + i % 30, 1 + i % 12, 1 + i % 28, i % 2 ? "true" : "false");
      line += buf;
      if (memo.empty()) line += "null";
      else Json(memo, &line);
      line += "}\n";
      fputs(line.c_str(), stdout);
    }
  }
  if (dbclose(read_fields, t) != 0) {
    fprintf(stderr, "plain_writer: dbclose failed\n");
    return 1;
  }
  return 0;
}
