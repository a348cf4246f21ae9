#include "platform/hostservices/Launcher.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <pthread.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <utility>

#include "platform/hostservices/Bubblewrap.h"
#include "platform/ipc/IpcMemoryFile.h"
#include "platform/ipc/PeerIdentity.h"
#include "platform/launch/LaunchProtocol.h"
#include "platform/log/Log.h"
#include "platform/queue/WorkGuard.h"

namespace platform {
namespace {

constexpr const char* kLaunchProgram = "xtd-launch";
constexpr const char* kLaunchFolder = "/usr/libexec/extora";
constexpr std::size_t kShownComplaint = 512;

// A memory file that is read from its beginning.
UniqueFd memoryFile(const std::string& content) {
  UniqueFd file = createSealedMemoryFile({reinterpret_cast<const std::uint8_t*>(content.data()), content.size()});
  if (file && ::lseek(file.get(), 0, SEEK_SET) != 0) file.reset();
  return file;
}

std::string planOf(const JobManager::Launch& launch) {
  std::string plan = launch.executable + '\0';
  for (const std::string& variable : launch.environment) plan.append(variable).push_back('\0');
  return plan;
}

UniqueFd openFirst(const std::vector<std::string>& paths) {
  UniqueFd file;
  for (const std::string& path : paths) {
    file.reset(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    if (file) break;
  }
  return file;
}

bool makePair(int type, UniqueFd* own, UniqueFd* others) {
  std::array<int, 2> pair{};
  if (::socketpair(AF_UNIX, type | SOCK_CLOEXEC, 0, pair.data()) != 0) return false;
  own->reset(pair[0]);
  others->reset(pair[1]);
  return true;
}

void kill(const UniqueFd& pidfd) {
  if (pidfd) (void)::syscall(SYS_pidfd_send_signal, pidfd.get(), SIGKILL, nullptr, 0);
}

// What bubblewrap has written, as one line.
std::string readComplaint(int file) {
  std::array<char, kShownComplaint> text{};
  const ssize_t size = ::pread(file, text.data(), text.size(), 0);
  std::string_view line(text.data(), size > 0 ? static_cast<std::size_t>(size) : 0);
  line = line.substr(0, line.find('\n'));
  return line.empty() ? "it ended without a word" : std::string(line);
}

// The one descriptor that comes with the sandbox's first word; none when something else comes.
UniqueFd receiveFirstWord(int control) {
  char byte = 0;
  struct iovec part = {&byte, sizeof byte};
  union {
    struct cmsghdr header;
    std::array<char, CMSG_SPACE(sizeof(int))> bytes;
  } rights = {};
  struct msghdr message = {};
  message.msg_iov = &part;
  message.msg_iovlen = 1;
  message.msg_control = rights.bytes.data();
  message.msg_controllen = rights.bytes.size();
  if (::recvmsg(control, &message, MSG_CMSG_CLOEXEC | MSG_DONTWAIT) != sizeof byte) return {};
  const struct cmsghdr* header = CMSG_FIRSTHDR(&message);
  if (header == nullptr || header->cmsg_type != SCM_RIGHTS) return {};
  int fd = -1;
  std::memcpy(&fd, CMSG_DATA(header), sizeof fd);
  UniqueFd received(fd);
  return byte == launch::kRunning ? std::move(received) : UniqueFd();
}

}  // namespace

Launcher::Programs Launcher::Programs::installed() {
  Programs programs;
  std::error_code error;
  const std::filesystem::path self = std::filesystem::read_symlink("/proc/self/exe", error);
  if (!error) programs.launch.push_back(self.parent_path() / kLaunchProgram);
  programs.launch.push_back(std::string(kLaunchFolder) + "/" + kLaunchProgram);
  return programs;
}

Launcher::Launcher(std::shared_ptr<JobManager> jobs, Programs programs)
    : jobs_(std::move(jobs)), programs_(std::move(programs)), wake_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
  // The new thread starts with all signals blocked: they are the program's own business.
  sigset_t all;
  sigset_t before;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, &before);
  thread_ = std::thread([this] {
    pthread_setname_np(pthread_self(), "launcher");
    runGuarded([this] { serve(); });
  });
  pthread_sigmask(SIG_SETMASK, &before, nullptr);
}

