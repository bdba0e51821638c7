// Reading memos: opening and checking a memo file, and the memo read shared by
// getmemo and putmemo. Layouts: memo_format.h.
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "host/endian.h"
#include "host/zqglob.h"
#include "table/memo.h"
#include "table/memo_format.h"

namespace {

// Memo texts are read in pieces of this size, so a short memo costs little
// and a long one never needs more room than the file holds.
constexpr int32_t kReadPiece = 512;

// Byte offset of `block`, or -1 when it lies outside the 32-bit offsets that
// memo files use (a damaged block number never wraps onto another memo).
int64_t BlockOffset(const ZQDBFILE* file, uint32_t block) {
  int64_t off = int64_t{block} * file->memoblksize;
  return off > INT32_MAX ? -1 : off;
}

// Appends up to `count` bytes from the present position; the count that came.
int64_t AppendBytes(ZQFileProxy& f, ZQString& text, int64_t count) {
  int32_t start = text.length();
  if (count <= 0 || count > INT32_MAX - 1 - start) return 0;
  if (!text.Allocate(int32_t(start + count))) return 0;
  int32_t got = f.read(text.GetBuffer() + start, int32_t(count));
  text.SetLength(start + got);
  return got;
}

// dBASE III: the text up to 0x1A, the end of the file or 32,000 bytes. A
// block with no byte at all lies at or past the end: a damaged pointer.
MemoRead ReadDb3(ZQFileProxy& f, ZQString& text) {
  while (text.length() < kDb3MaxText) {
    int32_t want = kDb3MaxText - text.length() < kReadPiece ? kDb3MaxText - text.length() : kReadPiece;
    int32_t start = text.length();
    if (AppendBytes(f, text, want) == 0) return start == 0 ? MemoRead::kDamaged : MemoRead::kOk;
    const char* piece = text.c_str() + start;
    const void* end = memchr(piece, kDb3Terminator, size_t(text.length() - start));
    if (end != nullptr) {
      text.SetLength(int32_t(static_cast<const char*>(end) - text.c_str()));
      break;
    }
    if (text.length() - start < want) break;  // the end of the file
  }
  return MemoRead::kOk;
}

// A text of `count` bytes at `off` in the file. Counts up to the file
// object's buffer size are read as they stand, the short read finding the end
// of the file; a larger count is first held against the file's size, so that
// a damaged length never sets the size of an allocation. A count the file
// can't hold reads what there is and is damage.
MemoRead ReadCounted(ZQFileProxy& f, int64_t count, int64_t off, ZQString& text) {
  if (count < 0) return MemoRead::kDamaged;
  int64_t want = count;
  if (count > ZQFileProxy::kBufferSize) {
    int64_t avail = f.size() - off;
    if (avail < want) want = avail < 0 ? 0 : avail;
  }
  if (AppendBytes(f, text, want) != count) return MemoRead::kDamaged;
  return MemoRead::kOk;
}

// Opens the memo file with extension `ext`, then with it upper-cased.
bool OpenMemoFile(const char* tablepath, ZQDBFILE* db, const char* ext, bool writable) {
  char path[4096];
  char upper[8];
  size_t n = strlen(ext);
  if (n >= sizeof upper) return false;
  for (size_t i = 0; i <= n; ++i) upper[i] = char(ext[i] >= 'a' && ext[i] <= 'z' ? ext[i] - 'a' + 'A' : ext[i]);
  const char* mode = writable ? "r+b" : "rb";
  if (memopath(tablepath, ext, path, sizeof path) && db->memofile.openfile(path, mode, 0) == 0) return true;
  return memopath(tablepath, upper, path, sizeof path) && db->memofile.openfile(path, mode, 0) == 0;
}

}  // namespace

uint32_t getmword(ZQFileProxy& f) {
  uint32_t lo = uint32_t(f.getch()) & 0xFF;
  uint32_t hi = uint32_t(f.getch()) & 0xFF;
  return lo | hi << 8;
}

uint32_t getmlong(ZQFileProxy& f) {
  uint32_t v = 0;
  for (int i = 0; i < 4; ++i) v |= (uint32_t(f.getch()) & 0xFF) << (8 * i);
  return v;
}

void putmlong(ZQFileProxy& f, uint32_t value) {
  for (int i = 0; i < 4; ++i) f.putch(int(value >> (8 * i) & 0xFF));
}

bool memopath(const char* tablepath, const char* ext, char* out, size_t size) {
  char base[4096];
  size_t n = tablepath != nullptr ? strlen(tablepath) : 0;
  if (n == 0 || n >= sizeof base || n + strlen(ext) + 3 > size) return false;
  strcpy(out, tablepath);
  ZQGlob::sepfile(out, base, nullptr);
  ZQGlob::appndnam(out, base);
  ZQGlob::appndext(out, ext);
  return true;
}

