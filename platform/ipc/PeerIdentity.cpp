#include "platform/ipc/PeerIdentity.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <charconv>
#include <climits>
#include <fstream>
#include <string_view>

// Older system headers lack it.
#ifndef SO_PEERPIDFD
#define SO_PEERPIDFD 77
#endif

namespace platform {
namespace {

constexpr std::string_view kDeletedSuffix = " (deleted)";

UniqueFd openPidfd(pid_t pid) {
  return UniqueFd(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0U)));
}

// Answers false when the kernel does not know the option; `pidfd` stays empty when the peer has gone.
bool peerPidfd(int socket, UniqueFd* pidfd) {
  int fd = -1;
  socklen_t size = sizeof fd;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERPIDFD, &fd, &size) == 0) {
    pidfd->reset(fd);
    return true;
  }
  return errno != ENOPROTOOPT;
}

std::string executableLink(pid_t pid) {
  return fmt::format("/proc/{}/exe", pid);
}

std::string readLink(const std::string& link) {
  std::array<char, PATH_MAX + 1> buffer;
  const ssize_t size = ::readlink(link.c_str(), buffer.data(), buffer.size());
  if (size <= 0 || static_cast<std::size_t>(size) == buffer.size()) return {};
  return {buffer.data(), static_cast<std::size_t>(size)};
}

bool isFile(const std::string& path, std::uint64_t device, std::uint64_t inode) {
  struct stat status = {};
  return ::stat(path.c_str(), &status) == 0 && status.st_dev == device && status.st_ino == inode;
}

// The number after `key` in a file of lines "key:<tab>number ...", `skip` numbers later; -1 when there is none.
long numberOf(const std::string& file, std::string_view key, int skip = 0) {
  std::ifstream lines(file);
  for (std::string line; std::getline(lines, line);) {
    if (!line.starts_with(key) || line.size() <= key.size() || line[key.size()] != ':') continue;
    std::string_view rest = std::string_view(line).substr(key.size() + 1);
    for (;; --skip) {
      rest.remove_prefix(std::min(rest.find_first_not_of(" \t"), rest.size()));
      if (skip == 0) break;
      rest.remove_prefix(std::min(rest.find_first_of(" \t"), rest.size()));
    }
    long number = -1;
    (void)std::from_chars(rest.data(), rest.data() + rest.size(), number);
    return number;
  }
  return -1;
}

}  // namespace

bool PeerIdentity::kernelNamesPeers() {
  std::array<int, 2> pair = {-1, -1};
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair.data()) != 0) return true;
  const UniqueFd first(pair[0]);
  const UniqueFd second(pair[1]);
  UniqueFd pidfd;
  return peerPidfd(first.get(), &pidfd);
}

std::shared_ptr<const PeerIdentity> PeerIdentity::ofSocket(int socket) {
  std::shared_ptr<PeerIdentity> identity(new PeerIdentity);
  struct ucred credentials = {};
  socklen_t size = sizeof credentials;
  if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) return identity;
  identity->pid_ = credentials.pid;
  identity->uid_ = credentials.uid;
  identity->gid_ = credentials.gid;
  // Without the option another process may have the number by now; that it holds the very peer is then taken on trust.
  if (!peerPidfd(socket, &identity->pidfd_) && credentials.pid > 0) identity->pidfd_ = openPidfd(credentials.pid);
  identity->readExecutable();
  return identity;
}

std::shared_ptr<const PeerIdentity> PeerIdentity::ofSelf() {
  std::shared_ptr<PeerIdentity> identity(new PeerIdentity);
  identity->pid_ = ::getpid();
  identity->uid_ = ::geteuid();
  identity->gid_ = ::getegid();
  identity->pidfd_ = openPidfd(identity->pid_);
  identity->readExecutable();
  return identity;
}

std::shared_ptr<const PeerIdentity> PeerIdentity::ofPidfd(int pidfd) {
  std::shared_ptr<PeerIdentity> identity(new PeerIdentity);
  identity->pidfd_.reset(::fcntl(pidfd, F_DUPFD_CLOEXEC, 0));
  const long pid = numberOf(fmt::format("/proc/self/fdinfo/{}", identity->pidfd_.get()), "Pid");
  if (pid <= 0) return identity;
  const std::string status = fmt::format("/proc/{}/status", pid);
  const long uid = numberOf(status, "Uid", 1);  // real, then effective
  const long gid = numberOf(status, "Gid", 1);
  if (uid < 0 || gid < 0 || !identity->isAlive()) return identity;
  identity->pid_ = static_cast<pid_t>(pid);
  identity->uid_ = static_cast<uid_t>(uid);
  identity->gid_ = static_cast<gid_t>(gid);
  identity->readExecutable();
  return identity;
}

bool PeerIdentity::isAlive() const {
  struct pollfd entry = {pidfd_.get(), POLLIN, 0};
  return pidfd_ && ::poll(&entry, 1, 0) == 0;
}

// What is read through /proc/<pid> belongs to the peer exactly if the peer is still alive afterwards: until then nobody
// else can have its number.
void PeerIdentity::readExecutable() {
  if (pid_ <= 0 || !pidfd_) return;
  const std::string link = executableLink(pid_);
  struct stat status = {};
  if (::stat(link.c_str(), &status) != 0) return;
  std::string path = readLink(link);
  // The kernel marks the path of a deleted file, but a file may also be called so.
  if (path.ends_with(kDeletedSuffix) && !isFile(path, status.st_dev, status.st_ino)) path.clear();
  if (!path.starts_with('/') || !isAlive()) return;
  executableDevice_ = status.st_dev;
  executableInode_ = status.st_ino;
  executablePath_ = std::move(path);
}

bool PeerIdentity::executableUnchanged() const {
  return !executablePath_.empty() && isFile(executableLink(pid_), executableDevice_, executableInode_) &&
         isFile(executablePath_, executableDevice_, executableInode_) && isAlive();
}

}  // namespace platform