Launcher::~Launcher() {
  {
    const MutexLock lock(mutex_);
    stopping_ = true;
  }
  (void)::eventfd_write(wake_.get(), 1);
  thread_.join();
}

void Launcher::launch(Order order, Done done) {
  {
    const MutexLock lock(mutex_);
    orders_.emplace_back(std::move(order), std::move(done));
  }
  (void)::eventfd_write(wake_.get(), 1);
}

void Launcher::serve() {
  for (;;) {
    std::deque<std::pair<Order, Done>> orders;
    {
      const MutexLock lock(mutex_);
      if (stopping_) break;
      orders.swap(orders_);
    }
    for (auto& [order, done] : orders) start(std::move(order), std::move(done));
    wait();
  }
  endAll();
}

// Waits for something to happen and handles it.
void Launcher::wait() {
  std::vector<struct pollfd> entries = {{wake_.get(), POLLIN, 0}};
  std::optional<Clock::time_point> next;
  for (const Child& child : children_) {
    entries.push_back({child.pidfd.get(), POLLIN, 0});
    entries.push_back({child.state == State::Over ? -1 : child.control.get(), POLLIN, 0});
    if (child.state != State::Over && (!next || child.deadline < *next)) next = child.deadline;
  }
  int timeout = -1;
  if (next) {
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*next - Clock::now()).count();
    timeout = static_cast<int>(std::max<std::int64_t>(left, 0));
  }
  if (::poll(entries.data(), entries.size(), timeout) < 0) return;
  std::uint64_t count = 0;
  if (entries[0].revents != 0) (void)!::read(wake_.get(), &count, sizeof count);

  const Clock::time_point now = Clock::now();
  std::size_t at = 1;
  for (auto child = children_.begin(); child != children_.end(); at += 2) {
    const auto each = child++;
    if (entries[at + 1].revents != 0) handleControl(*each);
    if (each->state != State::Over && each->deadline <= now) fail(*each, ETIMEDOUT, "the sandbox does not start");
    if (entries[at].revents == 0) continue;
    reap(*each);
    children_.erase(each);
  }
}

void Launcher::start(Order order, Done done) {
  Child child;
  std::string reason;
  const int number = prepare(order, child, &reason);
  child.launch = std::move(order.launch);
  child.done = std::move(done);
  child.deadline = Clock::now() + kStartTimeout;
  if (number == 0) {
    children_.push_back(std::move(child));
    return;
  }
  fail(child, number, std::move(reason));
  reap(child);
}

// Starts bubblewrap. 0, or an error number and its reason.
int Launcher::prepare(const Order& order, Child& child, std::string* reason) {
  const UniqueFd program = openFirst(programs_.launch);
  if (!program) {
    *reason = std::string("there is no ") + kLaunchProgram;
    return ENOENT;
  }
  if (::access(programs_.bubblewrap.c_str(), X_OK) != 0) {
    *reason = "there is no " + programs_.bubblewrap;
    return ENOENT;
  }
  *reason = "the sandbox cannot be started";
  UniqueFd connection;
  UniqueFd control;
  const UniqueFd null(::open("/dev/null", O_RDWR | O_CLOEXEC));
  const UniqueFd plan = memoryFile(planOf(order.launch));
  const UniqueFd options = memoryFile(order.options);
  child.complaints.reset(::memfd_create("complaints", MFD_CLOEXEC));
  if (!null || !plan || !options || !child.complaints || !makePair(SOCK_STREAM, &child.connection, &connection) ||
      !makePair(SOCK_SEQPACKET, &child.control, &control)) {
    return errno != 0 ? errno : EIO;
  }
  BubblewrapStart start;
  start.program = programs_.bubblewrap.c_str();
  start.user = order.user;
  start.null = null.get();
  start.complaints = child.complaints.get();
  start.connection = connection.get();
  start.control = control.get();
  start.plan = plan.get();
  start.options = options.get();
  start.launchProgram = program.get();
  int number = 0;
  child.pid = startBubblewrap(start, &number);
  if (child.pid < 0) return number;
  child.pidfd.reset(static_cast<int>(::syscall(SYS_pidfd_open, child.pid, 0)));
  if (child.pidfd) return 0;
  number = errno;
  (void)::kill(child.pid, SIGKILL);
  return number;
}

