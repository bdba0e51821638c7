// The table object's indexes: listing them to the host and opening one.
#include <new>

#include "connector/dbase.h"
#include "host/zqutil.h"
#include "index/dbindex.h"
#include "index/foxidx.h"
#include "index/mdx.h"

IndexFamily IndexFamilyOf(int dialect) {
  switch (dialect) {
    case DIALECT_DBASE4:
    case DIALECT_UNNAMED:
    case DIALECT_VDBASE: return IndexFamily::kDbase;
    // Visual FoxPro tables keep their CDX as FoxPro tables do, so that the
    // applications that own them see the records written here.
    case DIALECT_FOXPRO:
    case DIALECT_VFOXPRO: return IndexFamily::kFox;
    default: return IndexFamily::kNone;
  }
}

void ZQDbase::DescribeIndices(const char* name) {
  switch (IndexFamilyOf(VersionNumber)) {
    case IndexFamily::kDbase: ZQDBMdx::BuildIndexList(name, OwnerSpoke()); break;
    case IndexFamily::kFox: ZQDBFoxIndex::BuildIndexList(name, OwnerSpoke(), FoxIndexList); break;
    default: break;  // the host's list stays as it was
  }
}

ZQDBIndexBase* ZQDbase::OpenIndex(const char* base, const char* name) {
  switch (IndexFamilyOf(VersionNumber)) {
    case IndexFamily::kDbase: return new (std::nothrow) ZQDBMdx(base, name);
    case IndexFamily::kFox: return new (std::nothrow) ZQDBFoxIndex(base, name, FoxIndexList);
    default: return nullptr;
  }
}

ZQDBIndexBase* ZQDbase::CreateIndex(const char* base, const ZQRecord& fields, ZQIndexDef* def) {
  switch (IndexFamilyOf(VersionNumber)) {
    case IndexFamily::kDbase: return new (std::nothrow) ZQDBMdx(base, def->Name(), fields, def);
    case IndexFamily::kFox: return new (std::nothrow) ZQDBFoxIndex(base, def->Name(), fields, *def, FoxIndexList);
    default: return nullptr;
  }
}

void ZQDbase::DropIndexes() {
  delete OrderIndex;
  OrderIndex = nullptr;
  delete FoxIndexList;
  FoxIndexList = nullptr;
}

namespace {

// A walk over one index object, which it owns.
class IndexObjectWalk : public ZQIndexWalk {
 public:
  IndexObjectWalk(ZQDBIndexBase* index, bool backwards, const char* expression, const ZQIndexDef& def,
                  bool unique)
      : index_(index), backwards_(backwards), expression_(expression), def_(def), unique_(unique) {}
  ~IndexObjectWalk() override { delete index_; }
  int32_t First(ZQString& key) override { return index_->FirstKey(key); }
  int32_t Next(ZQString& key) override { return index_->NextKey(key); }
  bool Backwards() const override { return backwards_; }
  int32_t Last(ZQString& key) override { return backwards_ ? index_->LastKey(key) : -1; }
  int32_t Prev(ZQString& key) override { return backwards_ ? index_->PrevKey(key) : -1; }
  int32_t Seek(const ZQString& key, ZQString& found) override {
    // The search stops in the leaf where the key would go; when every key
    // there is less, the first key not less is the next one.
    int32_t r = index_->FindKey(key, false);
    if (r != -1) r = index_->CurrentKey(found);
    if (r == -1 || found < key) r = index_->NextKey(found);
    return r;
  }
  const char* Expression() const override { return expression_.c_str(); }
  bool Broken() const override { return index_->Broken(); }
  void BuildKey(ZQString& key) override { index_->BuildKey(key, &def_); }
  bool Unique() const override { return unique_; }
  int32_t CheckTree(ZQString& findings, bool byValue) override { return index_->CheckTree(findings, byValue); }

 private:
  ZQDBIndexBase* index_;
  bool backwards_;
  ZQString expression_;
  // The definition compiled over the spoke's layout 0, whose fields it names.
  ZQIndexDef def_;
  bool unique_;
};

}  // namespace

ZQIndexWalk* ZQDbase::OpenIndexWalk(const char* name, ZQIndexDef* def) {
  if (Table == nullptr || BasePath[0] == '\0') return nullptr;
  ZQDBIndexBase* index = OpenIndex(BasePath, name);
  if (index == nullptr) return nullptr;
  if (!index->OK()) {
    delete index;
    return nullptr;
  }
  ZQString expression;
  bool backwards = true;
  bool unique = false;
  bool compact = false;
  if (IndexFamilyOf(VersionNumber) == IndexFamily::kDbase) {
    auto* mdx = static_cast<ZQDBMdx*>(index);
    expression = mdx->Expression();
    backwards = !mdx->IsMdx();  // MDX tags are walked forwards only
    unique = mdx->Unique();
  } else {
    auto* fox = static_cast<ZQDBFoxIndex*>(index);
    fox->Expression(expression);
    unique = fox->Unique();
    compact = fox->Compact();
  }
  def->Name(name);
  def->Dups(!unique);
  def->Compress(compact);
  // An expression beyond the grammar still walks; it has no segments then,
  // and its keys show as text.
  ZQString parsed(expression);
  ZQIndexDef compiled;
  if (ZQDBIndexBase::ParseExpr(parsed, &compiled, OwnerSpoke())) {
    compiled.Name(name);
    compiled.Dups(!unique);
    compiled.Compress(compact);
    *def = compiled;
  }
  auto* walk = new (std::nothrow) IndexObjectWalk(index, backwards, expression.c_str(), *def, unique);
  if (walk == nullptr) delete index;
  return walk;
}

