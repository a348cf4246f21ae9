#include "tools/RuleArguments.h"

#include <fmt/format.h>

#include <set>

#include "platform/files/Files.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/Utf8.h"

namespace tools {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

Value patternOf(std::string text) {
  if (text == "true") return true;
  if (text == "false") return false;
  return text;
}

}  // namespace

std::string ruleFault(const std::string& argument, const char* what) {
  const std::size_t equals = argument.find('=');
  if (equals == std::string::npos) return fmt::format("\"{}\" has no \"=\": {}", argument, what);
  if (equals == 0) return fmt::format("\"{}\" has no key: {}", argument, what);
  if (!platform::isXmlText(argument)) return fmt::format("\"{}\" is not plain UTF-8 text", argument);
  return {};
}

std::optional<Dictionary> rulesFromArguments(const std::vector<std::string>& arguments, const Dictionary& base,
                                             std::string& fault) {
  Dictionary rules = base;
  std::set<std::string> given;
  for (const std::string& argument : arguments) {
    const std::size_t equals = argument.find('=');
    const std::string key = argument.substr(0, equals);
    Value pattern = patternOf(argument.substr(equals + 1));
    if (given.insert(key).second) {
      rules.set(key, std::move(pattern));
      continue;
    }
    Array alternatives = rules[key].isArray() ? Array(rules[key]) : Array({rules[key]});
    alternatives.append(std::move(pattern));
    for (const Value& alternative : alternatives) {
      if (!alternative.isString()) {
        fault = fmt::format("true and false cannot be alternatives (rule {})", key);
        return std::nullopt;
      }
    }
    rules.set(key, std::move(alternatives));
  }
  return rules;
}

std::optional<Dictionary> dictionaryFromFile(const std::string& path, std::string& fault) {
  platform::Error error;
  const auto bytes = platform::Files::make()->readFileData(path, &error);
  if (!bytes) {
    fault = fmt::format("{}: {}", path, error.localizedDescription());
    return std::nullopt;
  }
  const Value rules = platform::parsePropertyList(*bytes, &error);
  if (rules.isNothing()) {
    fault = fmt::format("{}: {}", path, error.localizedDescription());
    return std::nullopt;
  }
  if (!rules.isDictionary()) {
    fault = fmt::format("{}: not a dictionary", path);
    return std::nullopt;
  }
  return Dictionary(rules);
}

void addRuleOptions(CLI::App& command, std::vector<std::string>& arguments, std::string& file) {
  command.add_option("-r,--rule", arguments, "Only plug-ins for which the rule holds")
      ->option_text("KEY=PATTERN")
      ->check([](const std::string& rule) { return ruleFault(rule); })
      ->allow_extra_args(false);
  command.add_option("--rules", file, "Rules from an XML property list, a dictionary")->option_text("FILE");
}

std::optional<Dictionary> rulesOf(const std::vector<std::string>& arguments, const std::string& file,
                                  std::string& fault) {
  const auto base = file.empty() ? Dictionary() : dictionaryFromFile(file, fault);
  return base ? rulesFromArguments(arguments, *base, fault) : std::nullopt;
}

}  // namespace tools
