#include "xtd/XTDPlugInHold.h"

namespace extora {

XTDPlugInHold::XTDPlugInHold(const std::vector<std::shared_ptr<XTDPlugIn>>& plugIns,
                             const std::shared_ptr<XTDIpcClient>& client)
    : uuid_(platform::Uuid::random()),
      client_(client),
      created_(std::chrono::system_clock::now()),
      keepAlive_(platform::ipcHoldProcessAlive()) {
  blocked_.reserve(plugIns.size());
  for (const auto& plugIn : plugIns) blocked_.insert(plugIn->uuid());
}

}  // namespace extora
