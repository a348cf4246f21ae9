// WhyCommand: "why": says whether this program is offered a plug-in, and if not, what keeps it from being offered.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class WhyCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::string what_;
  std::vector<std::string> rules_;
  std::string rulesFile_;
};

}  // namespace tools
