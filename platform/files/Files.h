// Files: the file service. One interface so that a fault (a full disk, a failing fsync) is one override.
// Callable from any thread. Errors are of domain "POSIX" with errno as code, but 260 for a file that does not exist.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>

#include "platform/value/Error.h"
#include "platform/value/Value.h"

namespace platform {

/// Code of the error for reading a file that does not exist.
inline constexpr std::int64_t kFileDoesNotExist = 260;

class Files {
 public:
  virtual ~Files() = default;

  /// All bytes of a regular file (at most 1 GiB, else EFBIG); nothing and `error` on failure: 260 when there is no such
  /// file, EISDIR for a directory, EINVAL for another kind.
  [[nodiscard]] virtual std::optional<Bytes> readFileData(const std::string& path, Error* error) = 0;
  /// Replaces `path` in one step: <path>.tmp (exclusive, no link followed, mode 0600), write, fsync, rename, fsync of
  /// the directory. On failure the old content stands, the temporary file is removed, and the error is returned; when
  /// only the last step fails, the new content stands but may not outlive a power failure. A temporary file that a dead
  /// process left behind is replaced; a link at `path` is replaced, not followed.
  [[nodiscard]] virtual std::optional<Error> writeFileAtomic(const std::string& path,
                                                             std::span<const std::uint8_t> bytes) = 0;
  /// Makes a directory with `mode` (exactly, whatever the umask); with `intermediates` also the missing ones above it.
  /// An existing directory is success.
  [[nodiscard]] virtual std::optional<Error> createDirectory(const std::string& path, bool intermediates,
                                                             unsigned mode) = 0;
  /// Makes a second name (hard link) for a file; an existing `to` is left alone and is success.
  [[nodiscard]] virtual std::optional<Error> linkFile(const std::string& from, const std::string& to) = 0;
  /// The canonical path (realpath), or nothing.
  [[nodiscard]] virtual std::optional<std::string> resolvePath(const std::string& path) = 0;

  /// The Linux implementation. Each step of writeFileAtomic is a virtual operation of the class behind it
  /// (PosixFiles), so that a fault can be put at any of them.
  static std::shared_ptr<Files> make();
};

}  // namespace platform
