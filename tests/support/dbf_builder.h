// Builds table files byte by byte for tests, so that expected bytes come
// from the test, not from the code under test. Break one field afterwards
// with the Put helpers and the offsets of table/dbf.h.
//
//   auto bytes = DbfBuilder(0x03).Field("NAME", 'C', 10).Field("N", 'N', 5, 2)
//                    .Record({"alice", "1.50"}).Deleted({"bob", "2.00"}).Build();
#pragma once

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "host/endian.h"

namespace tests {

using Bytes = std::vector<uint8_t>;

struct FieldSpec {
  std::string name;
  char type;
  int length, decimals;
};

class DbfBuilder {
 public:
  // `narrow` selects the dBASE II / Enable header.
  explicit DbfBuilder(uint8_t version, bool narrow = false) : version_(version), narrow_(narrow) {}

  DbfBuilder& Field(const std::string& name, char type, int length, int decimals = 0) {
    fields_.push_back({name, type, length, decimals});
    return *this;
  }
  // Text values are padded with blanks (or cut) to each field's width; a value
  // given as raw bytes (RawRecord) goes in as it stands.
  DbfBuilder& Record(const std::vector<std::string>& values) { return Add(' ', values); }
  DbfBuilder& Deleted(const std::vector<std::string>& values) { return Add('*', values); }
  DbfBuilder& RawRecord(const Bytes& record_with_flag) {
    records_.push_back(record_with_flag);
    return *this;
  }
  // Extra bytes behind the terminator of a wide header (Visual FoxPro has 263).
  DbfBuilder& HeaderExtra(int n) { extra_ = n; return *this; }
  // Overrides the record count written in the header (-1: the real count).
  DbfBuilder& CountInHeader(int32_t n) { count_override_ = n; return *this; }
  DbfBuilder& RecordLength(int n) { reclen_override_ = n; return *this; }
  DbfBuilder& NoEndMark() { end_mark_ = false; return *this; }
  // The wide header's flags byte at 28 (production index, memo fields).
  DbfBuilder& Flags(uint8_t flags) { flags_ = flags; return *this; }
  // Visual FoxPro: each wide descriptor holds its field's displacement in the
  // record at 12.
  DbfBuilder& Displacements() { displacements_ = true; return *this; }

  int RecLen() const {
    if (reclen_override_ >= 0) return reclen_override_;
    int n = 1;
    for (const auto& f : fields_) n += f.length;
    return n;
  }

  int HeaderLength() const {
    if (narrow_) return fields_.size() <= 32 ? 521 : int(16 * fields_.size() + 9);
    return int(32 + 32 * fields_.size() + 1 + extra_);
  }

  // Narrow: count (16 bits), month, year, day, record length; descriptors of
  // 16 bytes (length at 12, decimals at 15) from 8. Wide: year, month, day,
  // count, header length, record length; descriptors of 32 bytes (length at
  // 16, decimals at 17) from 32.
  Bytes Build() const {
    int32_t count = count_override_ >= 0 ? count_override_ : int32_t(records_.size());
    Bytes out(narrow_ ? 8 : 32, 0);
    out[0] = version_;
    if (narrow_) {
      PutLe16(&out[1], uint16_t(count));
      out[3] = 1;
      out[4] = 24;
      out[5] = 2;
      PutLe16(&out[6], uint16_t(RecLen()));
    } else {
      out[1] = 124;
      out[2] = 1;
      out[3] = 2;
      PutLe32(&out[4], uint32_t(count));
      PutLe16(&out[8], uint16_t(HeaderLength()));
      PutLe16(&out[10], uint16_t(RecLen()));
      out[28] = flags_;
    }
    const size_t length_at = narrow_ ? 12 : 16;
    uint32_t displacement = 1;
    for (const auto& f : fields_) {
      Bytes d(narrow_ ? 16 : 32, 0);
      for (size_t i = 0; i < f.name.size() && i < 11; ++i) d[i] = uint8_t(f.name[i]);
      d[11] = uint8_t(f.type);
      d[length_at] = uint8_t(f.length);
      d[narrow_ ? 15 : 17] = uint8_t(f.decimals);
      if (displacements_) PutLe32(&d[12], displacement);
      displacement += uint32_t(f.length);
      out.insert(out.end(), d.begin(), d.end());
    }
    out.push_back(0x0D);
    out.resize(size_t(HeaderLength()), 0);
    for (const auto& r : records_) out.insert(out.end(), r.begin(), r.end());
    if (end_mark_) out.push_back(0x1A);
    return out;
  }

