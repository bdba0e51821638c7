// The connector framework: spokes, option blocks and definitions, connection
// targets and index definitions.
//
// A spoke is driven from one thread. Source: factory, options, SetUserInfo,
// MakeFields, GetRecord(n) until 1, ConnectionClose. Target: factory,
// options, _OpenOutput, GenerateDetailRecord per record, _CloseOutput.
#pragma once

#include <cstdarg>
#include <cstdint>

#include "host/zqdtype.h"
#include "host/zqfield.h"
#include "host/zqstring.h"
#include "host/zqtypes.h"

class ZQSpoke;
class ZQSpokeOptions;

// Passed through the connector unopened.
class ZQNotifier {};

// What the engine knows of a connector definition (from a module trailer).
struct ZQSpokeDef {
  const char* key = "";
  const char* display_name = "";
  const char* short_name = "";
  const char* option_text = "";
};

// The connection target; its first member is the table's path. An empty path
// means nothing has been named.
struct ZQConnTarget {
  ZQString path;
};

// A plain record a connector gives back from GetTargetInfo: five 32-bit words
// and a wide label.
struct ZQConnTargetInfo {
  int32_t words[5];
  wchar label[64];
};

// A row of an option's value table.
struct OptionValueDef {
  const wchar* display;
  const wchar* pointer;  // NULL in every row of this system
  const char* value;
  const wchar* description;
};

using ZQOptionGetter = BATCHERR (*)(void* block, ZQString& value, const wchar* unused);
using ZQOptionSetter = BATCHERR (*)(void* block, const char* value, bool& changed, const wchar* unused);
using ZQOptionWGetter = BATCHERR (*)(void* block, ZQWString& value, const wchar* unused);
using ZQOptionWSetter = BATCHERR (*)(void* block, const wchar* value, bool& changed, const wchar* unused);

// An option's definition. `flags` and the four trailing arguments are kept as
// they are given; this host gives them no meaning. The block handed to the
// getter and setter is the option block (a ZQSpokeOptions) as void*.
class ZQOptionDef {
 public:
  ZQOptionDef(const wchar* name, const wchar* label, const wchar* description, int flags,
              const char* default_value, const wchar* wide_default, ZQOptionGetter getter,
              ZQOptionSetter setter, ZQOptionWGetter wgetter, ZQOptionWSetter wsetter,
              const OptionValueDef* values, int value_count, const char* extra1,
              const char* extra2, int extra3, int32_t extra4);
  ~ZQOptionDef();
  ZQOptionDef(const ZQOptionDef&) = delete;
  ZQOptionDef& operator=(const ZQOptionDef&) = delete;

  const wchar* Name() const { return name_; }
  // The name as UTF-8, for matching by the engine.
  const char* NameText() const { return name_text_.c_str(); }
  const wchar* Label() const { return label_; }
  const wchar* Description() const { return description_; }
  int Flags() const { return flags_; }
  const char* Default() const { return default_; }
  const wchar* WideDefault() const { return wide_default_; }
  bool HasWideAccessors() const { return wgetter_ != nullptr || wsetter_ != nullptr; }
  const OptionValueDef* Values() const { return values_; }
  int ValueCount() const { return value_count_; }
  BATCHERR Get(void* block, ZQString& value) const;
  BATCHERR Set(void* block, const char* value) const;

 private:
  const wchar* name_;
  const wchar* label_;
  const wchar* description_;
  int flags_;
  const char* default_;
  const wchar* wide_default_;
  ZQOptionGetter getter_;
  ZQOptionSetter setter_;
  ZQOptionWGetter wgetter_;
  ZQOptionWSetter wsetter_;
  const OptionValueDef* values_;
  int value_count_;
  ZQString name_text_;
};

// An option block. The connector derives its own; the block carries the
// code page option of the host.
class ZQSpokeOptions {
 public:
  ZQSpokeOptions(SPOKETYPE type, ZQSpoke* spoke);
  ZQSpokeOptions(const ZQSpokeOptions& other);
  ZQSpokeOptions& operator=(const ZQSpokeOptions& other);
  virtual ~ZQSpokeOptions();
  virtual ZQOptionDef** OptionList();
  virtual int OptionCount();
  virtual void InitOptions();
  virtual void CodePage(int codepage) { codepage_ = codepage; }
  virtual void UEncoding(ZQ_CSET cs) { encoding_ = cs; }
  virtual void ByteOrder(int order) { byte_order_ = order; }
  virtual void OrderMark(bool mark) { order_mark_ = mark; }

