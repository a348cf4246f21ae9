// Command: one subcommand of a tool: its options, its help and its work.
//
// Made before the command line is read and used once, on the main thread.
#pragma once

#include <CLI/CLI.hpp>

#include <string>
#include <vector>

#include "tools/DaemonSession.h"
#include "tools/ExitStatus.h"

namespace tools {

class Command {
 public:
  Command() = default;
  virtual ~Command() = default;
  Command(const Command&) = delete;
  Command& operator=(const Command&) = delete;

  /// Adds its subcommand to `app`, whose parsing then fills this object, and answers it; `app` owns it.
  virtual CLI::App* addTo(CLI::App& app) = 0;

  /// Takes the words behind "--", after the parse; false when the command has no use for them.
  [[nodiscard]] virtual bool takeWords(std::vector<std::string>) { return false; }

  /// Does the work after a successful parse. What belongs on standard output is appended to `out`; complaints have been
  /// written to standard error already.
  [[nodiscard]] virtual ExitStatus run(DaemonSession& daemon, std::string& out) = 0;
};

/// The hint for a refusal of what only managers may do.
inline constexpr const char* kManagersOnly =
    "this is for managers: run xtctl-manager, which has the entitlement, outside of any sandbox";

/// Writes "xtctl: text" as one line to standard error, with control characters escaped.
void complain(const std::string& text);

}  // namespace tools
