#include "Extora/XTLog.h"
#include "xtd/RecordText.h"
#include "xtd/Transaction.h"
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDServer.h"

namespace extora {

void Transaction::lockDownPlugIns() {
  if (const Value& tokens = request()[XTDUUIDKey]; tokens.isArray()) {
    for (const Value& token : tokens.items()) {
      if (token.isUuid()) server().unholdToken(token.uuid());
    }
    done();
    return;
  }
  const std::uint64_t flags = request()[XTDFlagsKey].exactUnsigned();
  std::vector<std::shared_ptr<XTDPlugIn>> plugIns;
  if (!collectPlugInsToHold(flags, plugIns)) return;
  if (XTLogOps().enabled(platform::LogLevel::Info)) {
    XTLogOps().info("processing hold request for plug-ins:{}", describePlugIns(plugIns));
  }
  if ((flags & XTHoldFlagRefuseBusy) != 0 && !noneIsBusy(plugIns)) return;

  auto hold = std::make_shared<XTDPlugInHold>(plugIns, client_);
  const Uuid token = hold->uuid();
  server().addHold(std::move(hold));
  reply().set(XTDUUIDKey, token);
  if ((flags & XTHoldFlagTerminate) == 0) {
    XTLogOps().info("hold request granted uuid:{}", token);
    done();
    return;
  }
  platform::PlugInRecords records;
  for (const auto& plugIn : plugIns) {
    if (auto record = plugIn->getProxy()) records.push_back(std::move(record));
  }
  server().terminatePlugIns(records, [self = shared_from_this(), token] {
    XTLogOps().info("forced termination complete; hold request granted uuid:{}", token);
    self->done();
  });
}

bool Transaction::collectPlugInsToHold(std::uint64_t flags, std::vector<std::shared_ptr<XTDPlugIn>>& plugIns) {
  return marshalPaths([&](const std::string& path, bool exists) {
    if (!exists) {
      fail(XTErrorPath, fmt::format("invalid path: {}", path));
      return false;
    }
    if ((flags & XTHoldFlagPlugInPaths) == 0) {
      if (auto within = server().plugInsWithinApplication(Url::file(path))) {
        plugIns.insert(plugIns.end(), within->begin(), within->end());
      }
      return true;
    }
    auto plugIn = server().findPlugInAtPath(Url::file(path));
    if (plugIn == nullptr) {
      fail(XTErrorPath, fmt::format("no plug-in at path:{}", path));
      return false;
    }
    plugIns.push_back(std::move(plugIn));
    return true;
  });
}

// Every plug-in is asked; the first busy one does not end it.
bool Transaction::noneIsBusy(const std::vector<std::shared_ptr<XTDPlugIn>>& plugIns) {
  platform::Array conflicts;
  std::vector<std::shared_ptr<XTDPlugIn>> busy;
  for (const auto& plugIn : plugIns) {
    Value description = plugIn->checkBusy(*server().platformServices()->assertions);
    if (description.isNothing()) continue;
    busy.push_back(plugIn);
    conflicts.append(std::move(description));
  }
  if (busy.empty()) return true;
  if (XTLogOps().enabled(platform::LogLevel::Debug)) {
    XTLogOps().debug("hold refused. Busy plug-ins:{}", describePlugIns(busy));
  }
  reply().set(XTDConflictsKey, std::move(conflicts));
  fail(XTErrorBusy, "plug-ins are busy");
  return false;
}

}  // namespace extora
