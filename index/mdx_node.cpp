// The B-tree nodes of MDX tags and NDX files: reading, walking, adding keys
// with the splits on the way down, writing blocks, and checking the whole
// tree's structure.
#include <cstdio>
#include <cstring>
#include <new>

#include "host/endian.h"
#include "host/platform.h"
#include "index/mdx.h"

namespace {

// MDX node block: keys in the node (4), link (4), entries; behind the last
// entry a word that is 0 in a leaf and names the last child in an interior
// node. NDX node block: keys in the node (4), entries, the last child's slot.
constexpr int32_t kNodeKeyCount = 0, kMdxNodeLink = 4;
constexpr int32_t kMdxNodeHeader = 8, kNdxNodeHeader = 4;
// Within an entry: MDX child or record (4), key; NDX child (4), record (4), key.
constexpr int32_t kEntryChild = 0, kMdxEntryKey = 4, kNdxEntryRecord = 4, kNdxEntryKey = 8;

constexpr int32_t kUnit = 512;

// A record number of the file (from 1) as the key operations give it (from
// 0); one that can't be a record's (0, or negative in a damaged file) is -1.
int32_t FromFile(int32_t record) { return record > 0 ? record - 1 : -1; }

// The end of the file rounded up to a whole unit: where a new block goes.
int32_t NewBlockOffset(int fd) {
  int32_t end = _lseek(fd, 0, 2);
  if (end < 0 || end > INT32_MAX - 2 * kUnit) return -1;
  return (end + kUnit - 1) / kUnit * kUnit;
}

}  // namespace

ZQDBMdxNode::ZQDBMdxNode(ZQDBMdx* owner, ZQDBNodeBase* parent, int16_t keyLength, int16_t entrySize, int fd,
                         int32_t where, int32_t maxKeys, int16_t blockSize)
    : ZQDBNodeBase(parent, keyLength, fd, where), entrySize(entrySize), blockSize(blockSize), owner(owner),
      ndx(false) {
  this->maxKeys = int16_t(maxKeys);
  Load(false);
}

ZQDBMdxNode::ZQDBMdxNode(ZQDBMdx* owner, ZQDBNodeBase* parent, int16_t keyLength, int16_t entrySize, int fd,
                         int32_t where, int32_t maxKeys, bool ndx)
    : ZQDBNodeBase(parent, keyLength, fd, where), entrySize(entrySize), blockSize(kUnit), owner(owner), ndx(ndx) {
  this->maxKeys = int16_t(maxKeys);
}

ZQDBNdxNode::ZQDBNdxNode(ZQDBMdx* owner, ZQDBNodeBase* parent, int16_t keyLength, int16_t entrySize, int fd,
                         int32_t where, int32_t maxKeys)
    : ZQDBMdxNode(owner, parent, keyLength, entrySize, fd, where, maxKeys, true) {
  Load(true);
}

ZQDBMdxNode::~ZQDBMdxNode() {
  if (dirty) WriteNode();
}

void ZQDBMdxNode::Load(bool asNdx) {
  header = int16_t(asNdx ? kNdxNodeHeader : kMdxNodeHeader);
  keyOffset = int16_t(asNdx ? kNdxEntryKey : kMdxEntryKey);
  if (!block.Allocate(blockSize)) return;
  block.SetLength(blockSize);
  if (Depth() > kMaxDepth) return;  // a chain this deep is a cycle of blocks
  int32_t start = where;
  where = -1;
  int32_t kind = ReadNode(start);
  if (kind < 0) return;
  if (kind == 0) {
    ok = true;
    return;
  }
  int32_t first = ChildAt(0);
  if (first <= 0 || first > INT32_MAX / kUnit) return;
  ZQDBMdxNode* c = asNdx ? new (std::nothrow) ZQDBNdxNode(owner, this, keyLength, entrySize, fd, first * kUnit,
                                                         maxKeys)
                         : new (std::nothrow) ZQDBMdxNode(owner, this, keyLength, entrySize, fd, first * kUnit,
                                                         maxKeys, blockSize);
  child = c;
  ok = c != nullptr && c->ok;
}

