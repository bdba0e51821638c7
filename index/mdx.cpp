// ZQDBMdx: opening, listing, creating and closing MDX tags and NDX files.
#include "index/mdx.h"

#include <cstdio>
#include <cstring>
#include <new>

#include "host/endian.h"
#include "host/platform.h"
#include "host/zqdate.h"
#include "host/zqglob.h"
#include "host/zqutil.h"

namespace {

constexpr int32_t kUnit = 512;
constexpr int32_t kFileHeaderRead = 48;
constexpr int32_t kTagHeaderRead = 128;
// The block size of MDX files made here, and the units of 512 bytes in it.
constexpr int16_t kMdxBlockBytes = 1024, kMdxUnits = 2;
// Units that a new tag takes: its header block and its root, two each.
constexpr int32_t kNewTagUnits = 4;
// Fewer keys than this in a node can't be split into two parts and a key.
constexpr int32_t kMinKeysPerNode = 3;

bool HasExtension(const char* path, const char* ext) {
  size_t n = strlen(path);
  char name[4096], found[4096];
  if (n >= sizeof name) return false;
  char copy[4096];
  memcpy(copy, path, n + 1);
  ZQGlob::sepfile(copy, name, found);
  return strcmpi(found, ext) == 0;
}

void TodayBytes(uint8_t out[3]) {
  ZQDate today;
  out[0] = uint8_t(today.Year() % 100);
  out[1] = uint8_t(today.Month());
  out[2] = uint8_t(today.Day());
}

// The table's path rebuilt from `table` with the extension `ext`.
bool SiblingPath(const char* table, const char* ext, char (&out)[4096]) {
  size_t n = strlen(table);
  if (n + 5 >= sizeof out) return false;
  char name[4096], extension[4096];
  memcpy(out, table, n + 1);
  ZQGlob::sepfile(out, name, extension);
  ZQGlob::appndnam(out, name);
  ZQGlob::appndext(out, ext);
  return true;
}

bool ReadAt(int fd, int32_t at, void* buffer, int32_t n) {
  return at >= 0 && _lseek(fd, at, 0) == at && _read(fd, buffer, uint32_t(n)) == n;
}

bool WriteAt(int fd, int32_t at, const void* buffer, int32_t n) {
  return at >= 0 && _lseek(fd, at, 0) == at && _write(fd, buffer, uint32_t(n)) == n;
}

// The text of an index expression in a header: up to its NUL, at most `max` bytes.
void TakeExpression(ZQString& out, const char* p, int32_t max) {
  int32_t n = 0;
  while (n < max && p[n] != '\0') ++n;
  out.CopyN(p, n, 0);
}

}  // namespace

// ---------------------------------------------------------------------------
// Opening

ZQDBMdx::ZQDBMdx(const char* table, const char* tag) {
  shortType.MSBFirst(false);
  longType.MSBFirst(false);
  ZQString scratch;
  if (!scratch.Allocate(kTagHeaderRead)) return;
  if (HasExtension(tag, "ndx")) {
    OpenExisting(tag);
    blockUnits = 1;
    blockSize = kUnit;
    isMdx = false;
    ReadHeader(0, scratch);
    return;
  }
  char path[4096];
  size_t n = strlen(table);
  if (n + 5 >= sizeof path) return;
  memcpy(path, table, n + 1);
  ZQGlob::appndext(path, "mdx");
  OpenExisting(path);
  if (fd == -1) return;
  uint8_t head[kFileHeaderRead];
  if (!ReadAt(fd, 0, head, kFileHeaderRead)) return;
  blockUnits = int16_t(GetLe16(head + kMdxBlockUnits));
  blockSize = int16_t(GetLe16(head + kMdxBlockSize));
  // A node must be whole units long and hold a few keys; any other size is
  // damage, and reading by it would run off the buffers.
  if (blockUnits < 1 || blockUnits > 32 || blockSize != blockUnits * kUnit) return;
  int count = int8_t(head[kMdxTagCapacity]);
  if (count <= 0) return;
  // The table area ends where block 4 begins.
  if (count > kMdxMaxTags) count = kMdxMaxTags;
  for (int i = 0; i < count; ++i) {
    uint8_t entry[kMdxTagEntrySize];
    if (!ReadAt(fd, kMdxFirstTag + kMdxTagEntrySize * i, entry, kMdxTagEntrySize)) return;
    char name[kTagNameSize + 1] = {};
    memcpy(name, entry + kTagName, kTagNameSize);
    if (strcmpi(name, tag) == 0) {
      ReadHeader(int32_t(GetLe32(entry + kTagHeaderBlock)), scratch);
      return;
    }
  }
}

