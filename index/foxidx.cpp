// IDX and CDX files: index headers, the CDX tag list, and the node chain that
// reads, walks and grows the B-tree.
#include "index/foxidx.h"

#include <climits>
#include <cstdio>
#include <cstring>
#include <new>

#include "host/endian.h"
#include "host/platform.h"
#include "host/zqglob.h"

namespace {

// Index header fields (see foxidx.h).
constexpr int kHdrRoot = 0, kHdrFreeList = 4, kHdrFileEnd = 8, kHdrKeyLength = 12, kHdrOptions = 14,
              kHdrSignature = 15, kHdrExpression = 16, kHdrVersionWords = 504, kHdrExprLength = 510,
              kHdrCompactExpression = 512;
constexpr int kHeaderPlain = 512, kHeaderCompact = 1024;
// Longest expression each header form holds, without its NUL.
constexpr int kMaxExprPlain = kHeaderPlain - kHdrExpression - 1;
constexpr int kMaxExprCompact = kHeaderCompact - kHdrCompactExpression - 1;
constexpr uint8_t kOptUnique = 0x01, kOptCompact = 0x20, kOptTagList = 0xC0;

// Block header fields, and a compact leaf's own header behind them.
constexpr int kBlkAttr = 0, kBlkCount = 2, kBlkLeft = 4, kBlkRight = 8;
constexpr int kLeafFree = 12, kLeafRecordMask = 14, kLeafDupMask = 18, kLeafTrailMask = 19, kLeafRecordBits = 20,
              kLeafDupBits = 21, kLeafTrailBits = 22, kLeafEntryBytes = 23, kLeafData = 24;
constexpr int kAttrRoot = 1, kAttrLeaf = 2;

constexpr int kTagNameLength = 10;
constexpr int kMaxPath = 4096;
// Attempts of one AddKey: a retry follows a split that filled a parent, and
// each one splits a level further up, so a handful is the most any tree needs.
constexpr int kMaxInsertTries = 256;

int32_t ReadAt(int fd, int32_t at, void* buffer, uint32_t n) {
  if (fd < 0 || at < 0 || _lseek(fd, at, 0) != at) return -1;
  return _read(fd, buffer, n);
}

bool WriteAt(int fd, int32_t at, const void* buffer, uint32_t n) {
  if (fd < 0 || at < 0 || _lseek(fd, at, 0) != at) return false;
  return _write(fd, buffer, n) == int32_t(n);
}


// The extension of `name` into `ext` ("" for none). False for a name too long.
bool ExtensionOf(const char* name, char* ext) {
  char path[kMaxPath];
  if (strlen(name) >= sizeof path) return false;
  strcpy(path, name);
  ZQGlob::sepfile(path, nullptr, ext);
  return true;
}

// basepath + ".cdx". False for a path too long.
bool CdxPath(const char* basepath, char* out) {
  if (basepath == nullptr || strlen(basepath) + 5 >= kMaxPath) return false;
  strcpy(out, basepath);
  ZQGlob::appndext(out, "cdx");
  return true;
}

// Tag names come back blank-filled to the tag list's key length; the
// comparison and the host see the name without its fill.
void TrimTagName(ZQString& name) {
  int32_t n = name.length();
  while (n > 0 && (name[n - 1] == ' ' || name[n - 1] == '\0')) --n;
  name.SetLength(n);
}

// The header offset of the tag `name` (any case, trailing blanks aside) in
// `taglist`, -1 if none.
int32_t FindTag(ZQDBFoxIndex* taglist, const char* name) {
  ZQString wanted(name), key;
  TrimTagName(wanted);
  for (int32_t r = taglist->FirstKey(key); r != -1; r = taglist->NextKey(key)) {
    TrimTagName(key);
    if (ZQGlob::stricmp(key.c_str(), wanted.c_str()) == 0) return r + 1;
  }
  return -1;
}

// The key expression of a header of `n` bytes read at `h`.
void HeaderExpression(const uint8_t* h, int32_t n, ZQString& out) {
  bool compact = (h[kHdrOptions] & kOptCompact) != 0;
  int32_t from = compact ? kHdrCompactExpression : kHdrExpression;
  int32_t len = compact ? GetLe16(h + kHdrExprLength) : kHeaderPlain - kHdrExpression;
  if (len > n - from) len = n - from;
  if (len < 0) len = 0;
  const void* nul = memchr(h + from, 0, size_t(len));
  if (nul != nullptr) len = int32_t(static_cast<const uint8_t*>(nul) - (h + from));
  out.CopyN(reinterpret_cast<const char*>(h), len, from);
}

// The names of `keyfields` joined by "+", lower-cased for a compact header.
void ExpressionOf(const ZQRecord* keyfields, bool lower, ZQString& out) {
  out = "";
  for (int i = 0; keyfields != nullptr && i < keyfields->FieldCount(); ++i) {
    if (i > 0) out += "+";
    out += (*keyfields)[i]->Name();
  }
  if (lower) out.ToLower();
}

int32_t RoundUpToBlock(int32_t at) {
  int32_t b = ZQDBFoxNode::kBlock;
  return at > INT32_MAX - b ? -1 : (at + b - 1) / b * b;
}

uint64_t ShiftRight(uint64_t v, int n) { return n >= 64 ? 0 : v >> n; }

}  // namespace

// ---------------------------------------------------------------------------
// ZQDBFoxIndex

ZQDBFoxIndex::ZQDBFoxIndex() : ZQDBIndexBase() {}

ZQDBFoxIndex::ZQDBFoxIndex(const char* path) : ZQDBIndexBase() {
  headerWhere = 0;
  OpenExisting(path);
  ReadHeader();
  if (root != nullptr) static_cast<ZQDBFoxNode*>(root)->SetCDXAttr();
}

ZQDBFoxIndex::ZQDBFoxIndex(const char* basepath, const char* name, ZQDBFoxIndex*& taglist) : ZQDBIndexBase() {
  char ext[kMaxPath];
  if (name == nullptr || *name == '\0' || !ExtensionOf(name, ext)) {
    Fail("the index name is empty or too long");
    return;
  }
  if (ext[0] != '\0') {  // an IDX file
    headerWhere = 0;
    OpenExisting(name);
    ReadHeader();
    return;
  }
  char path[kMaxPath];
  if (!CdxPath(basepath, path)) {
    Fail("the table's path is too long");
    return;
  }
  if (!OpenTagList(path, taglist)) return;
  int32_t at = FindTag(taglist, name);
  if (at < 0) {
    Fail("the CDX file has no tag of that name");
    return;
  }
  headerWhere = at;
  OpenExisting(path);
  ReadHeader();
}

