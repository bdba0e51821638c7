// The dialect options, their value tables and lists, and the saved text form.
#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <new>

#include "connector/dbase.h"
#include "index/dbindex.h"
#include "host/zqutil.h"

namespace {

// The twelve types every option block points into; defined once per process
// by the first block built.
ZQDType DataTypes[12];
bool DataTypesDefined = false;

const char* TypeDefinitions[] = {
    "Date;usage=0x44;picture=yyyymmdd;picture_settable=0",
    "Boolean;alias=Logical;usage=0x4c;picture=T.F;picture_settable=False",
    "dBASE Numeric;decsep=.;alias=Numeric;usage=0x4e",
    "Text;alias=Character;usage=0x43;maxlength=254;maxprecision=254",
    "Memo;alias=Memo;usage=0x4d;length=255;length_invalid;maxlength=32000;maxprecision=32000;"
    "padchar_invalid;varlen_invalid",
    "dBASE Numeric;alias=Float;decsep=.;usage=0x46",
    "Binary;alias=Ole;usage=0x47",
    "Binary;usage=0x42",
    "Float;alias=Double;decsep=.;usage=0x42",
    "Float;alias=Currency;currency;decsep=.;usage=0x59",
    "Integer;usage=0x49",
    "DateTime;usage=0x54",
    nullptr,
};

constexpr int kValidSlots = 13;
constexpr int kIndexSlots = 5;

const OptionValueDef VersionValues[] = {
    {u"dBASE II", nullptr, "0", u"dBASE II"},
    {u"dBASE III", nullptr, "4", u"dBASE III"},
    {u"dBASE III+", nullptr, "1", u"dBASE III+"},
    {u"dBASE IV", nullptr, "2", u"dBASE IV"},
    {u"Enable", nullptr, "3", u"Enable"},
    {u"FoxPro", nullptr, "6", u"FoxPro"},
    {u"Enable OA (Database)", nullptr, "7", u"Enable OA (Database)"},
    {u"Clipper", nullptr, "8", u"Clipper"},
    {u"Visual dBASE 5.5", nullptr, "9", u"Visual dBASE 5.5"},
    {u"Visual FoxPro", nullptr, "10", u"Visual FoxPro"},
};

const OptionValueDef MemoPolicyValues[] = {
    {u"Never", nullptr, "0", u"Never ignore the memo file"},
    {u"Errors", nullptr, "1", u"Ignore the memo file if an error occurs"},
    {u"Always", nullptr, "2", u"Pretend there is no memo file"},
};

BATCHERR FormatInt(ZQString& value, int n) {
  char buf[16];
  snprintf(buf, sizeof buf, "%d", n);
  value = buf;
  return 0;
}

BATCHERR GetVersionOption(void* block, ZQString& value, const wchar*) {
  return FormatInt(value, static_cast<ZQDbaseOptions*>(block)->GetVersion());
}

BATCHERR GetMemoErrOption(void* block, ZQString& value, const wchar*) {
  return FormatInt(value, static_cast<ZQDbaseOptions*>(block)->IgnoreMemoFile());
}

BATCHERR SetVersionOption(void* block, const char* value, bool&, const wchar*) {
  auto* opts = static_cast<ZQDbaseOptions*>(block);
  int v = atoi(value ? value : "");
  if (v != opts->GetVersion()) opts->SetVersion(v);
  return 0;
}

BATCHERR SetMemoErrOption(void* block, const char* value, bool&, const wchar*) {
  auto* opts = static_cast<ZQDbaseOptions*>(block);
  int v = atoi(value ? value : "");
  if (v != opts->IgnoreMemoFile()) opts->IgnoreMemoFile(v);
  return 0;
}

ZQOptionDef VersionOption(u"version", u"Version", u"Version of dbase/derivative to read/write", 0xC001, "2",
                          nullptr, GetVersionOption, SetVersionOption, nullptr, nullptr, VersionValues, 10,
                          nullptr, nullptr, 0, 0);
ZQOptionDef MemoErrOption(u"ignorememoerr", u"IgnoreMemoErr", u"Ignore errors related to the memo file", 1, "0",
                          nullptr, GetMemoErrOption, SetMemoErrOption, nullptr, nullptr, MemoPolicyValues, 3,
                          nullptr, nullptr, 0, 0);

// Slot 0 is filled with the host's code page option when a list is fetched.
ZQOptionDef* opt_list[] = {nullptr, &MemoErrOption, &VersionOption, nullptr};
ZQOptionDef* imp_opt_list[] = {nullptr, &MemoErrOption, &VersionOption, nullptr};
ZQOptionDef* exp_opt_list[] = {nullptr, &VersionOption, nullptr};

}  // namespace

