// RuleArguments: match rules as they stand on a command line: KEY=PATTERN arguments over the entries of a file.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "platform/value/Value.h"

namespace tools {

/// What is wrong with one KEY=PATTERN argument, or an empty text: it needs a key and a "=", in UTF-8.
std::string ruleFault(const std::string& argument);

/// The rules dictionary of `arguments`, each faultless, on top of `base`: a key given here replaces the base's entry, a
/// key given more than once here offers its patterns as alternatives. The patterns "true" and "false" are booleans.
/// Nothing, with `fault` saying why, when a boolean stands among alternatives (it would never match there).
std::optional<platform::Dictionary> rulesFromArguments(const std::vector<std::string>& arguments,
                                                       const platform::Dictionary& base, std::string& fault);

/// The dictionary in the XML property list at `path`; nothing, with `fault` saying why, when there is none.
std::optional<platform::Dictionary> rulesFromFile(const std::string& path, std::string& fault);

}  // namespace tools
