// zqdb reindex: a table's index files built anew from its live records by
// the module's index classes, in a directory beside the table, and moved over
// the old files only once whole. A run killed at any point leaves every index
// file whole: the old one, or (after its rename) the new one.
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "engine/check.h"
#include "engine/indexes.h"
#include "engine/report.h"
#include "table/dbf.h"

namespace {

// The prefix of the staging directories of one table, in its directory.
const char kStagingPrefix[] = ".zqdb-reindex-";

void SplitPath(const std::string& path, std::string* dir, std::string* base, std::string* stem) {
  size_t slash = path.rfind('/');
  *dir = slash == std::string::npos ? "." : path.substr(0, slash == 0 ? 1 : slash);
  *base = slash == std::string::npos ? path : path.substr(slash + 1);
  size_t dot = base->rfind('.');
  *stem = dot == std::string::npos || dot == 0 ? *base : base->substr(0, dot);
}

std::string Extension(const std::string& name) {
  size_t slash = name.rfind('/');
  size_t dot = name.rfind('.');
  if (dot == std::string::npos || (slash != std::string::npos && dot < slash)) return "";
  std::string e = name.substr(dot + 1);
  for (char& c : e) c = char(tolower(static_cast<unsigned char>(c)));
  return e;
}

std::string Upper(std::string s) {
  for (char& c : s) c = char(toupper(static_cast<unsigned char>(c)));
  return s;
}

// Removes a staging directory and what it holds (files only: it holds no
// other directory).
void RemoveStaging(const std::string& dir) {
  DIR* d = opendir(dir.c_str());
  if (d != nullptr) {
    while (dirent* e = readdir(d)) {
      if (strcmp(e->d_name, ".") == 0 || strcmp(e->d_name, "..") == 0) continue;
      unlink((dir + "/" + e->d_name).c_str());
    }
    closedir(d);
  }
  rmdir(dir.c_str());
}

// Staging directories of this table left by a run that was killed: they
// only ever hold unfinished files.
void RemoveLeftovers(const std::string& dir, const std::string& stem) {
  const std::string prefix = std::string(kStagingPrefix) + stem + "-";
  DIR* d = opendir(dir.c_str());
  if (d == nullptr) return;
  std::vector<std::string> old;
  while (dirent* e = readdir(d))
    if (strncmp(e->d_name, prefix.c_str(), prefix.size()) == 0) old.push_back(dir + "/" + e->d_name);
  closedir(d);
  for (const std::string& o : old) RemoveStaging(o);
}

bool SyncPath(const std::string& path, int flags) {
  int fd = open(path.c_str(), flags);
  if (fd < 0) return false;
  bool ok = fsync(fd) == 0;
  return close(fd) == 0 && ok;
}

// The file that holds the tags: the one there is, in whichever case, or a
// new one in lower case.
std::string ProductionFile(const std::string& dir, const std::string& stem, const char* ext) {
  for (const std::string& e : {std::string(ext), Upper(ext)}) {
    std::string p = dir + "/" + stem + "." + e;
    if (access(p.c_str(), F_OK) == 0) return p;
  }
  return dir + "/" + stem + "." + ext;
}

// Sets the production-index flag of a table that had no MDX or CDX file
// before, so that other programs open the new one with the table.
bool MarkProduction(const std::string& table) {
  int fd = open(table.c_str(), O_RDWR);
  if (fd < 0) return false;
  uint8_t b = 0;
  bool ok = pread(fd, &b, 1, kWideProdIndex) == 1;
  if (ok && (b & 1) == 0) {
    b = uint8_t(b | 1);
    ok = pwrite(fd, &b, 1, kWideProdIndex) == 1 && fsync(fd) == 0;
  }
  return close(fd) == 0 && ok;
}

// One index to build: its definition, where it is built and where it goes.
struct Planned {
  ZQIndexDef def;
  std::string final_path;  // "" for a tag of the production file
};

bool Rebuild(const std::string& table, const SourceOptions& source, const std::vector<std::string>& names,
             const std::vector<IndexOption>& added, bool tags_only, std::string* summary, std::string* error) {
  SourceOptions quiet = source;
  quiet.memo_policy = 2;  // no key is made of a memo
  quiet.codepage = 0;     // keys are of the bytes the records hold, in the table's code page
  SourcePtr spoke;
  if (OpenSource(table, quiet, &spoke, error) != 0) return false;
  ZQString version;
  spoke->GetOption("version", version);
  const int dialect = atoi(version.c_str());
  const IndexKind kind = IndexKindOf(dialect);
  if (kind == IndexKind::kNone) {
    *error = "this dialect keeps no index files";
    return false;
  }
  const char* tag_ext = kind == IndexKind::kDbase ? "mdx" : "cdx";
  const char* file_ext = kind == IndexKind::kDbase ? "ndx" : "idx";
  std::vector<const ZQIndexDef*> tags;
  ZQIndexDef* const* list = spoke->IndexList();
  for (int i = 0; list != nullptr && list[i] != nullptr; ++i) tags.push_back(list[i]);
  auto is_tag = [&](const std::string& n) {
    for (const ZQIndexDef* t : tags)
      if (strcasecmp(t->Name(), n.c_str()) == 0) return true;
    return false;
  };

  std::vector<Planned> plan;
  bool production = names.empty();
  std::vector<std::string> files;
  for (const std::string& n : names) {
    if (is_tag(n)) {
      production = true;
    } else if (Extension(n) == file_ext) {
      files.push_back(n);
    } else {
      *error = "no index " + n + " to rebuild: it is no tag of the table's " + std::string(tag_ext) +
               " file and no ." + file_ext + " file";
      return false;
    }
  }
  std::vector<Planned> new_tags;
  for (const IndexOption& a : added) {
    Planned p;
    std::string name = a.name;
    if (Extension(name) == file_ext) {
      if (access(name.c_str(), F_OK) == 0) {
        *error = name + " exists already; reindex --index " + name + " rebuilds it";
        return false;
      }
      p.final_path = name;
    } else if (Extension(name).empty()) {
      name = Upper(name);
      if (is_tag(name)) {
        *error = "the table has a tag " + name + " already";
        return false;
      }
      production = true;
    } else {
      *error = "an index of this dialect is a tag name or a ." + std::string(file_ext) + " file, not " + name;
      return false;
    }
    if (!spoke->ParseIndexExpression(a.expression.c_str(), &p.def)) {
      *error = "cannot make an index of " + a.expression + " (fields joined by +, SUBSTR, STR or DTOS of a field)";
      return false;
    }
    p.def.Name(name.c_str());
    p.def.Dups(!a.unique);
    p.def.Compress(true);
    (p.final_path.empty() ? new_tags : plan).push_back(p);
  }
  if (tags_only && tags.empty()) {
    spoke->ConnectionClose();
    return true;
  }
  if (production) {
    for (const ZQIndexDef* t : tags) {
      Planned p;
      p.def = *t;
      plan.push_back(p);
    }
    for (const Planned& p : new_tags) plan.push_back(p);
  }
  for (const std::string& f : files) {
    Planned p;
    std::unique_ptr<ZQIndexWalk> walk(spoke->OpenIndexWalk(f.c_str(), &p.def));
    if (!walk) {
      // A file too damaged to open keeps its expression only in its header;
      // without it there is nothing to rebuild from.
      *error = "cannot open " + f + " to read its key expression; make it anew with --index " + f + "=EXPR";
      return false;
    }
    if (p.def.SegCount() == 0) {
      *error = f + ": its key expression " + walk->Expression() + " is beyond what zqdb can build";
      return false;
    }
    p.final_path = f;
    plan.push_back(p);
  }
  if (plan.empty()) {
    *error = "the table has no index to rebuild";
    return false;
  }

  std::string dir, base, stem;
  SplitPath(table, &dir, &base, &stem);
  RemoveLeftovers(dir, stem);
  const std::string staging = dir + "/" + kStagingPrefix + stem + "-" + std::to_string(getpid());
  if (mkdir(staging.c_str(), 0700) != 0) {
    *error = "cannot make " + staging + ": " + strerror(errno);
    return false;
  }
  std::vector<ZQIndexDef*> defs;
  std::vector<std::string> staged_files;
  for (Planned& p : plan) {
    if (!p.final_path.empty()) {
      std::string d, b, s;
      SplitPath(p.final_path, &d, &b, &s);
      std::string staged = staging + "/" + b;
      p.def.Name(staged.c_str());
      staged_files.push_back(staged);
    }
    defs.push_back(&p.def);
  }
  defs.push_back(nullptr);
  const std::string staged_base = staging + "/" + stem;
  if (spoke->BuildIndexes(staged_base.c_str(), defs.data()) != 0) {
    *error = std::string("rebuilding the indexes failed: ") + spoke->LastErrorMessage();
    spoke->ConnectionClose();
    RemoveStaging(staging);
    return false;
  }
  spoke->ConnectionClose();
  spoke.reset();

  // Whole and on disk before any takes the place of an old one.
  std::vector<std::pair<std::string, std::string>> moves;
  if (production) moves.emplace_back(staged_base + "." + tag_ext, ProductionFile(dir, stem, tag_ext));
  size_t k = 0;
  for (const Planned& p : plan)
    if (!p.final_path.empty()) moves.emplace_back(staged_files[k++], p.final_path);
  for (const auto& m : moves) {
    if (!SyncPath(m.first, O_RDONLY)) {
      *error = "cannot write " + m.first + ": " + strerror(errno);
      RemoveStaging(staging);
      return false;
    }
  }
  bool had_production = access(ProductionFile(dir, stem, tag_ext).c_str(), F_OK) == 0;
  for (const auto& m : moves) {
    if (rename(m.first.c_str(), m.second.c_str()) != 0) {
      *error = "cannot put the new " + m.second + " in place: " + strerror(errno) +
               " (the old file is unchanged; the new one is in " + staging + ")";
      return false;
    }
  }
  SyncPath(dir, O_RDONLY | O_DIRECTORY);
  RemoveStaging(staging);
  if (production && !had_production && !MarkProduction(table)) {
    *error = "the new " + ProductionFile(dir, stem, tag_ext) + " is in place, but the table's header could not be marked to name it";
    return false;
  }
  *summary = std::to_string(plan.size()) + (plan.size() == 1 ? " index" : " indexes") + " of " + table + " rebuilt:";
  for (const Planned& p : plan) *summary += " " + (p.final_path.empty() ? std::string(p.def.Name()) : p.final_path);
  return true;
}

}  // namespace

int RunReindex(const std::string& table, const SourceOptions& source, const ReindexOptions& opts) {
  std::string summary, error;
  if (!Rebuild(table, source, opts.names, opts.added, false, &summary, &error)) return Fail(error);
  fprintf(stderr, "zqdb: %s\n", summary.c_str());
  return 0;
}

bool RebuildTags(const std::string& table, const SourceOptions& source, std::string* summary, std::string* error) {
  summary->clear();
  return Rebuild(table, source, {}, {}, true, summary, error);
}