const VersionName VersionNames[] = {
    {0, "dBASE II"},
    {4, "dBASE III"},
    {1, "dBASE III+"},
    {3, "Enable"},
    {2, "dBASE IV"},
    {6, "FoxPro"},
    {7, "Enable OA (Database)"},
    {4, "ACT! for Windows"},
    {1, "Alpha Four"},
    {8, "Clipper"},
    {1, "dB-Fast"},
    {0, "Foxbase"},
    {1, "Foxbase+"},
    {1, "Lotus Works (Database)"},
    {2, "Personal Diary (dBASE IV)"},
    {0, "Action Plus (dBASE II)"},
    {6, "Telemagic (FoxPro)"},
    {6, "SBT Acct (FoxPro)"},
    {9, "Visual dBASE 5.5"},
    {10, "Visual FoxPro"},
    {-1, ""},
};

const char** ZQDbase::GetModifiedTypedefs() { return TypeDefinitions; }

// ---------------------------------------------------------------------------
// ZQDbaseOptions

ZQDbaseOptions::ZQDbaseOptions(ZQSpoke* spoke, int version)
    : ZQSpokeOptions(kSpokeTypeDbase, spoke), VersionNumber(version) {
  ValidTypes = new (std::nothrow) const ZQDType*[kValidSlots]();
  IndexTypes = new (std::nothrow) const ZQDType*[kIndexSlots]();
  if (!DataTypesDefined) {
    for (int i = 0; TypeDefinitions[i] != nullptr; ++i) DataTypes[i].Define(TypeDefinitions[i]);
    DataTypesDefined = true;
  }
  if (ValidTypes != nullptr && IndexTypes != nullptr) {
    for (int i = 0; i < 12; ++i) ValidTypes[i] = &DataTypes[i];
    ValidTypes[12] = nullptr;
    IndexTypes[0] = ValidTypes[0];
    IndexTypes[1] = ValidTypes[2];
    IndexTypes[2] = ValidTypes[3];
    IndexTypes[3] = ValidTypes[5];
    IndexTypes[4] = nullptr;
  }
  ResetDataTypes();
  MemoPolicy = 0;
  OrderNumber = 0;
  InitOptions();
}

ZQDbaseOptions::~ZQDbaseOptions() {
  delete[] ValidTypes;
  delete[] IndexTypes;
}

void ZQDbaseOptions::ResetDataTypes() {
  if (ValidTypes == nullptr || IndexTypes == nullptr) return;
  int v = VersionNumber;
  int n = 0;
  for (int i = 0; i < 12; ++i) {
    if (v == DIALECT_VFOXPRO && i == 7) continue;
    ValidTypes[n++] = &DataTypes[i];
  }
  ValidTypes[n] = nullptr;
  int keep;
  switch (v) {
    case DIALECT_DBASE2:
    case DIALECT_ENABLE: keep = 4; break;
    case DIALECT_DBASE3P:
    case DIALECT_DBASE3:
    case DIALECT_CLIPPER: keep = 5; break;
    case DIALECT_FOXPRO: keep = 7; break;
    case DIALECT_VDBASE: keep = 8; break;
    case DIALECT_VFOXPRO: keep = 11; break;
    default: keep = 6; break;  // 2, 5, 7
  }
  for (int i = keep; i < kValidSlots; ++i) ValidTypes[i] = nullptr;
  DataTypes[3].MaxLength(v == DIALECT_CLIPPER ? 32000 : 255);
  if (Spoke() != nullptr) Spoke()->ReplaceValidTypes(ValidTypes);
  IndexTypes[3] = ValidTypes[5];
  if (Spoke() != nullptr) Spoke()->ReplaceIndexTypes(IndexTypes);
}

