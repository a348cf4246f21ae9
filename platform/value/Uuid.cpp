#include "platform/value/Uuid.h"

#include <sys/random.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "platform/value/Hex.h"
#include "platform/value/InternalInconsistency.h"

namespace platform {
namespace {

constexpr std::size_t kTextLength = 36;

// Hyphens stand before these bytes.
constexpr bool hyphenBefore(std::size_t byte) {
  return byte == 4 || byte == 6 || byte == 8 || byte == 10;
}

}  // namespace

Uuid::Uuid(std::span<const std::uint8_t, 16> bytes) {
  std::copy(bytes.begin(), bytes.end(), bytes_.begin());
}

Uuid Uuid::random() {
  Uuid uuid;
  ssize_t got = 0;
  do {
    got = getrandom(uuid.bytes_.data(), uuid.bytes_.size(), 0);
  } while (got < 0 && errno == EINTR);
  if (got != static_cast<ssize_t>(uuid.bytes_.size())) throw InternalInconsistency("no random bytes for a UUID");
  uuid.bytes_[6] = static_cast<std::uint8_t>((uuid.bytes_[6] & 0x0F) | 0x40);  // version 4
  uuid.bytes_[8] = static_cast<std::uint8_t>((uuid.bytes_[8] & 0x3F) | 0x80);  // the variant of RFC 4122
  return uuid;
}

std::optional<Uuid> Uuid::parse(std::string_view text) {
  if (text.size() != kTextLength) return std::nullopt;
  Uuid uuid;
  std::size_t at = 0;
  for (std::size_t byte = 0; byte < uuid.bytes_.size(); ++byte) {
    if (hyphenBefore(byte) && text[at++] != '-') return std::nullopt;
    const int high = hexDigit(text[at++]);
    const int low = hexDigit(text[at++]);
    if (high < 0 || low < 0) return std::nullopt;
    uuid.bytes_[byte] = static_cast<std::uint8_t>(high << 4 | low);
  }
  return uuid;
}

std::string Uuid::text() const {
  std::string out;
  out.reserve(kTextLength);
  for (std::size_t byte = 0; byte < bytes_.size(); ++byte) {
    if (hyphenBefore(byte)) out += '-';
    out += kUpperHexDigits[bytes_[byte] >> 4];
    out += kUpperHexDigits[bytes_[byte] & 0x0F];
  }
  return out;
}

}  // namespace platform

std::size_t std::hash<platform::Uuid>::operator()(const platform::Uuid& uuid) const noexcept {
  std::uint64_t halves[2];
  std::memcpy(halves, uuid.bytes().data(), sizeof halves);
  return static_cast<std::size_t>(halves[0] ^ (halves[1] * 0x9E3779B97F4A7C15U));
}