uint32_t memoendblock(ZQDBFILE* file) {
  int64_t size = file->memofile.size();
  if (size <= 0 || file->memoblksize == 0) return 0;
  int64_t end = (size + file->memoblksize - 1) / file->memoblksize;
  return end > UINT32_MAX ? UINT32_MAX : uint32_t(end);
}

int openmemo(const char* name, ZQDBFILE* db, bool writable) {
  const char* ext = db->memokind == MEMO_FPT ? "fpt" : db->memokind == MEMO_SMT ? "smt" : "dbt";
  if (!OpenMemoFile(name, db, ext, writable)) return -1;
  db->memoblksize = kDb3BlockSize;
  db->memooff = 0;
  db->memostat = 1;
  ZQFileProxy& f = db->memofile;
  f.clearErrors();
  bool ok = true;
  switch (db->memokind) {
    case MEMO_DB4: {
      f.seek(kDb4Version, 0);
      uint32_t version = getmword(f);
      if (version == kDb4VersionFree) db->memokind = MEMO_DB4FREE;
      else if (version != kDb4VersionPlain) ok = false;
      db->memoblksize = uint16_t(getmword(f));
      if (f.getch() > 0) db->memooff = 1;
      break;
    }
    case MEMO_SMT:
      ok = f.seek(kSmtBlockSize, 0) >= 0;
      db->memoblksize = uint16_t(getmlong(f));
      break;
    case MEMO_FPT: {
      uint8_t b[2] = {0, 0};
      ok = f.seek(kFptBlockSize, 0) >= 0 && f.read(reinterpret_cast<char*>(b), 2) == 2;
      db->memoblksize = GetBe16(b);
      break;
    }
    default:
      return 0;  // dBASE III: nothing in the header to check; 512 a block
  }
  // A header cut short, a refused version word, or a block size of 0 (every
  // block would lie on the header, and the writer divides by it) refuse the
  // file.
  if (!ok || f.hasError() || db->memoblksize == 0) {
    f.close(false);
    db->memoblksize = 0;
    return -1;
  }
  return 0;
}

MemoRead readmemo(ZQDBFILE* file, uint32_t block, uint32_t length, ZQString& text) {
  text = "";
  ZQFileProxy& f = file->memofile;
  if (!f.isOpen() || !file->hasmemo || file->memoblksize == 0) return MemoRead::kNoFile;
  f.clearErrors();
  int64_t off = BlockOffset(file, block);
  if (off < 0 || f.seek(off, 0) < 0) return MemoRead::kSeekFailed;
  switch (file->memokind) {
    case MEMO_DB3: return ReadDb3(f, text);
    case MEMO_SMT: return ReadCounted(f, length, off, text);
    case MEMO_DB4:
    case MEMO_DB4FREE:
    case MEMO_FPT: {
      uint8_t head[kMemoBlockHead];
      if (f.read(reinterpret_cast<char*>(head), kMemoBlockHead) != kMemoBlockHead) return MemoRead::kDamaged;
      int64_t count;
      if (file->memokind == MEMO_FPT) {
        if (GetBe32(head + kFptType) != kFptTypeText) {
          file->memostat = 0;
          return MemoRead::kNotText;
        }
        count = GetBe32(head + kFptLength);
      } else {
        // The text starts at offset 8 whatever the offset word says; only its
        // count is the total length less that word.
        count = int64_t{GetLe32(head + kDb4TotalLength)} - GetLe16(head + kDb4TextOffset);
      }
      return ReadCounted(f, count, off + kMemoBlockHead, text);
    }
    default: return MemoRead::kNoFile;
  }
}

bool getmemo(ZQDBFILE* file, uint32_t block, uint32_t length, ZQString& text) {
  text = "";
  if (block == 0) return true;
  if (file->memokind == MEMO_SMT && length == 0) return true;
  if (!file->memofile.isOpen() || !file->hasmemo) {
    char buf[16];
    snprintf(buf, sizeof buf, "%10lu", static_cast<unsigned long>(block));
    text = buf;
    return false;
  }
  return readmemo(file, block, length, text) == MemoRead::kOk;
}

ZQMemoBlockNumber::~ZQMemoBlockNumber() = default;

uint32_t ZQMemoBlockNumber::StringtoNumber(const ZQString& text) {
  if (text == blank_memo_str) return 0;
  return uint32_t(strtoul(text.c_str(), nullptr, 10));
}

char* ZQMemoBlockNumber::NumbertoBuf(char* buffer, uint32_t block) {
  snprintf(buffer, 11, "%010lu", static_cast<unsigned long>(block));
  return buffer;
}
