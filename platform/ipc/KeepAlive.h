// KeepAlive: says that the process has work that must not be lost to an idle exit. Counted; without effect, since the
// daemon never leaves when it is idle.
#pragma once

#include <cstddef>
#include <utility>

namespace platform {

/// One hold on the process, ended by its destruction. Move-only; for any thread.
class KeepAlive {
 public:
  KeepAlive() = default;
  KeepAlive(KeepAlive&& other) noexcept : holds_(std::exchange(other.holds_, false)) {}
  KeepAlive& operator=(KeepAlive&& other) noexcept {
    if (this != &other) {
      reset();
      holds_ = std::exchange(other.holds_, false);
    }
    return *this;
  }
  KeepAlive(const KeepAlive&) = delete;
  KeepAlive& operator=(const KeepAlive&) = delete;
  ~KeepAlive() { reset(); }

  explicit operator bool() const noexcept { return holds_; }
  void reset() noexcept;

 private:
  friend KeepAlive ipcHoldProcessAlive();
  bool holds_ = false;
};

/// Begins a hold on the process.
[[nodiscard]] KeepAlive ipcHoldProcessAlive();
/// How many holds there are now.
std::size_t ipcKeepAliveCount() noexcept;

}  // namespace platform
