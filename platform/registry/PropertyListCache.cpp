#include "platform/registry/PropertyListCache.h"

#include "platform/files/DamagedFileLog.h"
#include "platform/registry/BundleFiles.h"

namespace platform {

constexpr std::size_t kMostFiles = 256;

Value PropertyListCache::dictionaryAt(const std::string& folder, const std::string& relative) {
  const std::string path = folder + "/" + relative;
  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return {};
  const FileState state = FileState::of(status);
  {
    const MutexLock lock(mutex_);
    const auto found = cached_.find(path);
    if (found != cached_.end() && found->second.state == state) return found->second.value;
  }

  const std::size_t slash = relative.rfind('/');
  UniqueFd directory = openDirectory(folder);
  if (slash != std::string::npos) directory = openDirectoryBelow(directory.get(), relative.substr(0, slash));
  FileStamp stamp;
  Error error;
  Value value = readPropertyListIn(directory.get(), relative.substr(slash + 1), &stamp, &error);
  if (!value.isDictionary()) {
    const std::string reason = value.isNothing() ? error.localizedDescription() : "it is not a dictionary";
    DamagedFileLog::shared().report(path, state, reason);
    value = {};
  }
  const MutexLock lock(mutex_);
  if (cached_.size() >= kMostFiles) cached_.clear();
  cached_[path] = {state, value};
  return value;
}

void PropertyListCache::clear() {
  const MutexLock lock(mutex_);
  cached_.clear();
}

}  // namespace platform
