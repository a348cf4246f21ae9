#include "tools/RegistrationCommand.h"

#include "platform/log/Log.h"
#include "tools/PlugInReference.h"

namespace tools {

using platform::Value;

CLI::App* RegistrationCommand::addTo(CLI::App& app) {
  const bool adds = kind_ == Kind::Add;
  CLI::App* command = app.add_subcommand(adds ? "add" : "remove",
                                         adds ? "Register plug-ins that lie outside of the folders of applications"
                                              : "Take plug-ins off the registry; their bundles stay where they are");
  command->add_option("path", paths_, "Bundles of plug-ins")->required()->option_text("PATH...");
  command->footer(adds ? R"(What is added stays so over a restart of the daemon, until it is removed or its bundle goes
away. Plug-ins of installed applications are registered without this. The daemon takes one
after the other: those before the one that it refuses are registered.

Examples
  xtctl add build/Filter.appex)"
                       : R"(Running instances are ended. A plug-in of an installed application stays out until its
application is replaced. Elections and notes are kept. Only managers may: see xtctl-manager.
The daemon takes one after the other: those before the one that it refuses are removed.

Examples
  xtctl-manager remove build/Filter.appex)");
  return command;
}

ExitStatus RegistrationCommand::run(DaemonSession& daemon, std::string& out) {
  const auto paths = absolutePaths(paths_);
  Value reply;
  const ExitStatus status = daemon.ask(
      [&](auto& client, const auto& answer) {
        kind_ == Kind::Add ? client.addPlugIns(paths, answer) : client.removePlugIns(paths, answer);
      },
      reply, kind_ == Kind::Add ? "" : kManagersOnly);
  if (status != ExitStatus::Success) return status;
  for (const auto& path : paths) {
    out += (kind_ == Kind::Add ? "added " : "removed ") + platform::escapeControlCharacters(path) + "\n";
  }
  return status;
}

}  // namespace tools
