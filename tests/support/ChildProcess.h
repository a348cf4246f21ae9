// ChildProcess: another process for tests that look at processes. It waits on its standard input until the object ends
// it; constructed only when it runs what it was asked to run.
#pragma once

#include <fcntl.h>
#include <signal.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <functional>
#include <memory>
#include <string>

#include "platform/files/UniqueFd.h"
#include "platform/ipc/PeerIdentity.h"

namespace tests {

class ChildProcess {
 public:
  /// Runs `executable` (one that reads standard input to its end, such as cat), or with an empty path just waits, after
  /// `prepare` answered true in the new process. Otherwise running() is false.
  explicit ChildProcess(const std::string& executable, const std::function<bool()>& prepare = nullptr) {
    std::array<int, 2> input{};
    std::array<int, 2> ready{};
    if (::pipe2(input.data(), O_CLOEXEC) != 0 || ::pipe2(ready.data(), O_CLOEXEC) != 0) return;
    pid_ = ::fork();
    if (pid_ == 0) {
      const bool prepared = (prepare == nullptr || prepare()) && ::dup2(input[0], STDIN_FILENO) == STDIN_FILENO;
      ::close(input[1]);
      if (prepared && executable.empty()) {
        ::close(ready[1]);
        char byte = 0;
        (void)!::read(STDIN_FILENO, &byte, 1);
        ::_exit(0);
      }
      if (prepared) ::execl(executable.c_str(), executable.c_str(), nullptr);
      (void)!::write(ready[1], "x", 1);
      ::_exit(1);
    }
    ::close(input[0]);
    ::close(ready[1]);
    input_.reset(input[1]);
    const platform::UniqueFd readyEnd(ready[0]);
    char failed = 0;
    running_ = pid_ > 0 && ::read(readyEnd.get(), &failed, 1) == 0;
    const platform::UniqueFd pidfd(static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0)));
    peer_ = platform::PeerIdentity::ofPidfd(pidfd.get());
  }
  ~ChildProcess() { end(); }
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  bool running() const { return running_; }
  std::shared_ptr<const platform::PeerIdentity> peer() const { return peer_; }
  /// Ends it and waits for its end.
  void end() {
    input_.reset();
    if (pid_ > 0) ::waitpid(pid_, nullptr, 0);
    pid_ = -1;
  }

 private:
  pid_t pid_ = -1;
  bool running_ = false;
  platform::UniqueFd input_;
  std::shared_ptr<const platform::PeerIdentity> peer_;
};

}  // namespace tests
