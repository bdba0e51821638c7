// dBASE indexes: tags of a multiple index file (MDX) and single index files
// (NDX). One ZQDBMdx object stands for one index; its chain of nodes is of
// ZQDBMdxNode (MDX) or ZQDBNdxNode (NDX).
//
// MDX file (all integers little-endian; block numbers count 512-byte units):
//   OFFSET SIZE  WHAT
//      0    512  file header
//    512     32  head entry of the tag table (byte 17: first tag of the name tree)
//    544  32 x n tag entries
//   2048         blocks: a tag header block and its nodes for each tag (block 4 on)
// NDX file: a 512-byte header at block 0, then 512-byte nodes.
//
// Every interior node, in both kinds, has n keys and n + 1 children: entry i
// names the child holding keys not above key i, and the last child (keys above
// them all) is named apart: in an MDX node by the link word at offset 4 and
// again by the word behind the last entry, in an NDX node by the child field
// of slot n.
#pragma once

#include <cstdint>

#include "index/dbindex.h"
#include "index/tree_check.h"

// MDX file header.
constexpr int32_t kMdxVersion = 0, kMdxCreated = 1, kMdxDataName = 4, kMdxBlockUnits = 20,
                  kMdxBlockSize = 22, kMdxProduction = 24, kMdxTagCapacity = 25, kMdxEntryLength = 26,
                  kMdxTagsInUse = 28, kMdxNextFree = 32, kMdxUpdated = 44;
constexpr int32_t kMdxDataNameSize = 16;
// The tag table: head entry at 512, tag entries from 544 up to block 4.
constexpr int32_t kMdxTableHead = 512, kMdxFirstTag = 544, kMdxTagEntrySize = 32;
constexpr int32_t kMdxMaxTags = (2048 - kMdxFirstTag) / kMdxTagEntrySize;  // 47
// Tag table entry.
constexpr int32_t kTagHeaderBlock = 0, kTagName = 4, kTagKeyFormat = 15, kTagLeft = 16, kTagRight = 17,
                  kTagParent = 18, kTagTwo = 19, kTagKeyType = 20;
constexpr int32_t kTagNameSize = 11;  // ten bytes and the NUL
// Tag header block (and, at the same offsets, the NDX header's first words).
constexpr int32_t kIdxRoot = 0, kIdxBlockCount = 4, kTagUniqueBits = 8, kTagHeaderKeyType = 9,
                  kIdxKeyLength = 12, kIdxKeysPerNode = 14, kNdxKeyType = 16, kTagEntrySize = 18,
                  kNdxEntrySize = 18, kIdxUnique = 23, kIdxExpression = 24;
constexpr int32_t kTagHeaderWritten = 125;  // bytes of a tag header this system writes
constexpr int32_t kMdxExpressionMax = kTagHeaderWritten - kIdxExpression - 1;  // 100
constexpr int32_t kNdxExpressionMax = 512 - kIdxExpression - 1;

class ZQDBMdxNode;

class ZQ_EXPORT ZQDBMdx : public ZQDBIndexBase {
 public:
  // Opens a tag of the MDX file of `table` (path without extension), or the
  // NDX file `tag` when its extension is "ndx".
  ZQDBMdx(const char* table, const char* tag);
  // Creates that tag or NDX file for `def`, empty of keys.
  ZQDBMdx(const char* table, const char* tag, const ZQRecord& fields, ZQIndexDef* def);
  ~ZQDBMdx() override;

  // Lists the tags of the table's MDX file to the host.
  static void BuildIndexList(const char* table, ZQSpoke* spoke);
  // Called for each block added to the tree.
  void AddedNode();

  // What the header says, for reports.
  bool IsMdx() const { return isMdx; }
  const char* Expression() const { return expression.c_str(); }
  bool Unique() const { return unique; }
  // "C", "D" or "N" from an MDX tag header; 0 for NDX, which doesn't say.
  char KeyType() const { return keyType; }
  int16_t KeyLength() const { return keyLength; }

  // Walks every block of the tree once: each lies in the file on a block
  // boundary and is reached from one parent, holds no more keys than its
  // block has room for, in order and within the keys its parent holds for
  // it; the leaves lie at one depth, and only the root may be an empty leaf.
  // For an MDX tag, the file header's next free block and the tag's block
  // count lie beyond the blocks the tree uses.
  int32_t CheckTree(ZQString& findings, bool byValue) override;

 private:
  friend class ZQDBMdxNode;
  friend class ZQDBNdxNode;

