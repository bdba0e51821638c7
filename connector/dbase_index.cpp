// The table object's indexes: listing them to the host and opening one.
#include <new>

#include "connector/dbase.h"
#include "index/dbindex.h"
#include "index/mdx.h"

IndexFamily IndexFamilyOf(int dialect) {
  switch (dialect) {
    case DIALECT_DBASE4:
    case DIALECT_UNNAMED:
    case DIALECT_VDBASE: return IndexFamily::kDbase;
    default: return IndexFamily::kNone;
  }
}

void ZQDbase::DescribeIndices(const char* name) {
  switch (IndexFamilyOf(VersionNumber)) {
    case IndexFamily::kDbase: ZQDBMdx::BuildIndexList(name, OwnerSpoke()); break;
    default: break;  // the host's list stays as it was
  }
}

ZQDBIndexBase* ZQDbase::OpenIndex(const char* base, const char* name) {
  switch (IndexFamilyOf(VersionNumber)) {
    case IndexFamily::kDbase: return new (std::nothrow) ZQDBMdx(base, name);
    default: return nullptr;
  }
}

void ZQDbase::DropIndexes() {
  delete OrderIndex;
  OrderIndex = nullptr;
}
