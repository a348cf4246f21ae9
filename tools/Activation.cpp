#include "tools/Activation.h"

#include <charconv>

#include "Extora/XTVocabulary.h"
#include "tools/Command.h"
#include "tools/RuleArguments.h"

namespace tools {

using platform::Dictionary;
using platform::Value;

void addEnvironmentOption(CLI::App& command, std::vector<std::string>& environment) {
  command.add_option("-e,--env", environment, "Give the plug-in an environment variable (managers only)")
      ->option_text("KEY=VALUE")
      ->check([](const std::string& text) { return ruleFault(text, "a variable is KEY=VALUE"); })
      ->allow_extra_args(false);
}

extora::XTDaemonClient::PlugIns plugInsOf(const std::vector<Value>& forms) {
  extora::XTDaemonClient::PlugIns plugIns;
  for (const Value& form : forms) {
    plugIns.emplace_back(form[extora::XTPathFormKey].string(),
                         platform::Uuid::parse(form[extora::XTUUIDFormKey].string()).value_or(platform::Uuid()));
  }
  return plugIns;
}

ExitStatus makeReady(DaemonSession& daemon, const std::vector<Value>& forms,
                     const std::vector<std::string>& environment) {
  Dictionary variables;
  for (const std::string& entry : environment) {
    const std::size_t equals = entry.find('=');
    variables.set(entry.substr(0, equals), entry.substr(equals + 1));
  }
  Value reply;
  return daemon.ask(
      [&](auto& client, const auto& answer) {
        client.readyPlugIns(plugInsOf(forms), true, 0, environment.empty() ? Value() : Value(variables), answer);
      },
      reply, environment.empty() ? "" : kManagersOnly);
}

Value typedValue(const std::string& text) {
  if (text == "true") return true;
  if (text == "false") return false;
  std::int64_t number = 0;
  const char* const end = text.data() + text.size();
  const auto parsed = std::from_chars(text.data(), end, number);
  if (!text.empty() && parsed.ptr == end && parsed.ec == std::errc()) return number;
  return text;
}

}  // namespace tools
