// FoxPro index files: the single index of an IDX file (compact or not), the
// tags of a CDX file, and a CDX's tag list.
//
// Both file kinds are B-trees of 512-byte blocks behind an index header. All
// numbers are little-endian but the record numbers and child offsets inside
// interior entries and non-compact leaf entries, which are big-endian.
//
// Index header (512 bytes non-compact, 1024 compact), at `headerWhere`:
//   OFFSET SIZE  FIELD
//      0     4   root block offset
//      4     4   free list (-1 new non-compact, 0 compact); kept as read
//      8     4   non-compact: file length; compact: 0
//     12     2   key length
//     14     1   options: 0x01 unique, 0x20 compact, 0xC0 tag list of a CDX
//     15     1   signature: 1 compact, 0 non-compact
//     16   496   non-compact: key expression, NUL-padded
//    504     6   compact: 16-bit words 10, 1, 0
//    510     2   compact: expression length with its NUL
//    512   512   compact: key expression, NUL-padded
//
// Block header, every node:
//      0     2   attributes: bit 0 root, bit 1 leaf
//      2     2   key count
//      4     4   left sibling (-1 none)
//      8     4   right sibling (-1 none)
// Interior nodes and non-compact leaves: fixed entries from offset 12 (key,
// then for compact interiors the record number, then the child offset or, in
// a non-compact leaf, the record number). A compact leaf has a 12-byte leaf
// header (free bytes, record mask, count masks and bit widths, entry bytes)
// and a 488-byte area: entries from its start, key bytes packed from its end.
//
// A CDX's tag list is a compact index of key length 10 whose keys are tag
// names and whose record numbers are the tags' header offsets.
#pragma once

#include <cstdint>

#include "index/dbindex.h"
#include "index/tree_check.h"

class ZQDBFoxNode;

class ZQ_EXPORT ZQDBFoxIndex : public ZQDBIndexBase {
 public:
  // Longest key a Fox index holds: two keys and their entries must fit one
  // compact leaf, and three entries one interior block.
  static constexpr int kMaxKeyLength = 240;
  // A tag's header offset is a record number of the tag list, whose 16 record
  // bits other programs rely on: tags begin below this offset.
  static constexpr int32_t kMaxTagOffset = 65536;

  // Opens the index whose header is at the start of `path`: the tag list of
  // a CDX file.
  explicit ZQDBFoxIndex(const char* path);
  // Opens an existing index: `name` with an extension is an IDX file's path,
  // without one a tag of the CDX at `basepath` (the table's path without its
  // extension). `taglist` is made when null and kept by the caller.
  ZQDBFoxIndex(const char* basepath, const char* name, ZQDBFoxIndex*& taglist);
  // Builds a new, empty index over `keyfields`: an IDX file (compact as
  // def.Compress() says) when `name` has an extension, else a compact CDX tag
  // appended to the CDX at `basepath`, which is made from scratch when
  // `taglist` is null.
  ZQDBFoxIndex(const char* basepath, const char* name, const ZQRecord& keyfields, ZQIndexDef& def,
               ZQDBFoxIndex*& taglist);
  // Brings the header and the changed blocks up to date if keys were added.
  ~ZQDBFoxIndex() override;
  ZQDBFoxIndex(const ZQDBFoxIndex&) = delete;
  ZQDBFoxIndex& operator=(const ZQDBFoxIndex&) = delete;

  // Offers the tags of the table's CDX (beside `tablepath`) to `spoke`.
  static void BuildIndexList(const char* tablepath, ZQSpoke* spoke, ZQDBFoxIndex*& taglist);
  // The key expression and the unique flag of the IDX file at `path`.
  static bool ReadExpression(const char* path, ZQString& expr, bool& unique);