int32_t ZQDBMdxNode::RecordAt(int i) { return int32_t(GetLe32(Entry(i) + (ndx ? kNdxEntryRecord : kEntryChild))); }

int32_t ZQDBMdxNode::ChildAt(int i) {
  if (i < keyCount || ndx) return int32_t(GetLe32(Entry(i) + kEntryChild));
  return link;
}

void ZQDBMdxNode::SetLastChild(int32_t blockNumber) {
  if (ndx) PutLe32(Entry(keyCount) + kEntryChild, uint32_t(blockNumber));
  else link = blockNumber;
}

int ZQDBMdxNode::CompareKey(int i, const ZQString& key) {
  int32_t n = key.length() < keyLength ? key.length() : keyLength;
  int c = memcmp(KeyAt(i), key.c_str(), size_t(n));
  if (c != 0) return c;
  return keyLength == key.length() ? 0 : keyLength > key.length() ? 1 : -1;
}

int32_t ZQDBMdxNode::ReadNode(int32_t at) {
  if (at < 0 || _lseek(fd, at, 0) != at) return -1;
  uint8_t* p = reinterpret_cast<uint8_t*>(block.GetBuffer());
  if (_read(fd, p, uint32_t(blockSize)) != blockSize) {
    where = -1;  // the buffer no longer holds the block it held
    return -1;
  }
  // More keys than the block holds, with the word or slot behind them, is damage.
  int32_t n = int32_t(GetLe32(p + kNodeKeyCount));
  int32_t room = (blockSize - header - 4) / entrySize;
  if (n < 0 || n > room) {
    where = -1;
    keyCount = 0;
    return -1;
  }
  where = at;
  dirty = false;
  keyCount = int16_t(n);
  if (ndx) {
    leafNode = GetLe32(Entry(0) + kEntryChild) == 0;
  } else {
    link = int32_t(GetLe32(p + kMdxNodeLink));
    int32_t after = int32_t(GetLe32(Entry(n)));
    leafNode = after == 0;
    // The last child: the word behind the last entry, as other programs write
    // it; a word that is the link as a byte offset names the link's block.
    if (!leafNode && !(link != 0 && int64_t(after) == int64_t(link) * kUnit)) link = after;
  }
  return leafNode ? 0 : 1;
}

bool ZQDBMdxNode::Move(int32_t blockNumber) {
  if (blockNumber <= 0 || blockNumber > INT32_MAX / kUnit) return false;
  int32_t at = blockNumber * kUnit;
  if (at == where) return true;
  if (dirty) WriteNode();
  int32_t kind = ReadNode(at);
  if (kind < 0) return false;
  if ((kind == 0) != (child == nullptr)) {
    // A leaf where interior nodes stand, or the other way round: damage.
    where = -1;
    keyCount = 0;
    leafNode = child == nullptr;
    return false;
  }
  return true;
}

bool ZQDBMdxNode::WriteNode() {
  if (where < 0) return false;
  uint8_t* p = reinterpret_cast<uint8_t*>(block.GetBuffer());
  PutLe32(p + kNodeKeyCount, uint32_t(keyCount));
  uint8_t* end = Entry(keyCount);
  if (ndx) {
    if (leafNode) PutLe32(end + kEntryChild, 0);
    end += 4;
  } else {
    int32_t last = leafNode ? 0 : link;
    PutLe32(p + kMdxNodeLink, uint32_t(link));
    PutLe32(end, uint32_t(last));
    end += 4;
  }
  memset(end, 0, size_t(p + blockSize - end));
  if (_lseek(fd, where, 0) != where) return false;
  if (_write(fd, p, uint32_t(blockSize)) != blockSize) return false;
  dirty = false;
  return true;
}