void ZQDBMdx::ReadHeader(int32_t block, ZQString& scratch) {
  if (fd == -1 || block < 0 || block > INT32_MAX / kUnit) return;
  int32_t want = isMdx ? kTagHeaderRead : kUnit;
  if (!scratch.Allocate(want)) return;
  char* p = scratch.GetBuffer();
  const uint8_t* u = reinterpret_cast<const uint8_t*>(p);
  if (!ReadAt(fd, block * kUnit, p, want)) return;
  scratch.SetLength(want);
  int32_t rootBlock = int32_t(GetLe32(u + kIdxRoot));
  blockCount = int32_t(GetLe32(u + kIdxBlockCount));
  if (isMdx && p[kTagHeaderKeyType] != 'C') ConsolePrintf("Ooops, not a character index\n");
  keyLength = int16_t(GetLe16(u + kIdxKeyLength));
  maxKeys = int16_t(GetLe16(u + kIdxKeysPerNode));
  entrySize = int16_t(GetLe16(u + kTagEntrySize));
  unique = isMdx ? u[kIdxUnique] == 0x40 : u[kIdxUnique] != 0;
  keyType = isMdx ? p[kTagHeaderKeyType] : 0;
  TakeExpression(expression, p + kIdxExpression, want - kIdxExpression);
  // Numbers a node can't hold are damage: refuse them before they size a walk.
  int32_t header = isMdx ? 8 : 4;
  int32_t keyAt = isMdx ? 4 : 8;
  if (keyLength < 1 || entrySize < keyLength + keyAt || rootBlock <= 0 || rootBlock > INT32_MAX / kUnit) return;
  int32_t room = (blockSize - header - 4) / entrySize;
  if (room < kMinKeysPerNode) return;
  if (maxKeys < kMinKeysPerNode || maxKeys > room) maxKeys = room;
  if (isMdx) headerBlock = block;
  rootOffset = rootBlock * kUnit;
  ZQDBMdxNode* node =
      isMdx ? new (std::nothrow) ZQDBMdxNode(this, nullptr, keyLength, entrySize, fd, rootOffset, maxKeys, blockSize)
            : new (std::nothrow) ZQDBNdxNode(this, nullptr, keyLength, entrySize, fd, rootOffset, maxKeys);
  root = node;
  if (node != nullptr && node->OK()) {
    leaf = root->FindLeaf();
    ok = true;
    position = 0;
  }
}

void ZQDBMdx::BuildIndexList(const char* table, ZQSpoke* spoke) {
  char path[4096];
  spoke->ClearIndices();
  if (!SiblingPath(table, "mdx", path)) return;
  if (_access(path, 0) != 0) return;
  FILE* f = _fsopen(path, "rb", 0x20);
  if (f == nullptr) return;
  uint8_t head[kFileHeaderRead];
  if (fread(head, 1, kFileHeaderRead, f) != size_t(kFileHeaderRead) || head[kMdxVersion] != 2) {
    fclose(f);
    return;
  }
  int count = GetLe16(head + kMdxTagsInUse);
  if (count > kMdxMaxTags) count = kMdxMaxTags;  // the table area holds no more
  for (int i = 0; i < count; ++i) {
    uint8_t entry[kMdxTagEntrySize];
    if (fseek(f, kMdxFirstTag + kMdxTagEntrySize * i, SEEK_SET) != 0 ||
        fread(entry, 1, kMdxTagEntrySize, f) != size_t(kMdxTagEntrySize))
      break;
    uint32_t block = GetLe32(entry + kTagHeaderBlock);
    char name[kTagNameSize + 1] = {};
    memcpy(name, entry + kTagName, kTagNameSize);
    char header[kTagHeaderRead + 1] = {};
    if (block > uint32_t(INT32_MAX / kUnit) || fseek(f, long(block) * kUnit, SEEK_SET) != 0 ||
        fread(header, 1, kTagHeaderRead, f) != size_t(kTagHeaderRead))
      break;
    ZQIndexDef* def = new (std::nothrow) ZQIndexDef;
    if (def == nullptr) break;
    def->Dups(uint8_t(header[kIdxUnique]) != 0x40);
    def->Name(name);
    ZQString expression;
    TakeExpression(expression, header + kIdxExpression, kTagHeaderRead - kIdxExpression);
    if (ZQDBIndexBase::ParseExpr(expression, def, spoke)) {
      spoke->AddIndex(def);
    } else {
      ConsolePrintf("Parse failed on ``%s''\n", expression.c_str());
      delete def;
    }
  }
  fclose(f);
}

