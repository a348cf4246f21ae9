#include "tools/ReadyCommand.h"

#include <fmt/format.h>

#include "Extora/XTVocabulary.h"
#include "platform/log/Log.h"
#include "tools/Activation.h"
#include "tools/PlugInReference.h"

namespace tools {

using platform::Value;

CLI::App* ReadyCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("ready", "Ask whether this program might launch plug-ins");
  command->add_option("plug-ins", plugIns_, "UUIDs, paths, file URLs or identifiers")
      ->required()
      ->option_text("PLUGIN...")
      ->check(plugInReferenceFault);
  addEnvironmentOption(*command, environment_);
  command->footer(R"(The daemon makes plug-ins ready for the process that asks, and for nobody else: all is over when
this command ends. What it tells is whether the daemon would allow it, and if not, why:
a hold, the plug-in's or the host's entitlements, a missing executable. `xtctl run` goes on
and launches. With several plug-ins none is made ready unless all of them may be.

Examples
  xtctl ready com.example.mail.filter
  xtctl-manager ready com.example.mail.filter --env DEBUG=1)");
  return command;
}

ExitStatus ReadyCommand::run(DaemonSession& daemon, std::string& out) {
  std::vector<Value> forms;
  for (const std::string& each : plugIns_) {
    const ExitStatus status = PlugInReference::parse(each).find(daemon, forms.emplace_back());
    if (status != ExitStatus::Success) return status;
  }
  const ExitStatus status = makeReady(daemon, forms, environment_);
  if (status != ExitStatus::Success) return status;
  for (const Value& form : forms) {
    out += platform::escapeControlCharacters(fmt::format("{} {}: ready", form[extora::XTIdentifierFormKey].string(),
                                                         form[extora::XTVersionFormKey].string())) +
           "\n";
  }
  return status;
}

}  // namespace tools
