#include "Extora/XTLog.h"
#include "xtd/XTDPlugIn.h"

namespace extora {

Value XTDPlugIn::checkBusy(platform::ProcessAssertions& assertions) const {
  const std::string bundleIdentifier = infoKey("HBBundleIdentifier").string();
  const Value instances = assertions.queryBusyInstances({bundleIdentifier});
  for (const Value& instance : instances.items()) {
    const Value& busy = instance[platform::kBusyBundleIdentifierKey];
    if (busy.isString()) return Dictionary{{platform::kBusyBundleIdentifierKey, busy}};
    XTLogOps().error("procwatch reported incomplete bundle for plug-in {}/{}", identifier(), uuid().text());
  }
  return {};
}

}  // namespace extora
