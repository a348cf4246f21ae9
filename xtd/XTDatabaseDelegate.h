// XTDatabaseDelegate: told by the database of plug-ins that are being uninstalled.
#pragma once

#include "platform/registry/Records.h"

namespace extora {

class XTDatabaseDelegate {
 public:
  virtual ~XTDatabaseDelegate() = default;
  /// Called after the plug-ins' cache entries are gone, on the registry's queue.
  virtual void removedPlugIns(const platform::PlugInRecords& records) = 0;
};

}  // namespace extora
