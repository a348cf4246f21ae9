// A value as JSON, for programs that read a tool's output.
#pragma once

#include <string>

#include "platform/value/Value.h"

namespace tools {

/// The JSON text of `value`, indented by two spaces, with a line feed at its end. Numbers keep all their digits; a real
/// that is not finite is null; a UUID is its text, data is base64, a date is ISO 8601 in UTC, a wire message the value
/// that it carries. Control characters are escaped, so that the text is safe on a terminal; other text stands as UTF-8.
std::string jsonText(const platform::Value& value);
/// The same on one line.
std::string jsonLine(const platform::Value& value);

}  // namespace tools
