// 1. The place is opened by its canonical path with no link followed anywhere, its mount is cloned, and only then its
//    identity is compared: what is compared is what is handed out.
// 2. Cloning a mount takes rights over the mount namespace. A daemon that has none lets a short-lived child process do
//    it in a user and mount namespace of the child's own, where every user has them; the clone outlives the child.
#include "platform/hostservices/GrantedPlace.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <linux/openat2.h>
#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>

namespace platform {
namespace {

constexpr long kChildTimeoutSeconds = 10;

// A read-only clone of the mount below `path`, detached; -1 and errno. Nothing but system calls: it also runs in a
// child of this process, which has one thread of many.
int cloneMount(const char* path) {
  struct open_how how = {};
  how.flags = O_PATH | O_CLOEXEC;
  how.resolve = RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
  const int place = static_cast<int>(::syscall(SYS_openat2, AT_FDCWD, path, &how, sizeof how));
  if (place < 0) return -1;
  int tree = ::open_tree(place, "", AT_EMPTY_PATH | OPEN_TREE_CLONE | OPEN_TREE_CLOEXEC);
  struct mount_attr attributes = {};
  attributes.attr_set = MOUNT_ATTR_RDONLY | MOUNT_ATTR_NOSUID | MOUNT_ATTR_NODEV | MOUNT_ATTR_NOSYMFOLLOW;
  if (tree >= 0 && ::mount_setattr(tree, "", AT_EMPTY_PATH, &attributes, sizeof attributes) != 0) {
    const int number = errno;
    ::close(tree);
    tree = -1;
    errno = number;
  }
  const int number = errno;
  ::close(place);
  errno = number;
  return tree;
}

union DescriptorMessage {
  struct cmsghdr header;
  std::array<char, CMSG_SPACE(sizeof(int))> bytes;
};

[[noreturn]] void cloneInChild(const char* path, int channel) {
  (void)::prctl(PR_SET_PDEATHSIG, SIGKILL);
  const int tree = cloneMount(path);
  int number = tree < 0 ? errno : 0;
  struct iovec part = {&number, sizeof number};
  DescriptorMessage control = {};
  struct msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  if (tree >= 0) {
    message.msg_control = control.bytes.data();
    message.msg_controllen = control.bytes.size();
    control.header = {CMSG_LEN(sizeof tree), SOL_SOCKET, SCM_RIGHTS};
    std::memcpy(CMSG_DATA(&control.header), &tree, sizeof tree);
  }
  (void)::sendmsg(channel, &message, MSG_NOSIGNAL);
  ::_exit(0);
}

// What the child has to say; ETIMEDOUT when it says nothing.
UniqueFd receiveClone(int channel, int* errorNumber) {
  const struct timeval timeout = {kChildTimeoutSeconds, 0};
  (void)::setsockopt(channel, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
  int number = 0;
  struct iovec part = {&number, sizeof number};
  DescriptorMessage control = {};
  struct msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.bytes.data();
  message.msg_controllen = control.bytes.size();
  const ssize_t size = ::recvmsg(channel, &message, MSG_CMSG_CLOEXEC);
  if (size != sizeof number) {
    *errorNumber = size < 0 && (errno == EAGAIN || errno == EINTR) ? ETIMEDOUT : EIO;
    return {};
  }
  const struct cmsghdr* header = CMSG_FIRSTHDR(&message);
  if (header == nullptr) {
    *errorNumber = number;
    return {};
  }
  int fd = -1;
  std::memcpy(&fd, CMSG_DATA(header), sizeof fd);
  return UniqueFd(fd);
}

UniqueFd cloneThroughChild(const char* path, int* errorNumber) {
  std::array<int, 2> channel{};
  if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, channel.data()) != 0) {
    *errorNumber = errno;
    return {};
  }
  const UniqueFd own(channel[0]);
  UniqueFd childs(channel[1]);
  const pid_t child = static_cast<pid_t>(
      ::syscall(SYS_clone, CLONE_NEWUSER | CLONE_NEWNS | SIGCHLD, nullptr, nullptr, nullptr, nullptr));
  if (child == 0) cloneInChild(path, childs.get());
  if (child < 0) {
    *errorNumber = errno;
    return {};
  }
  childs.reset();
  UniqueFd tree = receiveClone(own.get(), errorNumber);
  (void)::kill(child, SIGKILL);
  while (::waitpid(child, nullptr, 0) < 0 && errno == EINTR) continue;
  return tree;
}

}  // namespace

UniqueFd openGrantedPlace(const SandboxGrant& grant, int* errorNumber) {
  int number = 0;
  UniqueFd tree(cloneMount(grant.subject.c_str()));
  if (!tree) {
    number = errno;
    if (number == EPERM) tree = cloneThroughChild(grant.subject.c_str(), &number);
  }
  if (!tree) {
    const bool gone = number == ENOENT || number == ENOTDIR || number == ELOOP;
    *errorNumber = gone ? ESTALE : number;
    return {};
  }
  const auto place = PlaceIdentity::of(tree.get(), &number);
  if (!place || *place != grant.place) {
    *errorNumber = ESTALE;
    return {};
  }
  // Opened anew for reading: of the clone's own descriptor nobody could list the directory. What is opened keeps the
  // clone alive.
  UniqueFd opened(::open(fmt::format("/proc/self/fd/{}", tree.get()).c_str(), O_RDONLY | O_CLOEXEC));
  if (!opened) *errorNumber = errno;
  return opened;
}

}  // namespace platform
