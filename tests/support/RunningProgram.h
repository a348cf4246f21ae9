// RunningProgram: a program that a test has started and that is ended with the test at the latest. What it writes is
// collected by a thread. For one thread.
#pragma once

#include <sys/types.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/queue/Mutex.h"

namespace tests {

/// No wait of a test takes longer than this, unless something is broken.
inline constexpr std::chrono::seconds kDeadline{30};
inline constexpr int kDeadlineMs = 30'000;

class RunningProgram {
 public:
  /// Starts `arguments` (the program first) with the environment of this process changed by `environment`. What it
  /// writes to `outputFd` (STDOUT_FILENO or STDERR_FILENO) is collected; `inputFd` becomes its standard input.
  RunningProgram(const std::vector<std::string>& arguments, const std::map<std::string, std::string>& environment,
                 int outputFd, int inputFd = STDIN_FILENO);
  /// Kills it when it still runs.
  ~RunningProgram();

  pid_t pid() const { return pid_; }
  int pidfd() const { return pidfd_.get(); }
  void signal(int number) const;
  /// The exit status (128 + number after a signal); fails the test and kills the process at the deadline.
  int wait();
  /// All that it has written so far.
  std::string output() const;
  /// Waits until the output holds `text` at least `count` times; false at the deadline.
  [[nodiscard]] bool waitForOutput(std::string_view text, std::size_t count = 1);

 private:
  void collect();
  // Takes what lies in the pipe.
  void drain() const XT_REQUIRES(mutex_);

  pid_t pid_ = -1;
  platform::UniqueFd pidfd_;
  platform::UniqueFd pipe_;
  std::optional<int> status_;
  mutable platform::Mutex mutex_;
  mutable std::condition_variable grown_;
  mutable std::string output_ XT_GUARDED_BY(mutex_);
  mutable bool ended_ XT_GUARDED_BY(mutex_) = false;
  std::thread collector_;
};

/// How often `part` stands in `text`.
std::size_t countOf(std::string_view text, std::string_view part);

}  // namespace tests