void ZQDBMdx::AddedNode() {
  blockCount += blockUnits;
  dirty = true;
}

// ---------------------------------------------------------------------------
// Closing

ZQDBMdx::~ZQDBMdx() {
  if (dirty && fd != -1 && root != nullptr) {
    uint8_t words[8];
    PutLe32(words, uint32_t(root->Where() / kUnit));
    PutLe32(words + 4, uint32_t(blockCount));
    if (!isMdx) {
      WriteAt(fd, 0, words, 8);
    } else if (headerBlock >= 0) {
      // The tag header names the root as it is now, so that the file reopens
      // with all its keys; the file header's next free block and update date
      // are kept true for other programs.
      WriteAt(fd, headerBlock * kUnit, words, 8);
      int32_t end = _lseek(fd, 0, 2);
      if (end > 0) {
        uint8_t next[4];
        PutLe32(next, uint32_t((end + kUnit - 1) / kUnit));
        WriteAt(fd, kMdxNextFree, next, 4);
      }
      uint8_t today[3];
      TodayBytes(today);
      WriteAt(fd, kMdxUpdated, today, 3);
    }
  }
}

// ---------------------------------------------------------------------------
// Creating

ZQDBMdx::ZQDBMdx(const char* table, const char* tag, const ZQRecord& fields, ZQIndexDef* def) {
  shortType.MSBFirst(false);
  longType.MSBFirst(false);
  bool built;
  if (HasExtension(tag, "ndx")) {
    fd = _open(tag, kRtReadWrite | kRtCreate | kRtTruncate | kRtBinary);
    isMdx = false;
    blockUnits = 1;
    blockSize = kUnit;
    built = BuildNdxFile(fields, def);
  } else {
    char path[4096];
    size_t n = strlen(table);
    if (n + 5 >= sizeof path) return;
    memcpy(path, table, n + 1);
    ZQGlob::appndext(path, "mdx");
    isMdx = true;
    fd = _open(path, kRtReadWrite | kRtCreate | kRtBinary);
    built = BuildMdxFile(path, tag, fields, def);
  }
  if (built) this->fields = fields;
}

namespace {

// The key length of a new index: the bytes of the keys BuildKey makes, so
// that a numeric or date key (8 bytes) is stored whole whatever its field's
// width; the sum of the field widths for a definition without segments.
int32_t NewKeyLength(const ZQRecord& fields, const ZQIndexDef* def) {
  if (def->SegCount() > 0) return ZQDBIndexBase::KeyFormLength(def);
  int32_t n = 0;
  for (int i = 0; i < fields.FieldCount(); ++i) n += fields[i]->Length();
  return n;
}

char KeyTypeOf(const ZQRecord& fields) {
  if (fields.FieldCount() != 1) return 'C';
  switch (fields[0]->FieldType()) {
    case FT_DATE:
    case FT_DATETIME: return 'D';
    case FT_INTEGER:
    case FT_FLOAT:
    case FT_NUMERIC:
    case FT_CURRENCY: return 'N';
    default: return 'C';
  }
}

}  // namespace