ZQDBFoxIndex::ZQDBFoxIndex(const char* basepath, const char* name, const ZQRecord& keyfields, ZQIndexDef& def,
                           ZQDBFoxIndex*& taglist)
    : ZQDBIndexBase() {
  compact = def.Compress();
  // The key's bytes as BuildKey makes them: 8 for a numeric or date segment.
  // A definition without segments falls back to the fields' widths.
  int32_t length = 0;
  if (def.SegCount() > 0) {
    length = KeyFormLength(&def);
  } else {
    for (int i = 0; i < keyfields.FieldCount(); ++i) length += keyfields[i]->Length();
  }
  if (length < 1 || length > kMaxKeyLength) {
    Fail("the key length is out of range (1 to 240 bytes)");
    return;
  }
  char ext[kMaxPath];
  if (name == nullptr || *name == '\0' || !ExtensionOf(name, ext)) {
    Fail("the index name is empty or too long");
    return;
  }
  bool tag = ext[0] == '\0';
  if (tag) compact = true;  // CDX tags are always compact
  ZQString text;
  ExpressionOf(&keyfields, compact, text);
  if (text.length() > (compact ? kMaxExprCompact : kMaxExprPlain)) {
    Fail("the key expression is too long for the index header");
    return;
  }
  if (tag) {
    char path[kMaxPath];
    if (!CdxPath(basepath, path)) {
      Fail("the table's path is too long");
      return;
    }
    CreateTag(path, name, length, keyfields, def, taglist);
    return;
  }
  headerWhere = 0;
  fd = _open(name, kRtReadWrite | kRtCreate | kRtTruncate | kRtBinary);
  if (fd < 0) {
    Fail("the index file could not be created");
    return;
  }
  ZQString buffer;
  BuildNewHeader(0, buffer, length, def.Dups(), &keyfields, false);
  BuildRootNode(compact ? kHeaderCompact : kHeaderPlain, buffer, length);
  if (*reason != '\0') return;
  ReadHeader();
  fields = keyfields;
}

ZQDBFoxIndex::~ZQDBFoxIndex() {
  if (dirty) Flush();
}

bool ZQDBFoxIndex::Fail(const char* why) {
  reason = why;
  ok = false;
  return false;
}

bool ZQDBFoxIndex::OpenTagList(const char* path, ZQDBFoxIndex*& taglist) {
  if (taglist != nullptr) return true;
  taglist = new (std::nothrow) ZQDBFoxIndex(path);
  if (taglist != nullptr && taglist->OK()) return true;
  delete taglist;
  taglist = nullptr;
  return Fail("the CDX file could not be opened or its tag list is damaged");
}

void ZQDBFoxIndex::CreateTag(const char* path, const char* name, int32_t length, const ZQRecord& keyfields,
                             const ZQIndexDef& def, ZQDBFoxIndex*& taglist) {
  if (strlen(name) > size_t(kTagNameLength)) {
    Fail("a tag name has at most 10 characters");
    return;
  }
  if (taglist == nullptr) {  // a new CDX file: its tag list, empty
    fd = _open(path, kRtReadWrite | kRtCreate | kRtTruncate | kRtBinary);
    if (fd < 0) {
      Fail("the CDX file could not be created");
      return;
    }
    ZQString buffer;
    BuildNewHeader(0, buffer, kTagNameLength, true, nullptr, true);
    BuildRootNode(kHeaderCompact, buffer, kTagNameLength);
    _close(fd);
    fd = -1;
    if (*reason != '\0' || !OpenTagList(path, taglist)) return;
  } else if (!taglist->OK()) {
    Fail("the CDX file's tag list is damaged");
    return;
  } else if (FindTag(taglist, name) >= 0) {
    Fail("the CDX file has a tag of that name already");
    return;
  }
  fd = _open(path, kRtReadWrite | kRtBinary);
  if (fd < 0) {
    Fail("the CDX file could not be opened");
    return;
  }
  headerWhere = RoundUpToBlock(_lseek(fd, 0, 2));
  if (headerWhere < 0 || headerWhere >= kMaxTagOffset) {
    Fail("the CDX file is too large for another tag: a tag must begin below 65,536 bytes");
    return;
  }
  // The tag's blocks go to the file before its name goes into the list, so
  // a block that the list appends as it grows lands behind them.
  ZQString buffer;
  BuildNewHeader(headerWhere, buffer, length, def.Dups(), &keyfields, false);
  BuildRootNode(headerWhere + kHeaderCompact, buffer, length);
  if (*reason != '\0') return;
  ZQString tagname(name);
  if (!taglist->AddKey(tagname, headerWhere - 1) || !taglist->Flush()) {
    Fail("the tag could not be added to the CDX file's tag list");
    return;
  }
  ReadHeader();
  fields = keyfields;
}

void ZQDBFoxIndex::BuildNewHeader(int32_t where, ZQString& buffer, int keyLength, bool dups,
                                  const ZQRecord* keyfields, bool tagList) {
  int size = compact ? kHeaderCompact : kHeaderPlain;
  if (!buffer.Set('\0', size)) {
    Fail("out of memory");
    return;
  }
  uint8_t* h = reinterpret_cast<uint8_t*>(buffer.GetBuffer());
  PutLe32(h + kHdrRoot, uint32_t(where + size));
  PutLe32(h + kHdrFreeList, compact ? 0 : 0xFFFFFFFFu);
  PutLe32(h + kHdrFileEnd, compact ? 0 : uint32_t(kHeaderPlain + ZQDBFoxNode::kBlock));
  PutLe16(h + kHdrKeyLength, uint16_t(keyLength));
  uint8_t options = 0;
  unique = !dups;
  if (!dups) options |= kOptUnique;
  if (compact) options |= kOptCompact;
  if (tagList) options |= kOptTagList;
  h[kHdrOptions] = options;
  h[kHdrSignature] = compact ? 1 : 0;
  ExpressionOf(keyfields, compact, expression);
  int32_t n = expression.length();
  if (compact) {
    PutLe16(h + kHdrVersionWords, 10);
    PutLe16(h + kHdrVersionWords + 2, 1);
    PutLe16(h + kHdrVersionWords + 4, 0);
    PutLe16(h + kHdrExprLength, uint16_t(n + 1));
    memcpy(h + kHdrCompactExpression, expression.c_str(), size_t(n));
  } else {
    memcpy(h + kHdrExpression, expression.c_str(), size_t(n));
  }
  if (!WriteAt(fd, where, h, uint32_t(size))) Fail("the index header could not be written");
}

