#include <fmt/format.h>

#include <algorithm>
#include <utility>

#include "platform/ipc/IpcBufferPool.h"
#include "platform/ipc/IpcCodec.h"
#include "platform/ipc/IpcMemoryFile.h"
#include "platform/ipc/IpcSocketConnection.h"
#include "platform/log/Log.h"
#include "platform/queue/DeferredWork.h"
#include "platform/value/InternalInconsistency.h"

namespace platform {
namespace {

// What the kernel passes at once, one of them for the memory file.
constexpr std::size_t kMaxReplyDescriptors = 252;
constexpr std::uint64_t kReplyTooLargeCode = 4;

void putHeader(Bytes& frame, const IpcFrameHeader& header) {
  const auto bytes = header.serialize();
  std::copy(bytes.begin(), bytes.end(), frame.begin());
}

// The frame of `body`, its header still to be put.
void encodeFrame(const Value& body, Bytes& frame, std::vector<int>* descriptors) {
  frame.resize(IpcFrameHeader::kSize);
  encodeValue(body, frame, descriptors);
}

}  // namespace

void IpcSocketConnection::send(const IpcReply& reply) {
  if (reply.wanted && valid_) transmitReply(reply.id, Value(reply.body));
  if (reply.ticket) reply.ticket->serve();
}

void IpcSocketConnection::transmitReply(std::uint64_t id, const Value& body) {
  IpcBufferLease lease(IpcBufferPool::forWriting());
  Bytes& bytes = lease.buffer;
  IpcOutput::Frame frame;
  encodeFrame(body, bytes, &frame.descriptors);
  if (!frame.descriptors.empty()) frame.owner = body;
  if (bytes.size() - IpcFrameHeader::kSize > settings_.maxReplyBody ||
      frame.descriptors.size() > kMaxReplyDescriptors) {
    frame.descriptors.clear();
    encodeFrame(Dictionary{{"error", "reply too large"}, {"errorcode", kReplyTooLargeCode}}, bytes, nullptr);
  }
  IpcFrameHeader header;
  header.bodyLength = static_cast<std::uint32_t>(bytes.size() - IpcFrameHeader::kSize);
  header.type = IpcFrameType::Reply;
  header.descriptorCount = static_cast<std::uint16_t>(frame.descriptors.size());
  header.id = id;
  if (header.bodyLength > kIpcMemoryFileThreshold) {
    frame.memoryFile = createSealedMemoryFile(std::span(bytes).subspan(IpcFrameHeader::kSize));
  }
  frame.bytes = bytes;
  if (frame.memoryFile) {  // else the system has no room for one, and the body goes inside the frame
    header.flags = kIpcFlagMemoryFile;
    frame.memoryFileSize = header.bodyLength;
    frame.bytes = std::span(bytes).first(IpcFrameHeader::kSize);
  }
  putHeader(bytes, header);
  output_->send(std::move(frame));
}

std::optional<IpcError> IpcSocketConnection::encodeRequest(const Value& body, Bytes& frame) const {
  if (settings_.service) throw InternalInconsistency("a service has no requests for its clients");
  encodeFrame(body, frame, nullptr);
  const std::size_t size = frame.size() - IpcFrameHeader::kSize;
  if (size <= kIpcMaxInlineBody) return std::nullopt;
  return IpcError{IpcError::Kind::Other,
                  fmt::format("request too large ({} bytes, at most {})", size, kIpcMaxInlineBody)};
}

void IpcSocketConnection::transmit(IpcFrameType type, std::uint64_t id, Bytes& frame) {
  IpcFrameHeader header;
  header.bodyLength = static_cast<std::uint32_t>(frame.size() - IpcFrameHeader::kSize);
  header.type = type;
  header.id = id;
  putHeader(frame, header);
  output_->send({frame, UniqueFd()});
}

IpcError IpcSocketConnection::invalidError() {
  return {IpcError::Kind::ConnectionInvalid, reason_};
}

std::optional<IpcError> IpcSocketConnection::checkUsable() {
  if (claim_ == Claim::Unresumed) throw InternalInconsistency("a request on a connection that has not been resumed");
  if (cancelled_ || claim_ == Claim::Ended) return invalidError();
  return std::nullopt;
}

void IpcSocketConnection::sendWithReply(const Value& body, const SerialQueue& queue, ReplyFunction reply) {
  IpcBufferLease frame(IpcBufferPool::forWriting());
  auto error = encodeRequest(body, frame.buffer);
  std::uint64_t id = 0;
  if (!error) {
    MutexLock lock(mutex_);
    error = checkUsable();
    if (!error) {
      id = ++lastId_;
      pending_.emplace(id, Pending{self(), QueueReference(queue), reply});
      if (claim_ == Claim::Resting && waiters_.empty()) arm();
    }
  }
  if (error) {
    queue.async([reply = std::move(reply), error] { reply({Value(), error}); });
  } else {
    transmit(IpcFrameType::Request, id, frame.buffer);
  }
}

IpcReplyObject IpcSocketConnection::sendWithReplySync(const Value& body) {
  Waiter waiter;
  {
    IpcBufferLease frame(IpcBufferPool::forWriting());
    if (auto error = encodeRequest(body, frame.buffer)) return {Value(), std::move(error)};
    {
      MutexLock lock(mutex_);
      if (auto error = checkUsable()) return {Value(), std::move(error)};
      waiter.id = ++lastId_;
      waiters_.push_back(&waiter);
    }
    transmit(IpcFrameType::Request, waiter.id, frame.buffer);
  }
  DeferredWork::flushCurrent();
  while (claimFor(waiter)) {
    auto outcome = IpcFrameReader::Outcome::Read;
    while (outcome == IpcFrameReader::Outcome::Read && !isDone(waiter)) outcome = reader_.read(socket_, 0, *this);
    release(outcome, true);
  }
  return std::move(waiter.result);
}

// Waits until the waiter has its reply (false) or may read the connection itself (true).
bool IpcSocketConnection::claimFor(Waiter& waiter) {
  MutexLock lock(mutex_);
  waiter.reading = false;
  while (!waiter.done && claim_ != Claim::Armed && claim_ != Claim::Resting) waiter.wake.wait(lock.native());
  if (waiter.done) return false;
  if (claim_ == Claim::Armed) IpcEventPool::shared().disarm(socket_, token_);
  claim_ = Claim::Reading;
  waiter.reading = true;
  return true;
}

bool IpcSocketConnection::isDone(const Waiter& waiter) {
  MutexLock lock(mutex_);
  return waiter.done;
}

// A reply that nobody waits for is ignored, whatever is in it.
bool IpcSocketConnection::takeReply(IpcFrame& frame) {
  const std::uint64_t id = frame.header.id;
  const auto isIts = [id](const Waiter* waiter) { return waiter->id == id; };
  {
    MutexLock lock(mutex_);
    if (std::none_of(waiters_.begin(), waiters_.end(), isIts) && !pending_.contains(id)) return true;
  }
  IpcReplyObject result;
  if (!decode(frame, &result.body)) return false;
  Pending pending;
  {
    MutexLock lock(mutex_);
    const auto found = std::find_if(waiters_.begin(), waiters_.end(), isIts);
    if (found != waiters_.end()) {
      Waiter& waiter = **found;
      waiters_.erase(found);
      waiter.result = std::move(result);
      waiter.done = true;
      if (!waiter.reading) waiter.wake.notify_one();
      return true;
    }
    auto node = pending_.extract(id);
    if (node.empty()) return true;
    pending = std::move(node.mapped());
  }
  const QueueReference queue = pending.queue;
  queue.async([pending = std::move(pending), result = std::move(result)] { pending.reply(result); });
  return true;
}

void IpcSocketConnection::sendWithoutReply(const Value& body) {
  IpcBufferLease frame(IpcBufferPool::forWriting());
  if (const auto error = encodeRequest(body, frame.buffer)) {
    Log::processDefault().error("{}", error->describe());
    return;
  }
  transmit(IpcFrameType::RequestWithoutReply, nextId(), frame.buffer);
}

void IpcSocketConnection::announceTermination() {
  IpcBufferLease frame(IpcBufferPool::forWriting());
  frame.buffer.resize(IpcFrameHeader::kSize);
  transmit(IpcFrameType::TerminationImminent, nextId(), frame.buffer);
}

std::uint64_t IpcSocketConnection::nextId() {
  MutexLock lock(mutex_);
  return ++lastId_;
}

}  // namespace platform
