#include "platform/registry/FolderWatch.h"

#include <sys/epoll.h>
#include <sys/inotify.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <utility>

namespace platform {
namespace {

constexpr std::uint32_t kSelf = IN_DELETE_SELF | IN_MOVE_SELF;
constexpr std::uint32_t kArrivals = IN_CREATE | IN_MOVED_TO;
constexpr std::uint32_t kChildren = kArrivals | IN_MOVED_FROM | IN_DELETE | IN_ATTRIB;
constexpr std::uint32_t kFolderMask = kSelf | kChildren;
constexpr std::uint32_t kInsideMask = kChildren | IN_CLOSE_WRITE;
constexpr int kPollSeconds = 2;
// So many events wait to be looked at; when there are more it is cheaper to look at everything.
constexpr std::size_t kMostEvents = 65536;
constexpr int kReadsAtOnce = 8;

std::string parentOf(const std::string& path) {
  const std::size_t slash = path.rfind('/');
  return slash == 0 ? "/" : path.substr(0, slash);
}

UniqueFd makeTimer() {
  return UniqueFd(::timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC));
}

}  // namespace

FolderWatch::FolderWatch(std::size_t most)
    : most_(most),
      inotify_(::inotify_init1(IN_NONBLOCK | IN_CLOEXEC)),
      dueTimer_(makeTimer()),
      pollTimer_(makeTimer()),
      ranOut_(!inotify_) {}

void FolderWatch::start(std::function<void()> wake) {
  wake_ = std::move(wake);
  MainRunLoop& loop = MainRunLoop::main();
  if (inotify_) sources_.push_back(loop.addFd(inotify_.get(), EPOLLIN, [this](std::uint32_t) { readEvents(); }));
  const auto addTimer = [&](int timer, bool FolderWatch::*flag) {
    sources_.push_back(loop.addFd(timer, EPOLLIN, [this, timer, flag](std::uint32_t) { timerFired(timer, flag); }));
  };
  if (dueTimer_) addTimer(dueTimer_.get(), &FolderWatch::due_);
  if (pollTimer_) addTimer(pollTimer_.get(), &FolderWatch::poll_);
}

void FolderWatch::stop() {
  sources_.clear();
}

void FolderWatch::readEvents() {
  alignas(inotify_event) std::array<char, 65536> buffer;
  std::vector<Event> events;
  bool lost = false;
  // A few reads only: the loop has other events to serve, and what is left makes it ready again.
  for (int i = 0; i < kReadsAtOnce; ++i) {
    const ssize_t size = ::read(inotify_.get(), buffer.data(), buffer.size());
    if (size <= 0) break;
    for (std::size_t at = 0; at < static_cast<std::size_t>(size);) {
      inotify_event event{};
      std::memcpy(&event, buffer.data() + at, sizeof event);
      const char* name = buffer.data() + at + sizeof event;
      lost = lost || (event.mask & IN_Q_OVERFLOW) != 0;
      events.push_back({event.wd, event.mask, event.len == 0 ? std::string() : std::string(name)});
      at += sizeof event + event.len;
    }
  }
  bool wake = false;
  {
    const MutexLock lock(mutex_);
    std::move(events.begin(), events.end(), std::back_inserter(events_));
    lost_ = lost_ || lost || events_.size() > kMostEvents;
    if (lost_) events_.clear();
    wake = !std::exchange(awake_, true);
  }
  if (wake) wake_();
}

void FolderWatch::timerFired(int timer, bool FolderWatch::*flag) {
  std::uint64_t times = 0;
  (void)!::read(timer, &times, sizeof times);
  bool wake = false;
  {
    const MutexLock lock(mutex_);
    this->*flag = true;
    wake = !std::exchange(awake_, true);
  }
  if (wake) wake_();
}

FolderWatch::Batch FolderWatch::take() {
  std::vector<Event> events;
  Batch batch;
  {
    const MutexLock lock(mutex_);
    events.swap(events_);
    batch.everything = std::exchange(lost_, false);
    batch.due = std::exchange(due_, false);
    batch.poll = std::exchange(poll_, false);
    awake_ = false;
  }
  for (const Event& event : events) decode(event, batch);
  return batch;
}

void FolderWatch::decode(const Event& event, Batch& batch) {
  const auto place = roles_.find(event.watch);
  if (place == roles_.end()) return;
  if ((event.mask & IN_IGNORED) != 0) {
    // The directory is gone. When a folder is, its own event or that of one above it has said so.
    roles_.erase(place);
    return;
  }
  for (const Role& role : place->second) {
    switch (role.kind) {
      case Role::Kind::Inside:
        batch.changes[role.path].inside = true;
        break;
      case Role::Kind::Above:
        if ((event.mask & (kSelf | IN_UNMOUNT)) != 0 || (!role.next.empty() && event.name == role.next)) {
          batch.everything = true;
        }
        break;
      case Role::Kind::Folder:
        if ((event.mask & (kSelf | IN_UNMOUNT)) != 0) batch.everything = true;
        batch.folders.insert(role.path);
        if (event.name.empty()) break;
        Change& change = batch.changes[role.path + "/" + event.name];
        change.left = change.left || (event.mask & (IN_MOVED_FROM | IN_DELETE)) != 0;
        change.appeared = change.appeared || (event.mask & (IN_CREATE | IN_ISDIR)) == (IN_CREATE | IN_ISDIR);
        break;
    }
  }
}