bool ZQDBMdx::BuildMdxFile(const char* path, const char* tag, const ZQRecord& fields, ZQIndexDef* def) {
  if (fd == -1 || fields.FieldCount() < 1) return false;
  // Names and texts longer than their fields would shift what follows them:
  // such a definition is refused, and the file stays as it was.
  ZQString text;
  PrintExpr(text, def);
  if (strlen(tag) >= size_t(kTagNameSize) || tag[0] == '\0' || text.length() > kMdxExpressionMax) return false;
  int32_t length = NewKeyLength(fields, def);
  int32_t entry = (length + 7) & ~3;
  if (length < 1 || (kMdxBlockBytes - 12) / entry < kMinKeysPerNode) return false;
  uint8_t today[3];
  TodayBytes(today);
  if (_lseek(fd, 0, 2) == 0) {
    uint8_t head[kUnit + kMdxTagEntrySize] = {};
    head[kMdxVersion] = 2;
    memcpy(head + kMdxCreated, today, 3);
    // The table's base name; a longer one is cut to the field, NUL-ended.
    char dir[4096], name[4096], ext[4096];
    size_t n = strlen(path);
    if (n >= sizeof dir) return false;
    memcpy(dir, path, n + 1);
    ZQGlob::sepfile(dir, name, ext);
    size_t nameLength = strlen(name);
    if (nameLength > size_t(kMdxDataNameSize - 1)) nameLength = kMdxDataNameSize - 1;
    memcpy(head + kMdxDataName, name, nameLength);
    PutLe16(head + kMdxBlockUnits, kMdxUnits);
    PutLe16(head + kMdxBlockSize, kMdxBlockBytes);
    head[kMdxTagCapacity] = 48;
    PutLe16(head + kMdxEntryLength, kMdxTagEntrySize);
    PutLe32(head + kMdxNextFree, 4);
    memcpy(head + kMdxUpdated, today, 3);
    head[kUnit + kTagRight] = 1;  // the head entry names the first tag
    if (!WriteAt(fd, 0, head, sizeof head)) return false;
  }
  uint8_t head[kFileHeaderRead];
  if (!ReadAt(fd, 0, head, kFileHeaderRead)) return false;
  blockUnits = int16_t(GetLe16(head + kMdxBlockUnits));
  blockSize = int16_t(GetLe16(head + kMdxBlockSize));
  if (blockSize != kMdxBlockBytes || blockUnits != kMdxUnits) return false;
  int tags = int8_t(head[kMdxTagsInUse]) + 1;
  if (tags < 1 || tags > kMdxMaxTags) return false;  // the tag table is full
  int32_t block = int32_t(GetLe32(head + kMdxNextFree));
  if (block < 4 || block > INT32_MAX / kUnit - kNewTagUnits) return false;
  uint8_t counts[8];
  counts[0] = uint8_t(tags);
  if (!WriteAt(fd, kMdxTagsInUse, counts, 1)) return false;
  PutLe32(counts, uint32_t(block + kNewTagUnits));
  if (!WriteAt(fd, kMdxNextFree, counts, 4)) return false;
  // The tag table from the head entry to the new tag's entry.
  ZQString table;
  int32_t tableBytes = (tags + 1) * kMdxTagEntrySize;
  if (!table.Allocate(tableBytes)) return false;
  if (!ReadAt(fd, kMdxTableHead, table.GetBuffer(), tags * kMdxTagEntrySize)) return false;
  uint8_t* t = reinterpret_cast<uint8_t*>(table.GetBuffer());
  uint8_t* e = t + tags * kMdxTagEntrySize;
  memset(e, 0, kMdxTagEntrySize);
  PutLe32(e + kTagHeaderBlock, uint32_t(block));
  memcpy(e + kTagName, tag, strlen(tag));
  e[kTagKeyFormat] = fields.FieldCount() == 1 ? 0x10 : 0;
  e[kTagTwo] = 2;
  char type = KeyTypeOf(fields);
  e[kTagKeyType] = uint8_t(type);
  table.SetLength(tableBytes);
  UpdateDescriptions(tags + 1, table);
  if (!WriteAt(fd, kMdxTableHead, table.c_str(), tableBytes)) return false;
  // The tag header, then an empty root in the block behind it.
  uint8_t header[kTagHeaderWritten] = {};
  PutLe32(header + kIdxRoot, uint32_t(block + blockUnits));
  PutLe32(header + kIdxBlockCount, uint32_t(blockUnits));
  header[kTagUniqueBits] = def->Dups() ? 0 : 0x40;
  header[kTagHeaderKeyType] = uint8_t(type);
  PutLe16(header + kIdxKeyLength, uint16_t(length));
  PutLe32(header + kIdxKeysPerNode, uint32_t((blockSize - 12) / entry));
  PutLe16(header + kTagEntrySize, uint16_t(entry));
  header[kIdxUnique] = def->Dups() ? 0 : 0x40;
  memcpy(header + kIdxExpression, text.c_str(), size_t(text.length()));
  if (!WriteAt(fd, block * kUnit, header, kTagHeaderWritten)) return false;
  ZQString rootBlock;
  if (!rootBlock.Set('\0', blockSize)) return false;
  if (!WriteAt(fd, (block + blockUnits) * kUnit, rootBlock.c_str(), blockSize)) return false;
  ZQString scratch;
  ReadHeader(block, scratch);
  return ok;
}