void ZQDbase::ReportIndexes(ZQString& text) {
  ZQIndexDef* const* list = OwnerSpoke()->IndexList();
  for (int i = 0; list != nullptr && list[i] != nullptr; ++i) {
    const ZQIndexDef* def = list[i];
    ZQString expression;
    ZQString file(BasePath);
    if (IndexFamilyOf(VersionNumber) == IndexFamily::kDbase) {
      file += ".mdx";
      ZQDBMdx tag(BasePath, def->Name());
      if (tag.OK()) expression = tag.Expression();
    } else {
      file += ".cdx";
      ZQDBFoxIndex tag(BasePath, def->Name(), FoxIndexList);
      if (tag.OK()) tag.Expression(expression);
    }
    if (expression.length() == 0) ZQDBIndexBase::PrintExpr(expression, const_cast<ZQIndexDef*>(def));
    // The key type follows from the segments: a single date or numeric
    // segment makes 8-byte keys of that kind, anything else text.
    const char* type = "C";
    if (def->SegCount() == 1 && (*def)[0].Type() != nullptr && (*def)[0].Type()->Kind() != DT_TEXT)
      type = (*def)[0].IdxField() != nullptr && (*def)[0].IdxField()->FieldType() == FT_DATE ? "D" : "N";
    text += "index: ";
    text += def->Name();
    text += "\t";
    text += expression;
    text += "\t";
    text += type;
    text += def->Dups() ? "\tduplicates\t" : "\tunique\t";
    text += file;
    text += "\n";
  }
}

void IndexSegmentFields(const ZQIndexDef* def, ZQRecord& fields) {
  fields.ClearFields();
  for (int s = 0; s < def->SegCount(); ++s) fields.InstallField(s, (*def)[s].IdxField());
}

BATCHERR ZQDbase::BuildIndexes(const char* base, ZQIndexDef* const* defs) {
  if (Table == nullptr || RecordBuffer == nullptr) return ZQ_NOT_OPEN;
  IndexFamily family = IndexFamilyOf(VersionNumber);
  if (family == IndexFamily::kNone)
    return OwnerSpoke()->LogError(4, ZQ_NOT_SUPPORTED, lgettext(u"This dialect has no index files"));
  int count = 0;
  while (defs != nullptr && defs[count] != nullptr) ++count;
  if (count == 0) return 0;
  ZQDBIndexBase** made = new (std::nothrow) ZQDBIndexBase*[size_t(count)]();
  if (made == nullptr) return ZQ_NO_MEMORY;
  // The new CDX's own tag list: the first tag makes the file, the others
  // join it.
  ZQDBFoxIndex* tags = nullptr;
  BATCHERR rc = 0;
  ZQRecord fields;
  for (int i = 0; i < count && rc == 0; ++i) {
    IndexSegmentFields(defs[i], fields);
    if (family == IndexFamily::kDbase)
      made[i] = new (std::nothrow) ZQDBMdx(base, defs[i]->Name(), fields, defs[i]);
    else
      made[i] = new (std::nothrow) ZQDBFoxIndex(base, defs[i]->Name(), fields, *defs[i], tags);
    fields.ClearFields();
    if (made[i] == nullptr || !made[i]->OK()) {
      ZQWString name;
      name.Assign(defs[i]->Name(), 0, -1);
      rc = OwnerSpoke()->LogError(4, ZQ_INDEX_ERROR, lgettext(u"Cannot create index %s"), name.c_str());
    }
  }
  // Every live record in file order: its fields decoded into layout 0, whose
  // fields the definitions' segments name, and its key added under its
  // physical number, the number the files hold.
  ZQRecord& layout = *OwnerSpoke()->GetLayout(0);
  ZQString key;
  for (int32_t n = 0; rc == 0; ++n) {
    rc = GetRecord(layout, n, nullptr, false);
    if (rc == ZQ_END) {
      rc = 0;
      break;
    }
    for (int i = 0; i < count && rc == 0; ++i) {
      made[i]->BuildKey(key, defs[i]);
      if (!made[i]->AddKey(key, CurrentPhysical))
        rc = OwnerSpoke()->LogError(4, ZQ_WRITE_ERROR, lgettext(u"Got False from addkey %1$S, recno %2$d"),
                                    key.c_str(), CurrentPhysical);
    }
    if (n == INT32_MAX - 1) break;
  }
  for (int i = 0; i < count; ++i) {
    if (rc == 0 && family == IndexFamily::kFox && made[i] != nullptr &&
        !static_cast<ZQDBFoxIndex*>(made[i])->Flush())
      rc = OwnerSpoke()->LogError(4, ZQ_WRITE_ERROR, lgettext(u"Error writing index file"));
    delete made[i];
  }
  delete[] made;
  delete tags;
  return rc;
}
