// xtd-launch: the first process of a plug-in's sandbox. Starts the executable, reaps whatever its processes leave
// behind, passes SIGTERM on, and exits with the executable's status, which ends all else in the sandbox.
//
// It runs with an empty environment and is linked statically: nothing that a bundle names acts on it. See
// LaunchProtocol.h for what it is given.
#include <fcntl.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "platform/launch/LaunchProtocol.h"

namespace {

using namespace platform::launch;

// The plan's texts, in place: the executable and its environment, ended by a null pointer. Null when there is none.
char** readPlan() {
  struct stat status = {};
  if (fstat(kPlanDescriptor, &status) != 0 || status.st_size <= 0) return nullptr;
  const size_t size = static_cast<size_t>(status.st_size);
  void* const memory = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_PRIVATE, kPlanDescriptor, 0);
  if (memory == MAP_FAILED) return nullptr;
  char* const begin = static_cast<char*>(memory);
  char* const end = begin + size;
  if (end[-1] != '\0') return nullptr;
  size_t count = 0;
  for (const char* at = begin; at != end; ++at) count += *at == '\0' ? 1 : 0;
  char** const texts = static_cast<char**>(calloc(count + 1, sizeof(char*)));
  if (texts == nullptr) return nullptr;
  size_t index = 0;
  for (char* at = begin; at != end; at += strlen(at) + 1) texts[index++] = at;
  return texts;
}

bool reportRunning() {
  const int pidfd = static_cast<int>(syscall(SYS_pidfd_open, getpid(), 0));
  if (pidfd < 0) return false;
  char byte = kRunning;
  struct iovec part = {&byte, sizeof byte};
  union {
    struct cmsghdr header;
    char bytes[CMSG_SPACE(sizeof(int))];
  } control = {};
  control.header = {CMSG_LEN(sizeof pidfd), SOL_SOCKET, SCM_RIGHTS};
  memcpy(CMSG_DATA(&control.header), &pidfd, sizeof pidfd);
  struct msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = control.bytes;
  message.msg_controllen = sizeof control.bytes;
  const bool sent = sendmsg(kControlDescriptor, &message, MSG_NOSIGNAL) == sizeof byte;
  close(pidfd);
  return sent;
}

bool mayGoOn() {
  char byte = 0;
  return read(kControlDescriptor, &byte, sizeof byte) == sizeof byte && byte == kGoOn;
}

[[noreturn]] void giveUp(int number) {
  (void)!write(kControlDescriptor, &number, sizeof number);
  _exit(kCannotExecute);
}

// All signals are blocked here; the executable starts with none blocked.
[[noreturn]] void execute(char** plan, const sigset_t& none) {
  fcntl(kControlDescriptor, F_SETFD, FD_CLOEXEC);
  sigprocmask(SIG_SETMASK, &none, nullptr);
  char* arguments[] = {plan[0], nullptr};
  execve(plan[0], arguments, plan + 1);
  giveUp(errno);
}

// Returns the executable's status once it has ended.
int serve(pid_t executable, const sigset_t& all) {
  for (;;) {
    const int signal = sigwaitinfo(&all, nullptr);
    if (signal == SIGTERM) kill(executable, SIGTERM);
    if (signal != SIGCHLD) continue;
    int status = 0;
    for (pid_t child; (child = waitpid(-1, &status, WNOHANG)) > 0;) {
      if (child != executable) continue;
      return WIFSIGNALED(status) ? kEndedBySignal + WTERMSIG(status) : WEXITSTATUS(status);
    }
  }
}

}  // namespace

int main() {
  sigset_t all;
  sigset_t none;
  sigfillset(&all);
  sigemptyset(&none);
  sigprocmask(SIG_SETMASK, &all, nullptr);
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  prctl(PR_SET_DUMPABLE, 0);  // the plug-in, which has the same user, can neither trace it nor read its memory
  dup2(kNullDescriptor, kComplaintsDescriptor);
  syscall(SYS_close_range, kOptionsDescriptor, ~0U, 0);
  char** const plan = readPlan();
  close(kPlanDescriptor);
  if (plan == nullptr || !reportRunning() || !mayGoOn()) return kCannotExecute;

  const pid_t executable = fork();
  if (executable == 0) execute(plan, none);
  if (executable < 0) giveUp(errno);
  close(kConnectionDescriptor);
  close(kControlDescriptor);
  return serve(executable, all);
}
