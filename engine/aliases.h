// A conversion whose target would write over its own source: the target
// table or one of its companion files (memo, index, .cpg) being the source
// or one of the source's. `convert t.dbf t.DBT` would otherwise make a
// table whose memo file is t.dbt, the source's memo file.
#pragma once

#include <string>
#include <vector>

// Files that belong to a table `path`: the table itself, then its memo,
// index and code page files of the same base name, in either case of their
// extension; only those that exist, each with its role ("table", "memo file",
// "index file", "code page file").
struct TableFile {
  std::string path;
  const char* role;
};
std::vector<TableFile> TableFiles(const std::string& path, bool with_companions);

// False with `error` set when a file the target writes (the target, with its
// companions when `target_is_table`, and the index files `index_files`) is,
// by device and inode, one of the source's files (its companions when
// `source_is_table`).
bool CheckNoAlias(const std::string& src, bool source_is_table, const std::string& dst, bool target_is_table,
                  const std::vector<std::string>& index_files, std::string* error);
