// Launcher: starts plug-ins in their sandboxes.
//
// One thread of its own does all of it, for as long as the object lives: a sandbox ends with the thread that started
// it. The thread starts bubblewrap, hears of the sandbox's first process, has it put on record, lets it go on, and
// reaps bubblewrap in the end; any number of launches are on their way at a time and none waits for another. What is
// not running within kStartTimeout is ended.
#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <list>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/files/UserAndGroup.h"
#include "platform/jobs/JobManager.h"
#include "platform/queue/Mutex.h"

namespace platform {

class Launcher {
 public:
  static constexpr std::chrono::seconds kStartTimeout{20};

  /// The programs that it runs.
  struct Programs {
    std::string bubblewrap = "/usr/bin/bwrap";
    std::vector<std::string> launch;  ///< places of xtd-launch; the first that there is
    /// bubblewrap, and xtd-launch beside this process's executable or in /usr/libexec/extora.
    static Programs installed();
  };
  struct Order {
    JobManager::Launch launch;
    std::string options;  ///< bubblewrap's, each ended by a NUL
    std::optional<UserAndGroup> user;
  };
  /// An error number and its reason, or the first process and the host's end of the connection.
  struct Outcome {
    int errorNumber = 0;
    std::string reason;
    pid_t pid = 0;
    UniqueFd connection;
  };
  using Done = std::function<void(Outcome)>;

  Launcher(std::shared_ptr<JobManager> jobs, Programs programs);
  /// Ends what still runs, without a grace.
  ~Launcher();
  Launcher(const Launcher&) = delete;
  Launcher& operator=(const Launcher&) = delete;

  /// `done` is called once, on the launcher's thread; by then the job manager has been told.
  void launch(Order order, Done done);

 private:
  using Clock = std::chrono::steady_clock;
  enum class State {
    Starting,   // the first process has not been heard of
    Executing,  // it has been told to go on
    Over,       // the outcome is known; bubblewrap is to be reaped
  };
  struct Child {
    JobManager::Launch launch;
    Done done;
    State state = State::Starting;
    Clock::time_point deadline;
    pid_t pid = -1;  // of bubblewrap
    UniqueFd pidfd;
    UniqueFd control;
    UniqueFd complaints;
    UniqueFd connection;
    UniqueFd firstProcess;
    pid_t firstPid = 0;
    std::optional<Outcome> failure;  // to be told once bubblewrap has been reaped
  };

  void serve();
  void start(Order order, Done done);
  [[nodiscard]] int prepare(const Order& order, Child& child, std::string* reason);
  void wait();
  void handleControl(Child& child);
  void handleFirstWord(Child& child);
  void handleLastWord(Child& child);
  void fail(Child& child, int errorNumber, std::string reason);
  void reap(Child& child);
  void endAll();

  // Constant after construction.
  const std::shared_ptr<JobManager> jobs_;
  const Programs programs_;
  UniqueFd wake_;

  Mutex mutex_;
  std::deque<std::pair<Order, Done>> orders_ XT_GUARDED_BY(mutex_);
  bool stopping_ XT_GUARDED_BY(mutex_) = false;

  // On the thread.
  std::list<Child> children_;

  std::thread thread_;
};

}  // namespace platform
