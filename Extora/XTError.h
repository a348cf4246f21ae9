// Errors of the system's own domain.
#pragma once

#include <fmt/format.h>

#include <optional>
#include <string>

#include "platform/value/Describe.h"
#include "platform/value/Error.h"

namespace extora {

using platform::Error;

/// The error domain of the system: "Extora".
inline constexpr const char* XTExtoraErrorDomain = "Extora";

/// An error of domain XTExtoraErrorDomain; without a description it carries none.
Error makeError(std::int64_t code, std::optional<std::string> description);

/// As makeError, with the description formatted.
template <typename... Args>
Error makeErrorWithFormat(std::int64_t code, fmt::format_string<Args...> format, Args&&... args) {
  return makeError(code, fmt::format(format, std::forward<Args>(args)...));
}

}  // namespace extora
