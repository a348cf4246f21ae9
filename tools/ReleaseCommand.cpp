#include "tools/ReleaseCommand.h"

namespace tools {

using platform::Uuid;

CLI::App* ReleaseCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("release", "End a hold");
  command->add_option("token", token_, "What `xtctl hold` has printed")
      ->required()
      ->option_text("TOKEN")
      ->check([](const std::string& text) -> std::string {
        return Uuid::parse(text) ? "" : "\"" + text + "\" is no token";
      });
  command->footer(R"(Whoever knows the token may. The daemon does not say whether there was such a hold.

Examples
  xtctl release 8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8)");
  return command;
}

ExitStatus ReleaseCommand::run(DaemonSession& daemon, std::string& out) {
  const Uuid token = Uuid::parse(token_).value_or(Uuid());
  platform::Value reply;
  const auto status = daemon.ask([&](auto& client, const auto& answer) { client.releaseHold(token, answer); }, reply);
  if (status == ExitStatus::Success) out += "no hold " + token.text() + " any more\n";
  return status;
}

}  // namespace tools
