#include "engine/indexes.h"

#include <unistd.h>

#include <cctype>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <set>

#include "engine/outbuf.h"
#include "engine/report.h"
#include "engine/writers.h"
#include "host/bytescan.h"
#include "host/endian.h"
#include "host/zqdate.h"
#include "host/zqglob.h"

namespace {

constexpr size_t kTagNameMax = 10;
constexpr int kMaxMdxTags = 47;
// Longest expression text the header of an MDX tag (an NDX file) holds.
constexpr size_t kMdxExpressionMax = 100, kNdxExpressionMax = 487;

// The extension of the last name of `path`, lower-cased; "" for none.
std::string ExtensionOf(const std::string& path) {
  size_t slash = path.rfind('/');
  size_t dot = path.rfind('.');
  if (dot == std::string::npos || (slash != std::string::npos && dot < slash)) return "";
  std::string ext = path.substr(dot + 1);
  for (char& c : ext) c = char(tolower(static_cast<unsigned char>(c)));
  return ext;
}

bool ValidTagName(const std::string& name) {
  if (name.empty() || name.size() > kTagNameMax || isdigit(static_cast<unsigned char>(name[0]))) return false;
  for (char c : name)
    if (!isalnum(static_cast<unsigned char>(c)) && c != '_') return false;
  return true;
}

bool IsBinary(const ZQIndexSeg& seg) { return seg.Type() != nullptr && seg.Type()->Kind() != DT_TEXT; }

// The expression as the index file will hold it: its fields joined by "+".
std::string StoredForm(const ZQIndexDef& def) {
  std::string text;
  for (int i = 0; i < def.SegCount(); ++i) {
    if (i > 0) text += "+";
    text += def[i].Name();
  }
  return text;
}

int DialectOf(ZQSpoke* spoke) {
  ZQString v;
  spoke->GetOption("version", v);
  return atoi(v.c_str());
}

}  // namespace

IndexKind IndexKindOf(int dialect) {
  switch (dialect) {
    case 2:
    case 5:
    case 9: return IndexKind::kDbase;
    case 6:
    case 10: return IndexKind::kFox;
    default: return IndexKind::kNone;
  }
}

bool AddIndexDefinitions(ZQExport* spoke, const TableWriteOptions& opts, bool existing, std::string* error) {
  if (opts.indexes.empty()) return true;
  if (existing) {
    *error = "--index makes the indexes of a new table; an existing table's own indexes are kept current without it";
    return false;
  }
  IndexKind kind = IndexKindOf(DialectOf(spoke));
  if (kind == IndexKind::kNone) {
    Warn("this dialect has no index files: " + std::to_string(opts.indexes.size()) +
         " index definition(s) ignored");
    return true;
  }
  const std::string file_ext = kind == IndexKind::kDbase ? "ndx" : "idx";
  std::set<std::string> names;
  int tags = 0;
  for (const IndexOption& o : opts.indexes) {
    std::string name = o.name;
    std::string ext = ExtensionOf(name);
    bool is_file = !ext.empty();
    if (is_file && ext != file_ext) {
      *error = "index " + name + ": an index file of this dialect ends in ." + file_ext;
      return false;
    }
    if (!is_file) {
      for (char& c : name) c = char(toupper(static_cast<unsigned char>(c)));
      if (!ValidTagName(name)) {
        *error = "index " + o.name + ": a tag name is 1 to 10 letters, digits or _, not starting with a digit";
        return false;
      }
      if (++tags > kMaxMdxTags && kind == IndexKind::kDbase) {
        *error = "more than 47 tags: an MDX file holds no more";
        return false;
      }
    }
    if (!names.insert(name).second) {
      *error = "index " + name + " is given twice";
      return false;
    }
    auto def = std::make_unique<ZQIndexDef>();
    def->Name(name.c_str());
    def->Dups(!o.unique);
    def->Compress(!opts.plain_idx);
    if (!spoke->ParseIndexExpression(o.expression.c_str(), def.get()) || def->SegCount() == 0) {
      *error = "index " + name + ": cannot index on \"" + o.expression +
               "\" (an index key is fields of the table joined by +, or SUBSTR, STR or DTOS of a field)";
      return false;
    }
    // The file keeps the expression as its fields joined by "+". Read back,
    // that must make the same keys, or later appends and other programs
    // would add keys of another form to the same index.
    std::string stored = StoredForm(*def);
    ZQIndexDef again;
    bool same = spoke->ParseIndexExpression(stored.c_str(), &again) && again.SegCount() == def->SegCount();
    for (int i = 0; same && i < def->SegCount(); ++i) same = IsBinary(again[i]) == IsBinary((*def)[i]);
    if (!same) {
      *error = "index " + name + ": \"" + o.expression + "\" would be stored as \"" + stored +
               "\", whose keys differ; index the field itself";
      return false;
    }
    size_t max = is_file && kind == IndexKind::kDbase ? kNdxExpressionMax : kMdxExpressionMax;
    if (stored.size() > max) {
      *error = "index " + name + ": the expression is longer than the " + std::to_string(max) +
               " bytes an index header holds";
      return false;
    }
    for (int i = 0; i < def->SegCount(); ++i) {
      if (IsBinary((*def)[i])) {
        Warn("index " + name + ": its numeric or date keys are 8-byte doubles in this system's own byte order, "
             "which other programs don't read in value order");
        break;
      }
    }
    spoke->AddIndex(def.release());
  }
  return true;
}

