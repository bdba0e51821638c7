// zqdb check: the table's bytes (header against size, delete flags, values),
// its memo file (pointers, lengths, shared blocks, free space) and each of its
// indexes (the tree's structure, order, one key per live record equal to the
// key its fields give now). Nothing is written; every loop is bounded by the
// size of the file it walks, and the memory by the number of records.
#include "engine/check.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <memory>
#include <unordered_set>

#include "engine/indexes.h"
#include "engine/outbuf.h"
#include "engine/raw_table.h"
#include "engine/report.h"
#include "engine/writers.h"
#include "host/endian.h"
#include "table/dbf.h"
#include "table/memo_format.h"

namespace {

// At most this many findings of one part are listed; the rest are counted.
constexpr size_t kShownPerPart = 200;

struct Finding {
  std::string part;     // "table", "memo", or "index NAME"
  int64_t record = -1;  // from 1
  int64_t block = -1;
  int64_t offset = -1;
  std::string problem;
};

class Findings {
 public:
  void Add(const std::string& part, int64_t record, int64_t block, int64_t offset, const std::string& problem) {
    size_t& n = per_part_[part];
    ++n;
    ++total_;
    if (n <= kShownPerPart) list_.push_back({part, record, block, offset, problem});
  }
  void Record(const std::string& part, int64_t record, const std::string& problem) {
    Add(part, record, -1, -1, problem);
  }
  size_t total() const { return total_; }
  const std::vector<Finding>& list() const { return list_; }
  // Parts with more findings than were listed, and how many were not.
  std::vector<std::pair<std::string, size_t>> Unlisted() const {
    std::vector<std::pair<std::string, size_t>> out;
    for (const auto& p : per_part_)
      if (p.second > kShownPerPart) out.emplace_back(p.first, p.second - kShownPerPart);
    return out;
  }