  void ReadHeader(int32_t block, ZQString& scratch);
  bool BuildMdxFile(const char* path, const char* tag, const ZQRecord& fields, ZQIndexDef* def);
  bool BuildNdxFile(const ZQRecord& fields, ZQIndexDef* def);
  void UpdateDescriptions(int count, ZQString& table);
  // CheckTree: whether the link `entry` of block `from` (-1: the header's
  // root link; the key count: the last child link) names a block a node can
  // be in (told if not); and the walk of the subtree at `block`, which
  // raises `end` to the unit behind each block and counts the blocks.
  bool CheckLink(ZQTreeCheck& check, int32_t from, int entry, int keys, int32_t block) const;
  void CheckNode(ZQTreeCheck& check, int32_t block, int depth, int32_t parent, ZQTreeCheck::Bound lo,
                 ZQTreeCheck::Bound hi, int32_t& end, int32_t& nodes);

  int32_t maxKeys = 0;
  int32_t rootOffset = 0;
  int32_t blockCount = 0;
  int16_t blockUnits = 1;
  int16_t blockSize = 512;
  int16_t keyLength = 0;
  int16_t entrySize = 0;
  ZQDType shortType{DT_SHORT};
  ZQDType longType{DT_LONG};
  bool isMdx = true;
  // Block number of this tag's header, where the close writes the root and
  // the block count back; -1 for NDX.
  int32_t headerBlock = -1;
  ZQString expression;
  bool unique = false;
  char keyType = 0;
};

// One level of an MDX tag's tree (and, with the NDX layout, of an NDX file's).
// `block` holds the whole block of the level that is current.
class ZQ_EXPORT ZQDBMdxNode : public ZQDBNodeBase {
 public:
  ZQDBMdxNode(ZQDBMdx* owner, ZQDBNodeBase* parent, int16_t keyLength, int16_t entrySize, int fd,
              int32_t where, int32_t maxKeys, int16_t blockSize);
  ZQDBMdxNode(const ZQDBMdxNode&) = default;
  ~ZQDBMdxNode() override;

  int32_t CurrentKey(ZQString& key) override;
  int32_t NextKey(ZQString& key) override;
  int32_t FindKey(const ZQString& key, bool exact) override;
  bool AddKey(ZQString& key, int32_t record) override;
  int32_t FirstKey(ZQString& key) override;
  bool WriteNode() override;

 protected:
  // The NDX layout: 512-byte blocks, a 4-byte header, entries of child,
  // record and key, the last child in slot n.
  ZQDBMdxNode(ZQDBMdx* owner, ZQDBNodeBase* parent, int16_t keyLength, int16_t entrySize, int fd,
              int32_t where, int32_t maxKeys, bool ndx);
  void Load(bool ndx);
  // Walking backwards, for the kinds that allow it.
  int32_t PrevKeyImpl(ZQString& key);
  int32_t LastKeyImpl(ZQString& key);

  // -1 on failure, else 1 for an interior block and 0 for a leaf.
  int32_t ReadNode(int32_t where);
  // Brings `block` (a block number) into this object, saving a changed block
  // first. False when it can't be read or isn't of this level's kind.
  bool Move(int32_t block);
  bool RootSplit();
  bool ChildSplit(const ZQString& key);
  int32_t GetRight();
  int32_t GetLeft();

  // Entry layout.
  uint8_t* Entry(int i) { return reinterpret_cast<uint8_t*>(block.GetBuffer()) + header + i * entrySize; }
  const uint8_t* KeyAt(int i) { return Entry(i) + keyOffset; }
  int32_t RecordAt(int i);
  // Block number of child i; i == keyCount is the last child.
  int32_t ChildAt(int i);
  void SetLastChild(int32_t blockNumber);
  bool IsLeaf() const { return leafNode; }
  ZQDBMdxNode* Child() { return static_cast<ZQDBMdxNode*>(child); }
  // Key i against `key` in the order of ZQString: <0, 0, >0.
  int CompareKey(int i, const ZQString& key);
  int32_t Give(ZQString& key);

  ZQString block;
  int32_t link = 0;  // MDX: left sibling of a leaf, last child of an interior node
  int16_t entrySize;
  int16_t blockSize;
  ZQDBMdx* owner;
  bool ndx;
  int16_t header;     // bytes before the first entry: 8 MDX, 4 NDX
  int16_t keyOffset;  // key within an entry: 4 MDX, 8 NDX
  bool leafNode = true;
  // Scratch of the splits of this node's child, kept so that a split
  // allocates nothing once they have grown.
  ZQString splitBlock;
  ZQString splitKey;
};

class ZQ_EXPORT ZQDBNdxNode : public ZQDBMdxNode {
 public:
  ZQDBNdxNode(ZQDBMdx* owner, ZQDBNodeBase* parent, int16_t keyLength, int16_t entrySize, int fd,
              int32_t where, int32_t maxKeys);
  ZQDBNdxNode(const ZQDBNdxNode&) = default;
  int32_t PrevKey(ZQString& key) override { return PrevKeyImpl(key); }
  int32_t LastKey(ZQString& key) override { return LastKeyImpl(key); }
};
