#include "platform/preferences/Preferences.h"

#include <sys/stat.h>

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>

#include "platform/files/DamagedFileLog.h"
#include "platform/files/FileState.h"
#include "platform/files/Files.h"
#include "platform/files/ReadFile.h"
#include "platform/plist/PropertyList.h"
#include "platform/queue/Mutex.h"

namespace platform {
namespace {

constexpr std::size_t kMaxPreferencesBytes = std::size_t{16} << 20;

// A file that changed later than this before it was read is read again: a second change could carry the same time.
constexpr std::int64_t kSettledNanoseconds = 50'000'000;

std::int64_t now() {
  return std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::system_clock::now().time_since_epoch())
      .count();
}

class FilePreferences : public Preferences {
 public:
  explicit FilePreferences(std::string folder) : folder_(std::move(folder)) {}

  Value preferenceValue(const std::string& domain, const std::string& key) override {
    if (!isPathSafeName(domain)) return {};
    const MutexLock lock(mutex_);
    const std::string path = folder_ + "/" + domain + ".plist";
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
      domains_.erase(domain);
      return {};
    }
    const auto known = domains_.find(domain);
    if (known != domains_.end() && known->second.state == FileState::of(status)) return known->second.content[key];
    domains_.erase(domain);
    return read(domain, path, FileState::of(status))[key];
  }

 private:
  struct Parsed {
    FileState state;
    Value content;  // a dictionary; nothing when the file is damaged
  };

  Value read(const std::string& domain, const std::string& path, FileState state) XT_REQUIRES(mutex_) {
    const std::int64_t begun = now();
    Error error;
    std::optional<Bytes> bytes;
    if (const UniqueFd fd = openForReading(path, &error)) {
      struct stat status {};
      if (::fstat(fd.get(), &status) == 0) state = FileState::of(status);
      bytes = readOpenFile(fd.get(), path, kMaxPreferencesBytes, &error);
    } else if (error.code == kFileDoesNotExist) {
      return {};
    }
    Value content = bytes ? parsePropertyList(*bytes, &error) : Value();
    if (!content.isDictionary()) {
      DamagedFileLog::shared().report(path, state, content ? "it is not a dictionary" : error.describe());
      content = Value();
    }
    if (begun - state.changed >= kSettledNanoseconds) domains_[domain] = {state, content};
    return content;
  }

  const std::string folder_;
  Mutex mutex_;
  std::map<std::string, Parsed> domains_ XT_GUARDED_BY(mutex_);  // those that may be reused
};

}  // namespace

std::shared_ptr<Preferences> Preferences::make(const Directories& directories) {
  return std::make_shared<FilePreferences>(directories.config + "/preferences");
}

}  // namespace platform
