#include "host/filecache.h"

#include "host/journal.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <new>
#include <vector>

namespace filecache {
namespace {

struct File;

struct Page {
  File* file = nullptr;
  int64_t index = 0;
  bool dirty = false;
  Page* newer = nullptr;  // toward the most recently used end
  Page* older = nullptr;
  uint8_t data[kPage];
};

struct File {
  dev_t dev;
  ino_t ino;
  std::vector<int> fds;  // open descriptors; the first writes pages back
  int64_t size = 0;
  // The cached pages by page number; null where a page isn't cached. Eight
  // bytes for every 4 KiB of the file: an index file of 2 GiB costs 4 MiB.
  std::vector<Page*> pages;
  int64_t cached = 0;
};

std::vector<File*> files;
std::vector<File*> byFd;  // by descriptor
Page* newest = nullptr;
Page* oldest = nullptr;
int64_t pageCount = 0;

void Unlink(Page* p) {
  if (p->newer != nullptr) p->newer->older = p->older;
  else newest = p->older;
  if (p->older != nullptr) p->older->newer = p->newer;
  else oldest = p->newer;
  p->newer = p->older = nullptr;
}

void PushNewest(Page* p) {
  p->older = newest;
  p->newer = nullptr;
  if (newest != nullptr) newest->newer = p;
  newest = p;
  if (oldest == nullptr) oldest = p;
}

// Writes a changed page, no further than the file's end.
bool WriteBack(Page* p) {
  if (!p->dirty) return true;
  File* f = p->file;
  int64_t at = p->index * kPage;
  int64_t n = f->size - at;
  if (n > kPage) n = kPage;
  p->dirty = false;
  if (n <= 0) return true;
  if (!journal::BeforeWrite(f->fds.front(), at, n)) return false;
  int64_t done = 0;
  while (done < n) {
    ssize_t w = ::pwrite(f->fds.front(), p->data + done, size_t(n - done), off_t(at + done));
    if (w < 0 && errno == EINTR) continue;
    if (w <= 0) {
      journal::NoteWriteError(w == 0 ? ENOSPC : errno, f->fds.front());
      return false;
    }
    done += w;
  }
  return true;
}

void Drop(Page* p) {
  Unlink(p);
  p->file->pages[size_t(p->index)] = nullptr;
  --p->file->cached;
  --pageCount;
  delete p;
}

int64_t pageBudget = kMaxPages;

bool Evict() {
  Page* p = oldest;
  if (p == nullptr) return true;
  bool written = WriteBack(p);
  Drop(p);
  return written;
}

// The page `index` of `f`, read from the file unless `fill` is false (the
// caller overwrites all of it). NULL with errno on failure.
Page* GetPage(File* f, int64_t index, bool fill) {
  if (index < int64_t(f->pages.size()) && f->pages[size_t(index)] != nullptr) {
    Page* p = f->pages[size_t(index)];
    if (p != newest) {
      Unlink(p);
      PushNewest(p);
    }
    return p;
  }
  if (index >= int64_t(f->pages.size())) f->pages.resize(size_t(index) + 1 + f->pages.size() / 2, nullptr);
  if (pageCount >= pageBudget && !Evict()) {
    errno = EIO;
    return nullptr;
  }
  Page* p = new (std::nothrow) Page;
  if (p == nullptr) {
    errno = ENOMEM;
    return nullptr;
  }
  p->file = f;
  p->index = index;
  int64_t got = 0;
  if (fill) {
    while (got < kPage) {
      ssize_t r = ::pread(f->fds.front(), p->data + got, size_t(kPage - got), off_t(index * kPage + got));
      if (r < 0 && errno == EINTR) continue;
      if (r < 0) {
        delete p;
        return nullptr;
      }
      if (r == 0) break;
      got += r;
    }
  }
  memset(p->data + got, 0, size_t(kPage - got));
  f->pages[size_t(index)] = p;
  ++f->cached;
  ++pageCount;
  PushNewest(p);
  return p;
}

File* Of(int fd) { return fd >= 0 && size_t(fd) < byFd.size() ? byFd[size_t(fd)] : nullptr; }

// Every cached page of `f`.
std::vector<Page*> PagesOf(File* f) {
  std::vector<Page*> all;
  for (Page* p : f->pages)
    if (p != nullptr) all.push_back(p);
  return all;
}

}  // namespace

void Attach(int fd, bool truncated) {
  struct stat st;
  if (fstat(fd, &st) != 0) return;
  File* f = nullptr;
  for (File* g : files)
    if (g->dev == st.st_dev && g->ino == st.st_ino) f = g;
  if (f == nullptr) {
    f = new (std::nothrow) File{st.st_dev, st.st_ino, {}, int64_t(st.st_size), {}};
    if (f == nullptr) return;
    files.push_back(f);
  } else if (truncated) {
    // The open cut the file: what the cache held of it is gone too.
    for (Page* p : PagesOf(f)) Drop(p);
    f->size = 0;
  }
  f->fds.push_back(fd);
  if (size_t(fd) >= byFd.size()) byFd.resize(size_t(fd) + 1, nullptr);
  byFd[size_t(fd)] = f;
}

bool Attached(int fd) { return Of(fd) != nullptr; }

bool Detach(int fd) {
  File* f = Of(fd);
  if (f == nullptr) return true;
  bool ok = true;
  if (f->fds.size() == 1) {
    for (Page* p : PagesOf(f)) {
      if (!WriteBack(p)) ok = false;
      Drop(p);
    }
    for (size_t i = 0; i < files.size(); ++i)
      if (files[i] == f) files.erase(files.begin() + long(i));
    delete f;
  } else {
    // Pages are written back through the first descriptor: keep one open.
    for (size_t i = 0; i < f->fds.size(); ++i)
      if (f->fds[i] == fd) f->fds.erase(f->fds.begin() + long(i));
  }
  byFd[size_t(fd)] = nullptr;
  return ok;
}

int64_t Read(int fd, void* buffer, int64_t count, int64_t offset) {
  File* f = Of(fd);
  if (f == nullptr || offset < 0) {
    errno = EBADF;
    return -1;
  }
  if (offset >= f->size || count <= 0) return 0;
  if (count > f->size - offset) count = f->size - offset;
  uint8_t* out = static_cast<uint8_t*>(buffer);
  int64_t done = 0;
  while (done < count) {
    int64_t at = offset + done;
    Page* p = GetPage(f, at / kPage, true);
    if (p == nullptr) return done > 0 ? done : -1;
    int64_t in = at % kPage;
    int64_t n = kPage - in < count - done ? kPage - in : count - done;
    memcpy(out + done, p->data + in, size_t(n));
    done += n;
  }
  return done;
}

int64_t Write(int fd, const void* buffer, int64_t count, int64_t offset) {
  File* f = Of(fd);
  if (f == nullptr || offset < 0) {
    errno = EBADF;
    return -1;
  }
  const uint8_t* in = static_cast<const uint8_t*>(buffer);
  int64_t done = 0;
  while (done < count) {
    int64_t at = offset + done;
    int64_t within = at % kPage;
    int64_t n = kPage - within < count - done ? kPage - within : count - done;
    // A page that the write covers whole, or that lies past the end, needs
    // nothing from the file.
    bool fill = n < kPage && at - within < f->size;
    Page* p = GetPage(f, at / kPage, fill);
    if (p == nullptr) return done > 0 ? done : -1;
    memcpy(p->data + within, in + done, size_t(n));
    p->dirty = true;
    done += n;
    if (at + n > f->size) f->size = at + n;
  }
  return done;
}

void SetPageBudget(int64_t pages) {
  pageBudget = pages > 0 ? pages : kMaxPages;
  while (pageCount > pageBudget && Evict()) {
  }
}

int64_t Size(int fd) {
  File* f = Of(fd);
  return f == nullptr ? -1 : f->size;
}

}  // namespace filecache
