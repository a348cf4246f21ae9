// RuleArguments: match rules as they stand on a command line: KEY=PATTERN arguments over the entries of a file.
#pragma once

#include <CLI/CLI.hpp>

#include <optional>
#include <string>
#include <vector>

#include "platform/value/Value.h"

namespace tools {

/// What is wrong with one KEY=PATTERN argument, or an empty text: it needs a key and a "=", in UTF-8. `what` says what
/// it should be.
std::string ruleFault(const std::string& argument, const char* what = "a rule is KEY=PATTERN");

/// The rules dictionary of `arguments`, each faultless, on top of `base`: a key given here replaces the base's entry, a
/// key given more than once here offers its patterns as alternatives. The patterns "true" and "false" are booleans.
/// Nothing, with `fault` saying why, when a boolean stands among alternatives (it would never match there).
std::optional<platform::Dictionary> rulesFromArguments(const std::vector<std::string>& arguments,
                                                       const platform::Dictionary& base, std::string& fault);

/// The dictionary in the XML property list at `path`; nothing, with `fault` saying why, when there is none.
std::optional<platform::Dictionary> dictionaryFromFile(const std::string& path, std::string& fault);

/// Adds the options --rule and --rules, which fill `arguments` and `file`, and whose values rulesOf makes rules of;
/// nothing, with `fault` saying why, when that cannot be.
void addRuleOptions(CLI::App& command, std::vector<std::string>& arguments, std::string& file);
std::optional<platform::Dictionary> rulesOf(const std::vector<std::string>& arguments, const std::string& file,
                                            std::string& fault);

}  // namespace tools
