// The table object and option block shared by the source and target spokes.
#pragma once

#include <cstdint>

#include "connector/export.h"
#include "host/zqfield.h"
#include "host/zqhash.h"
#include "host/zqspoke.h"
#include "host/zqstring.h"
#include "table/dbf.h"

class ZQDBIndexBase;
class ZQDBFoxIndex;
class ZQFromDbase;
class ZQToDbase;

// The connector's option block: dialect, memo policy, selected index, and
// the two type lists of the dialect.
class ZQ_EXPORT ZQDbaseOptions : public ZQSpokeOptions {
 public:
  ZQDbaseOptions(ZQSpoke* spoke, int version);
  ZQDbaseOptions(const ZQDbaseOptions&) = delete;
  ZQDbaseOptions& operator=(const ZQDbaseOptions&) = delete;
  ~ZQDbaseOptions() override;
  ZQOptionDef** OptionList() override;
  int OptionCount() override;

  virtual void SetVersion(int version);
  virtual int GetVersion() const { return VersionNumber; }
  virtual int Order() { return OrderNumber; }
  virtual void Order(int order) { OrderNumber = order; }
  virtual int IgnoreMemoFile() const { return MemoPolicy; }
  virtual void IgnoreMemoFile(int policy) { MemoPolicy = policy; }

  static ZQOptionDef** ExportOptionList();
  static int ExportOptionCount();
  static ZQOptionDef** ImportOptionList();
  static int ImportOptionCount();

 protected:
  void ResetDataTypes();

  int OrderNumber = 0;
  int VersionNumber = 2;
  int MemoPolicy = 0;
  const ZQDType** ValidTypes = nullptr;  // 13 entries, NULL-ended
  const ZQDType** IndexTypes = nullptr;  // 5 entries, NULL-ended
};

// Which index classes serve a dialect: MDX tags and NDX files for dBASE IV,
// the unnamed dialect and Visual dBASE 5.5; CDX tags and IDX files for FoxPro
// and Visual FoxPro; none for the others.
enum class IndexFamily { kNone, kDbase, kFox };
ZQ_EXPORT IndexFamily IndexFamilyOf(int dialect);
// The fields of a definition's segments, borrowed, in segment order: what the
// index classes take to make a new index.
void IndexSegmentFields(const ZQIndexDef* def, ZQRecord& fields);

// One row of the name table of the saved text form.
struct VersionName {
  int dialect;
  const char* name;
};
extern const VersionName VersionNames[];

// The table object: owns the open table, decodes records, and is the option
// block the host reaches through GetOptions.
class ZQ_EXPORT ZQDbase : public ZQDbaseOptions {
 public:
  static constexpr int memoptrlen = 10;
  // Room behind a record in RecordBuffer, so that the decoding can read 16
  // bytes from any field without running off the buffer.
  static constexpr unsigned kRecordSlack = 16;

  ~ZQDbase() override;
  static const char** GetModifiedTypedefs();
  const char* DatePicture() const { return "yyyymmdd"; }
  const char* BooleanPicture() const { return "T.F"; }
  void SaveOptions(ZQString& text, bool noIndex) const;
  void LoadOptions(ZQString& text, bool ignored);

 private:
  friend class ZQFromDbase;
  friend class ZQToDbase;
  friend class DbaseTestPeer;  // unit tests reach the private state

  explicit ZQDbase(ZQSpoke* spoke);
  bool GetOptions(ZQSpokeOptions* opts) const;
  BATCHERR SetOptions(const ZQSpokeOptions* opts);
  BATCHERR DBOpenFile(const char* name, bool writable);
  BATCHERR MakeFields(ZQRecord& layout, const ZQConnTarget& target);
  BATCHERR ReadRecord(int32_t n);
  BATCHERR GetRecord(ZQRecord& record, int32_t n, int64_t* position, bool withInfo);
  // The decoding of C, N, F, D, L and unknown letters: trailing blanks cut,
  // the code page converted, the text assigned.
  void DecodeText(ZQField* field, const char* raw, int32_t length, int codepage);
  // DecodeText's conversion of `kept` bytes that are not all ASCII.
  void DecodeCodePage(ZQField* field, const char* raw, int32_t kept, int codepage);
  void CloseFile(const ZQConnTarget* target);
  bool IsMemoType(int type) const;
  BATCHERR GetMemoField(ZQField* field, const ZQString& pointer, bool withInfo);
  void DescribeIndices(const char* name);
  // Opens the index `name` (a tag, or an index file's path) of the table
  // whose path without extension is `base`, by the dialect's index classes.
  // NULL when the dialect has none or memory runs out; test OK() else.
  ZQDBIndexBase* OpenIndex(const char* base, const char* name);
  // Creates the index of `def` over `fields` for the table at `base`.
  ZQDBIndexBase* CreateIndex(const char* base, const ZQRecord& fields, ZQIndexDef* def);
  // Opens an index of the open table for a walk in key order; see ZQImport.
  ZQIndexWalk* OpenIndexWalk(const char* name, ZQIndexDef* def);
  // Builds the indexes `defs` anew beside `base`; see ZQImport.
  BATCHERR BuildIndexes(const char* base, ZQIndexDef* const* defs);
  // "index: name, expression, key type, unique, file" lines for reports.
  void ReportIndexes(ZQString& text);
  // Deletes the selected index and the CDX tag list.
  void DropIndexes();
  ZQSpoke* OwnerSpoke() const { return Spoke(); }

  ZQDBFILE* Table = nullptr;
  int32_t DeletedSkipped = 0;
  int32_t HighRecord = -1;
  int32_t CurrentLogical = 0;
  int32_t CurrentPhysical = 0;
  char* RecordBuffer = nullptr;
  unsigned RecordBufferSize = 0;
  ZQString MemoText;
  ZQHashTable RecordMap{512};
  ZQDBFIELD* FieldList[kMaxFields] = {};
  // MakeFields lists the table's indexes to the host; not so when the
  // target reads a table's layout into a record of the host's, since the
  // index definitions would then name fields the records never reach.
  bool DescribeOnOpen = true;
  ZQDBIndexBase* OrderIndex = nullptr;
  ZQDBFoxIndex* FoxIndexList = nullptr;
  // Directory and base name of the table, without extension. Sized for the
  // platform's paths.
  char BasePath[4096] = {};
  ZQDType BinaryLong{DT_LONG};
  ZQString FieldText;
};
