// A new Visual FoxPro table (dialect 10), byte for byte: version 0x30, the
// 263-byte area behind the terminator, the table flags, descriptors with
// their displacement, the fixed widths of the binary forms, and the FPT memo
// file with 64-byte blocks that the memo engine then fills.
#include <gtest/gtest.h>

#include <unistd.h>

#include <cstring>
#include <string>
#include <utility>
#include <vector>

#include "table/dbf.h"
#include "table/memo.h"
#include "tests/support/memo_builder.h"

namespace {

using tests::Bytes;

constexpr int kMemo = 0x8000;

ZQDBFIELD Descriptor(const char* name, char type, int length, int decimals = 0) {
  ZQDBFIELD f{};
  strncpy(f.name, name, 11);
  f.type = int8_t(type);
  f.length = uint8_t(length);
  f.decimals = uint8_t(decimals);
  return f;
}

// dbcreat takes an array of pointers; the descriptors belong to the test,
// and dbcreat pads their names in place.
struct Fields {
  explicit Fields(std::vector<ZQDBFIELD> descriptors) : list(std::move(descriptors)) {
    for (auto& f : list) ptrs.push_back(&f);
    ptrs.push_back(nullptr);
  }
  std::vector<ZQDBFIELD> list;
  std::vector<ZQDBFIELD*> ptrs;
};

std::string Sibling(const std::string& path, const std::string& ext) {
  return path.substr(0, path.rfind('.') + 1) + ext;
}

// The header as a Visual FoxPro table carries it, the date bytes left 0.
Bytes VfpHeader(uint16_t hdrlen, uint16_t reclen, uint8_t flags) {
  Bytes h(32, 0);
  h[0] = 0x30;
  PutLe16(&h[8], hdrlen);
  PutLe16(&h[10], reclen);
  h[28] = flags;
  return h;
}

void AddDescriptor(Bytes& b, const char* name, char type, uint32_t displacement, uint8_t length,
                   uint8_t decimals = 0) {
  Bytes d(32, 0);
  for (size_t i = 0; name[i] != '\0'; ++i) d[i] = uint8_t(name[i]);
  d[11] = uint8_t(type);
  PutLe32(&d[12], displacement);
  d[16] = length;
  d[17] = decimals;
  b.insert(b.end(), d.begin(), d.end());
}

void EndHeader(Bytes& b) {
  b.push_back(0x0D);
  b.resize(b.size() + 263, 0);
}

// Checks today's date at offsets 1 to 3 and blanks it for the comparison.
void TakeDate(Bytes& b) {
  char day, month, year;
  dbdate(&day, &month, &year);
  EXPECT_EQ(b[1], uint8_t(year));
  EXPECT_EQ(b[2], uint8_t(month));
  EXPECT_EQ(b[3], uint8_t(day));
  b[1] = b[2] = b[3] = 0;
}

struct Open {
  Open(const std::string& path, bool writable) { db = dbopen(nullptr, path.c_str(), fields, &dialect, writable); }
  ~Open() {
    if (db != nullptr) dbclose(fields, db);
  }
  ZQDBFIELD* fields[kMaxFields] = {};
  int dialect = DIALECT_VFOXPRO;
  ZQDBFILE* db = nullptr;
};

TEST(CreateVfp, TableWithoutMemoFields) {
  // The caller's widths of the binary forms don't count: I is 4, T and Y 8.
  Fields f({Descriptor("ID", 'I', 11), Descriptor("NAME", 'C', 10), Descriptor("WHEN", 'T', 19),
            Descriptor("PRICE", 'Y', 20, 4), Descriptor("AMOUNT", 'N', 8, 2)});
  std::string path = tests::MemoScratch("vfp_plain.dbf");
  unlink(Sibling(path, "fpt").c_str());
  ASSERT_EQ(dbcreat(path.c_str(), 5, f.ptrs.data(), DIALECT_VFOXPRO, false), 0);

  Bytes b = tests::ReadFile(path);
  ASSERT_EQ(b.size(), 456u);  // 32 * 5 + 296
  TakeDate(b);
  Bytes want = VfpHeader(456, 39, 0x00);  // record: 1 + 4 + 10 + 8 + 8 + 8
  AddDescriptor(want, "ID", 'I', 1, 4);
  AddDescriptor(want, "NAME", 'C', 5, 10);
  AddDescriptor(want, "WHEN", 'T', 15, 8);
  AddDescriptor(want, "PRICE", 'Y', 23, 8, 4);
  AddDescriptor(want, "AMOUNT", 'N', 31, 8, 2);
  EndHeader(want);
  EXPECT_EQ(b, want);
  EXPECT_NE(access(Sibling(path, "fpt").c_str(), F_OK), 0);

  // Its own open takes it: the header length is read, not recomputed.
  Open t(path, false);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->hdrlen, 456);
  EXPECT_EQ(t.db->reclen, 39);
  EXPECT_EQ(t.db->fieldcount, 5);
  EXPECT_EQ(t.db->hasmemo, 0);
  EXPECT_EQ(t.fields[0]->length, 4);
  EXPECT_STREQ(t.fields[4]->name, "AMOUNT");
}

