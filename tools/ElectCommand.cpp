#include "tools/ElectCommand.h"

#include <fmt/format.h>

#include "Extora/XTVocabulary.h"
#include "platform/log/Log.h"
#include "tools/Election.h"
#include "tools/PlugInReference.h"

namespace tools {

using platform::Dictionary;
using platform::Value;

CLI::App* ElectCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("elect", "Say whether a plug-in is to be used");
  command->add_option("plug-in", what_, "UUID, path, file URL or identifier")
      ->required()
      ->option_text("PLUGIN")
      ->check(plugInReferenceFault);
  command->add_option("election", election_, "use, ignore, clear, or the number of another election")
      ->required()
      ->option_text("use|ignore|clear|N")
      ->check([](const std::string& text) -> std::string {
        return electionFromText(text) ? "" : "\"" + text + "\" is no election: use, ignore, clear or a number";
      });
  command->footer(R"(An election is kept for all versions of the plug-in, and over its removal. The daemon only
keeps it: hosts ask for plug-ins of an election with the rule HXUserElection=N
(use is 1, ignore 2, none 0).

Examples
  xtctl elect com.example.mail.filter use
  xtctl elect Mail.app/PlugIns/Filter.appex ignore
  xtctl elect 8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8 clear)");
  return command;
}

ExitStatus ElectCommand::run(DaemonSession& daemon, std::string& out) {
  Value form;
  ExitStatus status = PlugInReference::parse(what_).find(daemon, form);
  if (status != ExitStatus::Success) return status;
  const auto uuid = platform::Uuid::parse(form[extora::XTUUIDFormKey].string());
  const Value election = electionFromText(election_).value_or(0);
  Value reply;
  status = daemon.ask(
      [&](auto& client, const auto& answer) {
        client.setPluginAnnotations({uuid.value_or(platform::Uuid())},
                                    Dictionary{{extora::XTAnnotationElectionKey, election}}, answer);
      },
      reply);
  if (status != ExitStatus::Success) return status;
  const Value& before = form[extora::XTAnnotationsFormKey][extora::XTAnnotationElectionKey];
  out += platform::escapeControlCharacters(fmt::format("{} {}: {} (was {})", form[extora::XTIdentifierFormKey].string(),
                                                       form[extora::XTVersionFormKey].string(), electionText(election),
                                                       electionText(before))) +
         "\n";
  return ExitStatus::Success;
}

}  // namespace tools
