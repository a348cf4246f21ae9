// ExtensionHandles: which process has consumed which sandbox extensions. A handle belongs to the process that consumed
// it, on whichever connection it comes back, and ends with the process. Callable from any thread.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <set>

#include "platform/ipc/PeerIdentity.h"
#include "platform/jobs/FdWatch.h"
#include "platform/queue/Mutex.h"

namespace platform {

class ExtensionHandles : public std::enable_shared_from_this<ExtensionHandles> {
 public:
  /// Most handles of one process.
  static constexpr std::size_t kMaxHandles = 4096;

  /// A new handle of `owner`, above 0; -1 and an error number: EMFILE it has too many, ESRCH it has ended.
  [[nodiscard]] std::int64_t add(const std::shared_ptr<const PeerIdentity>& owner, int* errorNumber);
  /// Whether `handle` was one of `owner`; it is none from here on.
  [[nodiscard]] bool remove(const PeerIdentity& owner, std::int64_t handle);

 private:
  struct Owner {
    std::shared_ptr<const PeerIdentity> process;
    std::set<std::int64_t> handles;
    std::unique_ptr<FdWatch> watch;
  };
  void ended(pid_t pid);

  Mutex mutex_;
  std::int64_t last_ XT_GUARDED_BY(mutex_) = 0;
  std::map<pid_t, Owner> owners_ XT_GUARDED_BY(mutex_);
};

}  // namespace platform
