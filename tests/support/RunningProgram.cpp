#include "tests/support/RunningProgram.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>

extern char** environ;

namespace tests {
namespace {

std::vector<char*> pointers(std::vector<std::string>& texts) {
  std::vector<char*> result;
  for (auto& text : texts) result.push_back(text.data());
  result.push_back(nullptr);
  return result;
}

std::vector<std::string> mergedEnvironment(const std::map<std::string, std::string>& changes) {
  std::vector<std::string> result;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    const std::string text(*entry);
    if (changes.find(text.substr(0, text.find('='))) == changes.end()) result.push_back(text);
  }
  for (const auto& [name, value] : changes) result.push_back(name + "=" + value);
  return result;
}

}  // namespace

std::size_t countOf(std::string_view text, std::string_view part) {
  std::size_t count = 0;
  for (auto at = text.find(part); at != std::string_view::npos; at = text.find(part, at + part.size())) ++count;
  return count;
}

RunningProgram::RunningProgram(const std::vector<std::string>& arguments,
                               const std::map<std::string, std::string>& environment, int outputFd, int inputFd) {
  int ends[2];
  if (::pipe2(ends, O_CLOEXEC) != 0) std::abort();
  pipe_.reset(ends[0]);
  ::fcntl(ends[0], F_SETFL, O_NONBLOCK);
  const platform::UniqueFd writeEnd(ends[1]);
  auto argumentTexts = arguments;
  auto environmentTexts = mergedEnvironment(environment);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, writeEnd.get(), outputFd);
  posix_spawn_file_actions_adddup2(&actions, inputFd, STDIN_FILENO);
  const int error = ::posix_spawn(&pid_, arguments.front().c_str(), &actions, nullptr, pointers(argumentTexts).data(),
                                  pointers(environmentTexts).data());
  posix_spawn_file_actions_destroy(&actions);
  if (error != 0) {
    ADD_FAILURE() << "cannot start " << arguments.front() << ": " << std::strerror(error);
    std::abort();
  }
  pidfd_.reset(static_cast<int>(::syscall(SYS_pidfd_open, pid_, 0)));
  collector_ = std::thread([this] { collect(); });
}

RunningProgram::~RunningProgram() {
  if (!status_) {
    signal(SIGKILL);
    wait();
  }
  collector_.join();
}

void RunningProgram::collect() {
  for (bool ended = false; !ended;) {
    pollfd readable{pipe_.get(), POLLIN, 0};
    ::poll(&readable, 1, -1);
    const platform::MutexLock lock(mutex_);
    drain();
    ended = ended_;
  }
}

void RunningProgram::drain() const {
  char buffer[4096];
  for (;;) {
    const ssize_t got = ::read(pipe_.get(), buffer, sizeof buffer);
    if (got < 0 && errno == EINTR) continue;
    if (got < 0 && errno == EAGAIN) return;
    if (got <= 0) ended_ = true;
    if (got > 0) output_.append(buffer, static_cast<std::size_t>(got));
    grown_.notify_all();
    if (ended_) return;
  }
}

void RunningProgram::signal(int number) const {
  if (!status_) ::kill(pid_, number);
}

int RunningProgram::wait() {
  if (status_) return *status_;
  pollfd ended{pidfd_.get(), POLLIN, 0};
  if (::poll(&ended, 1, kDeadlineMs) != 1) {
    ADD_FAILURE() << "process " << pid_ << " does not end";
    ::kill(pid_, SIGKILL);
  }
  int status = 0;
  ::waitpid(pid_, &status, 0);
  status_ = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
  const auto deadline = std::chrono::steady_clock::now() + kDeadline;
  platform::MutexLock lock(mutex_);
  while (!ended_ && grown_.wait_until(lock.native(), deadline) != std::cv_status::timeout) {
  }
  return *status_;
}

std::string RunningProgram::output() const {
  const platform::MutexLock lock(mutex_);
  if (!ended_) drain();
  return output_;
}

bool RunningProgram::waitForOutput(std::string_view text, std::size_t count) {
  const auto deadline = std::chrono::steady_clock::now() + kDeadline;
  platform::MutexLock lock(mutex_);
  std::size_t found = 0;
  for (std::size_t from = 0;;) {
    for (auto at = output_.find(text, from); at != std::string::npos; at = output_.find(text, from)) {
      from = at + text.size();
      if (++found >= count) return true;
    }
    from = std::max(from, output_.size() - std::min(output_.size(), text.size()));
    if (ended_ || grown_.wait_until(lock.native(), deadline) == std::cv_status::timeout) return false;
  }
}

}  // namespace tests
