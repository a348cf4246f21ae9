#include "platform/files/DamagedFileLog.h"

#include "platform/log/Log.h"

namespace platform {
namespace {
constexpr std::size_t kMaxReported = 1024;
}  // namespace

DamagedFileLog& DamagedFileLog::shared() {
  static auto* const log = new DamagedFileLog;
  return *log;
}

void DamagedFileLog::report(const std::string& path, const FileState& state, const std::string& reason) {
  {
    const MutexLock lock(mutex_);
    const auto known = reported_.find(path);
    if (known != reported_.end() && known->second == state) return;
    if (known == reported_.end() && reported_.size() >= kMaxReported) reported_.clear();
    reported_[path] = state;
  }
  Log::processDefault().error("cannot use {}: {}", path, reason);
}

}  // namespace platform
