// The source spoke: from a table to the engine's records.
#pragma once

#include "connector/dbase.h"
#include "host/zqspoke.h"

class ZQ_EXPORT ZQFromDbase : public ZQImport {
 public:
  explicit ZQFromDbase(const ZQSpokeDef& def);
  ~ZQFromDbase() override;

  ZQSpokeOptions* NewOptions() const override;
  void DeleteOptions(ZQSpokeOptions* opts) const override;
  bool FillOptions(ZQSpokeOptions* opts) const override;
  BATCHERR SetOptions(const ZQSpokeOptions* opts) override;
  bool SupportIndexes() const override { return true; }
  bool SupportURI() const override { return true; }
  int MaxFieldCount() override;
  void LoadOptions(ZQString& text) override;
  int OptionDefCount() const override;
  ZQOptionDef** GetOptionDefs() const override;
  bool ConnectionEstablished() override { return dbase.Table != nullptr; }
  BATCHERR ConnectionClose() override;
  BATCHERR _Rewind() override { return 0; }
  ZQSpokeOptions* GetOptions() const override;
  void SaveOptions(ZQString& text) const override;

  BATCHERR SetUserInfo(const ZQConnTarget& target) override;
  const ZQConnTargetInfo* GetTargetInfo() const override;
  int64_t EstimateRecordCount() override;
  bool EstimateIsAccurate() override { return dbase.Table != nullptr; }
  int RecordSeekGrade() override { return 9; }
  BATCHERR MakeFields() override;
  BATCHERR GetRecord(int32_t n) override;
  // Version byte, header count and lengths, memo file, field descriptors.
  void ReportFacts(ZQString& text) const override;
  ZQIndexWalk* OpenIndexWalk(const char* name, ZQIndexDef* def) override { return dbase.OpenIndexWalk(name, def); }
  bool ParseIndexExpression(const char* text, ZQIndexDef* def) override;
  BATCHERR BuildIndexes(const char* base, ZQIndexDef* const* defs) override { return dbase.BuildIndexes(base, defs); }

  // Read-only views for reports (`zqdb info`) and tests.
  const ZQDBFILE* TableHandle() const { return dbase.Table; }
  const ZQDBFIELD* const* Descriptors() const { return dbase.FieldList; }

 private:
  mutable ZQDbase dbase{this};
};

// Exported factories.
extern "C" ZQ_EXPORT ZQFromDbase* NewFromDbase(const ZQSpokeDef& def);
extern "C" ZQ_EXPORT void DeleteFromDbase(ZQFromDbase* spoke);
