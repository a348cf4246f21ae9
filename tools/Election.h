// Elections as people write them.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/value/Value.h"

namespace tools {

/// "use" is 1, "ignore" 2, "clear" 0, and any other election its number; nothing for another text.
std::optional<std::int64_t> electionFromText(const std::string& text);
/// "use", "ignore" or the number; "none" for 0 and for no election at all.
std::string electionText(const platform::Value& election);

}  // namespace tools
