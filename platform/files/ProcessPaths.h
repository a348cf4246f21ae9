// The executable paths of processes that are held by pidfd. Free functions, for any thread.
//
// Both answer the path that was read when the process was first looked at (its connection's accept): a later exec of
// another program does not lend that program's place to the process.
#pragma once

#include <cstddef>
#include <optional>
#include <string>

#include "platform/ipc/PeerIdentity.h"

namespace platform {

/// Bytes, with the terminating zero, that a path of each function may take.
inline constexpr std::size_t kExecutablePathBuffer = 4096;
inline constexpr std::size_t kProcessExecutablePathBuffer = 1024;

/// The path of the process's executable; empty when it could not be read or is longer than 4,095 bytes.
std::string executablePathOfPid(const PeerIdentity& peer);

/// The path of the executable of a process that still lives, or nothing and an error number in `errorNumber` (which may
/// be null): ESRCH when the process has ended, ENOENT when its executable has no path, ENAMETOOLONG above 1,023 bytes.
[[nodiscard]] std::optional<std::string> processExecutablePath(const PeerIdentity& peer, int* errorNumber);

}  // namespace platform
