#include "engine/aliases.h"

#include <sys/stat.h>

#include <cctype>

namespace {

struct Companion {
  const char* ext;
  const char* role;
};
const Companion kCompanions[] = {
    {"dbt", "memo file"},  {"fpt", "memo file"},  {"smt", "memo file"},  {"mdx", "index file"},
    {"cdx", "index file"}, {"ndx", "index file"}, {"idx", "index file"}, {"ntx", "index file"},
    {"cpg", "code page file"},
};

std::string Cased(const std::string& ext, bool upper) {
  std::string s = ext;
  for (char& c : s) c = char(upper ? toupper(static_cast<unsigned char>(c)) : tolower(static_cast<unsigned char>(c)));
  return s;
}

// The base without the extension, and the extension ("" when none).
void Split(const std::string& path, std::string* base, std::string* ext) {
  size_t dot = path.rfind('.');
  if (dot == std::string::npos || path.find('/', dot) != std::string::npos) {
    *base = path, ext->clear();
    return;
  }
  *base = path.substr(0, dot);
  *ext = path.substr(dot + 1);
}

void AddIfExists(const std::string& path, const char* role, std::vector<TableFile>* out) {
  struct stat st;
  if (stat(path.c_str(), &st) == 0) out->push_back({path, role});
}

bool SameFile(const struct stat& a, const struct stat& b) { return a.st_dev == b.st_dev && a.st_ino == b.st_ino; }

}  // namespace

std::vector<TableFile> TableFiles(const std::string& path, bool with_companions) {
  std::vector<TableFile> files;
  std::string base, ext;
  Split(path, &base, &ext);
  AddIfExists(path, "table", &files);
  // The table's own name with its extension in the other case: on a file
  // system that ignores case it is the same file.
  if (!ext.empty()) {
    AddIfExists(base + "." + Cased(ext, false), "table", &files);
    AddIfExists(base + "." + Cased(ext, true), "table", &files);
  }
  if (!with_companions) return files;
  for (const Companion& c : kCompanions)
    for (bool upper : {false, true}) AddIfExists(base + "." + Cased(c.ext, upper), c.role, &files);
  return files;
}

bool CheckNoAlias(const std::string& src, bool source_is_table, const std::string& dst, bool target_is_table,
                  const std::vector<std::string>& index_files, std::string* error) {
  std::vector<TableFile> sources = TableFiles(src, source_is_table);
  std::vector<TableFile> targets = TableFiles(dst, target_is_table);
  for (const std::string& ix : index_files) AddIfExists(ix, "index file", &targets);
  for (const TableFile& t : targets) {
    struct stat ts;
    if (stat(t.path.c_str(), &ts) != 0) continue;
    for (const TableFile& s : sources) {
      struct stat ss;
      if (stat(s.path.c_str(), &ss) != 0 || !SameFile(ts, ss)) continue;
      std::string what = s.role == std::string("table") ? "the source" : "the source's " + std::string(s.role);
      *error = "the target " + dst + " would write over " + s.path + ", " + what + "; choose another name";
      return false;
    }
  }
  return true;
}
