// A table's records as bytes, read by zqdb itself beside the module: for
// what the module doesn't say (memo pointers it couldn't follow, delete
// flags, values that don't parse). The layout comes from the source spoke's
// facts, so both read the same fields at the same offsets.
#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

struct RawField {
  std::string name;
  char type;
  int32_t offset;  // within the record, behind the flag byte
  int32_t width;
};

// The fields of a spoke's "field" facts (name, letter, width, decimals
// separated by tabs), with their offsets.
std::vector<RawField> RawFieldsOf(const std::vector<std::pair<std::string, std::string>>& facts);

// The block a memo pointer names: ten digits (blanks around them), four
// little-endian bytes in Visual FoxPro, or Clipper's SMT pointer (its length
// in `*length`). 0 for no memo, -1 for a pointer that is no number.
int64_t MemoBlockOf(const char* p, int32_t width, bool vfp, bool smt, int64_t* length);

// Why a table's memo file, of the kind its version byte picks, is refused
// or missing: "No such file or directory", "its version word is 0x0000, not
// 0x0101 or 0x0102", ... "" when nothing is seen wrong. `kind` gets the
// kind's name ("dBASE IV"), `memo` the file looked for.
std::string MemoFileTrouble(const std::string& table, std::string* memo, std::string* kind);