void ZQDBFoxIndex::BuildRootNode(int32_t where, ZQString& buffer, int keyLength) {
  if (!buffer.Set('\0', ZQDBFoxNode::kBlock)) {
    Fail("out of memory");
    return;
  }
  uint8_t* b = reinterpret_cast<uint8_t*>(buffer.GetBuffer());
  PutLe16(b + kBlkAttr, kAttrLeaf);
  PutLe16(b + kBlkCount, 0);
  PutLe32(b + kBlkLeft, 0xFFFFFFFFu);
  PutLe32(b + kBlkRight, 0xFFFFFFFFu);
  if (compact) ZQDBFoxNode::PutLeafHeader(b, ZQDBFoxNode::TableWidths(keyLength), ZQDBFoxNode::kLeafArea);
  if (!WriteAt(fd, where, b, ZQDBFoxNode::kBlock)) Fail("the index's first block could not be written");
}

void ZQDBFoxIndex::ReadHeader() {
  if (fd < 0) {
    Fail("the index file could not be opened");
    return;
  }
  uint8_t h[kHeaderCompact] = {};
  int32_t n = ReadAt(fd, headerWhere, h, sizeof h);
  if (n < kHeaderPlain) {
    Fail("the index header could not be read");
    return;
  }
  rootWhere = int32_t(GetLe32(h + kHdrRoot));
  freeList = int32_t(GetLe32(h + kHdrFreeList));
  fileEnd = int32_t(GetLe32(h + kHdrFileEnd));
  keyLength = int16_t(GetLe16(h + kHdrKeyLength));
  unique = (h[kHdrOptions] & kOptUnique) != 0;
  compact = (h[kHdrOptions] & kOptCompact) != 0;
  HeaderExpression(h, n, expression);
  if (keyLength < 1 || keyLength > kMaxKeyLength) {
    Fail("the index header gives a key length out of range");
    return;
  }
  auto* node = new (std::nothrow) ZQDBFoxNode(nullptr, keyLength, fd, rootWhere, compact);
  if (node == nullptr || !node->OK()) {
    delete node;
    Fail("the index's blocks are damaged or cut short");
    return;
  }
  root = node;
  leaf = root->FindLeaf();
  position = 0;
  ok = true;
  reason = "";
}

bool ZQDBFoxIndex::Flush() {
  if (fd < 0 || root == nullptr) return false;
  bool good = true;
  if (dirty) {
    rootWhere = root->Where();
    uint8_t h[12];
    PutLe32(h + kHdrRoot, uint32_t(rootWhere));
    PutLe32(h + kHdrFreeList, uint32_t(freeList));
    PutLe32(h + kHdrFileEnd, compact ? 0 : uint32_t(_lseek(fd, 0, 2)));
    good = WriteAt(fd, headerWhere, h, sizeof h);
  }
  return static_cast<ZQDBFoxNode*>(root)->WriteChain() && good;
}

bool ZQDBFoxIndex::ReadExpression(const char* path, ZQString& expr, bool& unique) {
  int fd = _open(path, kRtReadOnly | kRtBinary);
  if (fd < 0) return false;
  uint8_t h[kHeaderCompact] = {};
  int32_t n = ReadAt(fd, 0, h, sizeof h);
  _close(fd);
  if (n < kHeaderPlain) return false;
  HeaderExpression(h, n, expr);
  unique = (h[kHdrOptions] & kOptUnique) != 0;
  return true;
}

void ZQDBFoxIndex::BuildIndexList(const char* tablepath, ZQSpoke* spoke, ZQDBFoxIndex*& taglist) {
  delete taglist;
  taglist = nullptr;
  char path[kMaxPath], base[kMaxPath];
  if (tablepath == nullptr || strlen(tablepath) + 5 >= kMaxPath) return;
  strcpy(path, tablepath);
  ZQGlob::sepfile(path, base, nullptr);
  ZQGlob::appndnam(path, base);
  ZQGlob::appndext(path, "cdx");
  spoke->ClearIndices();
  if (_access(path, 0) == -1) return;
  taglist = new (std::nothrow) ZQDBFoxIndex(path);
  if (taglist == nullptr) return;
  ZQString key, expr;
  uint8_t h[kHeaderCompact];
  for (int32_t r = taglist->FirstKey(key); r != -1; r = taglist->NextKey(key)) {
    int32_t n = ReadAt(taglist->fd, r + 1, h, sizeof h);
    if (n < kHeaderPlain) break;
    HeaderExpression(h, n, expr);
    auto* def = new (std::nothrow) ZQIndexDef;
    if (def == nullptr) break;
    TrimTagName(key);
    def->Dups((h[kHdrOptions] & kOptUnique) == 0);
    def->Name(key.c_str());
    // A tag whose expression the grammar doesn't know is not offered.
    if (ZQDBIndexBase::ParseExpr(expr, def, spoke)) {
      spoke->AddIndex(def);
    } else {
      delete def;
    }
  }
}

// ---------------------------------------------------------------------------
// ZQDBFoxNode: loading and reading

ZQDBFoxNode::ZQDBFoxNode(ZQDBNodeBase* parent, int16_t keyLength, int fd, int32_t where, bool compact)
    : ZQDBNodeBase(parent, keyLength, fd, where), compact(compact) {
  maxKeys = int16_t(kArea / (keyLength + 4));
  if (keyLength < 1 || keyLength > ZQDBFoxIndex::kMaxKeyLength || Depth() >= kMaxDepth) return;
  int32_t attr = ReadNode(where);
  if (attr < 0) return;
  if (attr & kAttrLeaf) {
    ok = true;
    return;
  }
  maxKeys = int16_t(Capacity());
  auto* below = new (std::nothrow) ZQDBFoxNode(this, keyLength, fd, ChildAt(0), compact);
  if (below == nullptr) return;
  child = below;
  ok = below->OK();
}

ZQDBFoxNode::~ZQDBFoxNode() {
  if (dirty && valid) WriteNode();
}

ZQDBFoxNode::Widths ZQDBFoxNode::TableWidths(int keyLength) {
  Widths w;
  int bits = keyLength < 8 ? 3 : keyLength < 16 ? 4 : keyLength < 32 ? 5 : keyLength < 64 ? 6 : 7;
  w.entryBytes = keyLength < 16 ? 3 : 4;
  w.dupBits = w.trailBits = bits;
  w.recordBits = 8 * w.entryBytes - 2 * bits;
  return w;
}

// The widths of the table by key length while `record` fits them; beyond,
// four entry bytes, and then fewer count bits, until it does. Thirty-two
// record bits (no counts) take any record number.
ZQDBFoxNode::Widths ZQDBFoxNode::WidthsFor(int keyLength, uint32_t record) {
  Widths w = TableWidths(keyLength);
  while (record > w.recordMask()) {
    if (w.entryBytes < 4) {
      w.entryBytes = 4;
    } else {
      --w.dupBits;
      --w.trailBits;
    }
    w.recordBits = 8 * w.entryBytes - w.dupBits - w.trailBits;
  }
  return w;
}

