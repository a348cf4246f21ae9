#include "platform/Platform.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

#include "platform/jobs/ProcessJobManager.h"
#include "platform/registry/BundleRegistry.h"

namespace platform {
namespace {

constexpr unsigned kStateMode = 0711;
constexpr unsigned kRuntimeMode = 0755;

// Makes a directory of this process's own, or gives one that it owns the mode it should have. Nothing on success.
std::optional<Error> prepareDirectory(Files& files, const std::string& path, unsigned mode) {
  if (auto error = files.createDirectory(path, true, mode)) return error;
  const UniqueFd directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  struct stat status {};
  if (!directory || ::fstat(directory.get(), &status) != 0)
    return posixError(errno, "cannot open the directory " + path);
  if (status.st_uid != 0 && status.st_uid != ::geteuid()) return posixError(EPERM, path + " belongs to somebody else");
  // A directory that is shared on purpose (/tmp as somebody's runtime directory) stays as it is.
  const bool ours = status.st_uid == ::geteuid() && (status.st_mode & S_ISVTX) == 0;
  if (ours && (status.st_mode & 07777U) != mode && ::fchmod(directory.get(), mode) != 0) {
    return posixError(errno, "cannot set the mode of " + path);
  }
  return std::nullopt;
}

// The lock that makes this process the only one of that state directory; null and `error` when it is taken.
std::shared_ptr<const UniqueFd> lockState(const std::string& state, Error* error) {
  const std::string path = state + "/lock";
  UniqueFd lock(::open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, 0600));
  // Nobody else may open it, so nobody else can take the lock.
  if (!lock || ::fchmod(lock.get(), 0600) != 0 || ::flock(lock.get(), LOCK_EX | LOCK_NB) != 0) {
    const int number = errno;
    setError(error, posixError(number,
                               number == EWOULDBLOCK ? "another process has the lock " + path : "cannot lock " + path));
    return nullptr;
  }
  return std::make_shared<const UniqueFd>(std::move(lock));
}

}  // namespace

std::shared_ptr<Platform> Platform::make(const Directories& directories, Error* error) {
  auto platform = std::make_shared<Platform>();
  platform->directories = directories;
  platform->files = Files::make();

  const auto prepared = [&](const std::string& path, unsigned mode) {
    auto problem = prepareDirectory(*platform->files, path, mode);
    if (!problem) return true;
    setError(error, std::move(*problem));
    return false;
  };
  if (!prepared(directories.state, kStateMode)) return nullptr;
  platform->stateLock = lockState(directories.state, error);
  if (platform->stateLock == nullptr || !prepared(directories.state + "/Containers", kStateMode) ||
      !prepared(directories.runtime, kRuntimeMode) || !prepared(directories.runtime + "/services", kRuntimeMode) ||
      !prepared(directories.runtime + "/notify", kRuntimeMode)) {
    return nullptr;
  }

  platform->containers = Containers::make(directories, platform->files);
  platform->locale = Locale::make(directories);
  platform->notifications = Notifications::make(directories);
  platform->notifications->prepare(kAnnotationChangeNotification);
  platform->preferences = Preferences::make(directories);
  platform->signing = CodeSigning::make();
  platform->sandbox = Sandbox::make();
  platform->registry = makeBundleRegistry(
      {directories, platform->files, platform->containers, platform->locale, platform->notifications});
  platform->jobs = ProcessJobManager::make(platform->registry, ProcessJobManager::graceFromEnvironment());
  platform->assertions = ProcessAssertions::make(platform->jobs);
  platform->consent = ConsentService::make(directories);
  // After the registry, which must hear of a change before anybody else does.
  platform->locale->startWatching();
  return platform;
}

}  // namespace platform
