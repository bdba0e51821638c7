// The index core shared by every index kind (NDX, MDX tags, IDX, CDX tags):
// key expressions, key bytes, and the two abstract classes of an index and
// of one level of its B-tree.
//
// An index object owns one file descriptor and a chain of node objects, one
// per tree level from the root down to a leaf. Moving through the tree
// re-reads a level's object from another block; only a root split adds an
// object. Record numbers are counted from 0 at ZQDBIndexBase and from 1 in the
// nodes and the files. Every key operation gives the record number of the key
// it stands on, or -1 for no key, the end, and any failure alike.
#pragma once

#include <cstdint>

#include "connector/export.h"
#include "host/zqdtype.h"
#include "host/zqfield.h"
#include "host/zqspoke.h"
#include "host/zqstring.h"

class ZQDBNodeBase;

class ZQ_EXPORT ZQDBIndexBase {
 public:
  // Opens `path` read-write; a failed open leaves the object not OK.
  explicit ZQDBIndexBase(const char* path);
  virtual ~ZQDBIndexBase();
  ZQDBIndexBase(const ZQDBIndexBase&) = default;
  ZQDBIndexBase& operator=(const ZQDBIndexBase&) = delete;

  bool OK() const { return ok; }
  void SetFields(const ZQRecord& f) { fields = f; }

  // The cursor by ordinal: one step per key from where it stands.
  virtual int32_t GetRecord(int32_t n);
  virtual int32_t GetFirst();
  virtual int32_t GetNext();
  // Adds a key for `record` (from 0). `key` may come back changed.
  virtual bool AddKey(ZQString& key, int32_t record);
  virtual void BuildKey(ZQString& key, const ZQIndexDef* def);
  virtual int32_t FindKey(const ZQString& key, bool exact);
  virtual int32_t NextKey(ZQString& key);
  virtual int32_t CurrentKey(ZQString& key);
  virtual int32_t FirstKey(ZQString& key);
  // Walking backwards, where the index kind can (NDX, IDX, CDX): the last key,
  // then the one before. -1 where it can't.
  virtual int32_t LastKey(ZQString& key);
  virtual int32_t PrevKey(ZQString& key);
  // True when the last walk ended at damage (a block that couldn't be read,
  // a walk longer than the file can hold) rather than at its last key.
  bool Broken() const;
  // Walks every block of the tree from the root, as the file holds it (an
  // index that was given keys may hold changed blocks that aren't written
  // yet), and appends a line "block N: what is wrong" to `findings` for each
  // fault of structure; N counts 512-byte units in every kind. Reads only,
  // bounded by the file's size. `byValue` compares 8-byte keys as the
  // doubles they hold, in the order of their values (as dBASE and libxbase64
  // order numeric and date keys), rather than by their bytes. The number of
  // faults; 0 for an index that isn't open.
  virtual int32_t CheckTree(ZQString& findings, bool byValue) {
    (void)findings;
    (void)byValue;
    return 0;
  }

  static const char* GetToken(const char* p, ZQString& token);
  static bool ParseExpr(ZQString& expression, ZQIndexDef* def, ZQSpoke* spoke);
  static void PrintExpr(ZQString& text, ZQIndexDef* def);
  // Bytes of the key that BuildKey makes for `def`: 8 for a date or numeric
  // segment, the field's width for a text one.
  static int32_t KeyFormLength(const ZQIndexDef* def);

 protected:
  ZQDBIndexBase();
  // A walk may take no more steps than the file can hold keys: damage (a
  // cycle of blocks) ends it instead of looping. False once that is spent.
  bool Step();
  void ResetSteps();
  // Opens an existing index file read-write, or read-only where the file
  // allows no more: walking and seeking need no write, and AddKey then
  // refuses. Sets `fd`.
  void OpenExisting(const char* path);

  ZQRecord fields;
  int32_t position = -1;
  int fd = -1;
  bool readOnly = false;
  bool dirty = false;
  ZQDBNodeBase* root = nullptr;
  ZQDBNodeBase* leaf = nullptr;
  bool ok = false;
  int64_t steps = 0;
};

class ZQ_EXPORT ZQDBNodeBase {
 public:
  // No tree on disk is deeper than this; a deeper chain is damage (a cycle).
  static constexpr int kMaxDepth = 20;

  ZQDBNodeBase(ZQDBNodeBase* parent, int16_t keyLength, int fd, int32_t where);
  virtual ~ZQDBNodeBase();
  ZQDBNodeBase(const ZQDBNodeBase&) = default;
  ZQDBNodeBase& operator=(const ZQDBNodeBase&) = default;

  bool OK() const { return ok; }
  ZQDBNodeBase* FindLeaf();
  ZQDBNodeBase* Child() const { return child; }
  int32_t Where() const { return where; }
  // Levels above this one: 0 at the root.
  int Depth() const;

  virtual int32_t CurrentKey(ZQString& key);
  virtual int32_t NextKey(ZQString& key);
  virtual int32_t PrevKey(ZQString& key);
  virtual int32_t FindKey(const ZQString& key, bool exact);
  virtual bool AddKey(ZQString& key, int32_t record) = 0;
  virtual int32_t FirstKey(ZQString& key);
  virtual bool WriteNode() = 0;
  // Goes to the last key of the tree; -1 where the kind can't walk backwards.
  virtual int32_t LastKey(ZQString& key);
  // A move to another block of this level failed during a walk.
  bool LostWay() const { return lostWay; }
  void ClearLostWay() { lostWay = false; }

 protected:
  int16_t keyLength;
  int16_t keyCount = 0;
  int16_t maxKeys = 0;
  int fd;
  int32_t where;
  int32_t current = 0;
  bool dirty = false;
  ZQDBNodeBase* parent;
  ZQDBNodeBase* child = nullptr;
  bool ok = false;
  bool lostWay = false;
};
