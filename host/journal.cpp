#include "host/journal.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cerrno>
#include <cstring>
#include <new>
#include <vector>

#include "host/endian.h"

namespace journal {
namespace {

constexpr int64_t kPage = 4096;
constexpr char kMagic[8] = {'Z', 'Q', 'D', 'B', 'J', 'R', 'N', '1'};

struct File {
  dev_t dev;
  ino_t ino;
  int64_t length;              // at the first open; bytes past it need no copy
  std::vector<uint64_t> kept;  // one bit a page below `length`
};

int jfd = -1;
std::string jpath;
std::vector<File> files;
std::vector<int> byFd;  // descriptor -> file number + 1, 0 = not watched
int lastError = 0;
char lastFile[PATH_MAX] = "";

bool WriteAll(int fd, const void* data, size_t n) {
  const char* p = static_cast<const char*>(data);
  while (n > 0) {
    ssize_t w = ::write(fd, p, n);
    if (w < 0 && errno == EINTR) continue;
    if (w <= 0) {
      if (w == 0) errno = ENOSPC;
      lastError = errno;
      return false;
    }
    p += w;
    n -= size_t(w);
  }
  return true;
}

// One record: kind, file number, a 64-bit number, then `n` bytes.
bool Record(char kind, uint32_t file, int64_t number, const void* bytes, uint32_t n) {
  uint8_t head[17];
  head[0] = uint8_t(kind);
  PutLe32(head + 1, file);
  PutLe64(head + 5, uint64_t(number));
  PutLe32(head + 13, n);
  // One write for short records keeps a kill from splitting the head.
  std::vector<uint8_t> all(head, head + sizeof head);
  all.insert(all.end(), static_cast<const uint8_t*>(bytes), static_cast<const uint8_t*>(bytes) + n);
  return WriteAll(jfd, all.data(), all.size());
}

// `path` from the root, so that a restore run elsewhere finds the file.
std::string Absolute(const char* path) {
  if (path[0] == '/') return path;
  char cwd[PATH_MAX];
  if (getcwd(cwd, sizeof cwd) == nullptr) return path;
  return std::string(cwd) + "/" + path;
}

bool FileRecord(uint32_t n, int64_t length, const char* path) {
  std::string full = Absolute(path);
  if (full.size() > size_t(kPage)) return errno = ENAMETOOLONG, false;
  return Record('F', n, length, full.data(), uint32_t(full.size()));
}

int FileOf(const struct stat& st) {
  for (size_t i = 0; i < files.size(); ++i)
    if (files[i].dev == st.st_dev && files[i].ino == st.st_ino) return int(i);
  return -1;
}

// Keeps the old bytes of page `page` of file `n`, read through `fd`.
bool KeepPage(int n, int fd, int64_t page) {
  File& f = files[size_t(n)];
  uint64_t bit = uint64_t{1} << (page % 64);
  if (f.kept[size_t(page / 64)] & bit) return true;
  int64_t at = page * kPage;
  int64_t len = f.length - at < kPage ? f.length - at : kPage;
  uint8_t buf[kPage];
  int64_t got = 0;
  while (got < len) {
    ssize_t r = pread(fd, buf + got, size_t(len - got), off_t(at + got));
    if (r < 0 && errno == EINTR) continue;
    if (r <= 0) break;  // shorter than it was: nothing more to keep
    got += r;
  }
  if (!Record('P', uint32_t(n), at, buf, uint32_t(got))) return false;
  f.kept[size_t(page / 64)] |= bit;
  return true;
}

}  // namespace

bool Begin(const std::string& path) {
  jfd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
  if (jfd < 0) return false;
  jpath = path;
  files.clear();
  byFd.clear();
  if (WriteAll(jfd, kMagic, sizeof kMagic)) return true;
  int e = errno;
  close(jfd), unlink(path.c_str());
  jfd = -1;
  errno = e;
  return false;
}

bool Active() { return jfd >= 0; }

bool BeforeOpen(const char* path, bool truncating) {
  if (jfd < 0) return true;
  struct stat st;
  if (stat(path, &st) != 0) {
    // A file the run makes: removed by a restore. Its dev and ino are known
    // only once it is open; Opened adds it then.
    return FileRecord(uint32_t(files.size()), -1, path) &&
           (files.push_back({0, 0, 0, {}}), true);
  }
  if (!S_ISREG(st.st_mode) || FileOf(st) >= 0) return true;
  uint32_t n = uint32_t(files.size());
  if (!FileRecord(n, int64_t(st.st_size), path)) return false;
  files.push_back({st.st_dev, st.st_ino, int64_t(st.st_size), {}});
  files.back().kept.assign(size_t((st.st_size + kPage * 64 - 1) / (kPage * 64)), 0);
  if (!truncating) return true;
  // Cut at the open: everything it holds is kept now.
  int fd = open(path, O_RDONLY | O_CLOEXEC);
  if (fd < 0) return false;
  bool ok = true;
  for (int64_t page = 0; ok && page * kPage < st.st_size; ++page) ok = KeepPage(int(n), fd, page);
  close(fd);
  return ok;
}

void Opened(int fd) {
  if (jfd < 0 || fd < 0) return;
  struct stat st;
  if (fstat(fd, &st) != 0) return;
  int n = FileOf(st);
  if (n < 0) {
    // Made by this run: the entry BeforeOpen left without an inode.
    for (size_t i = files.size(); i-- > 0;)
      if (files[i].dev == 0 && files[i].ino == 0 && files[i].length == 0) {
        files[i].dev = st.st_dev, files[i].ino = st.st_ino;
        n = int(i);
        break;
      }
    if (n < 0) return;
  }
  if (size_t(fd) >= byFd.size()) byFd.resize(size_t(fd) + 1, 0);
  byFd[size_t(fd)] = n + 1;
}

void Closed(int fd) {
  if (fd >= 0 && size_t(fd) < byFd.size()) byFd[size_t(fd)] = 0;
}

bool BeforeWrite(int fd, int64_t offset, int64_t count) {
  if (jfd < 0 || fd < 0 || size_t(fd) >= byFd.size() || byFd[size_t(fd)] == 0) return true;
  int n = byFd[size_t(fd)] - 1;
  const File& f = files[size_t(n)];
  int64_t end = offset + count < f.length ? offset + count : f.length;
  for (int64_t page = offset / kPage; page * kPage < end; ++page)
    if (!KeepPage(n, fd, page)) return false;
  return true;
}

void Commit() {
  if (jfd < 0) return;
  close(jfd);
  unlink(jpath.c_str());
  jfd = -1;
  files.clear();
  byFd.clear();
}

bool RestoreActive(std::string* error) {
  if (jfd < 0) return true;
  close(jfd);
  jfd = -1;
  files.clear();
  byFd.clear();
  return Restore(jpath, error);
}

bool Restore(const std::string& path, std::string* error) {
  FILE* in = fopen(path.c_str(), "rb");
  if (in == nullptr) return *error = "cannot read " + path + ": " + strerror(errno), false;
  char magic[sizeof kMagic];
  if (fread(magic, 1, sizeof magic, in) != sizeof magic || memcmp(magic, kMagic, sizeof kMagic) != 0) {
    fclose(in);
    unlink(path.c_str());  // never got past its first bytes: nothing was written
    return true;
  }
  struct Target {
    std::string path;
    int64_t length;
    int fd;
  };
  std::vector<Target> targets;
  std::vector<uint8_t> bytes(kPage);
  bool ok = true;
  uint8_t r[17];
  // Every record whole; a last one cut short guarded a write that never
  // began. Records are at most a page (a path at most PATH_MAX).
  while (fread(r, 1, sizeof r, in) == sizeof r) {
    uint32_t file = GetLe32(r + 1), n = GetLe32(r + 13);
    int64_t number = int64_t(GetLe64(r + 5));
    if (n > kPage || fread(bytes.data(), 1, n, in) != n) break;
    if (r[0] == 'F' && file == targets.size()) {
      targets.push_back({std::string(reinterpret_cast<const char*>(bytes.data()), n), number, -1});
      Target& t = targets.back();
      if (number >= 0 && (t.fd = open(t.path.c_str(), O_WRONLY | O_CLOEXEC)) < 0)
        ok = false, *error = "cannot restore " + t.path + ": " + strerror(errno);
    } else if (r[0] == 'P' && file < targets.size() && targets[file].fd >= 0) {
      int64_t done = 0;
      while (done < n) {
        ssize_t w = pwrite(targets[file].fd, bytes.data() + done, size_t(n - done), off_t(number + done));
        if (w < 0 && errno == EINTR) continue;
        if (w <= 0) {
          ok = false, *error = "cannot restore " + targets[file].path + ": " + strerror(errno);
          break;
        }
        done += w;
      }
    }
  }
  fclose(in);
  for (Target& t : targets) {
    if (t.length < 0) {
      unlink(t.path.c_str());
    } else if (t.fd >= 0) {
      if (ftruncate(t.fd, off_t(t.length)) != 0) ok = false, *error = "cannot restore " + t.path + ": " + strerror(errno);
      close(t.fd);
    }
  }
  if (ok) unlink(path.c_str());
  return ok;
}

int LastWriteError() { return lastError; }
const char* LastWriteFile() { return lastFile; }

void NoteWriteError(int error, int fd) {
  lastError = error;
  lastFile[0] = '\0';
  if (fd < 0) return;
  // The name the descriptor was opened by, for the message of a failed run
  // (read only on this path: writes that fail are rare).
  char link[32];
  snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
  ssize_t n = readlink(link, lastFile, sizeof lastFile - 1);
  lastFile[n > 0 ? n : 0] = '\0';
}

}  // namespace journal
