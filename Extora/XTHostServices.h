// XTHostServices: what a host or a plug-in asks of the operating system's own service, one function each.
//
// All of a process's requests share one connection, which is made with the first request and again after it was lost.
// Each function waits for its answer; callable from any thread but an IPC event handler. Errors are of domain "POSIX"
// with the system error number as their code: the service's own, or ENOTCONN when it cannot be reached.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>

#include "Extora/XTError.h"
#include "platform/files/UniqueFd.h"

namespace extora {

class XTHostServices {
 public:
  /// A plug-in that has been started.
  struct Launched {
    pid_t pid = 0;  ///< of the first process of its sandbox
    /// A connected socket to it: hand it to platform::ipcConnectionOverSocket.
    platform::UniqueFd connection;
  };
  /// A sandbox extension that has been consumed.
  struct Consumed {
    std::int64_t handle = -1;  ///< for release
    /// Of a file token the file or directory, opened for reading; empty for a service token.
    platform::UniqueFd descriptor;
  };

  /// Starts the plug-in executable, for which the daemon has made this very process ready. Nothing and `error` on
  /// failure.
  [[nodiscard]] static std::optional<Launched> launch(const std::string& executable, Error* error);
  /// Nothing and `error` on failure: EACCES a token that is not sound, ESTALE one whose place is another by now.
  [[nodiscard]] static std::optional<Consumed> consume(const std::string& token, Error* error);
  /// Nothing on success; EINVAL for a handle that this process does not have.
  [[nodiscard]] static std::optional<Error> release(std::int64_t handle);
  /// For a plug-in: from here on it counts as busy, until endActivity or its end. Counted.
  [[nodiscard]] static std::optional<Error> beginActivity();
  [[nodiscard]] static std::optional<Error> endActivity();
};

}  // namespace extora