  bool Unique() const { return unique; }
  bool Compact() const { return compact; }
  int16_t KeyLength() const { return keyLength; }
  // The key expression as the header holds it.
  void Expression(ZQString& out) const { out = expression; }
  // Why the index is not OK; "" when it is.
  const char* Reason() const { return reason; }
  // Writes the header and every changed block now. False if a write failed.
  bool Flush();
  // Walks every block of the tree once: each lies in the file on a block
  // boundary outside the index headers and is reached from one parent, holds
  // no more keys than its block has room for (an interior block at least
  // one), in order and within the keys its parent holds for it; the leaves
  // lie at one depth, and the sibling links of each level follow its blocks
  // in key order, with none outside the first and the last.
  int32_t CheckTree(ZQString& findings, bool byValue) override;

 private:
  ZQDBFoxIndex();
  void BuildNewHeader(int32_t where, ZQString& buffer, int keyLength, bool dups, const ZQRecord* keyfields,
                      bool tagList);
  void BuildRootNode(int32_t where, ZQString& buffer, int keyLength);
  void ReadHeader();
  bool OpenTagList(const char* path, ZQDBFoxIndex*& taglist);
  void CreateTag(const char* path, const char* name, int32_t length, const ZQRecord& keyfields,
                 const ZQIndexDef& def, ZQDBFoxIndex*& taglist);
  bool Fail(const char* why);
  // CheckTree: whether the link `entry` of block `from` (-1: the header's
  // root link) names a place a block can be in (told if not); and the walk
  // of the subtree at byte offset `at`, with `probe` reading its blocks.
  bool CheckLink(ZQTreeCheck& check, int32_t from, int entry, int32_t at, int depth) const;
  void CheckNode(ZQTreeCheck& check, ZQDBFoxNode& probe, int32_t at, int depth, int32_t parent,
                 ZQTreeCheck::Bound lo, ZQTreeCheck::Bound hi);

  int32_t headerWhere = 0;
  int32_t rootWhere = 0;
  int32_t freeList = 0;
  int32_t fileEnd = 0;
  int16_t keyLength = 0;
  bool compact = false;
  bool unique = false;
  ZQString expression;
  const char* reason = "";
};

class ZQ_EXPORT ZQDBFoxNode : public ZQDBNodeBase {
 public:
  // Bytes of a block, of its header, of the data area below the header and
  // of a compact leaf's data area.
  static constexpr int kBlock = 512, kHeader = 12, kArea = 500, kLeafArea = 488;

  // Loads the block at `where` and the chain below it down to the leftmost
  // leaf. Not OK when a block can't be read, makes no sense, or the chain
  // grows deeper than kMaxDepth.
  ZQDBFoxNode(ZQDBNodeBase* parent, int16_t keyLength, int fd, int32_t where, bool compact);
  ~ZQDBFoxNode() override;
  ZQDBFoxNode(const ZQDBFoxNode&) = default;
  ZQDBFoxNode& operator=(const ZQDBFoxNode&) = delete;

  // The tag list's root is written with attributes 3 until it splits.
  void SetCDXAttr() { cdxAttr = true; }

  int32_t CurrentKey(ZQString& key) override;
  int32_t NextKey(ZQString& key) override;
  int32_t PrevKey(ZQString& key) override;
  // Positions on the first key not less than `key` (blank-padded or cut to
  // the key length first). With `exact`, -1 when that key differs.
  int32_t FindKey(const ZQString& key, bool exact) override;
  // Adds `key` for `record` (from 1); keys are blank-padded or cut to the
  // key length. False when a block could not be read or written.
  bool AddKey(ZQString& key, int32_t record) override;
  int32_t FirstKey(ZQString& key) override;
  int32_t LastKey(ZQString& key) override;
  bool WriteNode() override;
  // Writes this block if it changed, then the chain below it.
  bool WriteChain();