  SPOKETYPE Type() const { return type_; }
  int CodePage() const { return codepage_; }
  ZQSpoke* Spoke() const { return spoke_; }
  // The shared definition of the code page option ("codepage").
  static ZQOptionDef* CodePageOption();

 private:
  SPOKETYPE type_;
  ZQSpoke* spoke_;
  int codepage_ = 0;
  ZQ_CSET encoding_ = 0;
  int byte_order_ = 0;
  bool order_mark_ = false;
};

class ZQField;

class ZQIndexSeg {
 public:
  ZQIndexSeg() = default;
  ZQIndexSeg(int16_t offset, int16_t length, const ZQDType* type, ZQField* field)
      : offset_(offset), length_(length), type_(type), field_(field) {}
  ZQField* IdxField() const { return field_; }
  const ZQDType* Type() const { return type_; }
  const char* Name() const { return field_ ? field_->Name() : ""; }
  int16_t Offset() const { return offset_; }
  int16_t Length() const { return length_; }

 private:
  int16_t offset_ = 0;
  int16_t length_ = 0;
  const ZQDType* type_ = nullptr;
  ZQField* field_ = nullptr;
};

class ZQIndexDef {
 public:
  static constexpr int kMaxSegs = 16;
  ZQIndexDef() = default;
  ~ZQIndexDef() = default;
  const char* Name() const { return name_.c_str(); }
  void Name(const char* name) { name_ = name ? name : ""; }
  bool Dups() const { return dups_; }
  void Dups(bool d) { dups_ = d; }
  bool Compress() const { return compress_; }
  void Compress(bool c) { compress_ = c; }
  // False when the definition already holds kMaxSegs segments.
  bool AddSeg(int16_t offset, int16_t length, const ZQDType* type, ZQField* field);
  int16_t SegCount() const { return seg_count_; }
  ZQIndexSeg& operator[](int i) { return segs_[i]; }
  const ZQIndexSeg& operator[](int i) const { return segs_[i]; }

 private:
  ZQString name_;
  bool dups_ = true;
  bool compress_ = false;
  int16_t seg_count_ = 0;
  ZQIndexSeg segs_[kMaxSegs];
};

// This engine's own addition: one index of an open connection, walked in key
// order. Each step gives the record number (from 0) of the key it stands on
// and puts the key's bytes in `key`; -1 at either end, and on damage.
class ZQIndexWalk {
 public:
  virtual ~ZQIndexWalk() = default;
  virtual int32_t First(ZQString& key) = 0;
  virtual int32_t Next(ZQString& key) = 0;
  // Walking backwards; only where Backwards() says the index kind can.
  virtual bool Backwards() const = 0;
  virtual int32_t Last(ZQString& key) = 0;
  virtual int32_t Prev(ZQString& key) = 0;
  // Goes to the first key not less than `key`.
  virtual int32_t Seek(const ZQString& key, ZQString& found) = 0;
  // The key expression as the index file holds it.
  virtual const char* Expression() const = 0;
  // True when the last walk ended at damage rather than at its last key.
  virtual bool Broken() const { return false; }
  // For check: the key this index gives the record now in the spoke's
  // layout 0, built as the index kind builds the keys it adds.
  virtual void BuildKey(ZQString& key) { key = ""; }
  // Whether the index keeps one record per key.
  virtual bool Unique() const { return false; }
  // For check: walks every block of the tree from the root, bounded by the
  // file's size, and appends a line "block N: what is wrong" for each fault
  // of structure (levels, sibling links, counts, keys out of order within a
  // block, a block reached twice). `byValue`: 8-byte keys compared as the
  // doubles they hold. The number of faults.
  virtual int32_t CheckTree(ZQString& findings, bool byValue) {
    (void)findings;
    (void)byValue;
    return 0;
  }
};