int32_t ZQDBMdxNode::Give(ZQString& key) {
  if (current < 0 || current >= keyCount) {
    key = "";
    return -1;
  }
  key.CopyN(reinterpret_cast<const char*>(KeyAt(current)), keyLength, 0);
  return FromFile(RecordAt(current));
}

int32_t ZQDBMdxNode::CurrentKey(ZQString& key) {
  if (child != nullptr) return child->CurrentKey(key);
  return Give(key);
}

int32_t ZQDBMdxNode::FirstKey(ZQString& key) {
  if (child != nullptr) {
    if (!Child()->Move(ChildAt(0))) return -1;
    current = 0;
    return child->FirstKey(key);
  }
  current = 0;
  return Give(key);
}

int32_t ZQDBMdxNode::LastKeyImpl(ZQString& key) {
  if (child != nullptr) {
    if (!Child()->Move(ChildAt(keyCount))) return -1;
    current = keyCount;
    return child->LastKey(key);
  }
  current = keyCount - 1;
  return Give(key);
}

int32_t ZQDBMdxNode::GetRight() {
  if (current + 1 <= keyCount) {
    ++current;
    return ChildAt(current);
  }
  if (parent == nullptr) return -1;
  int32_t b = static_cast<ZQDBMdxNode*>(parent)->GetRight();
  if (b <= 0) return -1;
  if (!Move(b)) return lostWay = true, -1;
  current = 0;
  return ChildAt(0);
}

int32_t ZQDBMdxNode::GetLeft() {
  if (current > 0) {
    current = (current > keyCount ? keyCount : current) - 1;
    return ChildAt(current);
  }
  if (parent == nullptr) return -1;
  int32_t b = static_cast<ZQDBMdxNode*>(parent)->GetLeft();
  if (b <= 0) return -1;
  if (!Move(b)) return lostWay = true, -1;
  current = keyCount;
  return ChildAt(keyCount);
}

int32_t ZQDBMdxNode::NextKey(ZQString& key) {
  if (child != nullptr) return child->NextKey(key);
  if (current + 1 >= keyCount) {
    current = keyCount;
    if (parent == nullptr) return Give(key);
    int32_t b = static_cast<ZQDBMdxNode*>(parent)->GetRight();
    if (b <= 0 || !Move(b)) {
      if (b > 0) lostWay = true;
      key = "";
      return -1;
    }
    current = 0;
  } else {
    ++current;
  }
  return Give(key);
}

int32_t ZQDBMdxNode::PrevKeyImpl(ZQString& key) {
  if (child != nullptr) return child->PrevKey(key);
  if (current > 0) {
    current = (current > keyCount ? keyCount : current) - 1;
  } else {
    if (parent == nullptr) {
      key = "";
      return -1;
    }
    int32_t b = static_cast<ZQDBMdxNode*>(parent)->GetLeft();
    if (b <= 0 || !Move(b)) {
      if (b > 0) lostWay = true;
      key = "";
      return -1;
    }
    current = keyCount - 1;
  }
  return Give(key);
}

int32_t ZQDBMdxNode::FindKey(const ZQString& key, bool exact) {
  // An exact search compares whole stored keys: the key held to their length.
  if (exact && key.length() != keyLength) {
    ZQString held(key);
    if (held.length() > keyLength) held.Remove(held.length() - keyLength, keyLength);
    else held.Pad('\0', keyLength - held.length());
    return FindKey(held, exact);
  }
  int i = 0;
  while (i < keyCount && CompareKey(i, key) < 0) ++i;
  current = i;
  if (child != nullptr) {
    if (!Child()->Move(ChildAt(i))) return -1;
    return child->FindKey(key, exact);
  }
  if (i == keyCount) return exact || keyCount == 0 ? -1 : FromFile(RecordAt(keyCount - 1));
  if (exact && CompareKey(i, key) != 0) return -1;
  return FromFile(RecordAt(i));
}

