// Removing a table and its memo file from the disk.
#include "host/platform.h"
#include "table/dbf.h"
#include "table/memo.h"

int dbdelete(const char* name, bool hasmemo, char memokind) {
  if (name == nullptr || _unlink(name) != 0) return -1;
  if (!hasmemo) return 0;
  const char* ext = memokind == char(MEMO_FPT) ? "fpt" : memokind == char(MEMO_SMT) ? "smt" : "dbt";
  char path[4096];
  if (!memopath(name, ext, path, sizeof path)) return -1;
  return _unlink(path) == 0 ? 0 : -1;
}
