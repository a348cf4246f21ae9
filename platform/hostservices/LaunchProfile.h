// LaunchProfile: what a sandbox grants beyond what every plug-in has. Read from <profiles>/<name>.plist at each launch,
// so that a change counts from the next launch on. Plain data; reading is for any thread.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/value/Error.h"

namespace platform {

struct LaunchProfile {
  bool network = false;               ///< shares the device's network
  std::vector<std::string> readOnly;  ///< absolute paths that may be read; one that does not exist is left out
  std::vector<std::string> writable;  ///< likewise, to be written too

  /// The profile `name` of the folder `profiles`. Nothing and `error` (code ENOENT no such profile, EINVAL a name or a
  /// content that is none).
  [[nodiscard]] static std::optional<LaunchProfile> read(const std::string& profiles, const std::string& name,
                                                         Error* error);
};

}  // namespace platform