bool ZQDBMdxNode::AddKey(ZQString& key, int32_t record) {
  // A stored key fills the key length: longer keys are cut, shorter ones
  // filled up with zero bytes, before any comparison, so that the order in
  // the tree is the order of the stored bytes.
  if (key.length() > keyLength) key.Remove(key.length() - keyLength, keyLength);
  else if (key.length() < keyLength) key.Pad('\0', keyLength - key.length());
  if (parent == nullptr && keyCount >= maxKeys && !RootSplit()) return false;
  if (child != nullptr) {
    int i = 0;
    while (i < keyCount && CompareKey(i, key) < 0) ++i;
    if (!Child()->Move(ChildAt(i))) return false;
    current = i;
    if (Child()->keyCount >= Child()->maxKeys && !ChildSplit(key)) return false;
    return child->AddKey(key, record);
  }
  if (keyCount >= (blockSize - header - 4) / entrySize) return false;
  // Equal keys stand in the order of their record number's stored bytes.
  uint8_t rec[4];
  PutLe32(rec, uint32_t(record));
  int32_t recAt = ndx ? kNdxEntryRecord : kEntryChild;
  int i = 0;
  for (; i < keyCount; ++i) {
    int c = memcmp(KeyAt(i), key.c_str(), size_t(keyLength));
    if (c > 0 || (c == 0 && memcmp(Entry(i) + recAt, rec, 4) > 0)) break;
  }
  memmove(Entry(i + 1), Entry(i), size_t((keyCount - i) * entrySize));
  uint8_t* e = Entry(i);
  memset(e, 0, size_t(entrySize));
  memcpy(e + recAt, rec, 4);
  memcpy(e + keyOffset, key.c_str(), size_t(keyLength));
  ++keyCount;
  dirty = true;
  return true;
}

bool ZQDBMdxNode::RootSplit() {
  ZQDBMdxNode* copy = ndx ? new (std::nothrow) ZQDBNdxNode(static_cast<ZQDBNdxNode&>(*this))
                          : new (std::nothrow) ZQDBMdxNode(*this);
  if (copy == nullptr || copy->block.length() != blockSize) {
    if (copy != nullptr) copy->child = nullptr;  // the chain stays this node's
    delete copy;
    return false;
  }
  int32_t at = NewBlockOffset(fd);
  if (at < 0) {
    copy->child = nullptr;
    copy->dirty = false;
    delete copy;
    return false;
  }
  copy->parent = this;
  if (copy->child != nullptr) static_cast<ZQDBMdxNode*>(copy->child)->parent = copy;
  copy->dirty = true;
  where = at;
  keyCount = 0;
  current = 0;
  child = copy;
  leafNode = false;
  memset(block.GetBuffer(), 0, size_t(blockSize));
  SetLastChild(copy->where / kUnit);
  dirty = true;
  WriteNode();
  owner->AddedNode();
  return true;
}