void Launcher::handleControl(Child& child) {
  if (child.state == State::Starting) {
    handleFirstWord(child);
  } else if (child.state == State::Executing) {
    handleLastWord(child);
  }
}

void Launcher::handleFirstWord(Child& child) {
  child.firstProcess = receiveFirstWord(child.control.get());
  if (!child.firstProcess) {
    fail(child, EIO, "the sandbox cannot be made: " + readComplaint(child.complaints.get()));
    return;
  }
  child.firstPid = PeerIdentity::ofPidfd(child.firstProcess.get())->pid();
  UniqueFd recorded(::fcntl(child.firstProcess.get(), F_DUPFD_CLOEXEC, 0));
  const int number = recorded ? jobs_->instanceStarted(child.launch.instance, std::move(recorded)) : errno;
  if (number != 0) {
    fail(child, number, "its registration has ended");
    return;
  }
  child.state = State::Executing;
  const char word = launch::kGoOn;
  (void)::send(child.control.get(), &word, sizeof word, MSG_NOSIGNAL | MSG_DONTWAIT);
}

// The instance is on record by now, and leaves it by itself when it could not be executed.
void Launcher::handleLastWord(Child& child) {
  int number = 0;
  const ssize_t size = ::recv(child.control.get(), &number, sizeof number, MSG_DONTWAIT);
  child.state = State::Over;
  child.control.reset();
  child.complaints.reset();
  child.firstProcess.reset();
  const Done done = std::exchange(child.done, nullptr);
  if (size == sizeof number && number != 0) {
    const std::string reason = std::string("it cannot be executed: ") + std::strerror(number);
    Log::processDefault().error("cannot launch {}: {}", child.launch.executable, reason);
    done({number, reason, 0, {}});
    return;
  }
  Log::processDefault().info("launched {} as process {}", child.launch.executable, child.firstPid);
  done({0, {}, child.firstPid, std::move(child.connection)});
}

// Ends what there is of the sandbox; the outcome is told when bubblewrap has been reaped.
void Launcher::fail(Child& child, int errorNumber, std::string reason) {
  Log::processDefault().error("cannot launch {}: {}", child.launch.executable, reason);
  child.state = State::Over;
  child.failure = Outcome{errorNumber, std::move(reason), 0, {}};
  child.control.reset();
  kill(child.firstProcess);
  kill(child.pidfd);
}

void Launcher::reap(Child& child) {
  if (child.state != State::Over) {
    fail(child, EIO, "the sandbox cannot be made: " + readComplaint(child.complaints.get()));
  }
  if (child.pid > 0) {
    while (::waitpid(child.pid, nullptr, 0) < 0 && errno == EINTR) continue;
  }
  if (!child.failure) return;
  jobs_->launchFailed(child.launch.instance);
  child.done(std::move(*child.failure));
}

void Launcher::endAll() {
  for (Child& child : children_) {
    if (child.state != State::Over) fail(child, ECANCELED, "the daemon ends");
    kill(child.pidfd);
    reap(child);
  }
  children_.clear();
  std::deque<std::pair<Order, Done>> orders;
  {
    const MutexLock lock(mutex_);
    orders.swap(orders_);
  }
  for (auto& [order, done] : orders) {
    jobs_->launchFailed(order.launch.instance);
    done({ECANCELED, "the daemon ends", 0, {}});
  }
}

}  // namespace platform