TEST(CreateVfp, TableWithMemoFieldsAndProductionIndex) {
  Fields f({Descriptor("NAME", 'C', 10), Descriptor("NOTES", 'M', 10), Descriptor("PIC", 'G', 10),
            Descriptor("RATE", 'B', 10)});
  std::string path = tests::MemoScratch("vfp_memo.dbf");
  ASSERT_EQ(dbcreat(path.c_str(), 4, f.ptrs.data(), DIALECT_VFOXPRO | kMemo, true), 0);

  Bytes b = tests::ReadFile(path);
  ASSERT_EQ(b.size(), 424u);  // 32 * 4 + 296
  TakeDate(b);
  Bytes want = VfpHeader(424, 27, 0x03);  // production index and memo fields
  AddDescriptor(want, "NAME", 'C', 1, 10);
  AddDescriptor(want, "NOTES", 'M', 11, 4);
  AddDescriptor(want, "PIC", 'G', 15, 4);
  AddDescriptor(want, "RATE", 'B', 19, 8);  // a double in the record, not a memo
  EndHeader(want);
  EXPECT_EQ(b, want);
  EXPECT_NE(access(Sibling(path, "dbt").c_str(), F_OK), 0);
  EXPECT_EQ(tests::ReadFile(Sibling(path, "fpt")), tests::FptHeader(8, 64));

  // The memo engine fills it from block 8, 64 bytes a block, the header's
  // word big-endian; a text that fits its old blocks stays where it is, a
  // longer one goes to the end and its old blocks are lost.
  {
    Open t(path, true);
    ASSERT_NE(t.db, nullptr);
    EXPECT_EQ(t.db->memokind, MEMO_FPT);
    EXPECT_EQ(t.db->memoblksize, 64);
    EXPECT_EQ(t.db->memofailed, 0);
    EXPECT_EQ(putmemo(t.db, 0, ZQString("first")), 8u);
    EXPECT_EQ(putmemo(t.db, 0, ZQString(std::string(100, 'x').c_str())), 9u);  // (100 + 8) / 64 + 1 = 2 blocks
    EXPECT_EQ(putmemo(t.db, 8, ZQString("first, longer")), 8u);
    EXPECT_EQ(putmemo(t.db, 8, ZQString(std::string(70, 'y').c_str())), 11u);
    EXPECT_EQ(deloldm(t.db, 11, 2), 0);  // nothing to free in this kind
    ZQString text;
    EXPECT_TRUE(getmemo(t.db, 11, 0, text));
    EXPECT_EQ(std::string(text.c_str()), std::string(70, 'y'));
  }
  Bytes memo = tests::ReadFile(Sibling(path, "fpt"));
  ASSERT_EQ(memo.size(), 13u * 64);
  EXPECT_EQ(Bytes(memo.begin(), memo.begin() + 8), (Bytes{0, 0, 0, 13, 0, 0, 0, 64}));
  Bytes block8 = {0, 0, 0, 1, 0, 0, 0, 13};
  for (char c : std::string("first, longer")) block8.push_back(uint8_t(c));
  block8.resize(64, 0);
  EXPECT_EQ(Bytes(memo.begin() + 512, memo.begin() + 576), block8);
}

TEST(CreateVfp, DoublesOnlyGetAnEmptyMemoFile) {
  // A caller that marks the table as having memos for a "B" field (as the
  // target does in every dialect) gets an empty FPT file: the table's own open
  // looks for one whenever a "B" field is there. The flags still say that the
  // table has no memo fields.
  Fields f({Descriptor("RATE", 'B', 8)});
  std::string path = tests::MemoScratch("vfp_double.dbf");
  ASSERT_EQ(dbcreat(path.c_str(), 1, f.ptrs.data(), DIALECT_VFOXPRO | kMemo, false), 0);
  Bytes b = tests::ReadFile(path);
  ASSERT_EQ(b.size(), 328u);
  EXPECT_EQ(b[0], 0x30);
  EXPECT_EQ(b[28], 0x00);
  EXPECT_EQ(GetLe16(&b[10]), 9);
  EXPECT_EQ(tests::ReadFile(Sibling(path, "fpt")), tests::FptHeader(8, 64));
  Open t(path, false);
  ASSERT_NE(t.db, nullptr);
  EXPECT_EQ(t.db->memofailed, 0);
}

}  // namespace
