#include "platform/ipc/IpcSocketConnection.h"

#include <fmt/format.h>
#include <poll.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "platform/ipc/IpcCodec.h"
#include "platform/queue/ThreadPool.h"

namespace platform {
namespace {

// How long a connection that synchronous requests have used may rest before the event pool waits for it again.
constexpr std::chrono::milliseconds kRest{5};

IpcFrameReader::Rules readerRules(const IpcSocketConnection::Settings& settings, const PeerIdentity& peer) {
  IpcFrameReader::Rules rules;
  rules.service = settings.service;
  rules.sender = peer.pid();
  rules.maxUnfinishedBytes = settings.maxUnfinishedBytes;
  return rules;
}

}  // namespace

IpcSocketConnection::IpcSocketConnection(UniqueFd socket, std::shared_ptr<const PeerIdentity> peer, Settings settings)
    : settings_(std::move(settings)),
      peer_(std::move(peer)),
      socket_(socket.get()),
      output_(std::make_shared<IpcOutput>(std::move(socket), settings_.maxBacklog)),
      reader_(readerRules(settings_, *peer_)),
      client_(std::make_shared<Client>()) {}

std::shared_ptr<IpcSocketConnection> IpcSocketConnection::make(UniqueFd socket,
                                                               std::shared_ptr<const PeerIdentity> peer,
                                                               Settings settings) {
  std::shared_ptr<IpcSocketConnection> connection(
      new IpcSocketConnection(std::move(socket), std::move(peer), std::move(settings)));
  connection->output_->setOverflowHandler([weak = std::weak_ptr(connection)](std::string reason) {
    if (const auto self = weak.lock()) self->cancelWithReason(std::move(reason));
  });
  return connection;
}

std::shared_ptr<IpcSocketConnection> IpcSocketConnection::makeFailed(std::string reason, Settings settings) {
  auto connection = make(UniqueFd(), PeerIdentity::ofSocket(-1), std::move(settings));
  connection->valid_ = false;
  MutexLock lock(connection->mutex_);
  connection->claim_ = Claim::Ended;
  connection->failed_ = true;
  connection->reason_ = std::move(reason);
  return connection;
}

IpcSocketConnection::~IpcSocketConnection() {
  if (claim_ != Claim::Ended && token_ != 0) IpcEventPool::shared().remove(socket_, token_);
  output_->close();
}

std::shared_ptr<IpcSocketConnection> IpcSocketConnection::self() {
  return std::static_pointer_cast<IpcSocketConnection>(shared_from_this());
}

void IpcSocketConnection::setEventHandler(Handler handler) {
  client_->handler = std::move(handler);
}

void IpcSocketConnection::setContext(std::shared_ptr<void> context) {
  client_->context = std::move(context);
}

void IpcSocketConnection::resume() {
  bool failed = false;
  {
    MutexLock lock(mutex_);
    if (claim_ == Claim::Unresumed) {
      token_ = IpcEventPool::shared().add(socket_, std::weak_ptr<IpcEventSource>(self()));
      if (token_ != 0) {
        if (settings_.service) self_ = self();
        arm();
        return;
      }
      reason_ = fmt::format("cannot wait for its events: {}", std::strerror(errno));
      cancelled_ = true;
      valid_ = false;
      failed = true;
    } else {
      failed = std::exchange(failed_, false);
    }
  }
  if (failed) finish();
}

void IpcSocketConnection::cancel() {
  cancelWithReason("the connection was cancelled");
}

void IpcSocketConnection::cancelWithReason(std::string reason) {
  Claim before = Claim::Ended;
  {
    MutexLock lock(mutex_);
    if (cancelled_ || claim_ == Claim::Ended) return;
    cancelled_ = true;
    valid_ = false;
    reason_ = std::move(reason);
    before = claim_;
    claim_ = claim_ == Claim::Unresumed ? Claim::Ended : Claim::Reading;
  }
  output_->shutdown();  // wakes a reader that waits for the socket
  if (before == Claim::Unresumed) {
    output_->close();
    client_.reset();
    gone_ = true;
  } else if (before != Claim::Reading) {
    ThreadPool::workers().submit([self = self()] { self->finish(); });
  }
}

std::string IpcSocketConnection::describe() const {
  if (!valid_) return settings_.name + " (invalid)";
  return fmt::format("{} (pid {})", settings_.name, peer_->pid());
}

// Reading.

void IpcSocketConnection::handleEvent() {
  bool atEnd = false;
  {
    MutexLock lock(mutex_);
    atEnd = claim_ == Claim::Serving;
    if (claim_ != Claim::Armed && !atEnd) return;
    claim_ = Claim::Reading;
  }
  release(atEnd ? IpcFrameReader::Outcome::EndOfInput : reader_.read(socket_, MSG_DONTWAIT, *this), false);
}

// Ends the claim of the calling thread: the connection is read on by whoever is next, or has come to its end.
void IpcSocketConnection::release(IpcFrameReader::Outcome outcome, bool synchronous) {
  using Outcome = IpcFrameReader::Outcome;
  for (;;) {
    const bool ended = outcome == Outcome::EndOfInput || outcome == Outcome::Broken || outcome == Outcome::Stopped;
    if (outcome == Outcome::Broken) malformed_ = reader_.brokenReason();
    {
      MutexLock lock(mutex_);
      sendRest_ = outcome == Outcome::EndOfInput && !cancelled_ && peerListens();
      if (sendRest_ && unserved_ > 0) {
        claim_ = Claim::Serving;
        IpcEventPool::shared().disarm(socket_, token_);
        return;
      }
      if (ended && !cancelled_) {
        valid_ = false;
        reason_ = malformed_.empty() ? "the peer has gone" : malformed_;
      } else if (!cancelled_ && unserved_ >= kIpcMaxUnservedRequests) {
        claim_ = Claim::Paused;
        return;
      } else if (!cancelled_ && !reader_.hasRefused()) {
        park(synchronous);
        return;
      }
      if (ended || cancelled_) break;
    }
    outcome = reader_.resume(*this);
  }
  finish();
}

// Whether the peer of a service that sends nothing more takes replies still.
bool IpcSocketConnection::peerListens() const {
  struct pollfd entry = {socket_, 0, 0};
  return settings_.service && ::poll(&entry, 1, 0) == 0;
}

void IpcSocketConnection::park(bool synchronous) {
  if (!waiters_.empty()) {
    claim_ = Claim::Resting;
    waiters_.front()->wake.notify_one();
  } else if (!synchronous || !pending_.empty()) {
    arm();
  } else {
    // The next synchronous request spares two system calls when nothing has to be disarmed for it.
    claim_ = Claim::Resting;
    used_ = true;
    watchResting();
  }
}

void IpcSocketConnection::arm() {
  claim_ = Claim::Armed;
  IpcEventPool::shared().arm(socket_, token_);
}

void IpcSocketConnection::watchResting() {
  if (std::exchange(watched_, true)) return;
  IpcEventPool::shared().callAfter(kRest, [weak = std::weak_ptr(self())] {
    if (const auto connection = weak.lock()) connection->lookAtResting();
  });
}

void IpcSocketConnection::lookAtResting() {
  MutexLock lock(mutex_);
  watched_ = false;
  if (claim_ != Claim::Resting || !waiters_.empty()) return;
  if (std::exchange(used_, false)) {
    watchResting();
  } else {
    arm();
  }
}

void IpcSocketConnection::requestServed() {
  MutexLock lock(mutex_);
  --unserved_;
  if (claim_ == Claim::Serving && unserved_ == 0) {
    claim_ = Claim::Reading;
    ThreadPool::workers().submit([self = self()] { self->release(IpcFrameReader::Outcome::EndOfInput, false); });
    return;
  }
  if (claim_ != Claim::Paused || unserved_ >= kIpcMaxUnservedRequests) return;
  if (!reader_.hasRefused()) {
    park(false);
    return;
  }
  claim_ = Claim::Reading;
  ThreadPool::workers().submit([self = self()] { self->release(self->reader_.resume(*self), false); });
}

// Tells everybody that the connection has come to its end; by the thread that has the claim.
void IpcSocketConnection::finish() {
  const auto keptUntilReturn = self();
  std::shared_ptr<IpcSocketConnection> ownReference;
  std::unordered_map<std::uint64_t, Pending> pending;
  IpcError invalid;
  std::uint64_t token = 0;
  bool sendRest = false;
  {
    MutexLock lock(mutex_);
    claim_ = Claim::Ended;
    sendRest = sendRest_ && !cancelled_;
    invalid = invalidError();
    token = token_;
    ownReference.swap(self_);
    pending.swap(pending_);
    for (Waiter* waiter : waiters_) {
      waiter->result.error = invalid;
      waiter->done = true;
      waiter->wake.notify_one();
    }
    waiters_.clear();
  }
  if (token != 0) IpcEventPool::shared().remove(socket_, token);
  if (sendRest) {
    output_->closeWhenSent();
  } else {
    output_->close();
  }
  reader_.abandon();
  for (auto& [id, request] : pending) {
    request.queue.async([reply = std::move(request.reply), invalid] { reply({Value(), invalid}); });
  }
  if (!malformed_.empty()) deliver(IpcError{IpcError::Kind::BrokenInput, malformed_});
  deliver(std::move(invalid), true);
}

// Frames.

bool IpcSocketConnection::mayTake(const IpcFrameHeader& header) {
  if (header.type != IpcFrameType::Request && header.type != IpcFrameType::RequestWithoutReply) return true;
  MutexLock lock(mutex_);
  return unserved_ < kIpcMaxUnservedRequests;
}

bool IpcSocketConnection::take(IpcFrame& frame) {
  if (!valid_) return false;
  bool sound = true;
  switch (frame.header.type) {
    case IpcFrameType::Request:
    case IpcFrameType::RequestWithoutReply:
      sound = takeRequest(frame);
      break;
    case IpcFrameType::Reply:
      sound = takeReply(frame);
      break;
    case IpcFrameType::TerminationImminent:
      deliver(IpcError{IpcError::Kind::TerminationImminent, "the peer is about to end"});
      break;
  }
  return sound && valid_;
}

bool IpcSocketConnection::decode(const IpcFrame& frame, Value* body) {
  Error error;
  *body = decodeValue(frame.body, &error, frame.descriptors);
  if (body->isNothing()) malformed_ = error.localizedDescription();
  return !body->isNothing();
}

bool IpcSocketConnection::takeRequest(const IpcFrame& frame) {
  IpcMessage message;
  message.id = frame.header.id;
  message.expectsReply = frame.header.type == IpcFrameType::Request;
  if (!decode(frame, &message.body)) return false;
  {
    MutexLock lock(mutex_);
    ++unserved_;
  }
  message.ticket = std::make_shared<IpcTicket>(std::weak_ptr<IpcRequestCounter>(self()));
  deliver(std::move(message));
  return true;
}

void IpcSocketConnection::deliver(IpcEvent event, bool last) {
  if (settings_.targetQueue) {
    settings_.targetQueue.async([event = std::move(event), client = client_, self = last ? self() : nullptr] {
      if (client->handler) client->handler(event);
      if (self) self->gone_ = true;
    });
  } else {
    if (client_->handler) client_->handler(event);
    gone_ = last;
  }
  if (last) client_.reset();
}

}  // namespace platform
