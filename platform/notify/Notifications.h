// Notifications: system-wide, without payload. <runtime>/notify/<name> holds a counter (8 bytes, little-endian, mode
// 0644, made with 0 when missing); a post takes flock and rewrites the 8 bytes in place, one more than before, never
// truncating or renaming. A watcher sees every post as a change of that file. Callable from any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/files/Directories.h"

namespace platform {

/// Posted whenever annotations or holds change.
inline constexpr const char* kAnnotationChangeNotification = "com.orvane.extora.annotation-change";
/// Posted whenever the registry's data changes.
inline constexpr const char* kRegistryChangeNotification = "com.orvane.registry-change";

class Notifications {
 public:
  virtual ~Notifications() = default;
  /// Makes the counter file with 0 when it is missing or too short. Failures are logged.
  virtual void prepare(const std::string& name) = 0;
  /// Raises the counter by one; a file that is missing or too short counts as 0. Failures are logged. Whoever holds a
  /// lock on the file for long delays posts by a second in all, and can lose counts, but no change of the file.
  virtual void postNotification(const std::string& name) = 0;
  /// The counter, or nothing when there is no such notification.
  virtual std::optional<std::uint64_t> counter(const std::string& name) = 0;
  static std::shared_ptr<Notifications> make(const Directories& directories);
};

}  // namespace platform
