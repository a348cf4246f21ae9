// WatchCommand: "watch": prints each change of what this program, as a host, is offered.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class WatchCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::vector<std::string> rules_;
  std::string rulesFile_;
  bool allVersions_ = false;
  bool json_ = false;
};

}  // namespace tools
