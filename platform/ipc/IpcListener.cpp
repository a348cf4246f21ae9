#include "platform/ipc/IpcListener.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <mutex>
#include <optional>

#include "platform/files/Directories.h"
#include "platform/files/Files.h"
#include "platform/ipc/IpcServiceAddress.h"
#include "platform/ipc/IpcSocketListener.h"
#include "platform/log/Log.h"

namespace platform {
namespace {

constexpr unsigned kDirectoryMode = 0755;
constexpr mode_t kSocketMode = 0666;
constexpr mode_t kLockMode = 0600;

// The directory of the services: made where it is missing, this user's own, and nobody else's to write in.
UniqueFd openServicesDirectory(const std::string& path, Error* error) {
  if (auto failure = Files::make()->createDirectory(path, true, kDirectoryMode)) {
    setError(error, *std::move(failure));
    return {};
  }
  UniqueFd directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  struct stat status = {};
  if (!directory || ::fstat(directory.get(), &status) != 0) {
    setError(error, posixError(errno, path));
    return {};
  }
  if (status.st_uid != ::geteuid()) {
    setError(error, posixError(EPERM, path + " belongs to another user"));
    return {};
  }
  if ((status.st_mode & 07777) != kDirectoryMode && ::fchmod(directory.get(), kDirectoryMode) != 0) {
    setError(error, posixError(errno, path));
    return {};
  }
  return directory;
}

// The lock that says who serves the name; held until it is closed. The file stays, so that all look at the same one.
UniqueFd lockService(const UniqueFd& directory, const std::string& path, const std::string& service, Error* error) {
  UniqueFd lock(
      ::openat(directory.get(), (service + ".lock").c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, kLockMode));
  if (!lock) {
    setError(error, posixError(errno, path + "/" + service + ".lock"));
    return {};
  }
  if (::flock(lock.get(), LOCK_EX | LOCK_NB) == 0) return lock;
  setError(error, errno == EWOULDBLOCK ? posixError(EADDRINUSE, path + "/" + service + " is already served")
                                       : posixError(errno, path + "/" + service + ".lock"));
  return {};
}

// The socket that activation has handed over under the name; each is used once.
UniqueFd takeActivatedSocket(const std::string& service) {
  static std::once_flag once;
  static auto* const handedOver = new std::vector<std::pair<std::string, UniqueFd>>;
  std::call_once(once, [] {
    char** names = nullptr;
    const int count = sd_listen_fds_with_names(0, &names);
    for (int i = 0; i < count; ++i) {
      handedOver->emplace_back(names[i], SD_LISTEN_FDS_START + i);
      std::free(names[i]);
    }
    std::free(names);
  });
  static std::mutex mutex;
  const std::lock_guard lock(mutex);
  for (auto& [name, socket] : *handedOver) {
    if (name == service && socket && sd_is_socket_unix(socket.get(), SOCK_STREAM, 1, nullptr, 0) > 0) {
      return std::move(socket);
    }
  }
  return {};
}

// Makes the socket file anew; what a dead process left in its place goes.
bool bindService(const std::string& path, const std::string& service, IpcServiceSocket* made, Error* error) {
  const auto fail = [&](int number, const std::string& what) {
    setError(error, posixError(number, what));
    return false;
  };
  const std::string file = path + "/" + service;
  const auto address = IpcServiceAddress::make(path, service, error);
  if (!address) return false;
  made->socket.reset(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  if (!made->socket) return fail(errno, file);
  struct stat status = {};
  if (::fstatat(made->directory.get(), service.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) {
    if (!S_ISSOCK(status.st_mode)) return fail(EEXIST, file + " is no socket");
    if (::unlinkat(made->directory.get(), service.c_str(), 0) != 0) return fail(errno, file);
  }
  if (::bind(made->socket.get(), address->address(), address->size()) != 0 ||
      ::fchmodat(made->directory.get(), service.c_str(), kSocketMode, 0) != 0 ||
      ::fstatat(made->directory.get(), service.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
    return fail(errno, file);
  }
  made->device = status.st_dev;
  made->inode = status.st_ino;
  return true;
}

void logIdentitySupport() {
  static std::once_flag once;
  std::call_once(once, [] {
    if (PeerIdentity::kernelNamesPeers()) return;
    Log::processDefault().def("this kernel does not name the peer of a socket: peers are looked up by process id");
  });
}

}  // namespace

std::shared_ptr<IpcListener> ipcCreateListener(const std::string& runtimeDirectory, const std::string& service,
                                               const SerialQueue& eventQueue, Error* error) {
  if (!isPathSafeName(service)) {
    setError(error, posixError(EINVAL, "\"" + service + "\" is no name of a service"));
    return nullptr;
  }
  const std::string path = ipcServicesDirectory(runtimeDirectory);
  IpcServiceSocket made;
  UniqueFd directory = openServicesDirectory(path, error);
  if (!directory) return nullptr;
  made.lock = lockService(directory, path, service, error);
  if (!made.lock) return nullptr;
  made.socket = takeActivatedSocket(service);
  if (!made.socket) {
    made.directory = std::move(directory);
    if (!bindService(path, service, &made, error)) return nullptr;
  }
  // The kernel notes from here on who sends; each accepted connection is checked against it.
  const int on = 1;
  const int flags = ::fcntl(made.socket.get(), F_GETFL);
  if (::setsockopt(made.socket.get(), SOL_SOCKET, SO_PASSCRED, &on, sizeof on) != 0 || flags < 0 ||
      ::fcntl(made.socket.get(), F_SETFL, flags | O_NONBLOCK) != 0 || ::listen(made.socket.get(), SOMAXCONN) != 0) {
    setError(error, posixError(errno, path + "/" + service));
    return nullptr;
  }
  logIdentitySupport();
  return std::make_shared<IpcSocketListener>(service, std::move(made), QueueReference(eventQueue));
}

}  // namespace platform
