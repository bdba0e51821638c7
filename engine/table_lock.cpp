#include "engine/table_lock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

TableLocks::~TableLocks() {
  for (const Lock& l : locks_)
    if (l.fd >= 0) close(l.fd);  // closing releases the lock
}

void TableLocks::Add(const std::string& path, bool exclusive) {
  struct stat st;
  // Only regular files: a FIFO or device would block the open, and has no
  // table to protect.
  if (stat(path.c_str(), &st) != 0 || !S_ISREG(st.st_mode)) return;
  for (Lock& l : locks_)
    if (l.dev == st.st_dev && l.ino == st.st_ino) {
      l.exclusive = l.exclusive || exclusive;
      return;
    }
  locks_.push_back({path, exclusive, -1, static_cast<unsigned long long>(st.st_dev),
                    static_cast<unsigned long long>(st.st_ino)});
}

bool TableLocks::Take(bool wait, std::string* error) {
  std::sort(locks_.begin(), locks_.end(),
            [](const Lock& a, const Lock& b) { return a.dev != b.dev ? a.dev < b.dev : a.ino < b.ino; });
  for (Lock& l : locks_) {
    if (l.fd < 0) l.fd = open(l.path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (l.fd < 0) continue;  // unreadable: the command itself will say so
    int op = (l.exclusive ? LOCK_EX : LOCK_SH) | (wait ? 0 : LOCK_NB);
    int rc;
    do rc = flock(l.fd, op);
    while (rc != 0 && errno == EINTR);
    // A file system without flock (some network mounts): no lock to take.
    if (rc == 0 || errno == ENOLCK || errno == EOPNOTSUPP) continue;
    if (errno == EWOULDBLOCK) {
      *error = l.path + (l.exclusive ? " is in use by another program" : " is being written by another program") +
               " (--wait waits for it)";
    } else {
      *error = "cannot lock " + l.path + ": " + strerror(errno);
    }
    return false;
  }
  return true;
}
