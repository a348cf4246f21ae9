#include "platform/ipc/KeepAlive.h"

#include <atomic>

namespace platform {
namespace {

std::atomic<std::size_t> holds = 0;

}  // namespace

void KeepAlive::reset() noexcept {
  if (std::exchange(holds_, false)) holds.fetch_sub(1, std::memory_order_relaxed);
}

KeepAlive ipcHoldProcessAlive() {
  KeepAlive hold;
  hold.holds_ = true;
  holds.fetch_add(1, std::memory_order_relaxed);
  return hold;
}

std::size_t ipcKeepAliveCount() noexcept {
  return holds.load(std::memory_order_relaxed);
}

}  // namespace platform
