// Advisory locks on tables for the whole of a command. The module takes no
// locks, so two runs writing one table at once would interleave their
// records and memos; zqdb locks each table it opens with flock: a writer
// (append, update, replace) exclusively, a reader shared, so that readers
// never block each other and no one reads a table half-written. A lock on
// the table stands for its memo and index files too.
#pragma once

#include <string>
#include <vector>

class TableLocks {
 public:
  TableLocks() = default;
  ~TableLocks();
  TableLocks(const TableLocks&) = delete;
  TableLocks& operator=(const TableLocks&) = delete;

  // Adds a table to lock; a file that doesn't exist is not locked.
  void Add(const std::string& path, bool exclusive);
  // Takes every lock, in the order of the files' device and inode numbers so
  // that two runs waiting for each other's tables can't deadlock. With
  // `wait`, waits for locks held by others; without, a lock taken elsewhere
  // fails the call with a message naming the table. False with `error` set.
  bool Take(bool wait, std::string* error);

 private:
  struct Lock {
    std::string path;
    bool exclusive;
    int fd;
    unsigned long long dev, ino;
  };
  std::vector<Lock> locks_;
};