// The base of every spoke.
class ZQSpoke {
 public:
  enum SpokeMode : int32_t { kReplace = 0, kAppend = 1, kUpdate = 2 };

  ZQSpoke(const ZQSpokeDef& def, const char** typedefs, bool flag);
  virtual ~ZQSpoke();
  ZQSpoke(const ZQSpoke&) = delete;
  ZQSpoke& operator=(const ZQSpoke&) = delete;

  // Virtual operations, in the framework's slot order (those this system
  // uses).
  virtual ZQSpokeOptions* NewOptions() const;
  virtual void DeleteOptions(ZQSpokeOptions* opts) const;
  virtual bool FillOptions(ZQSpokeOptions* opts) const;
  virtual BATCHERR SetOptions(const ZQSpokeOptions* opts);
  virtual void SetMode(SpokeMode mode) { mode_ = mode; }
  virtual SpokeMode GetMode() const { return mode_; }
  virtual bool SupportMode(SpokeMode mode) const { return mode == kReplace; }
  virtual bool SupportIndexes() const { return false; }
  virtual bool SupportMultithreading() const { return false; }
  virtual bool SupportURI() const { return false; }
  virtual int MaxFieldCount() { return 255; }
  virtual BATCHERR LogError(int level, BATCHERR code, const wchar* format, ...);
  virtual BATCHERR LogError(int level, BATCHERR code, const char* format, ...);
  virtual const char* LastErrorMessage() const { return last_error_.c_str(); }
  virtual const ZQDType* const* GetValidTypes() const { return valid_types_; }
  virtual const ZQDType* const* GetIndexTypes() const { return index_types_; }
  virtual BATCHERR SetOption(const char* name, const char* value);
  virtual BATCHERR GetOption(const char* name, ZQString& value) const;
  virtual void LoadOptions(ZQString& text);
  virtual const ZQOptionDef* FindOptionDef(const char* name) const;
  virtual int OptionDefCount() const { return 0; }
  virtual ZQOptionDef** GetOptionDefs() const { return nullptr; }
  virtual ZQDType MapDType(const ZQDType& foreign);
  virtual bool ConnectionEstablished() { return false; }
  virtual BATCHERR ConnectionClose() { return 0; }
  virtual BATCHERR _Rewind() { return 0; }
  virtual ZQSpokeOptions* GetOptions() const { return nullptr; }
  virtual void SaveOptions(ZQString& text) const;
  virtual ZQRecord* GetIndexFields() { return GetLayout(0); }
  // This engine's own addition: "name: value" lines of facts about the open
  // connection (file format, counts, companion files) for reports. Nothing by
  // default.
  virtual void ReportFacts(ZQString& text) const { (void)text; }
  // This engine's own addition: compiles an index expression over layout 0
  // into `def` by the connector's own grammar. False when the connector has
  // no indexes or doesn't understand the expression.
  virtual bool ParseIndexExpression(const char* text, ZQIndexDef* def) {
    (void)text;
    (void)def;
    return false;
  }

  ZQRecord* GetLayout(int n) const;
  const ZQDType& TypeByUsage(int16_t usage) const;
  const ZQDType& GetDType(int i) const;
  const ZQDType& GetIdxType(int i) const;
  // Both copy the list: the arrays handed in may die with their block.
  void ReplaceValidTypes(const ZQDType** list);
  void ReplaceIndexTypes(const ZQDType** list);
  ZQIndexDef* const* IndexList();
  void ClearIndices();
  bool AddIndex(ZQIndexDef* def);
  void SetEncodingAndUnicode(ZQField*) {}
  ZQNotifier* GetNotifier() { return &notifier_; }
  const ZQSpokeDef& Definition() const { return def_; }
  const char** TypeDefinitions() const { return typedefs_; }

  // The framework's state that derived spokes read and write directly.
  SpokeMode mode_ = kReplace;
  ZQConnTarget target_;
  int64_t deleted_count_ = 0;
  int64_t updated_count_ = 0;
  int64_t inserted_count_ = 0;

 private:
  static constexpr int kMaxTypes = 32;
  BATCHERR Log(int level, BATCHERR code, const ZQString& message);

