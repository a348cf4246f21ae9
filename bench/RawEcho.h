// RawEcho: the floor under every round trip: a process of its own behind a Unix stream socket that answers frames of
// one size with frames of another, both ends blocking. Whatever the daemon takes more is what it adds.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <vector>

#include "platform/files/UniqueFd.h"

namespace bench {

class RawEcho {
 public:
  /// Starts the process (a fork that calls nothing but read and write).
  RawEcho(std::size_t requestSize, std::size_t replySize);
  /// Ends it.
  ~RawEcho();
  RawEcho(const RawEcho&) = delete;
  RawEcho& operator=(const RawEcho&) = delete;

  /// One request and its reply.
  void roundTrip();

 private:
  platform::UniqueFd socket_;
  pid_t process_ = -1;
  std::vector<std::uint8_t> request_;
  std::vector<std::uint8_t> reply_;
};

}  // namespace bench
