// Hexadecimal digits, for the texts that are read and written here.
#pragma once

namespace platform {

inline constexpr char kUpperHexDigits[] = "0123456789ABCDEF";

/// The digit's value in either case; -1 when `c` is none.
constexpr int hexDigit(char c) noexcept {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

}  // namespace platform
