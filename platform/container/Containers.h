// Containers: private directories of identifiers, <state>/Containers/<identifier>, mode 0700; and the user-management
// mode of the device. Callable from any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <variant>

#include "platform/files/Directories.h"
#include "platform/files/Files.h"

namespace platform {

class Containers {
 public:
  virtual ~Containers() = default;
  /// The path of the container, made when missing, or the service's error number (a system error number; 0 when it set
  /// none): EINVAL for an identifier that cannot be a part of a path. One of class kPlugInContainerClass may have a
  /// suffix
  /// "@" and a number in its name, has tmp/ inside, and belongs to the user that plug-ins run as (to this process's own
  /// user while there is no such user); each look-up sets owner and mode right. `option` is without effect.
  virtual std::variant<std::string, std::uint64_t> containerCreateOrLookup(unsigned containerClass,
                                                                           const std::string& identifier,
                                                                           unsigned option) = 0;
  /// Whether the device keeps data per user.
  virtual bool isMultiUserMode() = 0;
  static std::shared_ptr<Containers> make(const Directories& directories, std::shared_ptr<Files> files);
};

/// The daemon's own container identifier and class.
inline constexpr const char* kDaemonContainer = "com.orvane.xtd";
inline constexpr unsigned kDaemonContainerClass = 10;
inline constexpr unsigned kPlugInContainerClass = 4;

/// Whether a plug-in of this identifier can have a container.
inline bool isPlugInContainerName(const std::string& identifier) {
  return isPathSafeName(identifier) && identifier != kDaemonContainer;
}

}  // namespace platform