namespace {

// A sibling link as a byte offset. Nodes lie on 512-byte boundaries, so a
// link that isn't a multiple of 512 is a number of 512-byte blocks, as one
// writer (Perl XBase's IDX files) stores them between leaves.
int32_t SiblingOffset(uint32_t link) {
  int32_t v = int32_t(link);
  if (v > 0 && v % ZQDBFoxNode::kBlock != 0 && v <= INT32_MAX / ZQDBFoxNode::kBlock) return v * ZQDBFoxNode::kBlock;
  return v;
}

}  // namespace

int32_t ZQDBFoxNode::ReadNode(int32_t at) {
  if (at < 0) return -1;
  if (dirty && valid && !WriteNode()) return -1;  // a changed block is saved before it is replaced
  if (ReadAt(fd, at, raw, kBlock) != kBlock) {
    Invalidate();
    return -1;
  }
  int attr = GetLe16(raw + kBlkAttr);
  int count = int16_t(GetLe16(raw + kBlkCount));
  bool leafBlock = (attr & kAttrLeaf) != 0;
  bool compactLeaf = leafBlock && compact;
  int capacity = compactLeaf ? kMaxLeafKeys : kArea / (keyLength + (leafBlock || !compact ? 4 : 8));
  if (count < 0 || count > capacity || (!leafBlock && count == 0)) {
    Invalidate();
    return -1;
  }
  where = at;
  keyCount = int16_t(count);
  leftSibling = SiblingOffset(GetLe32(raw + kBlkLeft));
  rightSibling = SiblingOffset(GetLe32(raw + kBlkRight));
  isLeafBlock = leafBlock;
  dirty = false;
  plan.valid = false;
  valid = true;
  if (compactLeaf) {
    Widths w;
    w.recordBits = raw[kLeafRecordBits];
    w.dupBits = raw[kLeafDupBits];
    w.trailBits = raw[kLeafTrailBits];
    w.entryBytes = raw[kLeafEntryBytes];
    // Widths that don't add up, or masks that don't match them, are damage.
    bool sane = w.entryBytes >= 1 && w.entryBytes <= 8 && w.recordBits <= 32 && w.dupBits <= 8 &&
                w.trailBits <= 8 && w.recordBits + w.dupBits + w.trailBits <= 8 * w.entryBytes &&
                GetLe32(raw + kLeafRecordMask) == w.recordMask() && raw[kLeafDupMask] == w.dupMask() &&
                raw[kLeafTrailMask] == w.trailMask() && count * w.entryBytes <= kLeafArea;
    widths = w;
    if (!sane || !keys.Allocate((count + 1) * keyLength) ||
        (count > 0 && DecodeCompactKey(decoded, count - 1) < 0)) {
      Invalidate();
      return -1;
    }
    keys.SetLength(count * keyLength);
    UsedBytes();
  }
  return attr;
}

bool ZQDBFoxNode::Load(int32_t at) {
  int32_t attr = ReadNode(at);
  if (attr < 0) return false;
  if (((attr & kAttrLeaf) != 0) != (child == nullptr)) {  // a block of another level: damage
    Invalidate();
    return false;
  }
  return true;
}

void ZQDBFoxNode::Invalidate() {
  valid = false;
  dirty = false;
  keyCount = 0;
  where = -1;
  plan.valid = false;
}

int32_t ZQDBFoxNode::DecodeCompactKey(ZQString& key, int index) {
  uint8_t* base = KeySlot(0);
  memset(base, ' ', size_t(index + 1) * size_t(keyLength));
  int keyPos = kLeafArea;
  int32_t record = -1;
  for (int i = 0; i <= index; ++i) {
    record = DecodeStep(base, i, keyPos);
    if (record < 0) return -1;
  }
  key.CopyN(reinterpret_cast<const char*>(base) + index * keyLength, keyLength, 0);
  return record;
}

int32_t ZQDBFoxNode::DecodeCompactKey(ZQString& key, int index, int& keyPos) {
  uint8_t* base = KeySlot(0);
  memset(base + index * keyLength, ' ', size_t(keyLength));
  int32_t record = DecodeStep(base, index, keyPos);
  if (record >= 0) key.CopyN(reinterpret_cast<const char*>(base) + index * keyLength, keyLength, 0);
  return record;
}

// One step of rebuilding a compact leaf into the key slots at `base`: key
// `index` from key `index` - 1 and the stored bytes that end at `keyPos`.
// The duplicate count takes the start of the previous key, the trailing
// count stands for blanks, which the slot holds already. -1 for an entry
// that the block can't hold.
inline int32_t ZQDBFoxNode::DecodeStep(uint8_t* base, int index, int& keyPos) {
  const Widths& w = widths;
  const uint8_t* area = raw + kLeafData;
  uint64_t v = GetLe64(area + index * w.entryBytes);  // the block has room behind its last byte
  if (w.entryBytes < 8) v &= (uint64_t{1} << (8 * w.entryBytes)) - 1;
  uint32_t record = uint32_t(v & w.recordMask());
  int dup = int(ShiftRight(v, w.recordBits) & uint64_t(w.dupMask()));
  int trail = int(ShiftRight(v, w.recordBits + w.dupBits) & uint64_t(w.trailMask()));
  int stored = keyLength - dup - trail;
  if (stored < 0 || record > uint32_t(INT32_MAX) || (index == 0 && dup > 0) ||
      keyPos - stored < keyCount * w.entryBytes)
    return -1;
  keyPos -= stored;
  uint8_t* slot = base + index * keyLength;
  if (dup > 0) memcpy(slot, slot - keyLength, size_t(dup));
  memcpy(slot + dup, area + keyPos, size_t(stored));
  entries[index] = Entry{record, uint8_t(dup), uint8_t(trail)};
  return int32_t(record);
}

void ZQDBFoxNode::UsedBytes() { freeBytes = kLeafArea - RangeBytes(0, keyCount); }

// Bytes that keys first .. first + count - 1 take in a compact leaf of their
// own: entries and stored bytes, the first key with no duplicate count.
int ZQDBFoxNode::RangeBytes(int first, int count) const {
  int bytes = count * widths.entryBytes;
  for (int i = first; i < first + count; ++i)
    bytes += keyLength - (i == first ? 0 : entries[i].dup) - entries[i].trail;
  return bytes;
}

const uint8_t* ZQDBFoxNode::KeyBytes(int i) const {
  if (CompactLeaf()) return reinterpret_cast<const uint8_t*>(keys.c_str()) + i * keyLength;
  return raw + kHeader + i * EntrySize();
}

uint8_t* ZQDBFoxNode::KeySlot(int i) { return reinterpret_cast<uint8_t*>(keys.GetBuffer()) + i * keyLength; }

