// UTF-8 and the characters that XML 1.0 can carry: tab, line feed, carriage return, U+0020 to U+D7FF, U+E000 to U+FFFD,
// U+10000 to U+10FFFF. Every string of the wire and of property lists keeps to them.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace platform {

/// True when `text` is valid UTF-8 (no overlong form, no surrogate, nothing above U+10FFFF).
[[nodiscard]] bool isUtf8(std::string_view text) noexcept;

/// Bytes of the longest beginning of `text` that is valid UTF-8 of characters that XML can carry.
[[nodiscard]] std::size_t xmlTextLength(std::string_view text) noexcept;

/// True when the whole of `text` is.
[[nodiscard]] inline bool isXmlText(std::string_view text) noexcept {
  return xmlTextLength(text) == text.size();
}

/// `text` with each byte that breaks the rule replaced by U+FFFD.
[[nodiscard]] std::string repairedXmlText(std::string_view text);

}  // namespace platform
