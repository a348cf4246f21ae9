// XTNotificationWatcher: tells a process that a system-wide notification has been posted, and how often.
//
// A host watches XTNotifyAnnotationChange (elections, annotations, holds) and platform::kRegistryChangeNotification
// (installs, removals) and asks again when one was posted. There is no thread behind it: hand descriptor() to an event
// loop, or wait(). The notification may be missing, come into being and be made anew while it is watched (a daemon that
// is started, stopped, or begins with an empty runtime directory). For one thread at a time.
#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/notify/Notifications.h"

namespace extora {

class XTNotificationWatcher {
 public:
  /// Watches from now on. `serviceName` is that of the daemon that is meant, as for XTDaemonClient. Null when the
  /// system has no more watches to give, or the name is none.
  [[nodiscard]] static std::unique_ptr<XTNotificationWatcher> initWithName(
      std::string_view name, const std::optional<std::string>& serviceName = std::nullopt);

  /// Becomes readable (POLLIN) when there may be something to take; stays this object's.
  int descriptor() const { return inotify_.get(); }
  /// How many posts there were since the last call, or since the watch began; 0 for none. A notification that was made
  /// anew counts as one at least, since what was posted in between is not known. Never waits.
  [[nodiscard]] std::uint64_t take();
  /// As take(), but waits until there is something to take; 0 after `timeout`.
  [[nodiscard]] std::uint64_t wait(std::chrono::milliseconds timeout);

 private:
  XTNotificationWatcher(const std::string& runtime, std::string_view name);
  void arm();

  std::string name_;
  std::vector<std::string> places_;  // the file, and the directories above it, each of which may be missing
  std::shared_ptr<platform::Notifications> notifications_;
  platform::UniqueFd inotify_;
  std::set<int> watches_;
  std::uint64_t inode_ = 0;  // of the file that was last seen
  std::optional<std::uint64_t> counter_;
};

}  // namespace extora
