#include "Extora/XTDaemonClient.h"
#include "Extora/XTLog.h"
#include "xtd/Transaction.h"
#include "xtd/XTDServer.h"

namespace extora {

void Transaction::findPlugIn() {
  std::shared_ptr<XTDPlugIn> plugIn;
  if (const Value& uuid = request()[XTDUUIDKey]; uuid.isUuid()) plugIn = findPlugInByUUID(uuid);
  // When both keys are given, the location decides, even when it names nothing.
  if (const Value& location = request()[XTDPathsKey]; location.isString()) plugIn = findPlugInByPathURL(location);
  if (plugIn == nullptr) {
    XTLogOps().def("plugin not found");
    fail(XTErrorNotFound, "Cannot locate PlugIn");
    return;
  }
  XTLogOps().def("plugin found {}", *plugIn);
  Error error;
  const Value exported = plugIn->exportForm(&error);
  if (!error.domain.empty()) XTLogOps().error("failed to export matching plug-in {}: {}", plugIn->uuid(), error);
  if (exported.isDictionary()) {
    platform::Dictionary form(exported);
    finishForm(*plugIn, form);
    reply().set(XTDMatchesKey, XTDaemonClient::convertToIPC(std::move(form), version_));
  }
  done();
}

std::shared_ptr<XTDPlugIn> Transaction::findPlugInByUUID(const Value& uuid) {
  return server().findPlugIn(uuid.uuid());
}

std::shared_ptr<XTDPlugIn> Transaction::findPlugInByPathURL(const Value& text) {
  return server().findPlugInAtPath(Url::parse(text.string()).value_or(Url()));
}

}  // namespace extora
