// The descriptor trailer at the end of the module file: the nine connector
// definitions the module offers, one per product whose tables it serves.
// This table is the one source of the nine rows; the build appends the
// bytes that EncodeTrailer makes to the built module (tools/mktrailer.cpp).
//
// Trailer, all numbers big-endian:
//   the definitions, back to back
//   4 bytes per definition: its length, in the same order
//   end - 16   4   number of definitions (9)
//   end - 12   4   size of the definitions and the lengths together (1196)
//   end - 8    8   magic "ZQSPOKEX"
//
// One definition:
//   8 words of 32 bits: 1, definition number, 4, 6, 0, level 900, 0, 0
//   key, display name            NUL-ended
//   flags                        64 bits
//   option text, extension "dbf", display name again, short name,
//   module stem "dbse", class stem "Dbase"      NUL-ended
//   3 words: 4, 1, 0
//   kind "FlatFile"              NUL-ended
//   4 zero bytes
#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace trailer {

constexpr char kMagic[] = "ZQSPOKEX";  // 8 bytes, no NUL in the file
constexpr int kTailSize = 16;          // count, size, magic

struct Row {
  uint32_t number;
  const char* key;
  const char* display;
  uint64_t flags;
  const char* option_text;
  const char* short_name;
};

// The nine definitions, in their order. Visual FoxPro's flags leave out
// bits 0x02 and 0x10.
constexpr Row kRows[] = {
    {4, "DADBASE", "dBASE IV", 0x1F, "", "dbase"},
    {200, "DADBASE2", "dBASE II", 0x1F, "version=0", "dbase2"},
    {202, "DADBASE3P", "dBASE III+", 0x1F, "version=1", "dbase3p"},
    {203, "DAENABLE", "Enable", 0x1F, "version=3", "enable"},
    {204, "DAFOXPRO", "FoxPro", 0x1F, "version=6", "foxpro"},
    {205, "DAENABLEOA", "Enable OA (Database)", 0x1F, "version=7", "enableoa"},
    {206, "DACLIPPER", "Clipper", 0x1F, "version=8", "clipper"},
    {207, "DADBASE5", "Visual dBASE 5.5", 0x1F, "version=9", "dbase5"},
    {208, "DAVFOXPRO", "Visual FoxPro", 0x0D, "version=10", "vfoxpro"},
};

constexpr uint32_t kWord0 = 1, kWord2 = 4, kWord3 = 6, kWord4 = 0, kLevel = 900;
constexpr uint32_t kTailWords[3] = {4, 1, 0};
constexpr const char* kExtension = "dbf";
constexpr const char* kModuleStem = "dbse";
constexpr const char* kClassStem = "Dbase";
constexpr const char* kKind = "FlatFile";

inline void PutBe32(std::vector<uint8_t>& out, uint32_t v) {
  for (int i = 3; i >= 0; --i) out.push_back(uint8_t(v >> (8 * i)));
}
inline void PutText(std::vector<uint8_t>& out, const char* s) {
  for (; *s; ++s) out.push_back(uint8_t(*s));
  out.push_back(0);
}

inline std::vector<uint8_t> EncodeDefinition(const Row& r) {
  std::vector<uint8_t> d;
  for (uint32_t w : {kWord0, r.number, kWord2, kWord3, kWord4, kLevel, 0u, 0u}) PutBe32(d, w);
  PutText(d, r.key);
  PutText(d, r.display);
  PutBe32(d, uint32_t(r.flags >> 32));
  PutBe32(d, uint32_t(r.flags));
  PutText(d, r.option_text);
  PutText(d, kExtension);
  PutText(d, r.display);
  PutText(d, r.short_name);
  PutText(d, kModuleStem);
  PutText(d, kClassStem);
  for (uint32_t w : kTailWords) PutBe32(d, w);
  PutText(d, kKind);
  PutBe32(d, 0);
  return d;
}

// The whole trailer, ready to be appended to the module file.
inline std::vector<uint8_t> EncodeTrailer() {
  std::vector<uint8_t> defs, lengths;
  uint32_t count = 0;
  for (const Row& r : kRows) {
    std::vector<uint8_t> d = EncodeDefinition(r);
    defs.insert(defs.end(), d.begin(), d.end());
    PutBe32(lengths, uint32_t(d.size()));
    ++count;
  }
  std::vector<uint8_t> out = defs;
  out.insert(out.end(), lengths.begin(), lengths.end());
  PutBe32(out, count);
  PutBe32(out, uint32_t(defs.size() + lengths.size()));
  for (int i = 0; i < 8; ++i) out.push_back(uint8_t(kMagic[i]));
  return out;
}

}  // namespace trailer