// ---------------------------------------------------------------------------
// keys

namespace {

enum class KeyForm { kText, kNumber, kBytes };

KeyForm FormOf(const ZQIndexDef& def) {
  if (def.SegCount() == 1 && IsBinary(def[0])) return KeyForm::kNumber;
  for (int i = 0; i < def.SegCount(); ++i)
    if (IsBinary(def[i])) return KeyForm::kBytes;
  return KeyForm::kText;
}

bool DateSegment(const ZQIndexDef& def) {
  return def.SegCount() == 1 && def[0].IdxField() != nullptr && def[0].IdxField()->FieldType() == FT_DATE;
}

// The search key of --seek: the text as given, or for an index of numbers
// or dates the 8 bytes of the number (a date as YYYY-MM-DD or YYYYMMDD).
bool SeekKey(const std::string& text, const ZQIndexDef& def, ZQString* key) {
  if (FormOf(def) != KeyForm::kNumber) {
    *key = ZQString(text.c_str(), int32_t(text.size()));
    return true;
  }
  double v;
  int y, m, d;
  char* end = nullptr;
  if (DateSegment(def) && (sscanf(text.c_str(), "%4d-%2d-%2d", &y, &m, &d) == 3 ||
                           (text.size() == 8 && sscanf(text.c_str(), "%4d%2d%2d", &y, &m, &d) == 3))) {
    v = JulianDayFromDate(y, m, d);
  } else {
    v = strtod(text.c_str(), &end);
    if (text.empty() || *end != '\0') return false;
  }
  uint64_t bits;
  memcpy(&bits, &v, sizeof bits);
  uint8_t bytes[8];
  PutLe64(bytes, bits);
  *key = ZQString(reinterpret_cast<const char*>(bytes), 8);
  return true;
}

// Text keys hold the table's bytes, in its code page (`codepage`, 0 for
// none): shown as UTF-8 like the table's values.
void PutKey(OutBuf& out, const ZQString& key, KeyForm form, bool jsonl, int codepage, ZQString* scratch) {
  const char* p = key.c_str();
  size_t n = size_t(key.length());
  if (form == KeyForm::kText && codepage != 0 && bytescan::HasHighBit(p, n)) {
    *scratch = key;
    ZQGlob::ExternalToInternal(codepage, *scratch);
    p = scratch->c_str();
    n = size_t(scratch->length());
  }
  if (form == KeyForm::kNumber && n >= 8) {
    uint64_t bits = GetLe64(reinterpret_cast<const uint8_t*>(p));
    double v;
    memcpy(&v, &bits, sizeof v);
    out.PutDouble(v);
    return;
  }
  if (form == KeyForm::kBytes) {
    static const char kHex[] = "0123456789abcdef";
    std::string hex;
    for (size_t i = 0; i < n; ++i) {
      hex += kHex[uint8_t(p[i]) >> 4];
      hex += kHex[uint8_t(p[i]) & 15];
    }
    if (jsonl) PutJsonString(out, hex.data(), hex.size());
    else out.Put(hex.data(), hex.size());
    return;
  }
  while (n > 0 && (p[n - 1] == ' ' || p[n - 1] == '\0')) --n;
  if (jsonl) PutJsonString(out, p, n);
  else PutCsvText(out, p, n);
}

}  // namespace