bool ZQDBMdxNode::ChildSplit(const ZQString& key) {
  ZQDBMdxNode* c = Child();
  int n = c->keyCount;
  if (n < 3) return false;
  // The split point: the last entry of the left part of a leaf, the entry
  // whose key goes up from an interior node. Equal keys stay together where
  // a run of them ends near the middle; a run that fills the middle is split
  // at the middle, so that any number of equal keys goes in.
  int half = n / 2;
  int s = -1;
  const uint8_t* mid = c->KeyAt(half);
  for (int i = 1; i < half; ++i) {
    if (memcmp(c->KeyAt(half + i), mid, size_t(keyLength)) != 0) {
      s = half + i - 1;
      break;
    }
    if (memcmp(c->KeyAt(half - i), mid, size_t(keyLength)) != 0) {
      s = half - i;
      if (i >= s) s = -1;  // too few entries would stay on the left
      break;
    }
  }
  if (s < 0) s = half;
  ZQString& midKey = splitKey;
  midKey.CopyN(reinterpret_cast<const char*>(c->KeyAt(s)), keyLength, 0);
  int32_t at = NewBlockOffset(fd);
  if (at < 0) return false;
  int32_t newBlock = at / kUnit;
  ZQString& saved = splitBlock;
  saved.CopyN(c->block.c_str(), blockSize, 0);
  const uint8_t* old = reinterpret_cast<const uint8_t*>(saved.c_str()) + c->header;
  int32_t oldLink = c->link;
  bool leafChild = c->leafNode;
  // Right part: stays in the old block, which the parent already names.
  int keep = n - s - 1;
  memmove(c->Entry(0), c->Entry(s + 1), size_t(keep * entrySize + (ndx && !leafChild ? 4 : 0)));
  c->keyCount = int16_t(keep);
  if (leafChild && !ndx) c->link = newBlock;  // leaves are linked to the left
  c->dirty = true;
  c->WriteNode();
  // Left part: to the new block at the end of the file.
  int left = leafChild ? s + 1 : s;
  memcpy(c->Entry(0), old, size_t(left * entrySize + (ndx && !leafChild ? 4 : 0)));
  c->keyCount = int16_t(left);
  if (!ndx) c->link = leafChild ? oldLink : int32_t(GetLe32(old + s * entrySize + kEntryChild));
  c->where = at;
  c->dirty = true;
  c->WriteNode();
  owner->AddedNode();
  // The parent names the left part in a new entry before the old one.
  int pos = current;
  memmove(Entry(pos + 1), Entry(pos), size_t((keyCount - pos) * entrySize + (ndx ? 4 : 0)));
  uint8_t* e = Entry(pos);
  memset(e, 0, size_t(entrySize));
  PutLe32(e + kEntryChild, uint32_t(newBlock));
  memcpy(e + keyOffset, midKey.c_str(), size_t(keyLength));
  ++keyCount;
  dirty = true;
  current = pos + 1;
  if (midKey >= key) current = pos;
  return c->Move(ChildAt(current));
}

// ---------------------------------------------------------------------------
// Checking the tree's structure

namespace {

// The first block a node can be in: behind the tag table of an MDX file,
// behind the header block of an NDX file.
constexpr int32_t kMdxFirstNodeBlock = 2048 / kUnit, kNdxFirstNodeBlock = 1;

// "entry 3", "the last child link" or "the root link", for people.
const char* LinkName(int entry, int keys, char (&out)[40]) {
  if (entry < 0) return "the root link";
  if (entry >= keys) return "the last child link";
  snprintf(out, sizeof out, "entry %d", entry);
  return out;
}

}  // namespace

int32_t ZQDBMdx::CheckTree(ZQString& findings, bool byValue) {
  if (!ok || fd == -1 || root == nullptr) return 0;
  ZQTreeCheck check(findings, _lseek(fd, 0, 2), keyLength, byValue);
  if (!check.Ready()) return check.Finish();
  const int32_t header = isMdx ? headerBlock : 0;
  const int32_t rootBlock = rootOffset / kUnit;
  int32_t end = 0, nodes = 0;
  if (CheckLink(check, header, -1, 0, rootBlock)) CheckNode(check, rootBlock, 0, -1, {}, {}, end, nodes);
  if (isMdx) {
    // New blocks go where the file header's next free block says, for other
    // programs; one that lies inside the tree would be overwritten.
    uint8_t next[4];
    if (_lseek(fd, kMdxNextFree, 0) == kMdxNextFree && _read(fd, next, 4) == 4 && int32_t(GetLe32(next)) < end)
      check.Fault(0, "the file header's next free block %d lies inside this tag's tree, whose blocks reach block %d",
                  int32_t(GetLe32(next)), end - 1);
    if (int64_t(blockCount) < int64_t(nodes) * blockUnits)
      check.Fault(header, "the tag header counts %d units of blocks, fewer than the %d of the %d blocks its tree uses",
                  blockCount, nodes * blockUnits, nodes);
  }
  return check.Finish();
}