void ZQDBMdx::UpdateDescriptions(int count, ZQString& table) {
  struct Node {
    int left, right, parent;
    ZQString name;
  };
  Node nodes[kMdxMaxTags + 1];
  uint8_t* t = reinterpret_cast<uint8_t*>(table.GetBuffer());
  int tags = count - 1;
  for (int i = 0; i < tags && i <= kMdxMaxTags; ++i) {
    const char* name = reinterpret_cast<const char*>(t + (i + 1) * kMdxTagEntrySize + kTagName);
    nodes[i].left = nodes[i].right = nodes[i].parent = 0;
    nodes[i].name = ZQString(name, int32_t(strnlen(name, kTagNameSize)));
    if (i == 0) continue;
    int at = 0;
    // Each step goes one level down a tree of at most `tags` nodes.
    for (int steps = 0; steps <= tags; ++steps) {
      int& next = nodes[i].name < nodes[at].name ? nodes[at].left : nodes[at].right;
      if (next == 0) {
        next = i + 1;
        nodes[i].parent = at + 1;
        break;
      }
      at = next - 1;
    }
  }
  for (int i = 0; i < tags && i <= kMdxMaxTags; ++i) {
    uint8_t* e = t + (i + 1) * kMdxTagEntrySize;
    e[kTagLeft] = uint8_t(nodes[i].left);
    e[kTagRight] = uint8_t(nodes[i].right);
    e[kTagParent] = uint8_t(nodes[i].parent);
  }
}

bool ZQDBMdx::BuildNdxFile(const ZQRecord& fields, ZQIndexDef* def) {
  if (fd == -1 || fields.FieldCount() < 1) return false;
  ZQString text;
  PrintExpr(text, def);
  if (text.length() > kNdxExpressionMax) return false;
  int32_t length = NewKeyLength(fields, def);
  int32_t entry = (length + 11) & ~3;
  if (length < 1 || (kUnit - 8) / entry < kMinKeysPerNode) return false;
  uint8_t file[2 * kUnit] = {};
  PutLe32(file + kIdxRoot, 1);
  PutLe32(file + kIdxBlockCount, 2);
  PutLe16(file + kIdxKeyLength, uint16_t(length));
  PutLe16(file + kIdxKeysPerNode, uint16_t(504 / entry));
  PutLe32(file + kNdxEntrySize, uint32_t(entry));
  file[kIdxUnique] = def->Dups() ? 0 : 1;
  memcpy(file + kIdxExpression, text.c_str(), size_t(text.length()));
  if (_write(fd, file, sizeof file) != int32_t(sizeof file)) return false;
  ZQString scratch;
  ReadHeader(0, scratch);
  return ok;
}
