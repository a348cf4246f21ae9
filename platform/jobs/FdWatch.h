// FdWatch: calls a handler on the main run loop when a descriptor becomes readable; made and destroyed on any thread.
// It watches a duplicate of its own, so that the descriptor's owner may close it at any time.
#pragma once

#include <functional>
#include <memory>

namespace platform {

class FdWatch {
 public:
  /// Readiness is reported once (edge-triggered); what is readable already counts.
  FdWatch(int fd, std::function<void()> handler);
  /// The handler may still be running on the main thread when this returns, but is not called again after that.
  ~FdWatch();
  FdWatch(const FdWatch&) = delete;
  FdWatch& operator=(const FdWatch&) = delete;

 private:
  struct State;
  std::shared_ptr<State> state_;
};

}  // namespace platform
