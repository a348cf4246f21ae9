// FileState: tells one state of a file from another without reading it.
#pragma once

#include <sys/stat.h>

#include <cstdint>

namespace platform {

struct FileState {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  std::int64_t size = 0;
  /// Nanoseconds since the epoch: the last change of content or attributes (not the modification time, which a program
  /// may set at will).
  std::int64_t changed = 0;

  static FileState of(const struct stat& status) {
    return {status.st_dev, status.st_ino, status.st_size,
            std::int64_t{status.st_ctim.tv_sec} * 1'000'000'000 + status.st_ctim.tv_nsec};
  }
  friend bool operator==(const FileState&, const FileState&) = default;
};

}  // namespace platform
