#include "platform/files/ProcessPaths.h"

#include <cerrno>

namespace platform {

std::string executablePathOfPid(const PeerIdentity& peer) {
  return peer.executablePath().size() < kExecutablePathBuffer ? peer.executablePath() : std::string();
}

std::optional<std::string> processExecutablePath(const PeerIdentity& peer, int* errorNumber) {
  const std::string& path = peer.executablePath();
  const int number = !peer.isAlive()                               ? ESRCH
                     : path.empty()                                ? ENOENT
                     : path.size() >= kProcessExecutablePathBuffer ? ENAMETOOLONG
                                                                   : 0;
  if (number == 0) return path;
  if (errorNumber != nullptr) *errorNumber = number;
  return std::nullopt;
}

}  // namespace platform
