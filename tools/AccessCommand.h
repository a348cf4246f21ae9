// AccessCommand: "access": obtains read access to the bundles of plug-ins.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class AccessCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::vector<std::string> plugIns_;
  bool json_ = false;
};

}  // namespace tools
