// SHA-1 digest (FIPS 180-4).
#pragma once

#include <array>
#include <cstdint>
#include <span>

namespace platform {

std::array<std::uint8_t, 20> sha1(std::span<const std::uint8_t> bytes);

}  // namespace platform
