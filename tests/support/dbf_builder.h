// Builds table files byte by byte for tests, so that expected bytes come
// from the test, not from the code under test. Break one field afterwards
// with the Put helpers and the offsets of table/dbf.h.
//
//   auto bytes = DbfBuilder(0x03).Field("NAME", 'C', 10).Field("N", 'N', 5, 2)
//                    .Record({"alice", "1.50"}).Deleted({"bob", "2.00"}).Build();
#pragma once

#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "host/endian.h"

namespace tests {

using Bytes = std::vector<uint8_t>;

struct FieldSpec {
  std::string name;
  char type;
  int length;
  int decimals;
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
  DbfBuilder& HeaderExtra(int n) {
    extra_ = n;
    return *this;
  }
  // Overrides the record count written in the header (-1: the real count).
  DbfBuilder& CountInHeader(int32_t n) {
    count_override_ = n;
    return *this;
  }
  DbfBuilder& RecordLength(int n) {
    reclen_override_ = n;
    return *this;
  }
  DbfBuilder& NoEndMark() {
    end_mark_ = false;
    return *this;
  }

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

  Bytes Build() const {
    Bytes out;
    int32_t count = count_override_ >= 0 ? count_override_ : int32_t(records_.size());
    if (narrow_) {
      out.resize(8, 0);
      out[0] = version_;
      PutLe16(&out[1], uint16_t(count));
      out[3] = 1;   // month
      out[4] = 24;  // year
      out[5] = 2;   // day
      PutLe16(&out[6], uint16_t(RecLen()));
      for (const auto& f : fields_) {
        uint8_t d[16] = {0};
        for (size_t i = 0; i < f.name.size() && i < 11; ++i) d[i] = uint8_t(f.name[i]);
        d[11] = uint8_t(f.type);
        d[12] = uint8_t(f.length);
        d[15] = uint8_t(f.decimals);
        out.insert(out.end(), d, d + 16);
      }
      out.push_back(0x0D);
      out.resize(size_t(HeaderLength()), 0);
    } else {
      out.resize(32, 0);
      out[0] = version_;
      out[1] = 124;
      out[2] = 1;
      out[3] = 2;
      PutLe32(&out[4], uint32_t(count));
      PutLe16(&out[8], uint16_t(HeaderLength()));
      PutLe16(&out[10], uint16_t(RecLen()));
      for (const auto& f : fields_) {
        uint8_t d[32] = {0};
        for (size_t i = 0; i < f.name.size() && i < 11; ++i) d[i] = uint8_t(f.name[i]);
        d[11] = uint8_t(f.type);
        d[16] = uint8_t(f.length);
        d[17] = uint8_t(f.decimals);
        out.insert(out.end(), d, d + 32);
      }
      out.push_back(0x0D);
      out.resize(size_t(HeaderLength()), 0);
    }
    for (const auto& r : records_) out.insert(out.end(), r.begin(), r.end());
    if (end_mark_) out.push_back(0x1A);
    return out;
  }

 private:
  DbfBuilder& Add(char flag, const std::vector<std::string>& values) {
    Bytes r;
    r.push_back(uint8_t(flag));
    for (size_t i = 0; i < fields_.size(); ++i) {
      std::string v = i < values.size() ? values[i] : "";
      v.resize(size_t(fields_[i].length), ' ');
      r.insert(r.end(), v.begin(), v.end());
    }
    records_.push_back(r);
    return *this;
  }

  uint8_t version_;
  bool narrow_;
  int extra_ = 0;
  int32_t count_override_ = -1;
  int reclen_override_ = -1;
  bool end_mark_ = true;
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
    bool gone = false;
    for (int d : deleted) gone = gone || d == p;
    if (gone) b.Deleted({v});
    else b.Record({v});
  }
  return b.Build();
}

// A path in a directory of this process alone: the test programs (and the
// sanitizer build) run side by side, and each would otherwise overwrite the
// others' files. The directory goes when the process ends.
inline std::string ScratchPath(const std::string& name) {
  static const std::string dir = [] {
    std::string d = "/tmp/zqdbse-tests-" + std::to_string(getpid());
    mkdir(d.c_str(), 0700);
    static std::string to_remove = d;
    atexit([] {
      std::string rm = "rm -rf '" + to_remove + "'";
      if (system(rm.c_str()) != 0) {
      }
    });
    return d;
  }();
  return dir + "/" + name;
}

// Writes bytes to a file in this process's scratch directory.
inline std::string WriteScratch(const std::string& name, const Bytes& bytes) {
  std::string path = ScratchPath(name);
  FILE* f = fopen(path.c_str(), "wb");
  if (f == nullptr) return "";
  if (!bytes.empty()) fwrite(bytes.data(), 1, bytes.size(), f);
  fclose(f);
  return path;
}

inline Bytes ReadFile(const std::string& path) {
  Bytes out;
  FILE* f = fopen(path.c_str(), "rb");
  if (f == nullptr) return out;
  uint8_t buf[4096];
  size_t n;
  while ((n = fread(buf, 1, sizeof buf, f)) > 0) out.insert(out.end(), buf, buf + n);
  fclose(f);
  return out;
}

}  // namespace tests
