#include "connector/frdbase.h"
#include "index/dbindex.h"

#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <new>
#include <string>

#include "table/memo.h"

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

namespace {

void Line(ZQString& text, const char* name, const char* value) {
  text += name;
  text += ": ";
  text += value;
  text += "\n";
}

}  // namespace

void ZQFromDbase::ReportFacts(ZQString& text) const {
  const ZQDBFILE* t = dbase.Table;
  if (t == nullptr) return;
  char buf[4400];
  snprintf(buf, sizeof buf, "0x%02X", unsigned(t->filever));
  Line(text, "version", buf);
  snprintf(buf, sizeof buf, "%ld", static_cast<long>(TableCount(t)));
  Line(text, "records", buf);
  snprintf(buf, sizeof buf, "%u", unsigned(t->hdrlen));
  Line(text, "header", buf);
  snprintf(buf, sizeof buf, "%u", unsigned(t->reclen));
  Line(text, "record", buf);
  if (t->hasmemo) {
    const char* kind = "?";
    const char* ext = "dbt";
    switch (t->memokind) {
      case MEMO_DB3: kind = "dBASE III"; break;
      case MEMO_DB4: kind = "dBASE IV"; break;
      case MEMO_DB4FREE: kind = "dBASE IV, with a free-block chain"; break;
      case MEMO_FPT: kind = "FoxPro", ext = "fpt"; break;
      case MEMO_SMT: kind = "Clipper SMT", ext = "smt"; break;
    }
    char name[4200];
    std::string path = target_.path.c_str();
    std::string upper = ext;
    for (char& c : upper) c = char(toupper(static_cast<unsigned char>(c)));
    if (!memopath(path.c_str(), ext, name, sizeof name) || access(name, F_OK) != 0)
      memopath(path.c_str(), upper.c_str(), name, sizeof name);
    // The same facts one by one, for hosts that report them as data.
    Line(text, "memo file", name);
    Line(text, "memo kind", kind);
    snprintf(buf, sizeof buf, "%u", t->memofailed ? 0u : unsigned(t->memoblksize));
    Line(text, "memo block", buf);
    if (t->memofailed)
      snprintf(buf, sizeof buf, "%s (%s) could not be opened or was refused", name, kind);
    else
      snprintf(buf, sizeof buf, "%s (%s, blocks of %u bytes%s)", name, kind, unsigned(t->memoblksize),
               t->memooff ? ", memos switched off in its header" : "");
    Line(text, "memo", buf);
  } else {
    Line(text, "memo", "none");
  }
  for (int i = 0; i < t->fieldcount; ++i) {
    const ZQDBFIELD* f = dbase.FieldList[i];
    snprintf(buf, sizeof buf, "%s\t%c\t%u\t%u", f->name, f->type > ' ' ? f->type : '?', unsigned(f->length),
             unsigned(f->decimals));
    Line(text, "field", buf);
  }
  dbase.ReportIndexes(text);
}

bool ZQFromDbase::ParseIndexExpression(const char* text, ZQIndexDef* def) {
  if (IndexFamilyOf(dbase.GetVersion()) == IndexFamily::kNone) return false;
  ZQString expression(text);
  return ZQDBIndexBase::ParseExpr(expression, def, this);
}
