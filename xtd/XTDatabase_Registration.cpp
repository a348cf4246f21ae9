// The registry's install and uninstall callbacks.
#include "Extora/XTLog.h"
#include "xtd/RecordText.h"
#include "xtd/XTDatabase.h"

namespace extora {

void XTDatabase::pluginsDidInstall(const platform::PlugInRecords& records) {
  for (const platform::PlugInRecord& record : records) {
    XTLogOps().def("plug-in INSTALLED:{}", describeInstallation(*record));
  }
}

void XTDatabase::pluginsWillUninstall(const platform::PlugInRecords& records) {
  sync_.sync([&] {
    sync_.assertOnQueue();
    for (const platform::PlugInRecord& record : records) {
      XTLogOps().def("plug-in UNINSTALLED:{}", describeInstallation(*record));
      if (record->plugInUUID) cache_.erase(*record->plugInUUID);
    }
    cacheCount_ = cache_.size();
  });
  if (const std::shared_ptr<XTDatabaseDelegate> receiver = delegate().lock()) receiver->removedPlugIns(records);
}

}  // namespace extora
