// The target's indexes: opened with an existing table, created with a new
// one, and given one key for every record written.
#include <cstring>
#include <new>

#include "connector/todbase.h"
#include "host/platform.h"
#include "host/zqglob.h"
#include "host/zqutil.h"
#include "index/dbindex.h"
#include "index/mdx.h"

namespace {

// The target path without its extension.
bool BasePathOf(const char* path, char (&base)[4096]) {
  size_t n = strlen(path);
  if (n >= sizeof base) return false;
  char name[4096];
  memcpy(base, path, n + 1);
  ZQGlob::sepfile(base, name, nullptr);
  ZQGlob::appndnam(base, name);
  return true;
}

int CountOf(ZQIndexDef* const* list) {
  int n = 0;
  while (list != nullptr && list[n] != nullptr) ++n;
  return n;
}

}  // namespace

void ZQToDbase::CloseIndexes() {
  for (int i = 0; IndexObjects != nullptr && IndexObjects[i] != nullptr; ++i) delete IndexObjects[i];
  delete[] IndexObjects;
  IndexObjects = nullptr;
}

BATCHERR ZQToDbase::IndexFailed(const char* what, const ZQIndexDef* def) {
  ZQWString name;
  name.Assign(def->Name(), 0, -1);
  ZQWString verb;
  verb.Assign(what, 0, -1);
  // Each entry must be a working index: a key left out of one would leave
  // that index wrong for good, so the output isn't opened at all.
  CloseIndexes();
  return LogError(4, ZQ_INDEX_ERROR, lgettext(u"Cannot %s index %s"), verb.c_str(), name.c_str());
}

BATCHERR ZQToDbase::OpenIndexes(const char* path) {
  char base[4096];
  if (!BasePathOf(path, base)) return 0;
  if (IndexList() == nullptr) dbase.DescribeIndices(base);
  ZQIndexDef* const* list = IndexList();
  int count = CountOf(list);
  if (count == 0 || IndexFamilyOf(dbase.GetVersion()) == IndexFamily::kNone) return 0;
  IndexObjects = new (std::nothrow) ZQDBIndexBase*[size_t(count) + 1]();
  if (IndexObjects == nullptr) return ZQ_NO_MEMORY;
  ZQRecord fields;
  for (int i = 0; i < count; ++i) {
    IndexSegmentFields(list[i], fields);
    ZQDBIndexBase* index = dbase.OpenIndex(base, list[i]->Name());
    IndexObjects[i] = index;
    if (index == nullptr || !index->OK()) return IndexFailed("open", list[i]);
    index->SetFields(fields);
    fields.ClearFields();
  }
  return 0;
}

BATCHERR ZQToDbase::CreateIndexes(const char* path) {
  ZQIndexDef* const* list = IndexList();
  int count = CountOf(list);
  if (count == 0) return 0;
  char base[4096];
  if (!BasePathOf(path, base)) return ZQ_CREATE_ERROR;
  char mdx[4096];
  memcpy(mdx, base, sizeof mdx);
  if (strlen(mdx) + 5 < sizeof mdx) {
    ZQGlob::appndext(mdx, "mdx");
    _unlink(mdx);
  }
  if (IndexFamilyOf(dbase.GetVersion()) == IndexFamily::kNone) return 0;
  IndexObjects = new (std::nothrow) ZQDBIndexBase*[size_t(count) + 1]();
  if (IndexObjects == nullptr) return ZQ_NO_MEMORY;
  ZQRecord fields;
  for (int i = 0; i < count; ++i) {
    IndexSegmentFields(list[i], fields);
    ZQDBIndexBase* index = dbase.CreateIndex(base, fields, list[i]);
    IndexObjects[i] = index;
    if (index == nullptr || !index->OK()) return IndexFailed("create", list[i]);
    fields.ClearFields();
  }
  return 0;
}

BATCHERR ZQToDbase::AddIndexKeys() {
  ZQIndexDef* const* list = IndexList();
  if (IndexObjects == nullptr) return 0;
  for (int i = 0; list != nullptr && list[i] != nullptr && IndexObjects[i] != nullptr; ++i) {
    IndexKey = "";
    IndexObjects[i]->BuildKey(IndexKey, list[i]);
    if (!IndexObjects[i]->AddKey(IndexKey, CurrentRecord - 1)) {
      return LogError(4, ZQ_WRITE_ERROR, lgettext(u"Got False from addkey %1$S, recno %2$d"), IndexKey.c_str(),
                      CurrentRecord - 1);
    }
  }
  return 0;
}

bool ZQToDbase::ParseIndexExpression(const char* text, ZQIndexDef* def) {
  if (IndexFamilyOf(dbase.GetVersion()) == IndexFamily::kNone) return false;
  ZQString expression(text);
  return ZQDBIndexBase::ParseExpr(expression, def, this);
}
