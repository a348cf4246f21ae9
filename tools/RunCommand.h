// RunCommand: "run": makes a plug-in ready, launches it, and has one exchange with it; for authors of plug-ins.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class RunCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  /// An operation and its arguments.
  bool takeWords(std::vector<std::string> words) override {
    message_ = std::move(words);
    return true;
  }
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  std::string what_;
  std::vector<std::string> environment_;
  std::vector<std::string> message_;
  std::string file_;
};

}  // namespace tools
