// Reading a whole file that is opened already: what the file service, preferences, bundles and entitlements share.
#pragma once

#include <cstddef>
#include <optional>
#include <string>

#include "platform/files/UniqueFd.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

namespace platform {

/// Opens `path` for reading without waiting for anybody (a FIFO or device is opened too; reading it is refused). An
/// empty handle and `error` (code 260 when there is no such file) on failure.
[[nodiscard]] UniqueFd openForReading(const std::string& path, Error* error);

/// All bytes of the regular file `fd` from its beginning. Nothing and `error` when it is no regular file (a directory
/// is EISDIR, anything else EINVAL), longer than `limit` bytes (EFBIG) or not readable. `path` is for the error's text.
[[nodiscard]] std::optional<Bytes> readOpenFile(int fd, const std::string& path, std::size_t limit, Error* error);

}  // namespace platform
