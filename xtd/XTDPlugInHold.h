// XTDPlugInHold: a lock on a set of plug-ins on behalf of one client. Immutable; identity is its token.
#pragma once

#include <chrono>
#include <memory>
#include <unordered_set>
#include <vector>

#include "platform/ipc/KeepAlive.h"
#include "platform/value/Uuid.h"
#include "xtd/XTDPlugIn.h"

namespace extora {

class XTDIpcClient;

class XTDPlugInHold {
 public:
  XTDPlugInHold(const std::vector<std::shared_ptr<XTDPlugIn>>& plugIns, const std::shared_ptr<XTDIpcClient>& client);

  /// The token.
  const platform::Uuid& uuid() const { return uuid_; }
  /// Membership is by plug-in equality, that is by UUID.
  bool blocks(const XTDPlugIn& plugIn) const { return blocked_.count(plugIn.uuid()) != 0; }
  std::size_t blockedCount() const { return blocked_.size(); }
  std::weak_ptr<XTDIpcClient> client() const { return client_; }
  std::chrono::system_clock::time_point created() const { return created_; }

  friend bool operator==(const XTDPlugInHold& a, const XTDPlugInHold& b) { return a.uuid_ == b.uuid_; }

 private:
  platform::Uuid uuid_;
  std::unordered_set<platform::Uuid> blocked_;
  std::weak_ptr<XTDIpcClient> client_;
  std::chrono::system_clock::time_point created_;
  platform::KeepAlive keepAlive_;
};

}  // namespace extora
