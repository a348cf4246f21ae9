#include "platform/hostservices/Bubblewrap.h"

#include <fcntl.h>
#include <linux/keyctl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>

#include "platform/files/UniqueFd.h"
#include "platform/launch/LaunchProtocol.h"

namespace platform {
namespace {

// Above all numbers that the descriptors are to have.
constexpr int kAside = 64;
static_assert(kAside > launch::kFirstFreeDescriptor);

constexpr mode_t kUmask = 022;

// At least as large as the kernel's own structure; all zero it is the default action.
using KernelSignalAction = std::array<std::uint64_t, 8>;

using Descriptors = std::array<UniqueFd, launch::kFirstFreeDescriptor>;

// Raw calls: the library's own would change the other threads too, which the new process does not have.
bool become(const UserAndGroup& user) {
  return ::syscall(SYS_setgroups, 0, nullptr) == 0 &&
         ::syscall(SYS_setresgid, user.group, user.group, user.group) == 0 &&
         ::syscall(SYS_setresuid, user.user, user.user, user.user) == 0;
}

// In the new process, which has one thread of many: nothing but system calls.
[[noreturn]] void runBubblewrap(const BubblewrapStart& start, const Descriptors& descriptors, pid_t parent) {
  (void)::setsid();
  // All of them, also those that the library keeps for itself and that whoever started this process may have ignored.
  const KernelSignalAction standard = {};
  for (int signal = 1; signal < NSIG; ++signal) {
    (void)::syscall(SYS_rt_sigaction, signal, &standard, nullptr, (NSIG - 1) / 8);
  }
  sigset_t none;
  sigemptyset(&none);
  (void)::sigprocmask(SIG_SETMASK, &none, nullptr);
  (void)::umask(kUmask);
  if (start.user && !become(*start.user)) ::_exit(launch::kCannotExecute);
  // Keys that somebody gave to the daemon are not the plug-in's; a kernel without keys knows none either.
  (void)::syscall(SYS_keyctl, KEYCTL_JOIN_SESSION_KEYRING, nullptr);
  // Changing the user clears this. bubblewrap asks for it again, but a parent may end before it does.
  if (::prctl(PR_SET_PDEATHSIG, SIGKILL) != 0 || ::getppid() != parent) ::_exit(launch::kCannotExecute);
  for (std::size_t number = 0; number < descriptors.size(); ++number) {
    if (::dup2(descriptors[number].get(), static_cast<int>(number)) < 0) ::_exit(launch::kCannotExecute);
  }
  if (::syscall(SYS_close_range, launch::kFirstFreeDescriptor, ~0U, 0) != 0) ::_exit(launch::kCannotExecute);

  const char* const arguments[] = {"bwrap", "--args", launch::kOptionsNumber, "--", launch::kProgramPath, nullptr};
  const char* const environment[] = {nullptr};
  ::execve(start.program, const_cast<char* const*>(arguments), const_cast<char* const*>(environment));
  ::_exit(launch::kCannotExecute);
}

}  // namespace

pid_t startBubblewrap(const BubblewrapStart& start, int* errorNumber) {
  Descriptors descriptors;
  const std::array<std::pair<int, int>, launch::kFirstFreeDescriptor> places = {
      {{launch::kNullDescriptor, start.null},
       {launch::kNullDescriptor + 1, start.null},
       {launch::kComplaintsDescriptor, start.complaints},
       {launch::kConnectionDescriptor, start.connection},
       {launch::kControlDescriptor, start.control},
       {launch::kPlanDescriptor, start.plan},
       {launch::kOptionsDescriptor, start.options},
       {launch::kProgramDescriptor, start.launchProgram}}};
  for (const auto& [number, fd] : places) {
    UniqueFd& aside = descriptors[static_cast<std::size_t>(number)];
    aside.reset(::fcntl(fd, F_DUPFD_CLOEXEC, kAside));
    if (!aside) {
      *errorNumber = errno;
      return -1;
    }
  }
  const pid_t parent = ::getpid();
  const pid_t pid = ::fork();
  if (pid == 0) runBubblewrap(start, descriptors, parent);
  if (pid < 0) *errorNumber = errno;
  return pid;
}

}  // namespace platform
