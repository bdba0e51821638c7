#include "engine/target_path.h"

#include <sys/stat.h>

#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>

#include "engine/text_util.h"

bool ResolveTargetPath(const std::string& path, bool table, std::string* out, std::string* error) {
  *out = path;
  if (path == "-") {
    if (table) return *error = "a table can't be written to standard output", false;
    return true;
  }
  struct stat st, link;
  if (stat(path.c_str(), &st) != 0) {
    // Nothing there, or a link to nothing: a new file, or a link whose
    // target would be made in a place the user may not know.
    if (lstat(path.c_str(), &link) == 0 && S_ISLNK(link.st_mode))
      return *error = path + " is a symbolic link to a file that doesn't exist", false;
    return true;
  }
  if (S_ISDIR(st.st_mode)) return *error = path + " is a directory", false;
  if (!S_ISREG(st.st_mode)) {
    if (table) return *error = path + " is a device, FIFO or socket: a table is written to a regular file (- writes CSV to standard output)", false;
    return true;  // text is written into it as it comes
  }
  if (lstat(path.c_str(), &link) == 0 && S_ISLNK(link.st_mode)) {
    char real[PATH_MAX];
    if (realpath(path.c_str(), real) == nullptr) return *error = "cannot follow " + path + ": " + strerror(errno), false;
    *out = real;
  }
  return true;
}

bool IsForeignTargetName(const std::string& path) {
  std::string name = Lower(path);
  for (const char* ext : {".tsv", ".txt", ".tab", ".xls", ".xlsx", ".ods"}) {
    size_t n = strlen(ext);
    if (name.size() > n && name.compare(name.size() - n, n, ext) == 0) return true;
  }
  return false;
}
