#include "platform/value/Error.h"

#include <fmt/format.h>

#include <cstring>

namespace platform {

std::string Error::localizedDescription() const {
  return description ? *description : fmt::format("The operation could not be completed ({} {})", domain, code);
}

std::string Error::describe() const {
  return description ? fmt::format("{} {}: {}", domain, code, *description) : fmt::format("{} {}", domain, code);
}

Error posixError(int number, const std::string& what) {
  const char* text = strerrordesc_np(number);
  std::string reason = text != nullptr ? text : fmt::format("Unknown error {}", number);
  return {"POSIX", number, what.empty() ? std::move(reason) : fmt::format("{}: {}", what, reason)};
}

}  // namespace platform