void ZQDbaseOptions::SetVersion(int version) {
  if (version >= 0 && version <= 10) {
    VersionNumber = version;
    ResetDataTypes();
  }
  OrderNumber = 0;  // a change of dialect forgets the index
}

ZQOptionDef** ZQDbaseOptions::OptionList() {
  opt_list[0] = ZQSpokeOptions::CodePageOption();
  return opt_list;
}
int ZQDbaseOptions::OptionCount() { return 3; }

ZQOptionDef** ZQDbaseOptions::ExportOptionList() {
  exp_opt_list[0] = ZQSpokeOptions::CodePageOption();
  return exp_opt_list;
}
int ZQDbaseOptions::ExportOptionCount() { return 2; }

ZQOptionDef** ZQDbaseOptions::ImportOptionList() {
  imp_opt_list[0] = ZQSpokeOptions::CodePageOption();
  return imp_opt_list;
}
int ZQDbaseOptions::ImportOptionCount() { return 3; }

// ---------------------------------------------------------------------------
// Exchange with the host, and the text form.

bool ZQDbase::GetOptions(ZQSpokeOptions* opts) const {
  if (opts == nullptr || opts->Type() != kSpokeTypeDbase) return false;
  auto* o = static_cast<ZQDbaseOptions*>(opts);
  o->SetVersion(VersionNumber);  // first: SetVersion clears the order
  o->Order(OrderNumber);
  return true;
}

BATCHERR ZQDbase::SetOptions(const ZQSpokeOptions* opts) {
  if (opts == nullptr || opts->Type() != kSpokeTypeDbase) return ZQ_BAD_OPTIONS;
  auto* o = const_cast<ZQDbaseOptions*>(static_cast<const ZQDbaseOptions*>(opts));
  VersionNumber = o->GetVersion() == DIALECT_UNNAMED ? DIALECT_DBASE4 : o->GetVersion();
  int order = o->Order();
  if (order == OrderNumber) return 0;
  // Selecting an index: forget the open one, then open the new one.
  OrderNumber = order;
  delete OrderIndex;
  OrderIndex = nullptr;
  if (order == 0) return 0;
  // A number that names no entry of the list is an index that can't be opened.
  ZQIndexDef* const* list = Spoke() != nullptr ? Spoke()->IndexList() : nullptr;
  int count = 0;
  while (list != nullptr && list[count] != nullptr) ++count;
  if (order < 0 || order > count) return ZQ_INDEX_ERROR;
  OrderIndex = OpenIndex(BasePath, list[order - 1]->Name());
  if (OrderIndex == nullptr || !OrderIndex->OK()) return ZQ_INDEX_ERROR;
  return 0;
}

void ZQDbase::SaveOptions(ZQString& text, bool noIndex) const {
  for (int i = 0; VersionNames[i].dialect >= 0; ++i) {
    if (VersionNames[i].dialect == VersionNumber) {
      text += "version= ";
      text += VersionNames[i].name;
      text += "\n";
      break;
    }
  }
  if (!noIndex && OrderNumber != 0) {
    char line[40];
    snprintf(line, sizeof line, "index number= %d\n", OrderNumber);
    text += line;
  }
}

void ZQDbase::LoadOptions(ZQString& text, bool) {
  char keyword[kKeywordSize];
  ZQString value;
  while (NextKeyword(keyword, text)) {
    value.Extract(text);
    if (strcmpi(keyword, "index number") == 0) {
      OrderNumber = atoi(value.c_str());
    } else if (strcmpi(keyword, "version") == 0) {
      bool number = isdigit(static_cast<unsigned char>(value[0])) != 0;
      for (int i = 0; VersionNames[i].dialect >= 0; ++i) {
        if (strcmpi(VersionNames[i].name, value.c_str()) == 0 ||
            (number && atoi(value.c_str()) == VersionNames[i].dialect)) {
          SetVersion(VersionNames[i].dialect);
          break;
        }
      }
    }
  }
}
