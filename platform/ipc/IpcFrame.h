// IpcFrameHeader: the 16 bytes before every body on a connection, and the limits of the wire in one place.
//
// Offsets: 0 body length (32 bits), 4 type, 5 flags, 6 number of descriptors (16 bits), 8 message id (64 bits); all
// little-endian. Plain data: free of threads and of any connection's state.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

#include "platform/value/Error.h"

namespace platform {

enum class IpcFrameType : std::uint8_t {
  Request = 1,
  Reply = 2,
  RequestWithoutReply = 3,
  TerminationImminent = 4,  ///< "my termination is imminent": no body
};

/// Flag bit 0: the body is in the sealed memory file passed with this frame; body length = the file's size.
inline constexpr std::uint8_t kIpcFlagMemoryFile = 0x01;

/// The largest body, in bytes, that may stand inside a frame sent to a service.
inline constexpr std::uint32_t kIpcMaxInlineBody = 16U << 20;
/// The largest reply body, in bytes, that a client takes.
inline constexpr std::uint32_t kIpcMaxReplyBody = 1U << 30;
/// A reply body above this many bytes travels as a memory file.
inline constexpr std::uint32_t kIpcMemoryFileThreshold = 128U << 10;
/// What may wait on one connection, in bytes, besides the reply being sent; memory files count in full.
inline constexpr std::size_t kIpcMaxBacklog = std::size_t{4} << 20;
/// Reading from a connection pauses at this many unserved requests.
inline constexpr std::size_t kIpcMaxUnservedRequests = 32;
/// The unfinished bodies of all connections together, in bytes.
inline constexpr std::size_t kIpcMaxUnfinishedBytes = std::size_t{256} << 20;

/// Values in one body: this many, and one more for each kIpcBytesPerValue bytes of it. Bounds what small values, each
/// of which takes many times its bytes in memory, can make a receiver allocate.
inline constexpr std::size_t kIpcMaxValues = std::size_t{1} << 20;
inline constexpr std::size_t kIpcBytesPerValue = 16;

/// The domain of every error about frames and bodies.
inline constexpr const char* kIpcErrorDomain = "IPC";
/// The code of a malformed frame or body.
inline constexpr std::int64_t kIpcErrorMalformed = 1;

struct IpcFrameHeader {
  static constexpr std::size_t kSize = 16;

  std::uint32_t bodyLength = 0;
  IpcFrameType type = IpcFrameType::Request;
  std::uint8_t flags = 0;
  /// Descriptors passed with the frame, the memory file not counted.
  std::uint16_t descriptorCount = 0;
  /// Chosen by the requester; a reply carries its request's id.
  std::uint64_t id = 0;

  bool hasMemoryFile() const noexcept { return (flags & kIpcFlagMemoryFile) != 0; }

  [[nodiscard]] std::array<std::uint8_t, kSize> serialize() const noexcept;
  /// Nothing and an error for what is broken whoever the receiver is: another type than the four, an unknown flag bit,
  /// a termination frame with a body. Lengths, descriptors and who may send what are the receiver's to judge.
  [[nodiscard]] static std::optional<IpcFrameHeader> parse(std::span<const std::uint8_t, kSize> bytes, Error* error);

  friend bool operator==(const IpcFrameHeader&, const IpcFrameHeader&) = default;
};

}  // namespace platform