 private:
  std::vector<Finding> list_;
  std::map<std::string, size_t> per_part_;
  size_t total_ = 0;
};

std::string Hex(unsigned v) {
  char b[16];
  snprintf(b, sizeof b, "0x%02X", v);
  return b;
}

// A key for people: printable bytes as they are, others as \xHH, trailing
// blanks cut.
std::string Shown(const char* p, size_t n) {
  while (n > 0 && p[n - 1] == ' ') --n;
  std::string out;
  for (size_t i = 0; i < n && out.size() < 120; ++i) {
    auto c = static_cast<unsigned char>(p[i]);
    if (c >= 0x20 && c < 0x7F && c != '\\') {
      out += char(c);
    } else {
      char b[8];
      snprintf(b, sizeof b, "\\x%02X", c);
      out += b;
    }
  }
  return "'" + out + "'";
}

// Reads `n` bytes at `at`; false when the file holds fewer.
bool ReadAt(int fd, int64_t at, void* buf, size_t n) {
  auto* p = static_cast<char*>(buf);
  while (n > 0) {
    ssize_t got = pread(fd, p, n, at);
    if (got <= 0) return false;
    p += got;
    at += got;
    n -= size_t(got);
  }
  return true;
}

int64_t FileSize(int fd) {
  struct stat st;
  return fstat(fd, &st) == 0 ? int64_t(st.st_size) : -1;
}

using FieldDesc = RawField;

// ---------------------------------------------------------------------------
// Values, as the module reads them: blanks are no value in every type, a
// number may be a field of asterisks (dBASE's mark of one that didn't fit).

bool LeapYear(int y) { return (y % 4 == 0 && y % 100 != 0) || y % 400 == 0; }

const char* DateProblem(const char* p, int32_t n) {
  if (n != 8) return nullptr;
  bool blank = true, zero = true;
  for (int i = 0; i < 8; ++i) {
    blank = blank && p[i] == ' ';
    zero = zero && p[i] == '0';
  }
  // Some writers leave an empty date as eight zeros.
  if (blank || zero) return nullptr;
  for (int i = 0; i < 8; ++i)
    if (p[i] < '0' || p[i] > '9') return "is no date of 8 digits";
  int y = (p[0] - '0') * 1000 + (p[1] - '0') * 100 + (p[2] - '0') * 10 + (p[3] - '0');
  int m = (p[4] - '0') * 10 + (p[5] - '0');
  int d = (p[6] - '0') * 10 + (p[7] - '0');
  static const int kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  if (m < 1 || m > 12) return "has no month 1-12";
  int days = kDays[m - 1] + (m == 2 && LeapYear(y) ? 1 : 0);
  if (d < 1 || d > days) return "has no such day in its month";
  return nullptr;
}

bool NumberText(const char* p, int32_t n) {
  int32_t i = 0;
  while (i < n && p[i] == ' ') ++i;
  while (n > i && p[n - 1] == ' ') --n;
  if (i == n) return true;
  bool stars = true;
  for (int32_t k = i; k < n; ++k) stars = stars && p[k] == '*';
  if (stars) return true;
  if (p[i] == '-' || p[i] == '+') ++i;
  int digits = 0;
  bool dot = false;
  for (; i < n; ++i) {
    if (p[i] >= '0' && p[i] <= '9') {
      ++digits;
    } else if (p[i] == '.' && !dot) {
      dot = true;
    } else {
      break;
    }
  }
  if (digits == 0) return false;
  if (i < n && (p[i] == 'e' || p[i] == 'E')) {
    ++i;
    if (i < n && (p[i] == '-' || p[i] == '+')) ++i;
    int exp = 0;
    while (i < n && p[i] >= '0' && p[i] <= '9') ++i, ++exp;
    if (exp == 0) return false;
  }
  return i == n;
}

bool LogicalByte(char c) { return strchr("TtFfYyNn? ", c) != nullptr && c != '\0'; }

// ---------------------------------------------------------------------------
// Memo file

// The memo kind from the name the source reports it by.
int MemoKindNamed(const std::string& name) {
  static const struct {
    const char* name;
    int kind;
  } kKinds[] = {{"dBASE III", MEMO_DB3}, {"dBASE IV", MEMO_DB4}, {"dBASE IV, with a free-block chain", MEMO_DB4FREE},
                {"FoxPro", MEMO_FPT},    {"Clipper SMT", MEMO_SMT}};
  for (const auto& k : kKinds)
    if (name == k.name) return k.kind;
  return MEMO_NONE;
}

struct MemoSpan {
  int64_t start, end;  // blocks [start, end)
  int64_t record;      // from 1
};

class MemoCheck {
 public:
  MemoCheck(Findings* findings, const std::string& path, int kind, int block_size, bool vfp)
      : findings_(findings), kind_(kind), block_(block_size > 0 ? block_size : 512), vfp_(vfp) {
    if (kind_ == MEMO_DB3) block_ = kDb3BlockSize;
    fd_ = open(path.c_str(), O_RDONLY);
    size_ = fd_ >= 0 ? FileSize(fd_) : -1;
  }
  ~MemoCheck() {
    if (fd_ >= 0) close(fd_);
  }
  MemoCheck(const MemoCheck&) = delete;
  MemoCheck& operator=(const MemoCheck&) = delete;
  bool ok() const { return fd_ >= 0 && size_ >= kMemoHeaderSize; }

  // The pointer bytes of one memo field of live record `record` (from 1).
  void Pointer(int64_t record, const FieldDesc& f, const char* p) {
    int64_t length, block = MemoBlockOf(p, f.width, vfp_, kind_ == MEMO_SMT, &length);
    if (block < 0)
      findings_->Record("memo", record, f.name + ": pointer " + Shown(p, size_t(f.width)) + " is no block number");
    if (block <= 0) return;
    Memo(record, f, block, length);
  }

