#include "platform/notify/Notifications.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <thread>

#include "platform/files/Files.h"
#include "platform/files/UniqueFd.h"
#include "platform/log/Log.h"
#include "platform/queue/Mutex.h"

namespace platform {
namespace {

using std::chrono::steady_clock;

constexpr unsigned kFolderMode = 0755;
constexpr unsigned kFileMode = 0644;
constexpr std::size_t kCounterBytes = 8;
constexpr std::chrono::milliseconds kLongWait{50};

// The counter of an opened file; a file that is too short counts as 0.
std::uint64_t counterOf(int fd) {
  std::array<std::uint8_t, kCounterBytes> bytes{};
  if (::pread(fd, bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) return 0;
  std::uint64_t counter = 0;
  for (std::size_t i = bytes.size(); i-- > 0;) counter = counter << 8 | bytes[i];
  return counter;
}

bool setCounter(int fd, std::uint64_t counter) {
  std::array<std::uint8_t, kCounterBytes> bytes{};
  for (std::uint8_t& byte : bytes) {
    byte = static_cast<std::uint8_t>(counter);
    counter >>= 8;
  }
  return ::pwrite(fd, bytes.data(), bytes.size(), 0) == static_cast<ssize_t>(bytes.size());
}

class FileNotifications : public Notifications {
 public:
  explicit FileNotifications(std::string folder) : folder_(std::move(folder)) {}

  void prepare(const std::string& name) override {
    const MutexLock lock(mutex_);
    const UniqueFd fd = openLocked(name);
    struct stat status {};
    if (!fd || ::fstat(fd.get(), &status) != 0) return;
    if (status.st_size < static_cast<off_t>(kCounterBytes) && !setCounter(fd.get(), 0)) complain(name);
  }

  void postNotification(const std::string& name) override {
    const MutexLock lock(mutex_);
    const UniqueFd fd = openLocked(name);
    if (fd && !setCounter(fd.get(), counterOf(fd.get()) + 1)) complain(name);
  }

  std::optional<std::uint64_t> counter(const std::string& name) override {
    if (!isPathSafeName(name)) return std::nullopt;
    const UniqueFd fd(::open(pathOf(name).c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
    struct stat status {};
    if (!fd || ::fstat(fd.get(), &status) != 0 || !S_ISREG(status.st_mode)) return std::nullopt;
    return counterOf(fd.get());
  }

 private:
  std::string pathOf(const std::string& name) const { return folder_ + "/" + name; }

  void complain(const std::string& name) const {
    Log::processDefault().error("{}", posixError(errno, "cannot write " + pathOf(name)));
  }

  // The file, made when it is missing, with its lock; empty, and logged, on failure. The lock goes with the handle.
  UniqueFd openLocked(const std::string& name) XT_REQUIRES(mutex_) {
    if (!isPathSafeName(name)) return {};
    constexpr int kFlags = O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK;
    UniqueFd fd(::open(pathOf(name).c_str(), kFlags, kFileMode));
    if (!fd && errno == ENOENT && !Files::make()->createDirectory(folder_, true, kFolderMode)) {
      fd.reset(::open(pathOf(name).c_str(), kFlags, kFileMode));
    }
    struct stat status {};
    if (!fd || ::fstat(fd.get(), &status) != 0) {
      complain(name);
      return {};
    }
    if ((status.st_mode & 07777U) != kFileMode) (void)::fchmod(fd.get(), kFileMode);
    lock(fd.get());
    return fd;
  }

  // Everybody may open the file for reading and hold a lock on it for ever. So long waits are deducted from the
  // patience of this object's whole life; when that is used up the counter is raised without the lock.
  void lock(int fd) XT_REQUIRES(mutex_) {
    const auto begun = steady_clock::now();
    steady_clock::duration waited{};
    while (::flock(fd, LOCK_EX | LOCK_NB) != 0 && waited < patience_) {
      std::this_thread::sleep_for(std::chrono::microseconds(200));
      waited = steady_clock::now() - begun;
    }
    if (waited > kLongWait) patience_ -= std::min(waited, patience_);
  }

  const std::string folder_;
  Mutex mutex_;
  steady_clock::duration patience_ XT_GUARDED_BY(mutex_) = std::chrono::seconds(1);
};

}  // namespace

std::shared_ptr<Notifications> Notifications::make(const Directories& directories) {
  return std::make_shared<FileNotifications>(directories.runtime + "/notify");
}

}  // namespace platform
