// ElectCommand: "elect": records the user's election of a plug-in.
#pragma once

#include <string>

#include "tools/Command.h"

namespace tools {

class ElectCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::string what_;
  std::string election_;
};

}  // namespace tools
