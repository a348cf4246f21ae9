#include "tools/ExclusionsCommand.h"

#include <fmt/format.h>

#include "Extora/XTVocabulary.h"
#include "platform/files/Directories.h"
#include "platform/log/Log.h"
#include "platform/preferences/Preferences.h"
#include "tools/Json.h"

namespace tools {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::string_view kTypeTests[] = {"?KD-CONFORMS:", "?KD-IS:"};

// Why `pattern` can never match, or an empty text.
std::string patternFault(const Value& pattern) {
  if (pattern.isString()) {
    const std::string& text = pattern.string();
    if (!text.starts_with('?')) return {};
    for (const std::string_view test : kTypeTests) {
      if (text.starts_with(test)) return {};
    }
    return "there is no such operator";
  }
  if (pattern.isDictionary() || pattern == Value(true) || pattern == Value(false)) return {};
  if (!pattern.isArray()) return "a pattern is text, a boolean, a list of texts or a dictionary";
  for (const Value& alternative : pattern.items()) {
    if (alternative.isString() && patternFault(alternative).empty()) return {};
  }
  return "none of the alternatives is a usable text";
}

// Why the exclusion excludes nothing or everything, or an empty text.
std::string exclusionFault(const Value& exclusion) {
  if (!exclusion.isDictionary()) return "not a dictionary of rules: ignored";
  if (exclusion.size() == 0) return "without any rule: excludes every plug-in";
  for (const auto& [key, pattern] : exclusion.entries()) {
    if (const auto fault = patternFault(pattern); !fault.empty()) {
      return fmt::format("excludes nothing: the rule {} never holds, {}", key, fault);
    }
  }
  return {};
}

}  // namespace

CLI::App* ExclusionsCommand::addTo(CLI::App& app) {
  CLI::App* command = app.add_subcommand("exclusions", "Show what the user has excluded from every match");
  command->add_flag("--json", json_, "A JSON array of objects instead of text");
  command->footer(R"(Exclusions are match rules under the key "exclusions" of the preferences
com.orvane.extora.userprefs, an XML property list. The daemon reads them at every match; a
plug-in for which one of them holds is offered to nobody. What is malformed is said here,
and makes the exit status 1.)");
  return command;
}

ExitStatus ExclusionsCommand::run(DaemonSession& daemon, std::string& out) {
  const auto directories = platform::Directories::forClient(daemon.service());
  const std::string domain(extora::XTPreferenceDomain);
  const Value exclusions =
      platform::Preferences::make(directories)->preferenceValue(domain, std::string(extora::XTExclusionsPreferenceKey));
  const std::string file = directories.config + "/preferences/" + domain + ".plist";
  ExitStatus status = ExitStatus::Success;
  if (exclusions && !exclusions.isArray()) {
    complain(fmt::format("{}: \"{}\" is no list: nothing is excluded", file, extora::XTExclusionsPreferenceKey));
    status = ExitStatus::Refused;
  }
  Array list;
  std::string text;
  for (const Value& exclusion : exclusions.items()) {
    const std::string fault = exclusionFault(exclusion);
    if (!fault.empty()) status = ExitStatus::Refused;
    const std::string number = fmt::format("{:>3}. ", list.size() + 1);
    std::string indent = number;
    for (const auto& [key, pattern] : exclusion.entries()) {
      text += indent + platform::escapeControlCharacters(fmt::format("{} = {}", key, pattern)) + "\n";
      indent = "     ";
    }
    if (exclusion.size() == 0 || !exclusion.isDictionary()) {
      text += indent + platform::escapeControlCharacters(exclusion.describe()) + "\n";
    }
    if (!fault.empty()) text += "     ! " + platform::escapeControlCharacters(fault) + "\n";
    Dictionary record{{"exclusion", exclusion}};
    if (!fault.empty()) record.set("fault", fault);
    list.append(record);
  }
  if (json_) {
    out += jsonText(list);
  } else {
    out += list.size() == 0 ? fmt::format("Nothing is excluded ({}).\n", file) : text;
  }
  return status;
}

}  // namespace tools