int WriteKeys(ZQImport* spoke, const KeysOptions& opts) {
  ZQIndexDef def;
  std::unique_ptr<ZQIndexWalk> walk(spoke->OpenIndexWalk(opts.index.c_str(), &def));
  if (!walk) {
    std::string known;
    ZQIndexDef* const* list = spoke->IndexList();
    for (int i = 0; list != nullptr && list[i] != nullptr; ++i) known += std::string(known.empty() ? "" : ", ") + list[i]->Name();
    return Fail("no index " + opts.index + " could be opened" +
                (known.empty() ? std::string(" (the table has no index listed)") : " (the table's indexes: " + known + ")"));
  }
  if (opts.reverse && !walk->Backwards()) {
    fprintf(stderr, "zqdb: an MDX tag is walked forwards only; --reverse works on NDX, IDX and CDX indexes\n");
    return 2;
  }
  KeyForm form = FormOf(def);
  ZQString key, start;
  if (opts.has_seek && !SeekKey(opts.seek, def, &start)) {
    fprintf(stderr, "zqdb: --seek: %s is no number or date, as the keys of this index are\n", opts.seek.c_str());
    return 2;
  }
  ZQString v, shown;
  const int codepage = spoke->GetOption("codepage", v) == 0 ? atoi(v.c_str()) : 0;
  if (opts.has_seek && form == KeyForm::kText && codepage != 0) ZQGlob::InternalToExternal(codepage, start);
  // A key that names a record past the table's end shows an index that
  // doesn't belong to the table as it is: the keys are printed, and the
  // run ends with a warning and exit status 1.
  int64_t records = spoke->EstimateRecordCount();
  int64_t beyond = 0;
  OutBuf out(STDOUT_FILENO);
  if (!opts.jsonl) out.Put("key,recno\n");
  int32_t r;
  if (opts.has_seek) r = walk->Seek(start, key);
  else r = opts.reverse ? walk->Last(key) : walk->First(key);
  // With --seek and --reverse the walk goes back from the key found.
  while (r != -1) {
    if (opts.jsonl) out.Put("{\"key\": ");
    PutKey(out, key, form, opts.jsonl, codepage, &shown);
    out.Put(opts.jsonl ? ", \"recno\": " : ",");
    out.PutInt(int64_t(r) + 1);
    out.Put(opts.jsonl ? "}\n" : "\n");
    if (r >= records) ++beyond;
    r = opts.reverse ? walk->Prev(key) : walk->Next(key);
  }
  if (!out.Flush()) return Fail(std::string("cannot write the output: ") + strerror(out.error()));
  if (walk->Broken()) {
    Warn("the walk of index " + opts.index + " stopped at a block it couldn't follow: the keys above are not all" +
         " of them (zqdb check tells more)");
    return 1;
  }
  if (beyond > 0) {
    Warn(std::to_string(beyond) + " key(s) name records past the table's last (" + std::to_string(records) +
         "): the index doesn't match the table");
    return 1;
  }
  return 0;
}
