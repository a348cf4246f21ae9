// ElectionsCommand: "elections": lists the plug-ins for which there is an election.
#pragma once

#include <string>

#include "tools/Command.h"

namespace tools {

class ElectionsCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  bool all_ = false;
  bool json_ = false;
};

}  // namespace tools
