#include "tools/RunCommand.h"

#include <fmt/format.h>

#include "Extora/XTBundle.h"
#include "Extora/XTHostServices.h"
#include "Extora/XTPlugInConnection.h"
#include "Extora/XTPlugInCore.h"
#include "Extora/XTVocabulary.h"
#include "tools/Activation.h"
#include "tools/Json.h"
#include "tools/PlugInReference.h"
#include "tools/RuleArguments.h"

namespace tools {

using extora::XTPlugInConnection;
using platform::Dictionary;
using platform::Value;

namespace {

// What a plug-in that was launched sends as its answer to `request`, as it is.
ExitStatus exchange(platform::UniqueFd socket, const Dictionary& request, std::string& out) {
  static const platform::SerialQueue queue("xtctl run");
  const auto connection = platform::ipcConnectionOverSocket(std::move(socket), queue);
  connection->setEventHandler([](const platform::IpcEvent&) {});
  connection->resume();
  const auto reply = connection->sendWithReplySync(request);
  connection->cancel();
  if (reply.error) {
    complain(fmt::format("the plug-in has not answered: {}", reply.error->text));
    return ExitStatus::Refused;
  }
  out += jsonText(reply.body);
  return ExitStatus::Success;
}

ExitStatus call(platform::UniqueFd socket, const std::vector<std::string>& message, std::string& out) {
  static const platform::SerialQueue queue("xtctl run");
  const auto connection = XTPlugInConnection::initWithSocket(std::move(socket), queue);
  connection->resume();
  platform::Array arguments;
  for (std::size_t i = 1; i < message.size(); ++i) arguments.append(typedValue(message[i]));
  const auto answer = connection->call(message[0], arguments);
  if (answer.error) {
    complain(fmt::format("{}: {} (code {})", message[0], answer.error->localizedDescription(), answer.error->code));
    return ExitStatus::Refused;
  }
  out += jsonText(answer.arguments);
  return ExitStatus::Success;
}

}  // namespace

CLI::App* RunCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("run", "Launch a plug-in as its host, and ask it something");
  command->add_option("plug-in", what_, "UUID, path, file URL or identifier")
      ->required()
      ->option_text("PLUGIN [-- OPERATION [ARGUMENT...]]")
      ->check(plugInReferenceFault);
  command->add_option("--file", file_, "Send the dictionary of an XML property list as it is")->option_text("FILE");
  addEnvironmentOption(*command, environment_);
  command->footer(R"(Makes the plug-in ready, launches it in its sandbox, sends it one message, and prints the answer as
JSON. An argument true or false is a boolean, a whole number a number, all else text. Without a
message it only says whether the plug-in came up. The plug-in ends with this command. Each step that fails says why; the daemon's log (EXTORA_LOG=debug) says more.

Examples
  xtctl run com.example.studio.effects -- apply "some text"
  xtctl run Studio.app/PlugIns/Effects.appex --file request.plist)");
  return command;
}

ExitStatus RunCommand::run(DaemonSession& daemon, std::string& out) {
  std::string fault;
  const auto request = file_.empty() ? Dictionary() : dictionaryFromFile(file_, fault);
  if (request && !file_.empty() && !message_.empty()) fault = "a message and --file do not go together";
  if (!fault.empty()) {
    complain(fault);
    return ExitStatus::Usage;
  }
  Value form;
  ExitStatus status = PlugInReference::parse(what_).find(daemon, form);
  if (status != ExitStatus::Success) return status;
  if (const auto record = extora::XTPlugInCore::initWithForm(form); record && record->isData()) {
    complain("the plug-in is data only: there is nothing to launch");
    return ExitStatus::Refused;
  }
  const auto plugIns = plugInsOf({form});
  status = makeReady(daemon, {form}, environment_);
  if (status != ExitStatus::Success) return status;

  const auto executable = extora::XTBundle::initWithPath(plugIns[0].first)->executablePath();
  extora::Error error;
  auto launched = extora::XTHostServices::launch(executable.value_or(""), &error);
  if (!launched) {
    complain(fmt::format("the plug-in is ready, but cannot be launched: {}", error.localizedDescription()));
    return ExitStatus::Refused;
  }
  if (!file_.empty()) return exchange(std::move(launched->connection), *request, out);
  if (!message_.empty()) return call(std::move(launched->connection), message_, out);
  out += fmt::format("launched as process {}\n", launched->pid);
  return ExitStatus::Success;
}

}  // namespace tools
