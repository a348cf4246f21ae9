#include "Extora/XTLog.h"
#include "Extora/XTVocabulary.h"
#include "xtd/Probes.h"
#include "xtd/Transaction.h"
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDServer.h"

namespace extora {

void Transaction::addPlugIns() {
  (void)processPaths([this](const std::string& path, bool exists) {
    if (!exists) {
      fail(XTErrorPath, fmt::format("invalid plugin path: {}", path));
      return false;
    }
    probes::pluginAdd(path);
    if (server().addPlugIn(Url::file(path))) {
      XTLogOps().def("failed to register plug-in at {}", path);
      fail(XTErrorRegistry, fmt::format("unable to register plug-in at {}", path));
      return false;
    }
    return true;
  });
}

void Transaction::removePlugIns() {
  (void)processPaths([this](const std::string& path, bool exists) {
    probes::pluginRemove(path, exists);
    if (!client_->hasEntitlement(std::string(XTManagerEntitlement))) {
      platform::Log::processDefault().def(
          "refused request from pid={} to remove plug-in at {} - client lacks required entitlement", client_->pid(),
          path);
      fail(XTErrorNotPermitted, "caller lacks entitlement for this operation");
      return false;
    }
    if (server().removePlugIn(Url::file(path))) {
      fail(XTErrorPath, fmt::format("no plugin at {}", path));
      return false;
    }
    return true;
  });
}

void Transaction::bulkPlugIns() {
  XTLogOps().info("bulk options {:#x} not supported", request()[XTDFlagsKey].exactUnsigned());
  done();
}

}  // namespace extora
