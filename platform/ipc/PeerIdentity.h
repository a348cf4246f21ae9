// PeerIdentity: who is at the other end of a connection, held by pidfd so that a recycled process id is never mistaken
// for it. Made at accept and immutable; shared by the connection, the client object and the code-signing task.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>

#include "platform/files/UniqueFd.h"

namespace platform {

class PeerIdentity {
 public:
  /// The peer of a connected Unix stream socket. Never null: a peer that could not be looked at (it exited before, its
  /// executable cannot be read) has an empty executablePath().
  static std::shared_ptr<const PeerIdentity> ofSocket(int socket);
  /// The calling process itself.
  static std::shared_ptr<const PeerIdentity> ofSelf();
  /// Another process by pidfd (which is duplicated).
  static std::shared_ptr<const PeerIdentity> ofPidfd(int pidfd);

  /// Whether this kernel tells the peer of a socket by pidfd. Without that the peer is looked up by its process id,
  /// which another process may have by then.
  static bool kernelNamesPeers();

  pid_t pid() const noexcept { return pid_; }
  uid_t uid() const noexcept { return uid_; }
  gid_t gid() const noexcept { return gid_; }
  int pidfd() const noexcept { return pidfd_.get(); }
  /// The process has not ended (it may be a zombie: that counts as ended).
  bool isAlive() const;
  /// The path of the executable as read at accept, the process being alive afterwards; empty when that failed. A path
  /// whose file has been deleted has no such name any more and is empty too.
  const std::string& executablePath() const noexcept { return executablePath_; }
  /// Device and inode of the opened file behind the process at accept.
  std::uint64_t executableDevice() const noexcept { return executableDevice_; }
  std::uint64_t executableInode() const noexcept { return executableInode_; }
  /// The process still runs the very file that it ran at accept, and that file still stands at executablePath() as this
  /// process sees it (a private mount can wear any name).
  bool executableUnchanged() const;

 private:
  PeerIdentity() = default;
  void readExecutable();

  pid_t pid_ = 0;
  uid_t uid_ = static_cast<uid_t>(-1);
  gid_t gid_ = static_cast<gid_t>(-1);
  UniqueFd pidfd_;
  std::string executablePath_;
  std::uint64_t executableDevice_ = 0;
  std::uint64_t executableInode_ = 0;
};

}  // namespace platform
