#include "platform/ipc/IpcOutput.h"

#include <fmt/format.h>
#include <linux/sockios.h>
#include <sys/ioctl.h>
#include <sys/socket.h>

#include <array>
#include <cerrno>
#include <cstring>

#include "platform/ipc/IpcEventPool.h"
#include "platform/ipc/IpcWriter.h"

namespace platform {
namespace {

constexpr std::size_t kMaxDescriptors = 253;
constexpr std::chrono::milliseconds kRetry{50};
// What the socket reports as unread is memory, never less than this for even one byte; while the peer takes the last
// bytes, a few may still be reported when the writer has been woken.
constexpr int kUnreadNoise = 64;

}  // namespace

IpcOutput::IpcOutput(UniqueFd socket, std::size_t maxBacklog) : maxBacklog_(maxBacklog), socket_(std::move(socket)) {}

IpcOutput::~IpcOutput() {
  close();
}

void IpcOutput::send(Frame frame) {
  {
    MutexLock lock(mutex_);
    if (!socket_ || broken_) return;
    std::size_t sent = 0;
    if (backlog_.empty() && (!frame.memoryFile || memoryFileTaken())) {
      const Progress progress = sendSome(frame.bytes, &sent, frame.memoryFile.get(), frame.descriptors);
      if (progress == Progress::Done) {
        if (frame.memoryFile) memoryFileUnread_ = true;
        return;
      }
      if (progress == Progress::Failed) return;
      if (sent > 0 && frame.memoryFile) {
        memoryFileUnread_ = true;
        frame.memoryFile.reset();
      }
    }
    if (enqueue(frame, sent)) return;
    broken_ = true;
    dropBacklog();
  }
  overflowed_(fmt::format("more than {} bytes wait to be sent", maxBacklog_));
}

// What has been sent of the frame, if anything, took its descriptors along.
bool IpcOutput::enqueue(Frame& frame, std::size_t sent) {
  Waiting waiting;
  waiting.bytes.assign(frame.bytes.begin(), frame.bytes.end());
  waiting.sent = sent;
  waiting.memoryFile = std::move(frame.memoryFile);
  waiting.memoryFileSize = frame.memoryFileSize;
  waiting.descriptors = std::move(frame.descriptors);
  waiting.owner = std::move(frame.owner);
  if (!backlog_.empty()) {
    backlogBytes_ += waiting.weight();
    if (backlogBytes_ > maxBacklog_) return false;
  }
  backlog_.push_back(std::move(waiting));
  if (watch_ == 0) watch_ = IpcWriter::shared().watch(socket_.get(), weak_from_this());
  if (watch_ == 0) retryLater();
  return true;
}

void IpcOutput::flush() {
  std::shared_ptr<IpcOutput> keptUntilReturn;
  MutexLock lock(mutex_);
  if (!socket_) return;
  sendBacklog();
  if (!backlog_.empty()) return;
  if (watch_ != 0) IpcWriter::shared().unwatch(socket_.get(), std::exchange(watch_, 0));
  keptUntilReturn.swap(closing_);
  if (keptUntilReturn) closeNow();
}

void IpcOutput::sendBacklog() {
  while (!backlog_.empty()) {
    Waiting& head = backlog_.front();
    const bool first = head.sent == 0;
    if (first && head.memoryFile && !memoryFileTaken()) {
      retryLater();
      return;
    }
    const Progress progress =
        sendSome(std::span(head.bytes).subspan(head.sent), &head.sent, first ? head.memoryFile.get() : -1,
                 first ? std::span<const int>(head.descriptors) : std::span<const int>());
    if (progress == Progress::Failed) {
      dropBacklog();
      return;
    }
    if (head.sent > 0 && head.memoryFile) {
      memoryFileUnread_ = true;
      head.memoryFile.reset();
    }
    if (progress != Progress::Done) {
      if (progress == Progress::Blocked) retryLater();
      return;
    }
    backlog_.pop_front();
    if (!backlog_.empty()) backlogBytes_ -= backlog_.front().weight();
  }
}

// Sends from the front of `bytes` what the socket takes, and adds that to `sent`. Partly: the socket is full and will
// report room. Blocked: the system is short of something that nobody reports.
IpcOutput::Progress IpcOutput::sendSome(std::span<const std::uint8_t> bytes, std::size_t* sent, int memoryFile,
                                        std::span<const int> descriptors) {
  std::array<int, kMaxDescriptors> passed;
  std::size_t count = 0;
  if (memoryFile >= 0) passed[count++] = memoryFile;
  for (const int fd : descriptors) passed[count++] = fd;
  alignas(struct cmsghdr) std::array<char, CMSG_SPACE(sizeof passed)> control;
  while (!bytes.empty()) {
    struct iovec part = {const_cast<std::uint8_t*>(bytes.data()), bytes.size()};
    struct msghdr message = {};
    message.msg_iov = &part;
    message.msg_iovlen = 1;
    if (count > 0) {
      message.msg_control = control.data();
      message.msg_controllen = CMSG_SPACE(count * sizeof(int));
      struct cmsghdr* const header = CMSG_FIRSTHDR(&message);
      header->cmsg_level = SOL_SOCKET;
      header->cmsg_type = SCM_RIGHTS;
      header->cmsg_len = CMSG_LEN(count * sizeof(int));
      std::memcpy(CMSG_DATA(header), passed.data(), count * sizeof(int));
    }
    const ssize_t size = ::sendmsg(socket_.get(), &message, MSG_DONTWAIT | MSG_NOSIGNAL);
    if (size >= 0) {
      *sent += static_cast<std::size_t>(size);
      bytes = bytes.subspan(static_cast<std::size_t>(size));
      count = 0;
    } else if (errno == EAGAIN) {
      return Progress::Partly;
    } else if (errno == ENOBUFS || errno == ENOMEM || errno == ETOOMANYREFS) {
      return Progress::Blocked;
    } else if (errno != EINTR) {
      broken_ = true;  // the peer has gone; the reader comes to know it by itself
      return Progress::Failed;
    }
  }
  return Progress::Done;
}

bool IpcOutput::memoryFileTaken() {
  if (!memoryFileUnread_) return true;
  int unread = 0;
  if (::ioctl(socket_.get(), SIOCOUTQ, &unread) != 0 || unread < kUnreadNoise) memoryFileUnread_ = false;
  return !memoryFileUnread_;
}

void IpcOutput::retryLater() {
  if (std::exchange(retrying_, true)) return;
  IpcEventPool::shared().callAfter(kRetry, [weak = weak_from_this()] {
    const auto self = weak.lock();
    if (!self) return;
    {
      MutexLock lock(self->mutex_);
      self->retrying_ = false;
    }
    self->flush();
  });
}

void IpcOutput::dropBacklog() {
  backlog_.clear();
  backlogBytes_ = 0;
}

void IpcOutput::shutdown() {
  MutexLock lock(mutex_);
  if (socket_) (void)::shutdown(socket_.get(), SHUT_RDWR);
}

void IpcOutput::close() {
  MutexLock lock(mutex_);
  if (!closing_) closeNow();
}

void IpcOutput::closeWhenSent() {
  MutexLock lock(mutex_);
  if (backlog_.empty()) {
    closeNow();
  } else {
    closing_ = shared_from_this();
  }
}

void IpcOutput::closeNow() {
  if (watch_ != 0) IpcWriter::shared().unwatch(socket_.get(), std::exchange(watch_, 0));
  dropBacklog();
  socket_.reset();
}

}  // namespace platform