int FolderWatch::add(const std::string& directory, std::uint32_t mask, Role role) {
  if (!inotify_) return -1;
  // A directory may have several roles; its mask is what all of them need.
  const int watch =
      ::inotify_add_watch(inotify_.get(), directory.c_str(), mask | IN_ONLYDIR | IN_DONT_FOLLOW | IN_MASK_ADD);
  if (watch < 0) {
    ranOut_ = ranOut_ || errno == ENOSPC || errno == ENOMEM;
    return -1;
  }
  if (roles_.size() >= most_ && !roles_.contains(watch)) {
    (void)::inotify_rm_watch(inotify_.get(), watch);
    ranOut_ = true;
    return -1;
  }
  std::vector<Role>& roles = roles_[watch];
  if (std::find(roles.begin(), roles.end(), role) == roles.end()) roles.push_back(std::move(role));
  return watch;
}

void FolderWatch::drop(int watch, const std::function<bool(const Role&)>& which) {
  const auto place = roles_.find(watch);
  if (place == roles_.end()) return;
  std::erase_if(place->second, which);
  if (!place->second.empty()) return;
  (void)::inotify_rm_watch(inotify_.get(), watch);
  roles_.erase(place);
}

void FolderWatch::begin(const std::string& folder) {
  watchAbove(folder);
  (void)add(folder, kFolderMask, {Role::Kind::Folder, folder, {}});
}

void FolderWatch::end(const std::string& folder) {
  std::vector<int> watches;
  for (const auto& [watch, roles] : roles_) watches.push_back(watch);
  for (const int watch : watches) {
    drop(watch, [&](const Role& role) { return role.kind != Role::Kind::Inside && role.path == folder; });
  }
}

void FolderWatch::setFolders(std::vector<std::string> folders) {
  const auto before = std::exchange(folders_, std::move(folders));
  const auto isIn = [](const std::vector<std::string>& all, const std::string& folder) {
    return std::find(all.begin(), all.end(), folder) != all.end();
  };
  for (const std::string& folder : before) {
    if (!isIn(folders_, folder)) end(folder);
  }
  for (const std::string& folder : folders_) {
    if (!isIn(before, folder)) begin(folder);
  }
}

void FolderWatch::refresh() {
  for (const std::string& folder : folders_) end(folder);
  for (const std::string& folder : folders_) begin(folder);
}

// From the top down: whatever comes into being while this goes on is under watch or found by the next step.
void FolderWatch::watchAbove(const std::string& folder) {
  std::vector<std::string> above;
  for (std::string path = folder; path.size() > 1;) above.push_back(path = parentOf(path));
  std::reverse(above.begin(), above.end());
  for (std::size_t i = 0; i < above.size(); ++i) {
    if (add(above[i], kSelf, {Role::Kind::Above, folder, {}}) < 0) continue;
    const std::string& below = i + 1 < above.size() ? above[i + 1] : folder;
    if (::access(below.c_str(), F_OK) == 0) continue;
    // The one directory whose arrivals matter: the lowest that is there.
    (void)add(above[i], kSelf | kArrivals, {Role::Kind::Above, folder, below.substr(below.rfind('/') + 1)});
    if (::access(below.c_str(), F_OK) != 0) return;
  }
}

void FolderWatch::watchInside(const std::string& root, const std::vector<std::string>& inside) {
  std::vector<int>& watches = inside_[root];
  for (const std::string& directory : inside) {
    const int watch = add(directory, kInsideMask, {Role::Kind::Inside, root, {}});
    if (watch >= 0 && std::find(watches.begin(), watches.end(), watch) == watches.end()) watches.push_back(watch);
  }
}

void FolderWatch::forgetInside(const std::string& root) {
  const auto place = inside_.find(root);
  if (place == inside_.end()) return;
  for (const int watch : place->second) {
    drop(watch, [&](const Role& role) { return role.kind == Role::Kind::Inside && role.path == root; });
  }
  inside_.erase(place);
}

void FolderWatch::wakeAt(std::chrono::steady_clock::time_point when) {
  using std::chrono::nanoseconds;
  const auto since = std::chrono::duration_cast<nanoseconds>(when.time_since_epoch()).count();
  constexpr std::int64_t kSecond = 1'000'000'000;
  itimerspec time{};
  time.it_value = {since / kSecond, since % kSecond};
  (void)::timerfd_settime(dueTimer_.get(), TFD_TIMER_ABSTIME, &time, nullptr);
}

void FolderWatch::poll() {
  const itimerspec time{{kPollSeconds, 0}, {kPollSeconds, 0}};
  (void)::timerfd_settime(pollTimer_.get(), 0, &time, nullptr);
}

}  // namespace platform