  ZQSpokeDef def_;
  const char** typedefs_;
  ZQNotifier notifier_;
  mutable ZQRecord layout_;
  const ZQDType* valid_types_[kMaxTypes + 1] = {};
  const ZQDType* index_types_[kMaxTypes + 1] = {};
  ZQIndexDef** indexes_ = nullptr;
  int index_count_ = 0;
  ZQString last_error_;
  friend class ZQSpokeOptions;
};

class ZQImport : public ZQSpoke {
 public:
  ZQImport(const ZQSpokeDef& def, const char** typedefs, bool flag);
  ~ZQImport() override;

  virtual BATCHERR SetUserInfo(const ZQConnTarget& target);
  virtual const ZQConnTargetInfo* GetTargetInfo() const { return nullptr; }
  virtual int64_t EstimateRecordCount() { return 0; }
  virtual bool EstimateIsAccurate() { return false; }
  virtual int RecordSeekGrade() { return 0; }
  virtual BATCHERR MakeFields() { return ZQ_NOT_SUPPORTED; }
  virtual BATCHERR GetRecord(int32_t n) {
    (void)n;
    return ZQ_NOT_SUPPORTED;
  }

  // This engine's own addition: opens the index `name` (a name of IndexList()
  // or an index file's path) of the open connection for a walk, and fills
  // `def` with its definition. NULL when there is no such index or it can't
  // be opened; the caller deletes the walk.
  virtual ZQIndexWalk* OpenIndexWalk(const char* name, ZQIndexDef* def) {
    (void)name;
    (void)def;
    return nullptr;
  }

  // This engine's own addition: builds the indexes `defs` (NULL-ended;
  // names are tags, or index files' paths with their extension) anew for the
  // open table, beside `base` (a path without extension, where the new tags'
  // file goes): the key of every live record, with its physical record
  // number. Index files of those names must not exist yet. 0, or the error
  // code with the message logged.
  virtual BATCHERR BuildIndexes(const char* base, ZQIndexDef* const* defs) {
    (void)base;
    (void)defs;
    return ZQ_NOT_SUPPORTED;
  }

  // Called after the target or the options changed, with no table open; the
  // engine asks for MakeFields next, so there is nothing to redo here.
  BATCHERR ReFormatData() { return 0; }
};

class ZQExport : public ZQSpoke {
 public:
  ZQExport(const ZQSpokeDef& def, const char** typedefs, bool flag);
  ~ZQExport() override;

  // Virtual operations in the framework's slot order (those this system
  // uses); the defaults say "not supported".
  virtual BATCHERR SetUserInfo(const ZQConnTarget& target);
  virtual int64_t EstimateRecordCount() { return 0; }
  virtual int64_t DeletedRecordCount() const { return deleted_count_; }
  virtual int64_t UpdatedRecordCount() const { return updated_count_; }
  virtual int64_t InsertedRecordCount() const { return inserted_count_; }
  virtual const ZQConnTargetInfo* GetTargetInfo() const { return nullptr; }
  virtual BATCHERR MakeFields(ZQRecord& record, const ZQConnTarget& target);
  virtual void FormatSpokeField(ZQField* field, const ZQField* other) const;
  virtual int FieldNameMaxLength() { return 64; }
  virtual BATCHERR DeleteRecord() { return ZQ_NOT_SUPPORTED; }
  virtual BATCHERR DeleteRecord(int layout, const wchar* condition);
  virtual BATCHERR GenerateDetailRecord(int layout);
  virtual BATCHERR _CloseOutput(bool keep);
  virtual BATCHERR _OpenOutput(const ZQConnTarget& target);
  virtual BATCHERR GetRecord(ZQRecord& record, int64_t* position);
  virtual BATCHERR GetandDeleteRecord(ZQRecord& record);
  virtual BATCHERR Unwind() { return ZQ_NOT_SUPPORTED; }
  virtual BATCHERR SetFilePosition(int64_t position);
  virtual void FieldNameCharSet(ZQString& first, ZQString& second);
  virtual BATCHERR ValidateLocalRecord(const ZQRecord& record, int& field);
  // This engine's own addition: how many fields a new target keeps; fields of
  // a longer layout don't reach it. MaxFieldCount() by default.
  virtual int MaxNewFieldCount() { return MaxFieldCount(); }
};
