// Memo files of every kind from fuzzed bytes, beside a small table: reads of a
// range of blocks and lengths, then stores and frees on the same (scratch)
// copy. Input: one byte that picks the kind, two bytes of length seed, then
// the memo file.

#include <cstddef>
#include <cstdint>
#include <string>

#include "fuzz/scratch_file.h"
#include "table/dbf.h"
#include "table/memo.h"
#include "tests/support/dbf_builder.h"

namespace {

struct Kind {
  uint8_t version;
  int dialect;
  const char* ext;
};
constexpr Kind kKinds[] = {
    {0x83, DIALECT_DBASE3P, "dbt"},  // dBASE III
    {0x8B, DIALECT_DBASE4, "dbt"},   // dBASE IV, 0x0101 or 0x0102 by the header
    {0xF5, DIALECT_FOXPRO, "fpt"},
    {0xE5, DIALECT_CLIPPER, "smt"},
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size < 3 || size > (1u << 20)) return 0;
  const Kind& kind = kKinds[data[0] % 4];
  uint32_t seed = uint32_t(data[1]) | uint32_t(data[2]) << 8;
  std::string table = fuzz::ScratchDir("memofuzz") + "/t.dbf";
  std::string memo = fuzz::ScratchDir("memofuzz") + "/t." + kind.ext;
  // A wide table with one memo field and no records.
  tests::Bytes t = tests::DbfBuilder(kind.version).Field("NOTES", 'M', 10).Build();
  if (!fuzz::WriteScratch(table, t.data(), t.size()) || !fuzz::WriteScratch(memo, data + 3, size - 3)) return 0;

  ZQDBFIELD* fields[kMaxFields] = {};
  int dialect = kind.dialect;
  ZQDBFILE* db = dbopen(nullptr, table.c_str(), fields, &dialect, true);
  if (db == nullptr) return 0;
  ZQString text;
  uint32_t blocks = db->memoblksize != 0 ? uint32_t((size - 3) / db->memoblksize) + 2 : 4;
  if (blocks > 64) blocks = 64;
  for (uint32_t b = 0; b < blocks; ++b) {
    db->memostat = 1;
    getmemo(db, b, seed + b, text);
  }
  for (uint32_t b : {0x7FFFFFFFu, 0xFFFFFFFFu, 0x00010000u}) getmemo(db, b, 0xFFFFFFFFu, text);

  // Stores and frees on this scratch copy: a damaged chain or header must
  // end each call, never loop or write out of bounds.
  std::string body(size_t(seed % 2000) + 1, 'm');
  for (uint32_t b = 0; b < 6 && b < blocks; ++b) {
    uint32_t at = putmemo(db, b, ZQString(body.c_str()));
    if (at != 0) getmemo(db, at, uint32_t(body.size()), text);
    deloldm(db, b + 1, int(seed % 5));
    body.resize(body.size() / 2 + 1);
  }
  dbclose(fields, db);
  return 0;
}