 private:
  // Widths of a compact leaf's entry fields.
  struct Widths {
    int entryBytes = 3;
    int recordBits = 16;
    int dupBits = 4;
    int trailBits = 4;
    uint32_t recordMask() const { return recordBits >= 32 ? 0xFFFFFFFFu : (1u << recordBits) - 1; }
    int dupMask() const { return (1 << dupBits) - 1; }
    int trailMask() const { return (1 << trailBits) - 1; }
  };
  // One key of a compact leaf: record number, duplicate and trailing count.
  struct Entry {
    uint32_t record;
    uint8_t dup;
    uint8_t trail;
  };
  // What adding one key to this compact leaf takes; valid until it changes.
  struct Plan {
    bool valid = false;
    uint32_t record = 0;
    int at = 0;
    int dup = 0, trail = 0;        // the new key's counts
    int nextDup = 0, nextTrail = 0;  // the following key's counts behind it
    bool widen = false;
    Widths widths;
    int need = 0;
  };
  enum Outcome { kFailed, kDone, kRetry };
  static constexpr int kMaxLeafKeys = kLeafArea;

  friend class ZQDBFoxIndex;
  static Widths TableWidths(int keyLength);
  static Widths WidthsFor(int keyLength, uint32_t record);
  // A compact leaf's own header: free bytes, masks, bit widths, entry bytes.
  static void PutLeafHeader(uint8_t* block, const Widths& w, int freeBytes);

  int32_t ReadNode(int32_t where);
  int32_t DecodeCompactKey(ZQString& key, int index);
  int32_t DecodeCompactKey(ZQString& key, int index, int& keyPos);
  int32_t DecodeStep(uint8_t* base, int index, int& keyPos);
  bool RootSplit();
  bool ChildSplit(const uint8_t* key, uint32_t record);

  bool IsLeaf() const { return isLeafBlock; }
  bool CompactLeaf() const { return compact && isLeafBlock; }
  ZQDBFoxNode* Child() const { return static_cast<ZQDBFoxNode*>(child); }
  // Bytes of an entry in an interior block or a non-compact leaf.
  int EntrySize() const { return keyLength + (IsLeaf() || !compact ? 4 : 8); }
  int Capacity() const { return kArea / EntrySize(); }
  int16_t Attribute() const;
  // Re-reads this object from `at` (saving a changed block first); false if
  // the block can't be read or is not of this level's kind.
  bool Load(int32_t at);
  void Invalidate();
  void UsedBytes();
  int RangeBytes(int first, int count) const;
  Outcome Insert(const uint8_t* key, uint32_t record);
  bool PlanLeafInsert(const uint8_t* key, uint32_t record);
  bool ApplyLeafInsert(const uint8_t* key);
  void InsertEntry(int at, const uint8_t* key, uint32_t record, int32_t child);
  bool ChildHasRoom(const uint8_t* key, uint32_t record);
  int SplitPoint() const;
  void EncodeBlock(uint8_t* out, int first, int count, int32_t left, int32_t right) const;
  void KeepRange(int first, int count);
  int32_t Append(const uint8_t* block);
  int32_t KeyAt(int i, ZQString& key) const;
  const uint8_t* KeyBytes(int i) const;
  uint8_t* KeySlot(int i);
  uint32_t RecordAt(int i) const;
  int32_t ChildAt(int i) const;
  int Compare(int i, const uint8_t* key, uint32_t record, bool withRecord) const;
  int LowerBound(const uint8_t* key, uint32_t record, bool withRecord, bool upper) const;
  void Counts(const uint8_t* prev, int prevTrail, const uint8_t* key, const Widths& w, int& dup,
              int& trail) const;
  int32_t BlocksInFile() const;
  bool Normalize(const ZQString& key);

  bool compact;
  bool cdxAttr = false;
  // The object holds a block that loaded and made sense.
  bool valid = false;
  bool isLeafBlock = true;
  int32_t leftSibling = -1;
  int32_t rightSibling = -1;
  int freeBytes = 0;
  Widths widths;
  Plan plan;
  // The block as read (interior nodes and non-compact leaves work on it),
  // and 8 bytes of room behind it for whole-word reads of entries.
  uint8_t raw[kBlock + 8] = {};
  // A compact leaf, decoded: keyCount keys of keyLength bytes each.
  ZQString keys;
  Entry entries[kMaxLeafKeys + 1] = {};
  // The key being added or searched, blank-padded to the key length.
  ZQString scratch;
  // The last key DecodeCompactKey rebuilt.
  ZQString decoded;
};
