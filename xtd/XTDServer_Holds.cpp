#include <algorithm>

#include "Extora/XTLog.h"
#include "xtd/XTDIpcClient.h"
#include "xtd/XTDServer.h"

namespace extora {

bool XTDServer::holdOnPlugIn(const XTDPlugIn& plugIn) {
  return syncQueue_.sync([&] {
    syncQueue_.assertOnQueue();
    return std::any_of(holds_.begin(), holds_.end(), [&](const auto& hold) { return hold->blocks(plugIn); });
  });
}

void XTDServer::addHold(std::shared_ptr<XTDPlugInHold> hold) {
  const auto client = hold->client().lock();
  syncQueue_.sync([&] {
    syncQueue_.assertOnQueue();
    holds_.push_back(std::move(hold));
  });
  notifyAnnotationChange();
  // The holds of a client that died while its request was being served may have been released before this one came.
  if (client != nullptr && client->pid() == 0) unholdClient(*client);
}

void XTDServer::unholdToken(const Uuid& token) {
  syncQueue_.sync([&] {
    syncQueue_.assertOnQueue();
    const auto found =
        std::find_if(holds_.begin(), holds_.end(), [&](const auto& hold) { return hold->uuid() == token; });
    if (found == holds_.end()) return;
    XTLogOps().debug("releasing plug-in hold {} at client's request", token);
    holds_.erase(found);
    notifyAnnotationChange();
  });
}

void XTDServer::unholdClient(const XTDIpcClient& client) {
  syncQueue_.sync([&] {
    syncQueue_.assertOnQueue();
    const auto isClients = [&](const auto& hold) { return hold->client().lock().get() == &client; };
    for (;;) {
      const auto found = std::find_if(holds_.begin(), holds_.end(), isClients);
      if (found == holds_.end()) return;
      XTLogOps().debug("releasing plug-in hold {} for dead client pid {}", (*found)->uuid(), client.originalPid());
      holds_.erase(found);
      notifyAnnotationChange();
    }
  });
}

}  // namespace extora
