#include "platform/hostservices/ExtensionHandles.h"

#include <cerrno>

namespace platform {

std::int64_t ExtensionHandles::add(const std::shared_ptr<const PeerIdentity>& owner, int* errorNumber) {
  if (!owner->isAlive()) {
    *errorNumber = ESRCH;
    return -1;
  }
  const MutexLock lock(mutex_);
  Owner& entry = owners_[owner->pid()];
  // A dead process may have had the same process id.
  if (entry.process == nullptr || !entry.process->isAlive()) {
    entry = {owner, {}, std::make_unique<FdWatch>(owner->pidfd(), [weak = weak_from_this(), pid = owner->pid()] {
               if (const auto self = weak.lock()) self->ended(pid);
             })};
  }
  if (entry.handles.size() >= kMaxHandles) {
    *errorNumber = EMFILE;
    return -1;
  }
  entry.handles.insert(++last_);
  return last_;
}

bool ExtensionHandles::remove(const PeerIdentity& owner, std::int64_t handle) {
  const MutexLock lock(mutex_);
  const auto place = owners_.find(owner.pid());
  if (place == owners_.end() || !place->second.process->isAlive() || !owner.isAlive()) return false;
  return place->second.handles.erase(handle) != 0;
}

void ExtensionHandles::ended(pid_t pid) {
  const MutexLock lock(mutex_);
  const auto place = owners_.find(pid);
  if (place != owners_.end() && !place->second.process->isAlive()) owners_.erase(place);
}

}  // namespace platform
