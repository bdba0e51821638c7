// Helpers of the index tests: the key field of a new index, the forms of
// index the module writes, made or opened through one object, keys, and the
// bytes of an index file as the index objects see them.
#pragma once

#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include "host/endian.h"
#include "host/platform.h"
#include "index/foxidx.h"
#include "index/mdx.h"
#include "tests/support/dbf_builder.h"

namespace tests {

// The trees of a million keys run in the optimised build only.
#ifndef __has_feature
#define __has_feature(x) 0  // GCC says __SANITIZE_ADDRESS__ instead
#endif
#if __has_feature(address_sanitizer) || defined(__SANITIZE_ADDRESS__)
constexpr bool kSanitized = true;
#else
constexpr bool kSanitized = false;
#endif

// The key of a new index: one field `name` of `width` bytes, text or
// (numeric) an 8-byte double key.
struct KeyField {
  ZQRecord fields;
  ZQIndexDef def;
  ZQDType type;
  explicit KeyField(int width, bool compress = true, bool unique = false, bool numeric = false,
                    const char* name = "NAME")
      : type(numeric ? DT_DOUBLE : DT_TEXT) {
    type.Length(width);
    def.AddSeg(0, int16_t(numeric ? 8 : width), &type, fields.NewField(type, name));
    def.Name("NAME");
    def.Compress(compress);
    def.Dups(!unique);
  }
};

// A form of index. A name with an extension is a file of its own; without
// one, a tag of the table's MDX (dBASE) or CDX (FoxPro) file.
struct Form {
  const char* name;
  bool fox, compress;
  bool Tag() const { return strchr(name, '.') == nullptr; }
  bool Backwards() const { return fox || !Tag(); }  // an MDX tag walks forwards only
  // The file that holds the index beside the scratch table `table`, a name
  // in the scratch directory.
  std::string File(const std::string& table) const {
    return Tag() ? table + (fox ? ".cdx" : ".mdx") : name;
  }
};
constexpr Form kNdx{"TREE.NDX", false, false}, kMdx{"TREE", false, false};
constexpr Form kIdx{"tree.idx", true, true}, kPlainIdx{"plain.idx", true, false};
constexpr Form kCdx{"TREE", true, true};

// An index of `form` beside the scratch table `table`: made over `key` in a
// new file (a tag: the file it would join is removed first), or opened.
class Index {
 public:
  Index(const Form& form, const std::string& table, KeyField* key = nullptr) {
    const std::string path = ScratchPath(table);
    const std::string file = form.Tag() ? form.name : ScratchPath(form.name);
    const char *base = path.c_str(), *name = file.c_str();
    if (key != nullptr) unlink(ScratchPath(form.File(table)).c_str());
    if (form.fox)
      ix_.reset(key ? new ZQDBFoxIndex(base, name, key->fields, key->def, taglist_)
                    : new ZQDBFoxIndex(base, name, taglist_));
    else
      ix_.reset(key ? new ZQDBMdx(base, name, key->fields, &key->def) : new ZQDBMdx(base, name));
  }
  ~Index() {
    ix_.reset();
    delete taglist_;  // last: its descriptor would keep the file's pages cached
  }
  Index(const Index&) = delete;
  Index& operator=(const Index&) = delete;
  ZQDBIndexBase* operator->() const { return ix_.get(); }
  ZQDBIndexBase& operator*() const { return *ix_; }
  ZQDBFoxIndex& Fox() const { return static_cast<ZQDBFoxIndex&>(*ix_); }  // REQUIRES: a FoxPro form
  const ZQDBFoxIndex* TagList() const { return taglist_; }

 private:
  ZQDBFoxIndex* taglist_ = nullptr;
  std::unique_ptr<ZQDBIndexBase> ix_;
};

// `v` as eight digits, blank-padded to `width`.
inline std::string Key(int v, int width) {
  char digits[16];
  snprintf(digits, sizeof digits, "%08d", v);
  std::string k(digits);
  k.resize(size_t(width), ' ');
  return k;
}

inline bool AddKey(ZQDBIndexBase& ix, const std::string& key, int32_t record) {
  ZQString k(key.data(), int32_t(key.size()));
  return ix.AddKey(k, record);
}

inline std::string Text(const ZQString& s) { return std::string(s.c_str(), size_t(s.length())); }

// The file as the index objects see it: through the platform layer, whose
// page cache holds what open descriptors wrote and haven't yet put on disk.
inline Bytes ReadIndexFile(const std::string& path) {
  Bytes b;
  int fd = _open(path.c_str(), kRtReadOnly | kRtBinary);
  if (fd < 0) return b;
  uint8_t chunk[4096];
  for (int32_t n; (n = _read(fd, chunk, sizeof chunk)) > 0;) b.insert(b.end(), chunk, chunk + n);
  _close(fd);
  return b;
}

// A new index of `form` beside the scratch table `table`, over a text key of
// `width` bytes, with keys[i] added for record i: its file's bytes once closed.
inline Bytes Made(const Form& form, const std::string& table, int width,
                  const std::vector<std::string>& keys, bool unique = false) {
  KeyField f(width, form.compress, unique);
  {
    Index ix(form, table, &f);
    EXPECT_TRUE(ix->OK());
    for (size_t i = 0; i < keys.size(); ++i) EXPECT_TRUE(AddKey(*ix, keys[i], int32_t(i))) << i;
  }
  return ReadIndexFile(ScratchPath(form.File(table)));
}

inline void ExpectBytes(const Bytes& b, size_t at, const std::vector<uint8_t>& want) {
  ASSERT_LE(at + want.size(), b.size());
  EXPECT_EQ(Bytes(b.begin() + long(at), b.begin() + long(at + want.size())), want) << "at " << at;
}

// Little-endian numbers of 1, 2 or 4 bytes at their offsets.
struct Word { size_t at; int size; uint32_t value; };
inline void ExpectWords(const Bytes& b, std::initializer_list<Word> words) {
  for (const Word& w : words) {
    ASSERT_LE(w.at + size_t(w.size), b.size());
    uint32_t got = w.size == 1 ? b[w.at] : w.size == 2 ? GetLe16(&b[w.at]) : GetLe32(&b[w.at]);
    EXPECT_EQ(got, w.value) << "at " << w.at;
  }
}

}  // namespace tests
