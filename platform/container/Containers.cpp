#include "platform/container/Containers.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <optional>
#include <utility>

#include "platform/files/UniqueFd.h"
#include "platform/files/UserAndGroup.h"
#include "platform/log/Log.h"
#include "platform/queue/Mutex.h"

namespace platform {
namespace {

constexpr unsigned kFolderMode = 0711;
constexpr unsigned kContainerMode = 0700;
constexpr std::chrono::seconds kOwnerAge{10};

bool isContainerName(unsigned containerClass, const std::string& identifier) {
  const std::size_t at = identifier.find('@');
  if (at == std::string::npos || containerClass != kPlugInContainerClass) return isPathSafeName(identifier);
  const std::string suffix = identifier.substr(at + 1);
  return isPathSafeName(identifier.substr(0, at)) && !suffix.empty() && suffix.size() <= 9 &&
         std::all_of(suffix.begin(), suffix.end(), [](char c) { return c >= '0' && c <= '9'; });
}

// Gives an opened directory that owner and mode, as far as it differs; 0 or an error number.
int setRight(int directory, UserAndGroup owner) {
  struct stat status {};
  if (::fstat(directory, &status) != 0) return errno;
  const bool owned = status.st_uid == owner.user && status.st_gid == owner.group;
  if (!owned && ::fchown(directory, owner.user, owner.group) != 0) return errno;
  if ((status.st_mode & 07777U) != kContainerMode && ::fchmod(directory, kContainerMode) != 0) return errno;
  return 0;
}

UniqueFd openDirectoryAt(int folder, const char* name) {
  return UniqueFd(::openat(folder, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

class FileContainers : public Containers {
 public:
  FileContainers(const Directories& directories, std::shared_ptr<Files> files)
      : folder_(directories.state + "/Containers"),
        plugInUser_(directories.plugInUser),
        multiUser_(directories.multiUser),
        files_(std::move(files)) {}

  std::variant<std::string, std::uint64_t> containerCreateOrLookup(unsigned containerClass,
                                                                   const std::string& identifier,
                                                                   unsigned /*option*/) override {
    if (!isContainerName(containerClass, identifier)) return std::uint64_t{EINVAL};
    std::string path = folder_ + "/" + identifier;
    auto error = files_->createDirectory(path, false, kContainerMode);
    if (error && error->code == ENOENT) {
      error = files_->createDirectory(folder_, true, kFolderMode);
      if (!error) error = files_->createDirectory(path, false, kContainerMode);
    }
    if (error) return static_cast<std::uint64_t>(error->code);
    const int number = fitOut(path, containerClass == kPlugInContainerClass);
    if (number != 0) return static_cast<std::uint64_t>(number);
    return path;
  }

  bool isMultiUserMode() override { return multiUser_; }

 private:
  // What is inside a container belongs to whoever owns it, who may do anything there meanwhile: no link is followed.
  int fitOut(const std::string& path, bool forPlugIn) {
    const UniqueFd container = openDirectoryAt(AT_FDCWD, path.c_str());
    if (!container) return errno;
    const UserAndGroup owner = forPlugIn ? plugInOwner() : UserAndGroup{::geteuid(), ::getegid()};
    if (const int number = setRight(container.get(), owner); number != 0 || !forPlugIn) return number;
    if (::mkdirat(container.get(), "tmp", kContainerMode) != 0) return errno == EEXIST ? 0 : errno;
    const UniqueFd temporary = openDirectoryAt(container.get(), "tmp");
    return temporary ? setRight(temporary.get(), owner) : errno;
  }

  UserAndGroup plugInOwner() {
    const UserAndGroup self{::geteuid(), ::getegid()};
    if (plugInUser_.empty() || self.user != 0) return self;
    const auto now = std::chrono::steady_clock::now();
    const MutexLock lock(mutex_);
    if (owner_ && now - askedAt_ < kOwnerAge) return *owner_;
    askedAt_ = now;
    owner_ = UserAndGroup::named(plugInUser_);
    if (owner_) return *owner_;
    Log::processDefault().info("there is no user {}; its containers stay with user {}", plugInUser_, self.user);
    return self;
  }

  const std::string folder_;
  const std::string plugInUser_;
  const bool multiUser_;
  const std::shared_ptr<Files> files_;
  // Thousands of containers are made in a row, and the directory of users may be a server.
  Mutex mutex_;
  std::optional<UserAndGroup> owner_ XT_GUARDED_BY(mutex_);
  std::chrono::steady_clock::time_point askedAt_ XT_GUARDED_BY(mutex_);
};

}  // namespace

std::shared_ptr<Containers> Containers::make(const Directories& directories, std::shared_ptr<Files> files) {
  return std::make_shared<FileContainers>(directories, std::move(files));
}

}  // namespace platform