  // After the records: blocks used twice, and the free space.
  void Finish() {
    std::sort(spans_.begin(), spans_.end(),
              [](const MemoSpan& a, const MemoSpan& b) { return a.start < b.start || (a.start == b.start && a.record < b.record); });
    int64_t reach = 0, owner = -1, high = 0, high_owner = -1;
    for (const MemoSpan& s : spans_) {
      if (s.start < reach)
        findings_->Add("memo", s.record, s.start, -1,
                       "shares block " + std::to_string(s.start) + " with the memo of record " + std::to_string(owner));
      if (s.end > reach) {
        reach = s.end;
        owner = s.record;
      }
      if (s.end > high) {
        high = s.end;
        high_owner = s.record;
      }
    }
    uint8_t h[8];
    if (!ReadAt(fd_, 0, h, sizeof h)) return;
    int64_t next = kind_ == MEMO_FPT ? GetBe32(h + kMemoNextFree) : GetLe32(h + kMemoNextFree);
    if (kind_ == MEMO_DB4FREE) next = FreeChainEnd(next);
    if (next >= 0 && next < high)
      findings_->Add("memo", high_owner, next, -1,
                     "the header's next free block " + std::to_string(next) + " lies below block " +
                         std::to_string(high) + ", the end of record " + std::to_string(high_owner) +
                         "'s memo: the next memo written would overwrite it");
  }

 private:
  void Memo(int64_t record, const FieldDesc& f, int64_t block, int64_t length) {
    const int64_t at = block * block_;
    const int64_t blocks_in_file = (size_ + block_ - 1) / block_;
    if (at >= size_) {
      findings_->Add("memo", record, block, -1,
                     f.name + ": block " + std::to_string(block) + " lies past the end of the memo file (" +
                         std::to_string(blocks_in_file) + " blocks)");
      return;
    }
    int64_t bytes = 0;  // of the memo from its first block, head included
    const char* past = nullptr;
    if (kind_ == MEMO_DB3) {
      bytes = Db3Length(at);
      if (bytes < 0) {
        past = "text runs to the end of the memo file without its end mark 0x1A";
        bytes = size_ - at;
      }
    } else if (kind_ == MEMO_SMT) {
      bytes = length < 0 ? 0 : length;
    } else {
      uint8_t head[kMemoBlockHead];
      if (!ReadWindowed(at, head, sizeof head)) {
        past = "block head runs past the end of the memo file";
        bytes = size_ - at;
      } else if (kind_ == MEMO_FPT) {
        bytes = int64_t(GetBe32(head + kFptLength)) + kMemoBlockHead;
      } else {
        bytes = GetLe32(head + kDb4TotalLength);
      }
    }
    if (past == nullptr && at + bytes > size_) past = "length runs past the end of the memo file";
    if (past != nullptr) {
      findings_->Add("memo", record, block, -1,
                     f.name + ": memo at block " + std::to_string(block) + ": " + past + " (" +
                         std::to_string(bytes) + " bytes from offset " + std::to_string(at) + ", file " +
                         std::to_string(size_) + ")");
      bytes = std::min(bytes, size_ - at);
    }
    int64_t span = bytes <= 0 ? 1 : (bytes + block_ - 1) / block_;
    spans_.push_back({block, block + span, record});
  }

  // Reads `n` bytes at `at` through a window of the file: memos mostly lie
  // in the order of their records, so one read serves the heads of many
  // (one read per memo would be a system call per record). False when the
  // file holds fewer.
  bool ReadWindowed(int64_t at, void* out, size_t n) {
    if (at < window_at_ || at + int64_t(n) > window_at_ + int64_t(window_.size())) {
      constexpr int64_t kWindow = 64 << 10;
      const int64_t want = std::min<int64_t>(kWindow, size_ - at);
      if (want < int64_t(n)) return false;
      window_.resize(size_t(want));
      if (!ReadAt(fd_, at, window_.data(), window_.size())) {
        window_.clear();
        return false;
      }
      window_at_ = at;
    }
    memcpy(out, window_.data() + (at - window_at_), n);
    return true;
  }

  // Bytes of a dBASE III memo up to and with its 0x1A, or -1 when the file
  // ends first.
  int64_t Db3Length(int64_t at) {
    char buf[4096];
    for (int64_t pos = at; pos < size_;) {
      size_t want = size_t(std::min<int64_t>(sizeof buf, size_ - pos));
      if (!ReadAt(fd_, pos, buf, want)) return -1;
      const void* hit = memchr(buf, kDb3Terminator, want);
      if (hit != nullptr) return pos + (static_cast<const char*>(hit) - buf) + 1 - at;
      pos += int64_t(want);
    }
    return -1;
  }

