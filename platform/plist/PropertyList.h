// XML property lists, version 1.0: the text form of values in files and bundles. Free functions without state, for any
// thread. What serializeXml writes parsePropertyList reads back equal (a date in whole seconds).
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "platform/value/Error.h"
#include "platform/value/Value.h"

namespace platform {

/// The deepest nesting of either direction; the outermost value, of whatever kind, is level 1.
inline constexpr std::size_t kPropertyListMaxDepth = 96;
/// The longest document of either direction, in bytes.
inline constexpr std::size_t kPropertyListMaxBytes = std::size_t{256} << 20;

/// The domain of every error about property lists, and its codes: what could not be read, what could not be written.
inline constexpr const char* kPropertyListErrorDomain = "PropertyList";
inline constexpr std::int64_t kPropertyListErrorRead = 1;
inline constexpr std::int64_t kPropertyListErrorWrite = 2;

/// The value of a UTF-8 document. Nothing and an error (domain "PropertyList", code 1, text "line L, column C: reason")
/// when it is anything but `<plist version="1.0">` around one value. Entities other than XML's own are refused, a
/// document type declaration is skipped. An integer above 2^63-1 is unsigned, every other one signed; of equal keys the
/// last one counts.
[[nodiscard]] Value parsePropertyList(std::span<const std::uint8_t> bytes, Error* error);

/// The document of `value`: keys sorted, indented with tabs, without a document type declaration. Nothing and an error
/// (domain "PropertyList", code 2) that names the kind when `value` holds what property lists cannot: a UUID, a
/// message, a descriptor, the nothing value, a real that is not finite, a date beyond the years 0000 to 9999, text with
/// characters that XML lacks; or when it is nested too deep or too long.
[[nodiscard]] std::optional<std::string> serializeXml(const Value& value, Error* error);

}  // namespace platform
