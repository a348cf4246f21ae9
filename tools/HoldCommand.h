// HoldCommand: "hold": keeps plug-ins from being used while a command runs, or until it is interrupted.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class HoldCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  /// The command to run.
  bool takeWords(std::vector<std::string> words) override {
    command_ = std::move(words);
    return !command_.empty();
  }
  /// The status of the command that was run: its own, 128 and the number of the signal that ended it, 126 or 127 when
  /// it cannot be run.
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  ExitStatus ask(DaemonSession& daemon, platform::Value& reply) const;

  std::vector<std::string> paths_;
  std::vector<std::string> command_;
  bool plugIns_ = false;
  bool refuseBusy_ = false;
  bool terminate_ = false;
  bool json_ = false;
};

}  // namespace tools
