#include "connector/frdbase.h"

#include <new>

ZQFromDbase::ZQFromDbase(const ZQSpokeDef& def) : ZQImport(def, ZQDbase::GetModifiedTypedefs(), false) {}

ZQFromDbase::~ZQFromDbase() { dbase.CloseFile(nullptr); }

ZQSpokeOptions* ZQFromDbase::NewOptions() const {
  return new (std::nothrow) ZQDbaseOptions(const_cast<ZQFromDbase*>(this), dbase.GetVersion());
}

void ZQFromDbase::DeleteOptions(ZQSpokeOptions* opts) const { delete opts; }

bool ZQFromDbase::FillOptions(ZQSpokeOptions* opts) const { return dbase.GetOptions(opts); }

BATCHERR ZQFromDbase::SetOptions(const ZQSpokeOptions* opts) {
  if (dbase.SetOptions(opts) != 0) return ZQ_BAD_OPTIONS;
  dbase.CloseFile(nullptr);
  return ReFormatData();
}

int ZQFromDbase::MaxFieldCount() {
  int dialect = dbase.Table != nullptr ? dbase.Table->dialect : dbase.GetVersion();
  switch (dialect) {
    case DIALECT_DBASE2: return 32;
    case DIALECT_DBASE3P:
    case DIALECT_ENABLE:
    case DIALECT_DBASE3:
    case DIALECT_ENABLEOA: return 128;
    case DIALECT_CLIPPER: return 1000;
    case DIALECT_VDBASE:
    case DIALECT_VFOXPRO: return 1024;
    default: return 256;
  }
}

void ZQFromDbase::LoadOptions(ZQString& text) { dbase.LoadOptions(text, false); }
int ZQFromDbase::OptionDefCount() const { return ZQDbaseOptions::ImportOptionCount(); }
ZQOptionDef** ZQFromDbase::GetOptionDefs() const { return ZQDbaseOptions::ImportOptionList(); }

BATCHERR ZQFromDbase::ConnectionClose() {
  dbase.CloseFile(nullptr);
  return 0;
}

ZQSpokeOptions* ZQFromDbase::GetOptions() const { return &dbase; }
void ZQFromDbase::SaveOptions(ZQString& text) const { dbase.SaveOptions(text, false); }

BATCHERR ZQFromDbase::SetUserInfo(const ZQConnTarget& target) {
  target_.path = target.path;
  dbase.CloseFile(nullptr);
  return ReFormatData();
}

const ZQConnTargetInfo* ZQFromDbase::GetTargetInfo() const {
  static const ZQConnTargetInfo info = {{1, 0, 0, 0, 1}, u"Source File/URI"};
  return &info;
}

int64_t ZQFromDbase::EstimateRecordCount() {
  if (dbase.Table == nullptr) return 0;
  // A count that is negative as a signed number reads as an empty table.
  int64_t live = int64_t{TableCount(dbase.Table)} - dbase.DeletedSkipped;
  return live > 0 ? live : 0;
}

BATCHERR ZQFromDbase::MakeFields() {
  BATCHERR rc = dbase.MakeFields(*GetLayout(0), target_);
  SetEncodingAndUnicode(nullptr);
  return rc;
}

BATCHERR ZQFromDbase::GetRecord(int32_t n) { return dbase.GetRecord(*GetLayout(0), n, nullptr, false); }

ZQFromDbase* NewFromDbase(const ZQSpokeDef& def) { return new (std::nothrow) ZQFromDbase(def); }

void DeleteFromDbase(ZQFromDbase* spoke) { delete spoke; }
