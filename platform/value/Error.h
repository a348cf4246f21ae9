// Error: an answer that says why something could not be done. Printed as "domain code: description".
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>

namespace platform {

struct Error {
  std::string domain;
  std::int64_t code = 0;
  /// Nothing when the error was made without one.
  std::optional<std::string> description;

  /// The description, or "The operation could not be completed (domain code)" when there is none.
  std::string localizedDescription() const;
  /// "domain code: description", or "domain code" without one.
  std::string describe() const;
  friend bool operator==(const Error&, const Error&) = default;
};

/// An error of domain "POSIX" with `number` as its code and strerror's text after `what`.
Error posixError(int number, const std::string& what);

/// Stores `error` when the caller asked for one.
inline void setError(Error* out, Error error) {
  if (out != nullptr) *out = std::move(error);
}

}  // namespace platform
