#include "tools/FindCommand.h"

#include "tools/Json.h"
#include "tools/PlugInReference.h"
#include "tools/PlugInText.h"

namespace tools {

using platform::Value;

CLI::App* FindCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("find", "Show one plug-in, whether or not it would be offered");
  command->add_option("plug-in", what_, "UUID, path or file URL of a plug-in bundle; or an identifier")
      ->required()
      ->option_text("PLUGIN")
      ->check(plugInReferenceFault);
  command->add_flag("--json", json_, "The export form as a JSON object instead of a page");
  command->footer(R"(Examples
  xtctl find 8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8
  xtctl find Mail.app/PlugIns/Filter.appex
  xtctl find com.example.mail.filter
  xtctl find file:///usr/share/extora/Applications/Mail.app/PlugIns/Filter.appex --json)");
  return command;
}

ExitStatus FindCommand::run(DaemonSession& daemon, std::string& out) {
  Value form;
  const ExitStatus status = PlugInReference::parse(what_).find(daemon, form);
  if (status != ExitStatus::Success) return status;
  out += json_ ? jsonText(form) : plugInPage(form);
  return ExitStatus::Success;
}

}  // namespace tools
