// The codec of bodies: one value to and from MessagePack.
//
// Kinds keep their identity over the wire: unsigned numbers are written as MessagePack's unsigned forms, signed ones as
// the signed forms even when they are not negative. The encoder writes the shortest form of a kind and keys sorted, so
// that equal dictionaries have equal bytes; the decoder takes any order and any length form. Free functions without
// state, for any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

namespace platform {

/// The deepest nesting of a body; the outermost value, of whatever kind, is level 1.
inline constexpr std::size_t kIpcMaxDepth = 64;
/// The deepest nesting inside a message, where counting starts anew.
inline constexpr std::size_t kIpcMaxMessageDepth = 128;

/// Appends the encoding of `value` to `out` (which keeps its capacity: reuse it). A descriptor inside is written as its
/// index, and its number, which the value still owns, is appended to `descriptors`; the index counts from what the list
/// holds already. A string that could not travel (invalid UTF-8, a character that XML lacks) has the offending bytes
/// replaced by U+FFFD, so that one bad name never costs a connection. A descriptor without a list, a 257th descriptor
/// and the nothing value are broken contracts; `out` is then as it was.
void encodeValue(const Value& value, Bytes& out, std::vector<int>* descriptors = nullptr);

/// The one value that `bytes` hold. Nothing and an error (domain "IPC", code 1, the reason as its text) when they are
/// malformed. A descriptor inside takes ownership of the entry of `descriptors` that its index names, each at most once
/// (also when the decoding fails later); entries that nothing refers to stay with the caller. Memory is taken for what
/// is there, never for what a length claims.
[[nodiscard]] Value decodeValue(std::span<const std::uint8_t> bytes, Error* error,
                                std::span<UniqueFd> descriptors = {});

/// A message value that holds the encoding of `value`, opaque to everyone on its way. A descriptor inside `value` and
/// the nothing value are broken contracts; messages may nest.
[[nodiscard]] Value toWireMessage(const Value& value);

/// The value inside `message`; nothing when it is no message or what it holds is malformed. Each call decodes anew.
[[nodiscard]] Value fromWireMessage(const Value& message);

}  // namespace platform
