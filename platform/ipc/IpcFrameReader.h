// IpcFrameReader: takes the bytes and descriptors of one socket apart into frames, and keeps what is unfinished.
//
// 1. Bytes are received into a pooled buffer; a frame that lies there whole is handed on from there, without a copy.
//    Only the rest of an unfinished frame is kept, in a buffer of its own into which the next read goes directly.
// 2. What is broken is found as soon as its bytes are there, whatever a length claims; frames before it were handed on.
// 3. The receiver may refuse to take a further frame: the reader keeps what it has and goes on with resume().
//
// Not safe for two threads at once: whoever reads the connection owns it.
#pragma once

#include <sys/types.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/ipc/IpcFrame.h"
#include "platform/value/Value.h"

struct msghdr;

namespace platform {

/// One complete frame; valid only for the call that hands it on. Descriptors that are left in it are closed afterwards.
struct IpcFrame {
  IpcFrameHeader header;
  std::span<const std::uint8_t> body;
  std::span<UniqueFd> descriptors;
};

class IpcFrameReader {
 public:
  /// What a connection lets in.
  struct Rules {
    bool service = false;  ///< requests alone, and neither memory files nor descriptors
    pid_t sender = 0;      ///< of a service: the only process whose bytes count
    std::uint32_t maxRequestBody = kIpcMaxInlineBody;
    std::uint32_t maxReplyBody = kIpcMaxReplyBody;
    std::size_t maxUnfinishedBytes = kIpcMaxUnfinishedBytes;  ///< of the request bodies of all connections together
  };

  class Receiver {
   public:
    virtual ~Receiver() = default;
    /// False: the frame cannot be taken now; reading stops before it.
    virtual bool mayTake(const IpcFrameHeader& header) = 0;
    /// False: nothing more is wanted from this connection.
    virtual bool take(IpcFrame& frame) = 0;
  };

  enum class Outcome {
    Read,        ///< all frames that were complete have been handed on
    Refused,     ///< the receiver could not take a frame: go on with resume()
    Stopped,     ///< the receiver wants nothing more
    WouldBlock,  ///< nothing was there
    EndOfInput,  ///< the peer sends nothing more, or the socket failed
    Broken,      ///< brokenReason() says why
  };

  explicit IpcFrameReader(const Rules& rules) : rules_(rules) {}
  ~IpcFrameReader();
  IpcFrameReader(const IpcFrameReader&) = delete;
  IpcFrameReader& operator=(const IpcFrameReader&) = delete;

  /// Receives once (`flags` as for recvmsg) and hands on what is complete.
  [[nodiscard]] Outcome read(int socket, int flags, Receiver& receiver);
  /// Goes on with what Refused left.
  [[nodiscard]] Outcome resume(Receiver& receiver);
  /// Drops what is unfinished or refused; nothing is read afterwards.
  void abandon();
  /// There is something left that was refused.
  bool hasRefused() const noexcept { return refused_; }
  const std::string& brokenReason() const noexcept { return brokenReason_; }

 private:
  /// What is left is broken: drops it; answers false.
  bool refuse(std::string reason);
  bool takeControl(struct msghdr& message);
  bool checkHeader();
  bool checkDescriptors();
  bool addToBody(std::span<const std::uint8_t> bytes);
  void growBody();
  bool countBody(std::size_t received);
  void uncountBody();
  void dropBody();
  Outcome consume(std::span<const std::uint8_t> bytes, Receiver& receiver);
  Outcome handOn(std::span<const std::uint8_t> body, Receiver& receiver);
  /// Bytes of the body that stand in the stream: none when it is in a memory file.
  std::size_t inlineSize() const noexcept { return header_.hasMemoryFile() ? 0 : header_.bodyLength; }
  /// Descriptors of the frame, its memory file counted.
  std::size_t descriptorsOfFrame() const noexcept {
    return header_.descriptorCount + (header_.hasMemoryFile() ? std::size_t{1} : 0);
  }

  const Rules rules_;

  // The frame in the making.
  std::array<std::uint8_t, IpcFrameHeader::kSize> headerBytes_{};
  std::size_t headerFill_ = 0;
  bool hasHeader_ = false;
  IpcFrameHeader header_;
  Bytes body_;  // of which bodyFill_ bytes have been received
  std::size_t bodyFill_ = 0;
  std::size_t counted_ = 0;            // of the body, among the unfinished bytes of all connections
  std::vector<UniqueFd> descriptors_;  // received, and not yet handed on

  // After a refusal: what follows the header, or the complete body in body_.
  bool refused_ = false;
  Bytes rest_;

  std::string brokenReason_;
};

}  // namespace platform
