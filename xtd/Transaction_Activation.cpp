#include <unordered_set>

#include "Extora/XTLog.h"
#include "Extora/XTVocabulary.h"
#include "platform/value/PropertyListKinds.h"
#include "xtd/Probes.h"
#include "xtd/Transaction.h"
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDServer.h"

namespace extora {

void Transaction::readyPlugIns() {
  Value environment;
  if (const Value& sent = request()[XTDEnvironmentKey]; sent.isDictionary()) {
    environment = platform::toPropertyListKinds(sent);
    if (!client_->hasEntitlement(std::string(XTEnvironmentProvisionEntitlement))) {
      fail(XTErrorNotPermitted, fmt::format("Transmission of environment variables requires the {} host entitlement",
                                            XTEnvironmentProvisionEntitlement));
      return;
    }
    XTLogOps().debug("pid {} provided {} environment entries", client_->pid(), environment.size());
  }

  // Nothing is registered before the whole list has passed; a plug-in listed twice is enabled once.
  std::vector<std::shared_ptr<XTDPlugIn>> toEnable;
  std::unordered_set<Uuid> seen;
  const bool passed = processUuidList([&](const std::shared_ptr<XTDPlugIn>& plugIn) {
    if (!mayBeReady(*plugIn)) return false;
    if (!plugIn->isData() && seen.insert(plugIn->uuid()).second) toEnable.push_back(plugIn);
    return true;
  });
  if (!passed) return;

  bool failed = false;
  for (const auto& plugIn : toEnable) {
    const auto error = plugIn->enableForClient(*client_, environment);
    if (error && !failed) fail(XTErrorRequest, *error);
    failed = failed || error.has_value();
  }
  if (!failed) done();
}

// False when the failure has been sent.
bool Transaction::mayBeReady(const XTDPlugIn& plugIn) {
  probes::pluginReady(plugIn.uuid().text());
  if (server().holdOnPlugIn(plugIn)) {
    XTLogOps().def("denied access to {} for plugin {}({}): the plug-in is on hold", client_->pid(), plugIn.identifier(),
                   plugIn.uuid());
    fail(XTErrorNotPermitted, fmt::format("access to plugin {} denied: the plug-in is on hold", plugIn.identifier()));
    return false;
  }
  if (plugIn.isData()) return true;
  if (const auto reason = plugIn.allowForClient(*client_)) {
    XTLogOps().def("denied access to {} for plugin {}({}): {}", client_->pid(), plugIn.identifier(), plugIn.uuid(),
                   *reason);
    fail(XTErrorNotPermitted, fmt::format("access to plugin {} denied: {}", plugIn.identifier(), *reason));
    return false;
  }
  return true;
}

void Transaction::accessPlugIns() {
  platform::Array tokens;
  platform::Sandbox& sandbox = *server().platformServices()->sandbox;
  const bool passed = processUuidList([&](const std::shared_ptr<XTDPlugIn>& plugIn) {
    int errorNumber = 0;
    auto token = plugIn->issueFileExtension(sandbox, plugIn->url(), &errorNumber);
    if (!token) {
      fail(XTErrorRequest, fmt::format("cannot create file extension to {}: {}", plugIn->path(), errorNumber));
      return false;
    }
    tokens.append(*token);
    return true;
  });
  if (!passed) return;
  reply().set(XTDExtensionsKey, tokens);
  done();
}

}  // namespace extora
