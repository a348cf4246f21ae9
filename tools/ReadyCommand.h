// ReadyCommand: "ready": asks whether this program, as a host, might launch plug-ins.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class ReadyCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::vector<std::string> plugIns_;
  std::vector<std::string> environment_;
};

}  // namespace tools
