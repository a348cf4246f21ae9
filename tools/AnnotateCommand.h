// AnnotateCommand: "annotate": shows and changes what hosts have noted about plug-ins.
#pragma once

#include <string>
#include <vector>

#include "tools/Command.h"

namespace tools {

class AnnotateCommand : public Command {
 public:
  CLI::App* addTo(CLI::App& app) override;
  ExitStatus run(DaemonSession& daemon, std::string& out) override;

 private:
  bool changes() const { return clear_ || !file_.empty() || !set_.empty() || !remove_.empty(); }

  std::vector<std::string> plugIns_;
  std::vector<std::string> set_;
  std::vector<std::string> remove_;
  std::string file_;
  bool clear_ = false;
  bool json_ = false;
};

}  // namespace tools
