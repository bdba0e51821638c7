// Making a table as a conversion's target: the check after close, and the
// scratch directory a replaced table is built in.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "engine/endpoints.h"

// Reopens a table just written and checks that it holds `expected` records
// and that the last of them reads: a write that failed only when the last
// buffered bytes reached the disk (a full disk, a file size limit) shows
// here, since closing a table reports nothing.
bool VerifyTable(const std::string& path, const TableConnector& c, const std::string& dialect,
                 const TableWriteOptions& opts, int64_t expected, std::string* message);

// A replaced table is built in a scratch directory beside the target and
// moved into place when it is whole, so that a failed run leaves the old
// table and its memo file as they were.
class Staging {
 public:
  ~Staging() { Discard(); }
  // Makes the scratch directory; `work` is the path to build the table at.
  bool Begin(const std::string& dst, std::string* work, std::string* error);
  // Moves every file made into the target's directory.
  bool Commit(std::string* error);
  void Discard();

 private:
  std::vector<std::string> Entries() const;
  std::string dir_, staging_;
};
