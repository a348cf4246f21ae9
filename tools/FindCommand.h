// FindCommand: "find": shows one plug-in, by UUID, location or identifier.
#pragma once

#include <string>

#include "tools/Command.h"

namespace tools {

class FindCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::string what_;
  bool json_ = false;
};

}  // namespace tools
