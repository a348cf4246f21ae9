#include "platform/jobs/LaunchOverlay.h"

namespace platform {
namespace {

// Where a plug-in finds its end of the connection to its host.
constexpr const char* kConnectionVariable = "EXTORA_IPC_FD";
constexpr const char* kConnectionDescriptor = "3";

}  // namespace

std::optional<LaunchOverlay> LaunchOverlay::parse(const Value& overlay) {
  const Value& service = overlay["IPCService"];
  const Value& declared = service["EnvironmentVariables"];
  if (!service.isDictionary() || (!declared.isNothing() && !declared.isDictionary())) return std::nullopt;
  Dictionary variables(declared);
  variables.set(kConnectionVariable, kConnectionDescriptor);

  LaunchOverlay launch;
  launch.profile = service["_SandboxProfile"].string();
  for (const auto& [name, value] : variables) {
    if (!value.isString() && !value.isNumber()) return std::nullopt;
    std::string entry = name + "=" + (value.isString() ? value.string() : value.describe());
    if (name.empty() || name.find('=') != std::string::npos || entry.find('\0') != std::string::npos) {
      return std::nullopt;
    }
    launch.environment.push_back(std::move(entry));
  }
  return launch;
}

}  // namespace platform
