// FolderWatch: tells which bundles to look at again.
//
// It watches folders for what comes and goes among their direct children, and the insides of single bundles that are
// still being copied. A folder may be missing, come later, be moved away or be made anew. The main run loop only reads
// the events; everything else is used on one queue, that of the registry. An event only names what to look at again.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/queue/MainRunLoop.h"
#include "platform/queue/Mutex.h"

namespace platform {

class FolderWatch {
 public:
  /// What happened to one path since it was asked for last.
  struct Change {
    bool left = false;      ///< it was removed or moved away at some time: what is there now is another
    bool appeared = false;  ///< it was made in place, so that it may still be being filled
    bool inside = false;    ///< something inside it changed (only when its inside is watched)
  };
  struct Batch {
    std::map<std::string, Change> changes;  ///< by path of a bundle
    std::set<std::string> folders;          ///< those that anything happened in
    bool everything = false;                ///< events were lost or folders came or went: call refresh(), look at all
    bool due = false;                       ///< the time of wakeAt() has come
    bool poll = false;                      ///< watches have run out, and two seconds have passed
  };

  /// `most` bounds the number of watches.
  explicit FolderWatch(std::size_t most);
  FolderWatch(const FolderWatch&) = delete;
  FolderWatch& operator=(const FolderWatch&) = delete;

  /// Begins to read events on the main run loop, and calls `wake` there when take() has something. Main thread.
  void start(std::function<void()> wake);
  /// Ends that; main thread.
  void stop();

  // On the queue of the registry.

  /// What happened since the last call.
  Batch take();
  /// Watches `folders` (canonical, also when they are missing), and of those that it watched before only these.
  void setFolders(std::vector<std::string> folders);
  /// Finds the folders again. The caller then looks at all of them.
  void refresh();
  /// Watches the directories `inside` of the bundle at `root` too; once more for those that have come since.
  void watchInside(const std::string& root, const std::vector<std::string>& inside);
  bool watchesInside(const std::string& root) const { return inside_.contains(root); }
  void forgetInside(const std::string& root);
  std::size_t insideCount() const { return inside_.size(); }
  /// Wakes the registry at `when`; an earlier call for an earlier time is forgotten.
  void wakeAt(std::chrono::steady_clock::time_point when);
  /// True when there are not enough watches for all that should be watched; poll() then takes their place.
  bool ranOut() const { return ranOut_; }
  /// Wakes the registry every two seconds from now on.
  void poll();

 private:
  // Why a directory is watched.
  struct Role {
    enum class Kind { Folder, Above, Inside } kind = Kind::Folder;
    std::string path;  // the folder; the folder that it is above; the root of the bundle
    std::string next;  // Above: the missing component that leads to the folder; empty: only its own moves matter
    friend bool operator==(const Role&, const Role&) = default;
  };
  struct Event {
    int watch = -1;
    std::uint32_t mask = 0;
    std::string name;
  };

  void readEvents();
  void timerFired(int timer, bool FolderWatch::*flag);
  void decode(const Event& event, Batch& batch);
  int add(const std::string& directory, std::uint32_t mask, Role role);
  void drop(int watch, const std::function<bool(const Role&)>& which);
  void begin(const std::string& folder);
  void end(const std::string& folder);
  void watchAbove(const std::string& folder);

  const std::size_t most_;
  const UniqueFd inotify_;
  const UniqueFd dueTimer_;
  const UniqueFd pollTimer_;

  // On the main thread.
  std::function<void()> wake_;
  std::vector<std::unique_ptr<MainRunLoop::Source>> sources_;

  // On the queue of the registry.
  std::vector<std::string> folders_;
  std::map<int, std::vector<Role>> roles_;
  std::map<std::string, std::vector<int>> inside_;  // root -> its watches
  bool ranOut_ = false;

  // From the main thread to that queue.
  Mutex mutex_;
  std::vector<Event> events_ XT_GUARDED_BY(mutex_);
  bool lost_ XT_GUARDED_BY(mutex_) = false;
  bool due_ XT_GUARDED_BY(mutex_) = false;
  bool poll_ XT_GUARDED_BY(mutex_) = false;
  bool awake_ XT_GUARDED_BY(mutex_) = false;  // wake was called and take() has not been since
};

}  // namespace platform
