// LintCommand: "lint": says what is wrong with bundles on disk, before they are installed.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class LintCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::vector<std::string> bundles_;
  bool merged_ = false;
  bool json_ = false;
};

}  // namespace tools
