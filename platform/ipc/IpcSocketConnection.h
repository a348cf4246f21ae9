// IpcSocketConnection: the connection over a connected Unix stream socket, in both of its roles.
//
// A service's connection (accepted by a listener) takes requests, handles them on the threads of the IPC layer, and
// keeps itself alive from resume() until its last event has been delivered. A peer's connection (a client of a service,
// or one end of a socket that was handed over) also sends requests; its events go to its target queue, and it ends with
// its owner's last reference or when its last outstanding reply has come.
//
// Reading. Exactly one thread at a time reads, decodes and delivers: the one that has turned `claim_` into Reading.
// That is a thread of IpcEventPool when the socket is armed there, or a caller of sendWithReplySync, which reads its
// own reply without a change of threads, or a worker that goes on after a pause. release() says who comes next. A
// service's connection whose peer has closed only its own direction ends when all its requests have been served.
//
// Locks: mutex_ is a leaf but for the event pool's and is never held while a handler, a reply function or the codec
// runs.
#pragma once

#include <sys/types.h>

#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/ipc/IpcConnection.h"
#include "platform/ipc/IpcEventPool.h"
#include "platform/ipc/IpcFrameReader.h"
#include "platform/ipc/IpcOutput.h"
#include "platform/queue/Mutex.h"

namespace platform {

class IpcSocketConnection final : public IpcConnection,
                                  public IpcEventSource,
                                  public IpcRequestCounter,
                                  private IpcFrameReader::Receiver {
 public:
  struct Settings {
    std::string name;            ///< what describe() calls it
    bool service = false;        ///< the role
    QueueReference targetQueue;  ///< of a peer's connection; none for a service's
    std::size_t maxBacklog = kIpcMaxBacklog;
    std::uint32_t maxReplyBody = kIpcMaxReplyBody;  ///< what the other side takes
    std::size_t maxUnfinishedBytes = kIpcMaxUnfinishedBytes;
  };

  /// Over `socket`, whose peer is `peer`; a socket of a service must report the sender of each message (SO_PASSCRED).
  static std::shared_ptr<IpcSocketConnection> make(UniqueFd socket, std::shared_ptr<const PeerIdentity> peer,
                                                   Settings settings);
  /// A connection that could not be made: every request comes back with `reason`, which is also its only event.
  static std::shared_ptr<IpcSocketConnection> makeFailed(std::string reason, Settings settings);
  ~IpcSocketConnection() override;

  const std::shared_ptr<const PeerIdentity>& peer() const override { return peer_; }
  pid_t peerPid() const override { return gone_ ? 0 : peer_->pid(); }
  void setEventHandler(Handler handler) override;
  void setContext(std::shared_ptr<void> context) override;
  void resume() override;
  void cancel() override;
  bool isValid() const override { return valid_; }
  void send(const IpcReply& reply) override;
  void sendWithReply(const Value& body, const SerialQueue& queue, ReplyFunction reply) override;
  IpcReplyObject sendWithReplySync(const Value& body) override;
  void sendWithoutReply(const Value& body) override;
  void announceTermination() override;
  std::string describe() const override;

  void handleEvent() override;
  void requestServed() override;

 private:
  enum class Claim {
    Unresumed,
    Armed,    // the event pool waits for the socket
    Resting,  // nobody waits; a caller of sendWithReplySync is about to come, or may come soon
    Reading,  // one thread reads or delivers
    Paused,   // too many requests are unserved
    Serving,  // the peer sends nothing more, and waits for its last replies
    Ended,    // never to be read again
  };
  // Handler and context, which go together and last until the last event has been delivered.
  struct Client {
    Handler handler;
    std::shared_ptr<void> context;
  };
  // A caller of sendWithReplySync; stands on its stack.
  struct Waiter {
    std::uint64_t id = 0;
    bool done = false;
    bool reading = false;  // it reads itself and needs no wake-up
    IpcReplyObject result;
    std::condition_variable wake;
  };
  // An asynchronous request; keeps the connection alive.
  struct Pending {
    std::shared_ptr<IpcSocketConnection> connection;
    QueueReference queue;
    ReplyFunction reply;
  };

  IpcSocketConnection(UniqueFd socket, std::shared_ptr<const PeerIdentity> peer, Settings settings);
  std::shared_ptr<IpcSocketConnection> self();

  // Reading; by the thread that has the claim.
  bool mayTake(const IpcFrameHeader& header) override;
  bool take(IpcFrame& frame) override;
  bool takeRequest(const IpcFrame& frame);
  bool takeReply(IpcFrame& frame);
  bool decode(const IpcFrame& frame, Value* body);
  void deliver(IpcEvent event, bool last = false);
  void release(IpcFrameReader::Outcome outcome, bool synchronous);
  void finish();

  bool peerListens() const;
  void park(bool synchronous) XT_REQUIRES(mutex_);
  void arm() XT_REQUIRES(mutex_);
  void watchResting() XT_REQUIRES(mutex_);
  void lookAtResting();
  void cancelWithReason(std::string reason);

  // Sending.
  void transmit(IpcFrameType type, std::uint64_t id, Bytes& frame);
  void transmitReply(std::uint64_t id, const Value& body);
  std::optional<IpcError> encodeRequest(const Value& body, Bytes& frame) const;
  std::optional<IpcError> checkUsable() XT_REQUIRES(mutex_);
  IpcError invalidError() XT_REQUIRES(mutex_);
  bool claimFor(Waiter& waiter);
  bool isDone(const Waiter& waiter);
  std::uint64_t nextId();

  // Constant after construction.
  const Settings settings_;
  const std::shared_ptr<const PeerIdentity> peer_;
  const int socket_;  // owned by output_
  const std::shared_ptr<IpcOutput> output_;

  // Of the thread that has the claim (before resume(): of the owner).
  IpcFrameReader reader_;
  std::string malformed_;  // why a body could not be decoded
  std::shared_ptr<Client> client_;

  std::atomic<bool> valid_ = true;
  std::atomic<bool> gone_ = false;  // the last event has been delivered

  Mutex mutex_;
  Claim claim_ XT_GUARDED_BY(mutex_) = Claim::Unresumed;
  std::uint64_t token_ XT_GUARDED_BY(mutex_) = 0;
  std::shared_ptr<IpcSocketConnection> self_ XT_GUARDED_BY(mutex_);  // of a service, while it is resumed
  bool cancelled_ XT_GUARDED_BY(mutex_) = false;
  bool sendRest_ XT_GUARDED_BY(mutex_) = false;  // the peer sends nothing more, but takes what waits for it
  bool failed_ XT_GUARDED_BY(mutex_) = false;    // made by makeFailed, and not resumed yet
  std::string reason_ XT_GUARDED_BY(mutex_);     // why it is invalid
  std::size_t unserved_ XT_GUARDED_BY(mutex_) = 0;
  std::uint64_t lastId_ XT_GUARDED_BY(mutex_) = 0;
  std::unordered_map<std::uint64_t, Pending> pending_ XT_GUARDED_BY(mutex_);
  std::vector<Waiter*> waiters_ XT_GUARDED_BY(mutex_);  // not done yet
  bool watched_ XT_GUARDED_BY(mutex_) = false;          // a look at a resting connection is due
  bool used_ XT_GUARDED_BY(mutex_) = false;             // by a synchronous request since that was arranged
};

}  // namespace platform
