// LaunchOverlay: what an activation overlay asks of a launch. Plain data, made by a pure function.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/value/Value.h"

namespace platform {

struct LaunchOverlay {
  std::string profile;                   ///< "_SandboxProfile"; empty when there is none
  std::vector<std::string> environment;  ///< NAME=VALUE, sorted by name

  /// Reads {"IPCService": {"EnvironmentVariables": ..., "_SandboxProfile": ...}}. Numbers and booleans of the
  /// environment become text, and EXTORA_IPC_FD=3 is added and wins. Nothing when there is no service dictionary, or
  /// when the environment is no dictionary or holds another kind of value, an empty name, a name with "=" or a NUL.
  [[nodiscard]] static std::optional<LaunchOverlay> parse(const Value& overlay);
};

}  // namespace platform
