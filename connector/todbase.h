// The target spoke: from the engine's records to a table.
//
// States: closed -> open (after _OpenOutput: a table open, CurrentRecord set,
// the target remembered) -> closed (_CloseOutput). Records are written one at
// a time, memo first, then the table record, then index keys and counters;
// nothing is collected for close.
#pragma once

#include "connector/dbase.h"
#include "host/zqspoke.h"

class ZQ_EXPORT ZQToDbase : public ZQExport {
 public:
  explicit ZQToDbase(const ZQSpokeDef& def);
  ~ZQToDbase() override;

  ZQSpokeOptions* NewOptions() const override;
  void DeleteOptions(ZQSpokeOptions* opts) const override;
  bool FillOptions(ZQSpokeOptions* opts) const override;
  BATCHERR SetOptions(const ZQSpokeOptions* opts) override;
  bool SupportMode(SpokeMode mode) const override { return mode >= 0 && mode <= 2; }
  bool SupportIndexes() const override { return true; }
  bool SupportURI() const override { return true; }
  int MaxFieldCount() override;
  void LoadOptions(ZQString& text) override;
  int OptionDefCount() const override;
  ZQOptionDef** GetOptionDefs() const override;
  BATCHERR _Rewind() override;
  ZQSpokeOptions* GetOptions() const override;
  void SaveOptions(ZQString& text) const override;

  const ZQConnTargetInfo* GetTargetInfo() const override;
  BATCHERR MakeFields(ZQRecord& record, const ZQConnTarget& target) override;
  void FormatSpokeField(ZQField* field, const ZQField* other) const override;
  int FieldNameMaxLength() override { return 10; }
  BATCHERR DeleteRecord() override;
  BATCHERR DeleteRecord(int layout, const wchar* condition) override;
  BATCHERR GenerateDetailRecord(int layout) override;
  BATCHERR _CloseOutput(bool keep) override;
  BATCHERR _OpenOutput(const ZQConnTarget& target) override;
  BATCHERR GetRecord(ZQRecord& record, int64_t* position) override;
  BATCHERR GetandDeleteRecord(ZQRecord& record) override;
  BATCHERR Unwind() override;
  BATCHERR SetFilePosition(int64_t position) override;
  void FieldNameCharSet(ZQString& first, ZQString& second) override;
  BATCHERR ValidateLocalRecord(const ZQRecord& record, int& field) override;
  bool ParseIndexExpression(const char* text, ZQIndexDef* def) override;

  // The number of fields a new table of the current dialect keeps; fields of
  // a layout behind it don't reach the table.
  int CreateFieldCap() const;
  int MaxNewFieldCount() override { return CreateFieldCap(); }
  // Read-only view for reports and tests.
  const ZQDBFILE* TableHandle() const { return dbase.Table; }
  int32_t Position() const { return CurrentRecord; }

 private:
  BATCHERR DBCreateFile(const char* path, ZQIndexDef* const* indexes);
  bool LayoutsMatch();
  // 0, or an error when the table's fields run past its record length.
  BATCHERR FieldsFitRecord();
  char DTypeToDbase(ZQDType type);
  BATCHERR FormatDBMemo(char* dest, ZQField* field);
  BATCHERR FormatClipperMemo(char* dest, ZQField* field);
  // Reads the old memo at `block` into MemoScratch; false when it can't.
  bool ReadOldMemo(uint32_t block);
  // The physical record that a write at CurrentRecord goes to; -1 for none.
  int32_t PhysicalForWrite();
  void EncodeNumber(char* dest, int32_t room, ZQField* field);
  // Visual FoxPro (dialect 10): a memo pointer as a 4-byte little-endian block
  // number; elsewhere ten decimal digits.
  void PutMemoPointer(char* dest, uint32_t block);
  // Visual FoxPro: the binary forms of "I", "T", "B" and "Y" into `dest`
  // (their fixed widths). 0, or 8 with a message for a value the form
  // can't hold, so that no value is stored as another one.
  BATCHERR EncodeVfpValue(char* dest, ZQField* field, char letter);

  // The index objects of the host's index list, in its order.
  BATCHERR OpenIndexes(const char* path);
  BATCHERR CreateIndexes(const char* path);
  // One key in every index for the record just written.
  BATCHERR AddIndexKeys();
  void CloseIndexes();
  BATCHERR IndexFailed(const char* what, const ZQIndexDef* def);

  mutable ZQDbase dbase{this};
  class ZQDBIndexBase** IndexObjects = nullptr;
  ZQString IndexKey;
  ZQString MemoScratch;
  int32_t CurrentRecord = 0;
  ZQString FieldScratch;
};

extern "C" ZQ_EXPORT ZQToDbase* NewToDbase(const ZQSpokeDef& def);
extern "C" ZQ_EXPORT void DeleteToDbase(ZQToDbase* spoke);
