#include "platform/signing/Sha1.h"

#include <nettle/sha1.h>

namespace platform {

std::array<std::uint8_t, 20> sha1(std::span<const std::uint8_t> bytes) {
  std::array<std::uint8_t, 20> digest{};
  struct sha1_ctx context;
  sha1_init(&context);
  sha1_update(&context, bytes.size(), bytes.data());
  sha1_digest(&context, digest.size(), digest.data());
  return digest;
}

}  // namespace platform
