// FindCommand: "find": shows one plug-in, by UUID or by location.
#pragma once

#include <optional>
#include <string>

#include "platform/value/Url.h"
#include "platform/value/Uuid.h"
#include "tools/Command.h"

namespace tools {

class FindCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::string what_;
  bool json_ = false;
};

/// What a person may name a plug-in by: a UUID, or else a location: a file URL or a path, which is made absolute (and
/// canonical where it exists). Both are nothing when the text is a URL of another kind or a malformed one.
struct PlugInReference {
  std::optional<platform::Uuid> uuid;
  std::optional<platform::Url> url;
  static PlugInReference parse(const std::string& text);
};

}  // namespace tools