uint32_t ZQDBFoxNode::RecordAt(int i) const {
  if (CompactLeaf()) return entries[i].record;
  if (IsLeaf() || compact) return GetBe32(KeyBytes(i) + keyLength);
  return 0;  // a non-compact interior entry has no record number
}

int32_t ZQDBFoxNode::ChildAt(int i) const { return int32_t(GetBe32(KeyBytes(i) + EntrySize() - 4)); }

int32_t ZQDBFoxNode::KeyAt(int i, ZQString& key) const {
  key.CopyN(reinterpret_cast<const char*>(KeyBytes(i)), keyLength, 0);
  return int32_t(RecordAt(i)) - 1;
}

int ZQDBFoxNode::Compare(int i, const uint8_t* key, uint32_t record, bool withRecord) const {
  int c = memcmp(KeyBytes(i), key, size_t(keyLength));
  if (c != 0 || !withRecord) return c;
  uint32_t r = RecordAt(i);
  return r < record ? -1 : r > record ? 1 : 0;
}

// The first entry not below (`upper`: above) the key, by binary search.
int ZQDBFoxNode::LowerBound(const uint8_t* key, uint32_t record, bool withRecord, bool upper) const {
  int lo = 0, hi = keyCount;
  while (lo < hi) {
    int mid = (lo + hi) / 2;
    int c = Compare(mid, key, record, withRecord);
    if (upper ? c <= 0 : c < 0) {
      lo = mid + 1;
    } else {
      hi = mid;
    }
  }
  return lo;
}

int32_t ZQDBFoxNode::BlocksInFile() const {
  int32_t size = _lseek(fd, 0, 2);
  return size < 0 ? 0 : size / kBlock + 1;
}

bool ZQDBFoxNode::Normalize(const ZQString& key) {
  int32_t n = key.length() < keyLength ? key.length() : keyLength;
  return scratch.CopyN(key.c_str(), n, 0) && scratch.Pad(' ', keyLength - n);
}

int32_t ZQDBFoxNode::CurrentKey(ZQString& key) {
  if (child != nullptr) return child->CurrentKey(key);
  if (!valid || current < 0 || current >= keyCount) {
    key = "";
    return -1;
  }
  return KeyAt(current, key);
}

// The parents don't follow a leaf that crosses to its sibling: every descent
// re-reads a level whose object holds another block than its entry names.
int32_t ZQDBFoxNode::NextKey(ZQString& key) {
  if (child != nullptr) return child->NextKey(key);
  key = "";
  if (!valid) return -1;
  if (current < -1) current = -1;
  if (current > keyCount) current = keyCount;
  ++current;
  int32_t hops = 0, limit = -1;
  while (current >= keyCount) {  // empty leaves of other writers are passed over
    if (rightSibling < 0) {
      current = keyCount;
      return -1;
    }
    if (limit < 0) limit = BlocksInFile();
    if (++hops > limit || !Load(rightSibling)) return lostWay = true, -1;
    current = 0;
  }
  return KeyAt(current, key);
}

int32_t ZQDBFoxNode::PrevKey(ZQString& key) {
  if (child != nullptr) return child->PrevKey(key);
  key = "";
  if (!valid) return -1;
  if (current > keyCount) current = keyCount;
  if (current < 0) current = 0;
  --current;
  int32_t hops = 0, limit = -1;
  while (current < 0) {
    if (leftSibling < 0) {
      current = -1;
      return -1;
    }
    if (limit < 0) limit = BlocksInFile();
    if (++hops > limit || !Load(leftSibling)) return lostWay = true, -1;
    current = keyCount - 1;
  }
  return KeyAt(current, key);
}

int32_t ZQDBFoxNode::FirstKey(ZQString& key) {
  if (!valid) {
    key = "";
    return -1;
  }
  if (child == nullptr) {
    current = -1;
    return NextKey(key);
  }
  current = 0;
  ZQDBFoxNode* below = Child();
  int32_t at = ChildAt(0);
  if ((below->where != at || !below->valid) && !below->Load(at)) return -1;
  return below->FirstKey(key);
}

int32_t ZQDBFoxNode::LastKey(ZQString& key) {
  if (!valid) {
    key = "";
    return -1;
  }
  if (child == nullptr) {
    current = keyCount;
    return PrevKey(key);
  }
  current = keyCount - 1;
  ZQDBFoxNode* below = Child();
  int32_t at = ChildAt(current);
  if ((below->where != at || !below->valid) && !below->Load(at)) return -1;
  return below->LastKey(key);
}

// Interior nodes choose the first entry whose key is not below the searched
// one, as AddKey does, so a key equal to a child's greatest is found there.
int32_t ZQDBFoxNode::FindKey(const ZQString& key, bool exact) {
  if (!valid || !Normalize(key)) return -1;
  const uint8_t* k = reinterpret_cast<const uint8_t*>(scratch.c_str());
  int i = LowerBound(k, 0, false, false);
  if (child != nullptr) {
    if (i == keyCount) i = keyCount - 1;
    current = i;
    ZQDBFoxNode* below = Child();
    int32_t at = ChildAt(i);
    if ((below->where != at || !below->valid) && !below->Load(at)) return -1;
    return below->FindKey(scratch, exact);
  }
  current = i;
  if (i == keyCount) return exact || keyCount == 0 ? -1 : int32_t(RecordAt(keyCount - 1)) - 1;
  if (exact && memcmp(KeyBytes(i), k, size_t(keyLength)) != 0) return -1;
  return int32_t(RecordAt(i)) - 1;
}

// ---------------------------------------------------------------------------
// ZQDBFoxNode: adding keys

bool ZQDBFoxNode::AddKey(ZQString& key, int32_t record) {
  if (record < 0 || !valid || !Normalize(key)) return false;
  const uint8_t* k = reinterpret_cast<const uint8_t*>(scratch.c_str());
  for (int tries = 0; tries < kMaxInsertTries; ++tries) {
    Outcome o = Insert(k, uint32_t(record));
    if (o != kRetry) return o == kDone;
  }
  return false;
}

