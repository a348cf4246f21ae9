// MatchCommand: "match": lists the plug-ins that this program, as a host, is offered.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class MatchCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::vector<std::string> rules_;
  std::string rulesFile_;
  bool allVersions_ = false;
  bool duplicates_ = false;
  bool systemOnly_ = false;
  bool all_ = false;
  bool json_ = false;
};

}  // namespace tools
