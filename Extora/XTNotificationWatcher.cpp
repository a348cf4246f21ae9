// The file is watched, and each directory above it up to the first that exists: where a name is missing, the directory
// tells when it comes. A watch on a directory is set before its entry is looked at, so that nothing falls in between.
#include "Extora/XTNotificationWatcher.h"

#include <poll.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <filesystem>
#include <utility>

#include "Extora/XTProtocol.h"
#include "platform/files/Directories.h"

namespace extora {
namespace {

constexpr std::uint32_t kDirectoryEvents = IN_CREATE | IN_MOVED_TO | IN_DELETE_SELF | IN_MOVE_SELF | IN_ONLYDIR;
constexpr std::uint32_t kFileEvents = IN_MODIFY | IN_DELETE_SELF | IN_MOVE_SELF | IN_ATTRIB | IN_DONT_FOLLOW;

}  // namespace

std::unique_ptr<XTNotificationWatcher> XTNotificationWatcher::initWithName(
    std::string_view name, const std::optional<std::string>& serviceName) {
  if (!platform::isPathSafeName(std::string(name))) return nullptr;
  const auto directories = platform::Directories::forClient(serviceName.value_or(std::string(XTDDefaultServiceName)));
  std::unique_ptr<XTNotificationWatcher> watcher(new XTNotificationWatcher(directories.runtime, name));
  return watcher->inotify_ && !watcher->watches_.empty() ? std::move(watcher) : nullptr;
}

XTNotificationWatcher::XTNotificationWatcher(const std::string& runtime, std::string_view name)
    : name_(name), inotify_(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK)) {
  platform::Directories directories;
  directories.runtime = runtime;
  notifications_ = platform::Notifications::make(directories);
  std::filesystem::path place = std::filesystem::path(runtime) / "notify" / name_;
  for (; place.has_relative_path(); place = place.parent_path()) places_.push_back(place.native());
  places_.push_back(place.native());
  if (inotify_) (void)take();
}

void XTNotificationWatcher::arm() {
  // From the file upward as far as something is missing, then downward: the directories before what lies in them.
  std::size_t top = 1;
  struct stat status {};
  while (top + 1 < places_.size() && ::stat(places_[top].c_str(), &status) != 0) ++top;
  std::set<int> watches;
  // The directory above the first that exists tells when that one is replaced.
  for (std::size_t i = std::min(top + 2, places_.size()); i-- > 0;) {
    const int watch = ::inotify_add_watch(inotify_.get(), places_[i].c_str(), i == 0 ? kFileEvents : kDirectoryEvents);
    if (watch >= 0) watches.insert(watch);
  }
  for (const int old : watches_) {
    if (watches.count(old) == 0) (void)::inotify_rm_watch(inotify_.get(), old);  // it may be gone already
  }
  watches_ = std::move(watches);
}

std::uint64_t XTNotificationWatcher::take() {
  alignas(struct inotify_event) std::array<char, 4096> events;
  bool structural = watches_.empty();
  for (ssize_t size = 0; (size = ::read(inotify_.get(), events.data(), events.size())) > 0;) {
    for (const char* at = events.data(); at < events.data() + size;) {
      const auto* event = reinterpret_cast<const struct inotify_event*>(at);
      structural = structural || event->mask != IN_MODIFY;
      at += sizeof *event + event->len;
    }
  }
  if (structural) arm();

  struct stat status {};
  const std::uint64_t inode = ::stat(places_[0].c_str(), &status) == 0 ? status.st_ino : 0;
  const auto before = std::exchange(counter_, notifications_->counter(name_));
  const bool same = std::exchange(inode_, inode) == inode;
  if (!counter_ || (same && before == counter_)) return 0;
  if (same && before && *counter_ > *before) return *counter_ - *before;
  return std::max<std::uint64_t>(*counter_, 1);
}

std::uint64_t XTNotificationWatcher::wait(std::chrono::milliseconds timeout) {
  constexpr std::chrono::hours kEver{24 * 365};  // what a clock can still be moved by
  const auto deadline = std::chrono::steady_clock::now() + std::min<std::chrono::milliseconds>(timeout, kEver);
  for (;;) {
    if (const std::uint64_t posts = take()) return posts;
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - std::chrono::steady_clock::now());
    if (left.count() <= 0) return 0;
    struct pollfd entry = {inotify_.get(), POLLIN, 0};
    constexpr std::chrono::milliseconds kLongest{60'000};
    (void)::poll(&entry, 1, static_cast<int>(std::min(left, kLongest).count()));
  }
}

}  // namespace extora
