// The sealed memory files in which large reply bodies travel, and the view of a received one. For any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>

#include "platform/files/UniqueFd.h"

namespace platform {

/// A memory file that holds `bytes` and is sealed against writing, growing, shrinking and further seals; none when the
/// system has no room for it.
[[nodiscard]] UniqueFd createSealedMemoryFile(std::span<const std::uint8_t> bytes);

/// The mapped content of a received memory file; unmapped on destruction.
class IpcMemoryFileView {
 public:
  IpcMemoryFileView() = default;
  IpcMemoryFileView(const IpcMemoryFileView&) = delete;
  IpcMemoryFileView& operator=(const IpcMemoryFileView&) = delete;
  ~IpcMemoryFileView();

  /// Maps `file`, once. False and `reason` when it is not sealed against writing, growing and shrinking, when its size
  /// is not `size`, or when it cannot be mapped. The descriptor may be closed afterwards.
  [[nodiscard]] bool map(int file, std::size_t size, std::string* reason);

  /// Empty before map().
  std::span<const std::uint8_t> bytes() const noexcept { return bytes_; }

 private:
  std::span<std::uint8_t> bytes_;
};

}  // namespace platform