 private:
  DbfBuilder& Add(char flag, const std::vector<std::string>& values) {
    Bytes r{uint8_t(flag)};
    for (size_t i = 0; i < fields_.size(); ++i) {
      std::string v = i < values.size() ? values[i] : "";
      v.resize(size_t(fields_[i].length), ' ');
      r.insert(r.end(), v.begin(), v.end());
    }
    return RawRecord(r);
  }

  uint8_t version_;
  bool narrow_;
  int extra_ = 0;
  int32_t count_override_ = -1;
  int reclen_override_ = -1;
  bool end_mark_ = true;
  uint8_t flags_ = 0;
  bool displacements_ = false;
  std::vector<FieldSpec> fields_;
  std::vector<Bytes> records_;
};

// Pieces of raw records: text, little-endian numbers, a double; Rec joins
// them behind a flag byte.
inline Bytes Text(const std::string& s) { return Bytes(s.begin(), s.end()); }
inline Bytes Le32(uint32_t v) {
  Bytes b(4);
  PutLe32(b.data(), v);
  return b;
}
inline Bytes Le64(uint64_t v) {
  Bytes b(8);
  PutLe64(b.data(), v);
  return b;
}
inline Bytes Dbl(double d) {
  uint64_t raw;
  memcpy(&raw, &d, 8);
  return Le64(raw);
}
inline Bytes Rec(std::initializer_list<Bytes> parts, uint8_t flag = ' ') {
  Bytes r{flag};
  for (const Bytes& p : parts) r.insert(r.end(), p.begin(), p.end());
  return r;
}

// A dBASE III table of one column PHYS C(6) holding "p<physical number>",
// the records whose numbers are in `deleted` marked deleted: positions and
// skipped records show in the values read.
inline Bytes NumberedTable(int count, const std::vector<int>& deleted) {
  DbfBuilder b(0x03);
  b.Field("PHYS", 'C', 6);
  for (int p = 0; p < count; ++p) {
    std::string v = "p" + std::to_string(p);
    if (std::find(deleted.begin(), deleted.end(), p) != deleted.end()) b.Deleted({v});
    else b.Record({v});
  }
  return b.Build();
}

// A path in a directory of this process alone: the test programs (and the
// sanitizer build) run side by side, and each would otherwise overwrite the
// others' files. The directory goes when the process ends.
inline std::string ScratchPath(const std::string& name) {
  static const std::string dir = [] {
    static const std::string d = "/tmp/zqdbse-tests-" + std::to_string(getpid());
    mkdir(d.c_str(), 0700);
    atexit([] {
      std::error_code ignored;
      std::filesystem::remove_all(d, ignored);
    });
    return d;
  }();
  return dir + "/" + name;
}

// Writes bytes to `path`; the path, or "" when the file can't be made.
inline std::string WriteAt(const std::string& path, const Bytes& bytes) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out.write(reinterpret_cast<const char*>(bytes.data()), std::streamsize(bytes.size()));
  return out ? path : "";
}

// Writes bytes to a file in this process's scratch directory.
inline std::string WriteScratch(const std::string& name, const Bytes& bytes) {
  return WriteAt(ScratchPath(name), bytes);
}

// The bytes of a file; none when it can't be read.
inline Bytes ReadFile(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return Bytes(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

}  // namespace tests
