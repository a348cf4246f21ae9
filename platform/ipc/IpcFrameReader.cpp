#include "platform/ipc/IpcFrameReader.h"

#include <fmt/format.h>
#include <poll.h>
#include <sys/socket.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstring>
#include <optional>
#include <utility>

#include "platform/ipc/IpcBufferPool.h"
#include "platform/ipc/IpcMemoryFile.h"

// Older system headers lack it: a pidfd of the sender, for sockets on which somebody has asked for it.
#ifndef SCM_PIDFD
#define SCM_PIDFD 0x04
#endif

namespace platform {
namespace {

constexpr std::size_t kReadSize = std::size_t{64} << 10;
constexpr std::size_t kFirstBodySize = std::size_t{256} << 10;
// The most descriptors that the kernel passes at once.
constexpr std::size_t kMaxDescriptors = 253;
constexpr std::size_t kControlSize =
    CMSG_SPACE(kMaxDescriptors * sizeof(int)) + CMSG_SPACE(sizeof(struct ucred)) + CMSG_SPACE(sizeof(int));

// Of the request bodies of all connections.
std::atomic<std::size_t> unfinishedBytes = 0;

}  // namespace

IpcFrameReader::~IpcFrameReader() {
  abandon();
}

bool IpcFrameReader::refuse(std::string reason) {
  brokenReason_ = std::move(reason);
  abandon();
  return false;
}

void IpcFrameReader::abandon() {
  descriptors_.clear();
  rest_ = {};
  dropBody();
}

IpcFrameReader::Outcome IpcFrameReader::read(int socket, int flags, Receiver& receiver) {
  IpcBufferLease scratch(IpcBufferPool::forReading());
  if (scratch.buffer.size() < kReadSize) scratch.buffer.resize(kReadSize);
  std::array<struct iovec, 2> parts{};
  std::size_t count = 0;
  std::size_t direct = 0;
  if (hasHeader_ && bodyFill_ > 0) {
    growBody();
    direct = std::min(body_.size(), inlineSize()) - bodyFill_;
    parts[count++] = {body_.data() + bodyFill_, direct};
  }
  parts[count++] = {scratch.buffer.data(), kReadSize};
  alignas(struct cmsghdr) std::array<char, kControlSize> control;
  struct msghdr message = {};
  message.msg_iov = parts.data();
  message.msg_iovlen = count;
  message.msg_control = control.data();
  message.msg_controllen = control.size();
  ssize_t size = -1;
  while ((size = ::recvmsg(socket, &message, flags | MSG_CMSG_CLOEXEC)) < 0) {
    if (errno == EAGAIN && (flags & MSG_DONTWAIT) == 0) {
      // Whoever handed the socket over has made it non-blocking.
      struct pollfd entry = {socket, POLLIN, 0};
      (void)::poll(&entry, 1, -1);
    } else if (errno == EAGAIN) {
      return Outcome::WouldBlock;
    } else if (errno != EINTR) {
      return Outcome::EndOfInput;
    }
  }
  if (size == 0) return Outcome::EndOfInput;
  if (!takeControl(message)) return Outcome::Broken;
  const std::size_t received = static_cast<std::size_t>(size);
  const std::size_t toBody = std::min(received, direct);
  bodyFill_ += toBody;
  if (!countBody(toBody)) return Outcome::Broken;
  return consume({scratch.buffer.data(), received - toBody}, receiver);
}

IpcFrameReader::Outcome IpcFrameReader::resume(Receiver& receiver) {
  if (!refused_) return Outcome::Read;
  refused_ = false;
  const Bytes rest = std::exchange(rest_, {});
  return consume(rest, receiver);
}

// Takes the descriptors and the sender that came with bytes. Descriptors are owned before anything is judged.
bool IpcFrameReader::takeControl(struct msghdr& message) {
  std::optional<struct ucred> sender;
  for (struct cmsghdr* part = CMSG_FIRSTHDR(&message); part != nullptr; part = CMSG_NXTHDR(&message, part)) {
    if (part->cmsg_level != SOL_SOCKET) continue;
    if (part->cmsg_type == SCM_CREDENTIALS && part->cmsg_len >= CMSG_LEN(sizeof(struct ucred))) {
      std::memcpy(&sender.emplace(), CMSG_DATA(part), sizeof(struct ucred));
    } else if (part->cmsg_type == SCM_RIGHTS || part->cmsg_type == SCM_PIDFD) {
      const std::size_t count = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
      for (std::size_t i = 0; i < count; ++i) {
        int fd = -1;
        std::memcpy(&fd, CMSG_DATA(part) + i * sizeof fd, sizeof fd);
        UniqueFd owned(fd);
        if (part->cmsg_type == SCM_RIGHTS) descriptors_.push_back(std::move(owned));
      }
    }
  }
  if (rules_.service && (!sender || sender->pid != rules_.sender)) {
    return refuse(
        fmt::format("bytes of process {} on the connection of process {}", sender ? sender->pid : 0, rules_.sender));
  }
  if (rules_.service && !descriptors_.empty()) return refuse("malformed frame: descriptors are refused");
  if ((message.msg_flags & MSG_CTRUNC) != 0) return refuse("malformed frame: descriptors were lost");
  if (descriptors_.size() > 2 * kMaxDescriptors) return refuse("malformed frame: undeclared descriptors");
  return true;
}

bool IpcFrameReader::checkHeader() {
  Error error;
  const auto header = IpcFrameHeader::parse(headerBytes_, &error);
  if (!header) return refuse(error.localizedDescription());
  header_ = *header;
  const bool reply = header_.type == IpcFrameType::Reply;
  if (rules_.service && reply) return refuse("malformed frame: a reply that nobody asked for");
  if (!reply && header_.hasMemoryFile()) return refuse("malformed frame: memory files are refused");
  if (!reply && header_.descriptorCount > 0) return refuse("malformed frame: descriptors are refused");
  if (descriptorsOfFrame() > kMaxDescriptors) {
    return refuse(fmt::format("malformed frame: {} descriptors cannot be passed", descriptorsOfFrame()));
  }
  const std::uint32_t limit = reply ? rules_.maxReplyBody : rules_.maxRequestBody;
  if (header_.bodyLength > limit) {
    return refuse(fmt::format("malformed frame: a body of {} bytes is above {}", header_.bodyLength, limit));
  }
  return true;
}

// Once all complete frames have been handed on: the kernel ends a read with the bytes that descriptors came with, so
// that what is left belongs to the frame in the making, or to nobody.
bool IpcFrameReader::checkDescriptors() {
  const bool undeclared = hasHeader_         ? descriptors_.size() > descriptorsOfFrame()
                          : headerFill_ == 0 ? !descriptors_.empty()
                                             : false;
  return !undeclared || refuse("malformed frame: undeclared descriptors");
}

// Room for more of the body: memory is taken for what has come, doubling, never for what the length claims.
void IpcFrameReader::growBody() {
  if (bodyFill_ < body_.size()) return;
  body_.resize(std::min(inlineSize(), std::max(kFirstBodySize, body_.size() * 2)));
}

bool IpcFrameReader::addToBody(std::span<const std::uint8_t> bytes) {
  if (bodyFill_ == 0) body_ = IpcBufferPool::forReading().take();
  for (std::size_t done = 0; done < bytes.size();) {
    growBody();
    const std::size_t part = std::min(bytes.size() - done, body_.size() - bodyFill_);
    std::memcpy(body_.data() + bodyFill_, bytes.data() + done, part);
    bodyFill_ += part;
    done += part;
  }
  return countBody(bytes.size());
}

bool IpcFrameReader::countBody(std::size_t received) {
  if (header_.type == IpcFrameType::Reply || received == 0) return true;
  counted_ += received;
  if (unfinishedBytes.fetch_add(received) + received <= rules_.maxUnfinishedBytes) return true;
  return refuse(fmt::format("unfinished bodies exceed {} bytes", rules_.maxUnfinishedBytes));
}

void IpcFrameReader::uncountBody() {
  unfinishedBytes.fetch_sub(std::exchange(counted_, 0));
}

void IpcFrameReader::dropBody() {
  uncountBody();
  bodyFill_ = 0;
  IpcBufferPool::forReading().give(std::exchange(body_, {}));
}

IpcFrameReader::Outcome IpcFrameReader::consume(std::span<const std::uint8_t> bytes, Receiver& receiver) {
  for (;;) {
    if (!hasHeader_) {
      const std::size_t part = std::min(bytes.size(), headerBytes_.size() - headerFill_);
      std::copy_n(bytes.begin(), part, headerBytes_.begin() + static_cast<std::ptrdiff_t>(headerFill_));
      headerFill_ += part;
      bytes = bytes.subspan(part);
      if (headerFill_ < headerBytes_.size()) break;
      if (!checkHeader()) return Outcome::Broken;
      hasHeader_ = true;
    }
    const std::size_t missing = inlineSize() - bodyFill_;
    const bool whole = bodyFill_ == 0 && bytes.size() >= missing;
    if (!whole && missing > 0) {
      const std::size_t part = std::min(missing, bytes.size());
      if (part > 0 && !addToBody(bytes.first(part))) return Outcome::Broken;
      bytes = bytes.subspan(part);
      if (part < missing) break;
    }
    if (!receiver.mayTake(header_)) {
      rest_.assign(bytes.begin(), bytes.end());
      refused_ = true;
      return Outcome::Refused;
    }
    const auto body = whole ? bytes.first(missing) : std::span<const std::uint8_t>(body_).first(bodyFill_);
    if (whole) bytes = bytes.subspan(missing);
    if (bytes.empty() && !checkDescriptors()) return Outcome::Broken;
    const Outcome outcome = handOn(body, receiver);
    if (outcome != Outcome::Read) return outcome;
  }
  return checkDescriptors() ? Outcome::Read : Outcome::Broken;
}

IpcFrameReader::Outcome IpcFrameReader::handOn(std::span<const std::uint8_t> body, Receiver& receiver) {
  // The memory file comes first, then the descriptors of the body.
  const std::size_t passed = descriptorsOfFrame();
  if (descriptors_.size() < passed) {
    (void)refuse("malformed frame: descriptors are missing");
    return Outcome::Broken;
  }
  IpcMemoryFileView view;
  if (header_.hasMemoryFile()) {
    std::string reason;
    if (!view.map(descriptors_.front().get(), header_.bodyLength, &reason)) {
      (void)refuse(std::move(reason));
      return Outcome::Broken;
    }
    descriptors_.front().reset();
    body = view.bytes();
  }
  uncountBody();  // it is finished, however long the receiver takes
  IpcFrame frame{header_, body, std::span(descriptors_).first(passed).last(header_.descriptorCount)};
  const bool more = receiver.take(frame);
  descriptors_.erase(descriptors_.begin(), descriptors_.begin() + static_cast<std::ptrdiff_t>(passed));
  if (bodyFill_ > 0) dropBody();
  hasHeader_ = false;
  headerFill_ = 0;
  return more ? Outcome::Read : Outcome::Stopped;
}

}  // namespace platform
