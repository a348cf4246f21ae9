// MainRunLoop: the process's main queue and the loop that serves it (sd-event): signals, file watches, locale changes,
// child exits. It only reads events; real work belongs to queues of its own, so that a burst never holds SIGTERM back.
//
// Signals: blockSignals() comes before the first thread is made; a signal source then takes the signal as an event.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

namespace platform {

class MainRunLoop {
 public:
  /// A source that is live as long as it exists; destroy it on the main thread or before run().
  class Source {
   public:
    virtual ~Source() = default;
  };

  /// The loop of the main thread; made on the first call.
  static MainRunLoop& main();  // NOLINT(bugprone-exception-escape): no program entry

  /// Blocks SIGTERM, SIGINT, SIGHUP and SIGCHLD for this thread and all that it starts; ignores SIGPIPE
  /// and SIGXFSZ: both are errors of a write then.
  static void blockSignals();

  /// Calls `handler` on the main thread each time `signal` arrives. The signal must be blocked.
  [[nodiscard]] std::unique_ptr<Source> addSignal(int signal, std::function<void()> handler);
  /// Calls `handler` with the ready epoll events (EPOLLIN ...) of `fd`, which stays the caller's.
  [[nodiscard]] std::unique_ptr<Source> addFd(int fd, std::uint32_t events, std::function<void(std::uint32_t)> handler);
  /// Calls `handler` every `intervalMs` milliseconds (monotonic), the first time after one interval.
  [[nodiscard]] std::unique_ptr<Source> addTimer(std::uint64_t intervalMs, std::function<void()> handler);
  /// Runs `work` on the main thread, in order of submission; callable from any thread.
  void async(std::function<void()> work);

  /// Runs the loop on the calling (main) thread until stop(); returns afterwards.
  void run();
  /// Makes run() return; callable from any thread.
  void stop();
  /// Ends the process from the main thread: flushes the log and leaves with `status` without running destructors beside
  /// live queues.
  [[noreturn]] static void exitProcess(int status);

  struct State;

 private:
  MainRunLoop();
  std::unique_ptr<State> state_;
};

}  // namespace platform