// Adds the key below this node. Splits happen on the way down, before a
// node can overflow. A leaf that needs more than one split to take the key
// can fill its parent; the descent then starts again from the root, whose
// walk splits the full parent first.
ZQDBFoxNode::Outcome ZQDBFoxNode::Insert(const uint8_t* key, uint32_t record) {
  if (!valid) return kFailed;
  if (parent == nullptr) {
    bool room = CompactLeaf() ? PlanLeafInsert(key, record) : keyCount < Capacity();
    if (!room && !RootSplit()) return kFailed;
  }
  if (IsLeaf()) {
    if (compact) {
      if (!plan.valid || plan.record != record) PlanLeafInsert(key, record);
      return ApplyLeafInsert(key) ? kDone : kFailed;
    }
    if (keyCount >= Capacity()) return kFailed;
    InsertEntry(LowerBound(key, record, true, true), key, record, 0);
    return kDone;
  }
  // Equal keys stay in record order across leaves: compact interior entries
  // carry the greatest key's record number; non-compact ones don't, and an
  // equal key goes on to the child behind, where the later records are.
  int i = compact ? LowerBound(key, record, true, false) : LowerBound(key, 0, false, true);
  if (i == keyCount) {  // above everything below this node: the last entry takes the key
    i = keyCount - 1;
    uint8_t* e = raw + kHeader + i * EntrySize();
    memcpy(e, key, size_t(keyLength));
    if (compact) PutBe32(e + keyLength, record);
    dirty = true;
  }
  current = i;
  ZQDBFoxNode* below = Child();
  int32_t at = ChildAt(i);
  if ((below->where != at || !below->valid) && !below->Load(at)) return kFailed;
  while (!ChildHasRoom(key, record)) {
    if (keyCount >= Capacity()) return kRetry;
    if (!ChildSplit(key, record)) return kFailed;
  }
  return below->Insert(key, record);
}

bool ZQDBFoxNode::ChildHasRoom(const uint8_t* key, uint32_t record) {
  ZQDBFoxNode* below = Child();
  if (below->CompactLeaf()) return below->PlanLeafInsert(key, record);
  return below->keyCount < below->Capacity();
}

// The duplicate count of `key` after `prev` stops where the previous key's
// stored bytes end (at its trailing blanks); the trailing count counts the
// key's own trailing blanks. Both stay within their masks.
void ZQDBFoxNode::Counts(const uint8_t* prev, int prevTrail, const uint8_t* key, const Widths& w, int& dup,
                         int& trail) const {
  int d = 0;
  if (prev != nullptr) {
    int limit = keyLength - prevTrail < w.dupMask() ? keyLength - prevTrail : w.dupMask();
    while (d < limit && prev[d] == key[d]) ++d;
  }
  int t = 0;
  int limit = keyLength - d < w.trailMask() ? keyLength - d : w.trailMask();
  while (t < limit && key[keyLength - 1 - t] == ' ') ++t;
  dup = d;
  trail = t;
}

// Works out where the key goes in this compact leaf, its counts, the new
// counts of the key behind it, whether the leaf needs wider record numbers,
// and the bytes all that takes. True if they fit.
bool ZQDBFoxNode::PlanLeafInsert(const uint8_t* key, uint32_t record) {
  Plan& p = plan;
  p.record = record;
  p.widen = record > widths.recordMask();
  p.widths = p.widen ? WidthsFor(keyLength, record) : widths;
  const Widths& w = p.widths;
  auto capped = [](int v, int mask) { return v < mask ? v : mask; };
  int n = keyCount;
  p.at = LowerBound(key, record, true, true);
  int prevTrail = p.at > 0 ? capped(entries[p.at - 1].trail, w.trailMask()) : 0;
  Counts(p.at > 0 ? KeyBytes(p.at - 1) : nullptr, prevTrail, key, w, p.dup, p.trail);
  int need = w.entryBytes + keyLength - p.dup - p.trail;
  if (p.at < n) {
    int oldDup = capped(entries[p.at].dup, w.dupMask()), oldTrail = capped(entries[p.at].trail, w.trailMask());
    Counts(key, p.trail, KeyBytes(p.at), w, p.nextDup, p.nextTrail);
    need += oldDup + oldTrail - p.nextDup - p.nextTrail;
  }
  int available = freeBytes;
  if (p.widen) {
    int used = n * w.entryBytes;
    for (int i = 0; i < n; ++i)
      used += keyLength - capped(entries[i].dup, w.dupMask()) - capped(entries[i].trail, w.trailMask());
    available = kLeafArea - used;
  }
  p.need = need;
  p.valid = true;
  return need <= available;
}

bool ZQDBFoxNode::ApplyLeafInsert(const uint8_t* key) {
  Plan& p = plan;
  int n = keyCount;
  if (!p.valid || n >= kMaxLeafKeys || !keys.Allocate((n + 1) * keyLength)) return false;
  if (p.widen) {  // wider record numbers for the whole leaf; counts held to the new masks
    widths = p.widths;
    for (int i = 0; i < n; ++i) {
      if (entries[i].dup > widths.dupMask()) entries[i].dup = uint8_t(widths.dupMask());
      if (entries[i].trail > widths.trailMask()) entries[i].trail = uint8_t(widths.trailMask());
    }
  }
  uint8_t* slot = KeySlot(p.at);
  memmove(slot + keyLength, slot, size_t(n - p.at) * size_t(keyLength));
  memcpy(slot, key, size_t(keyLength));
  memmove(entries + p.at + 1, entries + p.at, size_t(n - p.at) * sizeof(Entry));
  entries[p.at] = Entry{p.record, uint8_t(p.dup), uint8_t(p.trail)};
  if (p.at < n) {
    entries[p.at + 1].dup = uint8_t(p.nextDup);
    entries[p.at + 1].trail = uint8_t(p.nextTrail);
  }
  keyCount = int16_t(n + 1);
  keys.SetLength(keyCount * keyLength);
  UsedBytes();
  dirty = true;
  p.valid = false;
  return freeBytes >= 0;
}

// Puts an entry into an interior node or a non-compact leaf at `at`.
void ZQDBFoxNode::InsertEntry(int at, const uint8_t* key, uint32_t record, int32_t below) {
  int size = EntrySize();
  uint8_t* e = raw + kHeader + at * size;
  memmove(e + size, e, size_t(keyCount - at) * size_t(size));
  memcpy(e, key, size_t(keyLength));
  if (IsLeaf()) {
    PutBe32(e + keyLength, record);
  } else if (compact) {
    PutBe32(e + keyLength, record);
    PutBe32(e + keyLength + 4, uint32_t(below));
  } else {
    PutBe32(e + keyLength, uint32_t(below));
  }
  ++keyCount;
  dirty = true;
}

// Where a full node splits: the last key of the lower half. From the middle,
// moved to the nearer end of a run of equal keys when one lies close by, so
// that a run stays in one block if it can. A compact leaf's upper half, whose
// first key is stored whole, must fit its block.
int ZQDBFoxNode::SplitPoint() const {
  int n = keyCount;
  int m = n / 2;
  const uint8_t* mid = KeyBytes(m);
  if (m - 2 > 1) {
    for (int s = 1; s < m - 2; ++s) {
      if (m + s < n && memcmp(KeyBytes(m + s), mid, size_t(keyLength)) != 0) {
        m = m + s - 1;
        break;
      }
      if (memcmp(KeyBytes(m - s), mid, size_t(keyLength)) != 0) {
        m = m - s;
        break;
      }
    }
  }
  if (m > n - 2) m = n - 2;
  while (CompactLeaf() && m < n - 2 && RangeBytes(m + 1, n - m - 1) > kLeafArea) ++m;
  return m;
}

