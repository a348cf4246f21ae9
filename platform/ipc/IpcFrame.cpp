#include "platform/ipc/IpcFrame.h"

#include <fmt/format.h>

namespace platform {
namespace {

// The offsets of the fields.
constexpr std::size_t kLength = 0;
constexpr std::size_t kType = 4;
constexpr std::size_t kFlags = 5;
constexpr std::size_t kDescriptors = 6;
constexpr std::size_t kId = 8;

template <typename T>
void store(std::uint8_t* to, T value) noexcept {
  for (std::size_t i = 0; i < sizeof value; ++i) to[i] = static_cast<std::uint8_t>(value >> (8 * i));
}

template <typename T>
T load(const std::uint8_t* from) noexcept {
  T value = 0;
  for (std::size_t i = 0; i < sizeof value; ++i) value = static_cast<T>(value | static_cast<T>(from[i]) << (8 * i));
  return value;
}

}  // namespace

std::array<std::uint8_t, IpcFrameHeader::kSize> IpcFrameHeader::serialize() const noexcept {
  std::array<std::uint8_t, kSize> bytes{};
  store(&bytes[kLength], bodyLength);
  bytes[kType] = static_cast<std::uint8_t>(type);
  bytes[kFlags] = flags;
  store(&bytes[kDescriptors], descriptorCount);
  store(&bytes[kId], id);
  return bytes;
}

std::optional<IpcFrameHeader> IpcFrameHeader::parse(std::span<const std::uint8_t, kSize> bytes, Error* error) {
  const auto refuse = [&](std::string reason) {
    setError(error, {kIpcErrorDomain, kIpcErrorMalformed, "malformed frame: " + std::move(reason)});
    return std::nullopt;
  };
  const std::uint8_t type = bytes[kType];
  if (type < static_cast<std::uint8_t>(IpcFrameType::Request) ||
      type > static_cast<std::uint8_t>(IpcFrameType::TerminationImminent)) {
    return refuse(fmt::format("type {} is unknown", type));
  }
  const IpcFrameHeader header{load<std::uint32_t>(&bytes[kLength]), static_cast<IpcFrameType>(type), bytes[kFlags],
                              load<std::uint16_t>(&bytes[kDescriptors]), load<std::uint64_t>(&bytes[kId])};
  if ((header.flags & ~kIpcFlagMemoryFile) != 0) return refuse(fmt::format("flags {:#04x} are unknown", header.flags));
  if (header.type == IpcFrameType::TerminationImminent && (header.bodyLength != 0 || header.hasMemoryFile())) {
    return refuse("a termination has no body");
  }
  return header;
}

}  // namespace platform
