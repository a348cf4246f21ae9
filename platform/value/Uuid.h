// Uuid: 16 bytes of RFC 4122. Read in either case, written in upper case (8-4-4-4-12).
#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace platform {

class Uuid {
 public:
  /// The nil UUID (all zero).
  constexpr Uuid() = default;
  explicit Uuid(std::span<const std::uint8_t, 16> bytes);
  /// A fresh version 4 UUID from the kernel's random source.
  static Uuid random();
  /// Nothing unless `text` is exactly the 36-character form.
  static std::optional<Uuid> parse(std::string_view text);

  const std::array<std::uint8_t, 16>& bytes() const noexcept { return bytes_; }
  /// The 36-character form in upper case.
  std::string text() const;
  std::string describe() const { return text(); }

  friend auto operator<=>(const Uuid&, const Uuid&) = default;

 private:
  std::array<std::uint8_t, 16> bytes_{};
};

}  // namespace platform

template <>
struct std::hash<platform::Uuid> {
  std::size_t operator()(const platform::Uuid& uuid) const noexcept;
};