  // Follows the free chain of a dBASE IV memo file from `head`; its last
  // entry is where the next memo goes. -1 when the chain is damaged (told).
  int64_t FreeChainEnd(int64_t head) {
    int64_t b = head, prev = -1;
    const int64_t limit = size_ / block_ + 2;
    for (int64_t steps = 0; steps <= limit; ++steps) {
      uint8_t run[kFreeEntrySize];
      if (b * block_ >= size_ || !ReadAt(fd_, b * block_, run, sizeof run)) {
        // The last entry may stand at the end of the file: nothing is there yet.
        if (b * block_ == size_ || (prev >= 0 && b * block_ >= size_ && b == prev)) return b;
        findings_->Add("memo", -1, b, -1, "the free chain leaves the file at block " + std::to_string(b));
        return -1;
      }
      int64_t next = GetLe32(run + kFreeNext);
      if (next == kFreeChainEnd) return b;
      if (next <= b) {
        findings_->Add("memo", -1, b, -1,
                       "the free chain goes back from block " + std::to_string(b) + " to " + std::to_string(next) +
                           ": it loops");
        return -1;
      }
      prev = b;
      b = next;
    }
    findings_->Add("memo", -1, b, -1, "the free chain is longer than the file has blocks");
    return -1;
  }

  Findings* findings_;
  int kind_;
  int64_t block_;
  bool vfp_;
  int fd_ = -1;
  int64_t size_ = -1;
  std::vector<MemoSpan> spans_;
  std::vector<char> window_;  // bytes of the file from window_at_
  int64_t window_at_ = 0;
};

// ---------------------------------------------------------------------------
// Indexes

// The key each live record's fields give, one fixed-width slot per record.
struct ExpectedKeys {
  size_t width = 0;
  std::vector<char> bytes;
  bool set = false;
  void Put(size_t record, const ZQString& key, size_t records) {
    if (!set) {
      width = size_t(key.length());
      bytes.assign(records * width, ' ');
      set = true;
    }
    size_t n = std::min(width, size_t(key.length()));
    if (width > 0) memcpy(&bytes[record * width], key.c_str(), n);
  }
  const char* At(size_t record) const { return width > 0 ? &bytes[record * width] : ""; }
};

// Equal once the shorter is blank-filled: index kinds pad text keys to their
// key length.
bool SameKey(const char* a, size_t an, const char* b, size_t bn) {
  size_t n = std::min(an, bn);
  if (memcmp(a, b, n) != 0) return false;
  for (size_t i = n; i < an; ++i)
    if (a[i] != ' ') return false;
  for (size_t i = n; i < bn; ++i)
    if (b[i] != ' ') return false;
  return true;
}

struct OpenedIndex {
  std::string name;
  std::unique_ptr<ZQIndexWalk> walk;
  ExpectedKeys expected;
  bool doubles = false;  // one numeric or date field: keys are 8-byte doubles
};

// The number an 8-byte double key holds (least significant byte first); NaN
// for a key of another length, which then compares with nothing.
double KeyValue(const ZQString& key) {
  if (key.length() != 8) return std::nan("");
  uint64_t bits = GetLe64(reinterpret_cast<const uint8_t*>(key.c_str()));
  double v;
  memcpy(&v, &bits, sizeof v);
  return v;
}

void CheckIndex(OpenedIndex& ix, const std::vector<uint8_t>& flags, int64_t header_count, bool keys_built,
                Findings* findings) {
  const std::string part = "index " + ix.name;
  ZQString tree;
  int32_t tree_faults = ix.walk->CheckTree(tree, false);
  // Numeric and date keys in the order of their values (below) make the
  // tree's order faults by their bytes: such a tree is judged by the order
  // it keeps, the one that finds fewer faults.
  if (tree_faults > 0 && ix.doubles) {
    ZQString by_value;
    int32_t value_faults = ix.walk->CheckTree(by_value, true);
    if (value_faults < tree_faults) {
      tree.Swap(by_value);
      tree_faults = value_faults;
    }
  }
  if (tree_faults > 0) {
    std::string all(tree.c_str(), size_t(tree.length()));
    size_t start = 0;
    while (start < all.size()) {
      size_t nl = all.find('\n', start);
      std::string line = all.substr(start, nl == std::string::npos ? std::string::npos : nl - start);
      int64_t block = -1;
      if (line.rfind("block ", 0) == 0) block = atoll(line.c_str() + 6);
      size_t colon = line.find(": ");
      findings->Add(part, -1, block, -1, colon == std::string::npos ? line : line.substr(colon + 2));
      if (nl == std::string::npos) break;
      start = nl + 1;
    }
  }
  const size_t records = flags.size();
  std::vector<uint8_t> counts(records, 0);
  std::unordered_set<std::string> unique_keys;
  const bool unique = ix.walk->Unique();
  ZQString key, prev;
  bool first = true;
  // The module orders keys by their bytes. Numeric and date keys are
  // doubles, which dBASE and libxbase64 order by value instead: an index in
  // either order throughout is whole for the programs that wrote it, so
  // such an index is out of order only when it is in neither. The findings
  // wait for the end of the walk to know which.
  std::vector<std::pair<int64_t, std::string>> disorder;
  size_t bytes_disordered = 0, values_disordered = 0;
  int64_t walked = 0;
  for (int32_t r = ix.walk->First(key); r != -1; r = ix.walk->Next(key)) {
    ++walked;
    if (!first && key < prev && ++bytes_disordered <= kShownPerPart)
      disorder.emplace_back(int64_t(r) + 1, "key " + Shown(key.c_str(), size_t(key.length())) +
                                                " stands after the greater key " +
                                                Shown(prev.c_str(), size_t(prev.length())) + ": the keys are out of order");
    if (!first && ix.doubles && KeyValue(key) < KeyValue(prev)) ++values_disordered;
    first = false;
    prev = key;
    if (unique) unique_keys.emplace(key.c_str(), size_t(key.length()));
    if (r < 0 || size_t(r) >= records) {
      findings->Record(part, int64_t(r) + 1,
                       "key " + Shown(key.c_str(), size_t(key.length())) + " names record " + std::to_string(int64_t(r) + 1) +
                           ", which the file doesn't hold (the header counts " + std::to_string(header_count) +
                           ", the file holds " + std::to_string(records) + ")");
      continue;
    }
    if (flags[size_t(r)] != kLiveFlag) {
      findings->Record(part, int64_t(r) + 1,
                       "key " + Shown(key.c_str(), size_t(key.length())) + " names a deleted record");
      continue;
    }
    if (counts[size_t(r)] < 255) ++counts[size_t(r)];
    if (keys_built && ix.expected.set) {
      const char* want = ix.expected.At(size_t(r));
      if (!SameKey(want, ix.expected.width, key.c_str(), size_t(key.length())))
        findings->Record(part, int64_t(r) + 1,
                         "key " + Shown(key.c_str(), size_t(key.length())) + " differs from " +
                             Shown(want, ix.expected.width) + ", the key of the record's fields now");
    }
  }
  if (bytes_disordered > 0 && !(ix.doubles && values_disordered == 0)) {
    for (const auto& d : disorder) findings->Record(part, d.first, d.second);
    // Beyond those listed, counted only.
    for (size_t i = disorder.size(); i < bytes_disordered; ++i) findings->Record(part, -1, "a key out of order");
  }
  // The faults of the tree's structure say where a broken walk stopped.
  if (tree_faults == 0 && ix.walk->Broken())
    findings->Add(part, -1, -1, -1,
                  "the walk in key order stopped at damage after " + std::to_string(walked) +
                      (walked == 1 ? " key" : " keys"));
  for (size_t r = 0; r < records; ++r) {
    if (flags[r] != kLiveFlag) continue;
    if (counts[r] > 1) {
      findings->Record(part, int64_t(r) + 1, "has " + std::to_string(counts[r]) + " keys, not one");
    } else if (counts[r] == 0) {
      // A unique index keeps one record of each key: the others of that key
      // are left out by design.
      if (unique && keys_built && ix.expected.set &&
          unique_keys.count(std::string(ix.expected.At(r), ix.expected.width)) != 0)
        continue;
      findings->Record(part, int64_t(r) + 1, "has no key in the index");
    }
  }
}

// ---------------------------------------------------------------------------
// Output

std::string Place(const Finding& f) {
  std::string s;
  auto add = [&](const std::string& x) { s += (s.empty() ? "" : ", ") + x; };
  if (f.record >= 0) add("record " + std::to_string(f.record));
  if (f.block >= 0) add("block " + std::to_string(f.block));
  if (f.offset >= 0) add("offset " + std::to_string(f.offset));
  return s;
}

void PutJsonNumber(OutBuf& out, const char* name, int64_t v) {
  if (v < 0) return;
  out.Put(", \"");
  out.Put(name);
  out.Put("\": ");
  out.PutInt(v);
}

bool Write(const std::string& table, const Findings& findings, const std::string& summary, bool json, int fd) {
  OutBuf out(fd);
  if (json) {
    out.Put("{\"table\": ");
    PutJsonString(out, table.data(), table.size());
    out.Put(", \"clean\": ");
    out.Put(findings.total() == 0 ? "true" : "false");
    out.Put(", \"count\": ");
    out.PutInt(int64_t(findings.total()));
    out.Put(", \"findings\": [");
    bool first = true;
    for (const Finding& f : findings.list()) {
      out.Put(first ? "\n  {\"part\": " : ",\n  {\"part\": ");
      first = false;
      PutJsonString(out, f.part.data(), f.part.size());
      PutJsonNumber(out, "record", f.record);
      PutJsonNumber(out, "block", f.block);
      PutJsonNumber(out, "offset", f.offset);
      out.Put(", \"problem\": ");
      PutJsonString(out, f.problem.data(), f.problem.size());
      out.Put("}");
    }
    out.Put("],\n \"unlisted\": {");
    first = true;
    for (const auto& u : findings.Unlisted()) {
      if (!first) out.Put(", ");
      first = false;
      PutJsonString(out, u.first.data(), u.first.size());
      out.Put(": ");
      out.PutInt(int64_t(u.second));
    }
    out.Put("}}\n");
  } else {
    for (const Finding& f : findings.list()) {
      std::string line = f.part + ": " + Place(f) + (Place(f).empty() ? "" : ": ") + f.problem + "\n";
      out.Put(line.data(), line.size());
    }
    for (const auto& u : findings.Unlisted()) {
      std::string line = u.first + ": " + std::to_string(u.second) + " more findings not listed\n";
      out.Put(line.data(), line.size());
    }
    std::string last = table + ": " + (findings.total() == 0 ? "clean" : std::to_string(findings.total()) +
                                                                            (findings.total() == 1 ? " finding" : " findings")) +
                       " (" + summary + ")\n";
    out.Put(last.data(), last.size());
  }
  return out.Flush();
}

}  // namespace

