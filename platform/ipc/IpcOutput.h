// IpcOutput: what one connection sends, in order, without ever waiting.
//
// 1. A frame goes to the socket straight from the thread that sends it. What the socket does not take at once waits in
//    the backlog, which the writer thread (IpcWriter) goes on with when the socket has room.
// 2. The frame at the head of the backlog is the one being sent; those behind it count, memory files in full, and must
//    not exceed the bound.
// 3. At most one memory file is with the peer unread. Whether it has been taken is asked of the socket: nothing that
//    was sent is unread any more (SIOCOUTQ). Frames behind a waiting memory file wait too, so that this is bound to
//    happen, and the socket's report of room wakes the writer each time that the peer has taken something.
//
// Callable from any thread. Shared by the connection and the writer.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/queue/Mutex.h"
#include "platform/value/Value.h"

namespace platform {

class IpcOutput : public std::enable_shared_from_this<IpcOutput> {
 public:
  /// One frame as it is handed over.
  struct Frame {
    std::span<const std::uint8_t> bytes;  ///< header, and the body unless it is in the memory file
    UniqueFd memoryFile;
    std::size_t memoryFileSize = 0;
    std::vector<int> descriptors = {};  ///< owned by `owner`
    Value owner = {};
  };

  IpcOutput(UniqueFd socket, std::size_t maxBacklog);
  ~IpcOutput();
  IpcOutput(const IpcOutput&) = delete;
  IpcOutput& operator=(const IpcOutput&) = delete;

  /// Set before the first send: called once with the reason, from the thread that sends and without a lock, when the
  /// backlog exceeds its bound. That the peer has gone is for the reader to notice.
  void setOverflowHandler(std::function<void(std::string)> handler) { overflowed_ = std::move(handler); }

  /// Sends, or puts in line; dropped when the peer has gone or the output is closed.
  void send(Frame frame);
  /// Ends the connection in both directions; the descriptor stays until close().
  void shutdown();
  /// Closes the socket and drops the backlog. Nobody may read from it any more.
  void close();
  /// As close(), but what waits is sent before, for as long as the peer takes it.
  void closeWhenSent();

  /// For the writer: sends what the socket takes now.
  void flush();

 private:
  struct Waiting {
    Bytes bytes;
    std::size_t sent = 0;
    UniqueFd memoryFile;
    std::size_t memoryFileSize = 0;
    std::vector<int> descriptors;
    Value owner;
    std::size_t weight() const noexcept { return bytes.size() + memoryFileSize; }
  };
  enum class Progress { Done, Partly, Blocked, Failed };

  Progress sendSome(std::span<const std::uint8_t> bytes, std::size_t* sent, int memoryFile,
                    std::span<const int> descriptors) XT_REQUIRES(mutex_);
  bool memoryFileTaken() XT_REQUIRES(mutex_);
  bool enqueue(Frame& frame, std::size_t sent) XT_REQUIRES(mutex_);
  void sendBacklog() XT_REQUIRES(mutex_);
  void dropBacklog() XT_REQUIRES(mutex_);
  void closeNow() XT_REQUIRES(mutex_);
  void retryLater() XT_REQUIRES(mutex_);

  // Constant after the first send.
  const std::size_t maxBacklog_;
  std::function<void(std::string)> overflowed_;

  Mutex mutex_;
  UniqueFd socket_ XT_GUARDED_BY(mutex_);
  bool broken_ XT_GUARDED_BY(mutex_) = false;  // the peer takes nothing more
  std::deque<Waiting> backlog_ XT_GUARDED_BY(mutex_);
  std::size_t backlogBytes_ XT_GUARDED_BY(mutex_) = 0;  // without the head
  bool memoryFileUnread_ XT_GUARDED_BY(mutex_) = false;
  std::uint64_t watch_ XT_GUARDED_BY(mutex_) = 0;  // the writer's token while there is a backlog
  bool retrying_ XT_GUARDED_BY(mutex_) = false;
  std::shared_ptr<IpcOutput> closing_ XT_GUARDED_BY(mutex_);  // itself, from closeWhenSent() until all is sent
};

}  // namespace platform