bool ZQDBMdx::CheckLink(ZQTreeCheck& check, int32_t from, int entry, int keys, int32_t block) const {
  char name[40];
  const int32_t first = isMdx ? kMdxFirstNodeBlock : kNdxFirstNodeBlock;
  if (block >= 0 && block < first) {
    check.Fault(from, "%s names block %d, which lies in the file's header", LinkName(entry, keys, name), block);
    return false;
  }
  if (block < 0 || int64_t(block) * kUnit + blockSize > int64_t(check.Units()) * kUnit) {
    check.Fault(from, "%s names block %d, which lies past the end of the file (%d blocks of 512 bytes)",
                LinkName(entry, keys, name), block, check.Units());
    return false;
  }
  if ((block - first) % blockUnits != 0) {
    check.Fault(from, "%s names block %d, which is not on a block boundary (blocks of %d units begin at block %d)",
                LinkName(entry, keys, name), block, blockUnits, first);
    return false;
  }
  return true;
}

void ZQDBMdx::CheckNode(ZQTreeCheck& check, int32_t block, int depth, int32_t parent, ZQTreeCheck::Bound lo,
                        ZQTreeCheck::Bound hi, int32_t& end, int32_t& nodes) {
  if (!check.Reach(block, parent)) return;
  if (depth > ZQTreeCheck::kLevels) {
    check.Fault(block, "lies more than %d levels below the root, deeper than any tree of this kind",
                ZQTreeCheck::kLevels);
    return;
  }
  uint8_t* p = check.Buffer(depth, blockSize);
  if (p == nullptr) {
    check.Fault(block, "not enough memory to walk the tree this deep");
    return;
  }
  if (_lseek(fd, block * kUnit, 0) != block * kUnit || _read(fd, p, uint32_t(blockSize)) != blockSize) {
    check.Fault(block, "can't be read");
    return;
  }
  ++nodes;
  if (block + blockUnits > end) end = block + blockUnits;
  const int32_t header = isMdx ? kMdxNodeHeader : kNdxNodeHeader;
  const int32_t keyAt = isMdx ? kMdxEntryKey : kNdxEntryKey;
  const int32_t n = int32_t(GetLe32(p + kNodeKeyCount));
  const int32_t room = (blockSize - header - 4) / entrySize;
  if (n < 0 || n > room) {
    check.Fault(block, "holds %d keys, more than the %d it has room for", n, room);
    return;
  }
  const uint8_t* entries = p + header;
  check.Keys(block, n, entries + keyAt, entrySize, lo, hi);
  // As ReadNode tells them apart: an NDX leaf names no child in its first
  // slot; an MDX leaf has a zero word behind its last entry, which in an
  // interior node names the last child (the link, as a block number, when
  // the word is the link as a byte offset).
  int32_t last = 0;
  bool leaf;
  if (!isMdx) {
    leaf = GetLe32(entries + kEntryChild) == 0;
  } else {
    const int32_t link = int32_t(GetLe32(p + kMdxNodeLink));
    last = int32_t(GetLe32(entries + n * entrySize));
    leaf = last == 0;
    if (link != 0 && int64_t(last) == int64_t(link) * kUnit) last = link;
  }
  if (leaf) {
    if (check.Leaf(block, depth) && n == 0 && depth > 0)
      check.Fault(block, "an empty leaf below the root: the walk in key order stops there");
    return;
  }
  for (int i = 0; i <= n; ++i) {
    const int32_t child = i < n || !isMdx ? int32_t(GetLe32(entries + i * entrySize + kEntryChild)) : last;
    ZQTreeCheck::Bound below = i > 0 ? ZQTreeCheck::Bound{entries + (i - 1) * entrySize + keyAt, block} : lo;
    ZQTreeCheck::Bound above = i < n ? ZQTreeCheck::Bound{entries + i * entrySize + keyAt, block} : hi;
    if (CheckLink(check, block, i, n, child)) CheckNode(check, child, depth + 1, block, below, above, end, nodes);
  }
}
