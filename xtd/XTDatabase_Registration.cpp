// Registration of bundles by request, and the registry's install and uninstall callbacks.
#include "Extora/XTError.h"
#include "Extora/XTLog.h"
#include "Extora/XTProtocol.h"
#include "xtd/RecordText.h"
#include "xtd/XTDatabase.h"

namespace extora {

std::optional<Error> XTDatabase::addPlugIn(const Url& url) {
  if (const auto refusal = workspace()->registryRegisterPlugin(url)) {
    XTLogAr().info("{} is not registered: {}", url.path(), *refusal);
    return makeError(XTErrorRegistry, "AppRegistry failed to register the plug-in");
  }
  return std::nullopt;
}

std::optional<Error> XTDatabase::removePlugIn(const Url& url) {
  if (const auto refusal = workspace()->registryUnregisterPlugin(url)) {
    XTLogAr().info("{} is not unregistered: {}", url.path(), *refusal);
    return makeError(XTErrorRegistry, "AppRegistry failed to deregister the plug-in");
  }
  return std::nullopt;
}

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
