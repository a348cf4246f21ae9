// RegistrationCommand: "add" and "remove": registers plug-ins that lie outside of the folders, and takes plug-ins off
// the registry.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class RegistrationCommand : public Command {
 public:
  enum class Kind { Add, Remove };
  explicit RegistrationCommand(Kind kind) : kind_(kind) {}

  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  const Kind kind_;
  std::vector<std::string> paths_;
};

}  // namespace tools