int RunCheck(const std::string& table, const SourceOptions& source, const CheckRunOptions& opts) {
  SourceOptions quiet = source;
  // Memos are checked from the memo file's bytes; the spoke reads the rest.
  quiet.memo_policy = 2;
  // Keys are built from the bytes the records hold, as the index kinds
  // store them: no code page conversion.
  quiet.codepage = 0;
  SourcePtr spoke;
  std::string error;
  if (OpenSource(table, quiet, &spoke, &error) != 0) return Fail(error);
  auto facts = SpokeFacts(spoke.get());
  ZQString version;
  spoke->GetOption("version", version);
  const int dialect = atoi(version.c_str());
  // The file holds the count unsigned; the module holds it in 32 signed bits,
  // so a damaged count past 2^31 comes back negative.
  int64_t header_count = atoll(SpokeFact(facts, "records").c_str());
  if (header_count < 0) header_count += int64_t(1) << 32;
  const int64_t hdrlen = atoll(SpokeFact(facts, "header").c_str());
  const int64_t reclen = atoll(SpokeFact(facts, "record").c_str());
  const std::vector<FieldDesc> fields = RawFieldsOf(facts);
  const int32_t offset = fields.empty() ? 0 : fields.back().offset + fields.back().width;

  Findings findings;
  int fd = open(table.c_str(), O_RDONLY);
  if (fd < 0) return Fail("cannot open " + table + ": " + strerror(errno));
  const int64_t size = FileSize(fd);
  // The header against the file.
  if (reclen <= 0) findings.Add("table", -1, -1, 10, "the record length is 0");
  if (reclen > 0 && offset + 1 != reclen)
    findings.Add("table", -1, -1, -1,
                 "the record length is " + std::to_string(reclen) + " bytes, the fields take " +
                     std::to_string(offset + 1) + " with the delete flag");
  const int64_t expected = hdrlen + header_count * reclen;
  int64_t whole = reclen > 0 && size > hdrlen ? (size - hdrlen) / reclen : 0;
  if (whole > header_count) whole = header_count;
  if (whole < 0) whole = 0;
  if (size < expected) {
    findings.Add("table", whole + 1, -1, size,
                 "the header counts " + std::to_string(header_count) + " records, the file holds " +
                     std::to_string(whole) + " whole ones: " + std::to_string(expected - size) + " bytes are missing");
  } else if (size > expected + 1) {
    findings.Add("table", -1, -1, expected,
                 std::to_string(size - expected) + " bytes stand behind the last of the header's " +
                     std::to_string(header_count) + " records (records the header doesn't count?)");
  } else if (size == expected + 1) {
    uint8_t mark = 0;
    if (ReadAt(fd, expected, &mark, 1) && mark != kEndMark)
      findings.Add("table", -1, -1, expected, "the end mark is " + Hex(mark) + ", not 0x1A");
  }
  // An index the header announces must be there.
  IndexKind kind = IndexKindOf(dialect);
  uint8_t flags_byte = 0;
  if (kind != IndexKind::kNone && !IsNarrowDialect(dialect) && ReadAt(fd, kWideProdIndex, &flags_byte, 1) &&
      (flags_byte & 1) != 0 && !HasSibling(table, kind == IndexKind::kDbase ? "mdx" : "cdx"))
    findings.Add("table", -1, -1, kWideProdIndex,
                 std::string("the header says the table has a production index, and no ") +
                     (kind == IndexKind::kDbase ? ".mdx" : ".cdx") + " file lies beside it");

  // The memo file.
  std::unique_ptr<MemoCheck> memo;
  std::string memo_fact = SpokeFact(facts, "memo");
  bool has_memo_fields = false;
  for (const FieldDesc& f : fields)
    has_memo_fields = has_memo_fields || f.type == 'M' || f.type == 'G' || (f.type == 'B' && dialect != DIALECT_VFOXPRO);
  const std::string memo_file = SpokeFact(facts, "memo file");
  const int memo_kind = MemoKindNamed(SpokeFact(facts, "memo kind"));
  const int memo_block = atoi(SpokeFact(facts, "memo block").c_str());
  if (!memo_file.empty() && memo_block > 0 && memo_kind != MEMO_NONE) {
    memo = std::make_unique<MemoCheck>(&findings, memo_file, memo_kind, memo_block, dialect == DIALECT_VFOXPRO);
    if (!memo->ok()) {
      findings.Add("memo", -1, -1, -1, "the memo file " + memo_file + " has no whole header");
      memo.reset();
    }
  } else if (has_memo_fields && memo_fact != "none") {
    findings.Add("memo", -1, -1, -1, "the memo file: " + memo_fact);
  }

  // The indexes: the table's tags, and the files named.
  std::vector<OpenedIndex> indexes;
  std::vector<std::string> names;
  ZQIndexDef* const* list = spoke->IndexList();
  for (int i = 0; list != nullptr && list[i] != nullptr; ++i) names.push_back(list[i]->Name());
  for (const std::string& n : opts.indexes) names.push_back(n);
  if (kind != IndexKind::kNone) {
    for (const std::string& n : names) {
      ZQIndexDef def;
      OpenedIndex ix;
      ix.name = n;
      ix.walk.reset(spoke->OpenIndexWalk(n.c_str(), &def));
      if (!ix.walk) {
        findings.Add("index " + n, -1, -1, -1, "cannot be opened: its header or root is damaged, or the file is missing");
        continue;
      }
      ix.doubles = def.SegCount() == 1 && def[0].Type() != nullptr && def[0].Type()->Kind() != 0;
      indexes.push_back(std::move(ix));
    }
  } else if (!opts.indexes.empty()) {
    findings.Add("table", -1, -1, -1, "this dialect has no index files; the indexes named were not checked");
  }

  // The records: flags and values from the bytes, keys from the spoke's
  // values.
  const size_t records = size_t(whole);
  std::vector<uint8_t> flags(records, 0);
  std::vector<char> rec(size_t(reclen > 0 ? reclen : 1));
  bool keys_built = true;
  int32_t logical = 0;
  ZQString key;
  const int64_t chunk_records = reclen > 0 ? std::max<int64_t>(1, (1 << 20) / reclen) : 1;
  std::vector<char> chunk;
  for (size_t r = 0; r < records && reclen > 0; ++r) {
    int64_t in_chunk = int64_t(r) % chunk_records;
    if (in_chunk == 0) {
      int64_t n = std::min<int64_t>(chunk_records, int64_t(records - r));
      chunk.resize(size_t(n * reclen));
      if (!ReadAt(fd, hdrlen + int64_t(r) * reclen, chunk.data(), chunk.size())) {
        findings.Record("table", int64_t(r) + 1, "cannot be read");
        break;
      }
    }
    const char* p = chunk.data() + in_chunk * reclen;
    uint8_t flag = uint8_t(p[0]);
    flags[r] = flag;
    if (flag != kLiveFlag && flag != kDeletedFlag) {
      findings.Add("table", int64_t(r) + 1, -1, hdrlen + int64_t(r) * reclen,
                   "delete flag " + Hex(flag) + " is neither blank nor '*' (read as deleted)");
      continue;
    }
    if (flag != kLiveFlag) continue;
    const char* body = p + 1;
    for (const FieldDesc& f : fields) {
      if (f.offset + f.width > reclen - 1) break;
      const char* v = body + f.offset;
      const char* problem = nullptr;
      switch (f.type) {
        case 'D': problem = DateProblem(v, f.width); break;
        case 'N':
        case 'F':
          if (!NumberText(v, f.width)) problem = "is no number";
          break;
        case 'L':
          if (f.width >= 1 && !LogicalByte(v[0])) problem = "is no logical (T, F, Y, N, ?)";
          break;
        case 'M':
        case 'G':
        case 'B':
          if (memo && (f.type != 'B' || dialect != DIALECT_VFOXPRO)) memo->Pointer(int64_t(r) + 1, f, v);
          break;
        default: break;
      }
      if (problem != nullptr)
        findings.Add("table", int64_t(r) + 1, -1, hdrlen + int64_t(r) * reclen + 1 + f.offset,
                     f.name + " " + Shown(v, size_t(f.width)) + " " + problem);
    }
    if (keys_built && !indexes.empty()) {
      BATCHERR rc = spoke->GetRecord(logical);
      if (rc != 0) {
        if (rc != ZQ_END) findings.Record("table", int64_t(r) + 1, std::string("cannot be read: ") + spoke->LastErrorMessage());
        keys_built = false;
        continue;
      }
      ++logical;
      for (OpenedIndex& ix : indexes) {
        ix.walk->BuildKey(key);
        ix.expected.Put(r, key, records);
      }
    }
  }
  close(fd);
  if (memo) memo->Finish();
  for (OpenedIndex& ix : indexes) CheckIndex(ix, flags, header_count, keys_built, &findings);
  indexes.clear();
  spoke->ConnectionClose();

  std::string summary = std::to_string(records) + " records";
  if (memo) summary += ", the memo file";
  if (!names.empty() && kind != IndexKind::kNone)
    summary += ", " + std::to_string(names.size()) + (names.size() == 1 ? " index" : " indexes");
  if (!Write(table, findings, summary, opts.json, opts.out)) return Fail("cannot write the output");
  return findings.total() == 0 ? 0 : 1;
}