void ZQDBFoxNode::PutLeafHeader(uint8_t* block, const Widths& w, int freeBytes) {
  PutLe16(block + kLeafFree, uint16_t(freeBytes));
  PutLe32(block + kLeafRecordMask, w.recordMask());
  block[kLeafDupMask] = uint8_t(w.dupMask());
  block[kLeafTrailMask] = uint8_t(w.trailMask());
  block[kLeafRecordBits] = uint8_t(w.recordBits);
  block[kLeafDupBits] = uint8_t(w.dupBits);
  block[kLeafTrailBits] = uint8_t(w.trailBits);
  block[kLeafEntryBytes] = uint8_t(w.entryBytes);
}

int16_t ZQDBFoxNode::Attribute() const {
  if (cdxAttr) return kAttrRoot | kAttrLeaf;
  return int16_t((parent == nullptr ? kAttrRoot : 0) | (child == nullptr ? kAttrLeaf : 0));
}

// A block of keys first .. first + count - 1 of this node, with the given
// siblings, in the form of the file.
void ZQDBFoxNode::EncodeBlock(uint8_t* out, int first, int count, int32_t left, int32_t right) const {
  memset(out, 0, kBlock);
  PutLe16(out + kBlkAttr, uint16_t(Attribute()));
  PutLe16(out + kBlkCount, uint16_t(count));
  PutLe32(out + kBlkLeft, uint32_t(left));
  PutLe32(out + kBlkRight, uint32_t(right));
  if (!CompactLeaf()) {
    memcpy(out + kHeader, KeyBytes(first), size_t(count) * size_t(EntrySize()));
    return;
  }
  const Widths& w = widths;
  PutLeafHeader(out, w, first == 0 && count == keyCount ? freeBytes : kLeafArea - RangeBytes(first, count));
  uint8_t* area = out + kLeafData;
  const uint8_t* key = KeyBytes(first);
  int keyPos = kLeafArea;
  for (int j = 0; j < count; ++j, key += keyLength) {
    const Entry& e = entries[first + j];
    int dup = j == 0 ? 0 : e.dup;
    int stored = keyLength - dup - e.trail;
    keyPos -= stored;
    memcpy(area + keyPos, key + dup, size_t(stored));
    uint64_t v = uint64_t(e.record & w.recordMask()) | uint64_t(dup) << w.recordBits |
                 uint64_t(e.trail) << (w.recordBits + w.dupBits);
    for (int b = 0; b < w.entryBytes; ++b) area[j * w.entryBytes + b] = uint8_t(v >> (8 * b));
  }
}

// Keeps keys first .. first + count - 1 in this object; the first of them
// loses its duplicate count.
void ZQDBFoxNode::KeepRange(int first, int count) {
  if (CompactLeaf()) {
    uint8_t* base = KeySlot(0);
    memmove(base, base + first * keyLength, size_t(count) * size_t(keyLength));
    memmove(entries, entries + first, size_t(count) * sizeof(Entry));
    if (count > 0) entries[0].dup = 0;
    keyCount = int16_t(count);
    keys.SetLength(count * keyLength);
    UsedBytes();
  } else {
    int size = EntrySize();
    memmove(raw + kHeader, raw + kHeader + first * size, size_t(count) * size_t(size));
    memset(raw + kHeader + count * size, 0, size_t(kArea - count * size));
    keyCount = int16_t(count);
  }
  plan.valid = false;
}

// Writes `block` behind the end of the file, at a whole number of blocks.
// Every new block is written at once, so that several index objects on one
// file never hand out the same place.
int32_t ZQDBFoxNode::Append(const uint8_t* block) {
  int32_t end = _lseek(fd, 0, 2);
  int32_t at = end < 0 ? -1 : RoundUpToBlock(end);
  if (at < 0 || at > INT32_MAX - kBlock || !WriteAt(fd, at, block, kBlock)) return -1;
  return at;
}

// The root takes a level above it: its content moves into a new object
// below, which keeps the old block, and the root moves to a new block at the
// end of the file with one entry naming that child.
bool ZQDBFoxNode::RootSplit() {
  if (keyCount < 1) return false;
  auto* below = new (std::nothrow) ZQDBFoxNode(*this);
  if (below == nullptr) return false;
  below->parent = this;
  if (below->child != nullptr) static_cast<ZQDBFoxNode*>(below->child)->parent = below;
  below->dirty = true;
  below->cdxAttr = false;
  below->plan.valid = false;
  cdxAttr = false;
  child = below;
  uint8_t last[ZQDBFoxIndex::kMaxKeyLength];
  int n = below->keyCount;
  memcpy(last, below->KeyBytes(n - 1), size_t(keyLength));
  uint32_t lastRecord = below->RecordAt(n - 1);
  isLeafBlock = false;
  memset(raw, 0, kBlock);
  keyCount = 0;
  current = 0;
  leftSibling = rightSibling = -1;
  plan.valid = false;
  keys.SetLength(0);
  maxKeys = int16_t(Capacity());
  InsertEntry(0, last, lastRecord, below->where);
  uint8_t block[kBlock];
  EncodeBlock(block, 0, keyCount, leftSibling, rightSibling);
  where = Append(block);
  if (where < 0) {
    valid = false;
    return false;
  }
  dirty = false;
  return true;
}

// Splits the full child that entry `current` names. The lower half moves to
// a new block at the end of the file, the upper half stays in place, so the
// entry that names the old block stays right and one entry, for the lower
// half, is added here. The child object ends holding the half for the key.
bool ZQDBFoxNode::ChildSplit(const uint8_t* key, uint32_t record) {
  ZQDBFoxNode* below = Child();
  int n = below->keyCount;
  if (n < 2 || keyCount >= Capacity()) return false;
  int m = below->SplitPoint();
  int32_t oldPlace = below->where, oldLeft = below->leftSibling, oldRight = below->rightSibling;
  uint8_t block[kBlock];
  below->EncodeBlock(block, 0, m + 1, oldLeft, oldPlace);
  int32_t newPlace = Append(block);
  if (newPlace < 0) return false;
  below->EncodeBlock(block, m + 1, n - m - 1, newPlace, oldRight);
  if (!WriteAt(fd, oldPlace, block, kBlock)) return false;
  if (oldLeft >= 0) {  // the left neighbour now precedes the new block
    uint8_t link[4];
    PutLe32(link, uint32_t(newPlace));
    if (!WriteAt(fd, oldLeft + kBlkRight, link, sizeof link)) return false;
  }
  uint8_t midKey[ZQDBFoxIndex::kMaxKeyLength];
  memcpy(midKey, below->KeyBytes(m), size_t(keyLength));
  uint32_t midRecord = below->RecordAt(m);
  InsertEntry(current, midKey, midRecord, newPlace);
  int c = memcmp(midKey, key, size_t(keyLength));
  bool toLower = c > 0 || (c == 0 && compact && midRecord >= record);
  if (toLower) {
    below->KeepRange(0, m + 1);
    below->where = newPlace;
    below->rightSibling = oldPlace;
  } else {
    below->KeepRange(m + 1, n - m - 1);
    below->leftSibling = newPlace;
    ++current;
  }
  below->dirty = false;  // both halves are on disk as they stand
  return true;
}

