// ReleaseCommand: "release": ends a hold by its token.
#pragma once

#include <string>

#include "tools/Command.h"

namespace tools {

class ReleaseCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::string token_;
};

}  // namespace tools
