// Reaches the table object's private operations from the connector tests
// (ZQDbase names this class its friend).
#pragma once

#include "connector/dbase.h"
#include "connector/frdbase.h"

class DbaseTestPeer {
 public:
  // The table object of a source spoke: its live option block.
  static ZQDbase& Of(ZQFromDbase* spoke) { return *static_cast<ZQDbase*>(spoke->GetOptions()); }
  static BATCHERR SetOptions(ZQDbase& db, const ZQSpokeOptions* opts) { return db.SetOptions(opts); }
  static const ZQHashTable& RecordMap(const ZQDbase& db) { return db.RecordMap; }
};