bool ZQDBFoxNode::WriteNode() {
  if (!valid || where < 0) return false;
  uint8_t block[kBlock];
  EncodeBlock(block, 0, keyCount, leftSibling, rightSibling);
  if (!WriteAt(fd, where, block, kBlock)) return false;
  dirty = false;
  return true;
}

bool ZQDBFoxNode::WriteChain() {
  bool good = !dirty || !valid || WriteNode();
  if (child != nullptr) good = static_cast<ZQDBFoxNode*>(child)->WriteChain() && good;
  return good;
}

// ---------------------------------------------------------------------------
// Checking the tree's structure

int32_t ZQDBFoxIndex::CheckTree(ZQString& findings, bool byValue) {
  if (!ok || fd < 0 || root == nullptr) return 0;
  ZQTreeCheck check(findings, _lseek(fd, 0, 2), keyLength, byValue);
  if (!check.Ready()) return check.Finish();
  // A node object of this index, cut loose from the chain, reads each block
  // as the walk in key order does; it is never dirty, so it writes nothing.
  auto* probe = new (std::nothrow) ZQDBFoxNode(*static_cast<ZQDBFoxNode*>(root));
  if (probe == nullptr) {
    check.Fault(-1, "not enough memory to walk the tree");
    return check.Finish();
  }
  probe->child = nullptr;
  probe->parent = nullptr;
  probe->cdxAttr = false;
  probe->Invalidate();
  if (CheckLink(check, headerWhere / ZQDBFoxNode::kBlock, -1, rootWhere, 0))
    CheckNode(check, *probe, rootWhere, 0, -1, {}, {});
  delete probe;
  return check.Finish();
}

bool ZQDBFoxIndex::CheckLink(ZQTreeCheck& check, int32_t from, int entry, int32_t at, int depth) const {
  const int32_t block = ZQDBFoxNode::kBlock;
  char name[40];
  if (entry < 0) snprintf(name, sizeof name, "the root link");
  else snprintf(name, sizeof name, "entry %d", entry);
  // The header at the start of the file (a CDX's tag list is compact, as
  // its tags are) and this index's own.
  const int32_t header = compact ? kHeaderCompact : kHeaderPlain;
  const char* problem = nullptr;
  if (at < 0 || int64_t(at) + block > int64_t(check.Units()) * block) problem = "which lies past the end of the file";
  else if (at % block != 0) problem = "which is not on a 512-byte block boundary";
  else if (at < header || (at >= headerWhere && at < headerWhere + header)) problem = "which lies in an index header";
  if (problem == nullptr) return true;
  if (at >= 0 && at % block == 0)
    check.Fault(from, "%s names block %d, %s", name, at / block, problem);
  else
    check.Fault(from, "%s names offset %d, %s", name, at, problem);
  check.LoseLevels(depth);
  return false;
}

void ZQDBFoxIndex::CheckNode(ZQTreeCheck& check, ZQDBFoxNode& probe, int32_t at, int depth, int32_t parent,
                             ZQTreeCheck::Bound lo, ZQTreeCheck::Bound hi) {
  const int32_t block = at / ZQDBFoxNode::kBlock;
  if (!check.Reach(block, parent)) {
    check.LoseLevels(depth);
    return;
  }
  if (depth > ZQTreeCheck::kLevels) {
    check.Fault(block, "lies more than %d levels below the root, deeper than any tree of this kind",
                ZQTreeCheck::kLevels);
    check.LoseLevels(depth);
    return;
  }
  if (probe.ReadNode(at) < 0) {
    // What ReadNode refused, from the block it read.
    const uint8_t* raw = probe.raw;
    const bool leaf = (GetLe16(raw + kBlkAttr) & kAttrLeaf) != 0;
    const int count = int16_t(GetLe16(raw + kBlkCount));
    const int room = leaf && compact ? ZQDBFoxNode::kMaxLeafKeys
                                     : ZQDBFoxNode::kArea / (keyLength + (leaf || !compact ? 4 : 8));
    if (count < 0 || count > room) check.Fault(block, "holds %d keys, more than the %d it has room for", count, room);
    else if (!leaf && count == 0) check.Fault(block, "an interior block with no keys");
    else check.Fault(block, "its compact leaf header or key entries make no sense: its keys can't be rebuilt");
    check.LoseLevels(depth);
    return;
  }
  const int n = probe.keyCount;
  // One writer (Perl XBase) leaves 0 for "none" in the links of a root it
  // made; no block can stand at offset 0, and nothing follows a root's links.
  const int32_t left = depth == 0 && probe.leftSibling == 0 ? -1 : probe.leftSibling;
  const int32_t right = depth == 0 && probe.rightSibling == 0 ? -1 : probe.rightSibling;
  if (probe.IsLeaf()) {
    check.Keys(block, n, probe.KeyBytes(0), probe.CompactLeaf() ? keyLength : probe.EntrySize(), lo, hi);
    if (!check.Leaf(block, depth)) {
      check.LoseLevels(depth);
      return;
    }
    check.Siblings(depth, at, left, right);
    return;
  }
  // The entries stay here while the probe reads the blocks below.
  uint8_t* p = check.Buffer(depth, ZQDBFoxNode::kBlock);
  if (p == nullptr) {
    check.Fault(block, "not enough memory to walk the tree this deep");
    check.LoseLevels(depth);
    return;
  }
  memcpy(p, probe.raw, ZQDBFoxNode::kBlock);
  const int size = probe.EntrySize();
  const uint8_t* entries = p + ZQDBFoxNode::kHeader;
  check.Keys(block, n, entries, size, lo, hi);
  check.Siblings(depth, at, left, right);
  for (int i = 0; i < n; ++i) {
    const uint8_t* e = entries + i * size;
    const int32_t child = int32_t(GetBe32(e + size - 4));
    ZQTreeCheck::Bound below = i > 0 ? ZQTreeCheck::Bound{e - size, block} : lo;
    if (CheckLink(check, block, i, child, depth + 1))
      CheckNode(check, probe, child, depth + 1, block, below, ZQTreeCheck::Bound{e, block});
  }
}
