// ExclusionsCommand: "exclusions": shows what the user has excluded, and which of it has no effect. Needs no daemon.
#pragma once

#include <string>

#include "tools/Command.h"

namespace tools {

class ExclusionsCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  bool json_ = false;
};

}  // namespace tools
