#include "tools/AccessCommand.h"

#include <fmt/format.h>

#include "Extora/XTVocabulary.h"
#include "platform/log/Log.h"
#include "platform/sandbox/Sandbox.h"
#include "tools/Activation.h"
#include "tools/Json.h"
#include "tools/PlugInReference.h"

namespace tools {

using platform::Dictionary;
using platform::Value;

CLI::App* AccessCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("access", "Obtain sandbox extensions for the bundles of plug-ins");
  command->add_option("plug-ins", plugIns_, "UUIDs, paths, file URLs or identifiers")
      ->required()
      ->option_text("PLUGIN...")
      ->check(plugInReferenceFault);
  command->add_flag("--json", json_, "A JSON array of objects with the whole tokens");
  command->footer(R"(A token gives whoever consumes it read access to one bundle, and is good until the daemon ends:
treat it as a secret. Without --json only its beginning is shown, as in the daemon's log.)");
  return command;
}

ExitStatus AccessCommand::run(DaemonSession& daemon, std::string& out) {
  std::vector<Value> forms;
  for (const std::string& each : plugIns_) {
    const ExitStatus status = PlugInReference::parse(each).find(daemon, forms.emplace_back());
    if (status != ExitStatus::Success) return status;
  }
  Value reply;
  const ExitStatus status = daemon.ask(
      [&](auto& client, const auto& answer) { client.accessPlugIns(plugInsOf(forms), true, 0, answer); }, reply);
  if (status != ExitStatus::Success) return status;
  const Value& tokens = reply[extora::XTDExtensionsKey];
  platform::Array list;
  for (std::size_t i = 0; i < forms.size(); ++i) {
    const std::string& path = forms[i][extora::XTPathFormKey].string();
    const std::string& token = tokens.at(i).string();
    list.append(Dictionary{{extora::XTPathFormKey, path}, {"token", token}});
    if (json_) continue;
    out += platform::escapeControlCharacters(fmt::format("{}...  {}", platform::shownToken(token), path)) + "\n";
  }
  if (json_) out += jsonText(list);
  return status;
}

}  // namespace tools
