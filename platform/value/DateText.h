// Dates as ISO 8601 text in UTC.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/value/Value.h"

namespace platform {

/// "YYYY-MM-DDTHH:MM:SSZ" of the date's whole seconds; nothing when its year has not four digits (0000 to 9999).
std::optional<std::string> dateText(const Date& date);

/// The date that the text names; nothing unless it has exactly that form and names a moment that exists (no month 13,
/// no 30th of February, no second 60).
std::optional<Date> parseDateText(std::string_view text);

/// For logs: dateText with the fraction of the second where there is one; far dates as "<N seconds since 1970>".
std::string describeDate(const Date& date);

}  // namespace platform
