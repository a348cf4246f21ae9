// IpcWriter: the one thread that goes on with the backlogs of all connections when their sockets have room.
// Callable from any thread; lives as long as the process; its thread starts with the first backlog.
#pragma once

#include <cstdint>
#include <memory>
#include <unordered_map>

#include "platform/files/UniqueFd.h"
#include "platform/queue/Mutex.h"
#include "platform/queue/ThreadRoster.h"

namespace platform {

class IpcOutput;

class IpcWriter {
 public:
  static IpcWriter& shared();

  /// From here on output->flush() is called each time that `socket` reports room, now too; answers the token of the
  /// watch, 0 when the system refuses it.
  [[nodiscard]] std::uint64_t watch(int socket, std::weak_ptr<IpcOutput> output);
  /// Before `socket` is closed.
  void unwatch(int socket, std::uint64_t token);

 private:
  IpcWriter();
  void serve();

  // Constant after construction.
  UniqueFd epoll_;
  ThreadRoster roster_{"ipc-writer"};

  Mutex mutex_;
  std::uint64_t lastToken_ XT_GUARDED_BY(mutex_) = 0;
  std::unordered_map<std::uint64_t, std::weak_ptr<IpcOutput>> outputs_ XT_GUARDED_BY(mutex_);
};

}  // namespace platform
