// The numeric string order: where both strings have a run of ASCII digits at the same place the runs compare by value
// (of any length, leading zeros aside); all else compares by code point; a proper prefix orders first. One order serves
// match rules and version comparison.
#pragma once

#include <compare>
#include <string>
#include <string_view>

namespace platform {

std::weak_ordering compareNumeric(std::string_view a, std::string_view b) noexcept;

/// `text` with the leading zeros of its digit runs left out: equal in the numeric order means equal here.
std::string withoutLeadingZeros(std::string_view text);

}  // namespace platform
