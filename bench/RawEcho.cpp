#include "bench/RawEcho.h"

#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>

namespace bench {

namespace {

bool transferAll(int fd, std::vector<std::uint8_t>& bytes, bool out) {
  for (std::size_t done = 0; done < bytes.size();) {
    const ssize_t count = out ? ::write(fd, bytes.data() + done, bytes.size() - done)
                              : ::read(fd, bytes.data() + done, bytes.size() - done);
    if (count <= 0) return false;
    done += static_cast<std::size_t>(count);
  }
  return true;
}

}  // namespace

RawEcho::RawEcho(std::size_t requestSize, std::size_t replySize) : request_(requestSize), reply_(replySize) {
  int ends[2];
  if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) std::abort();
  socket_.reset(ends[0]);
  platform::UniqueFd other(ends[1]);
  process_ = ::fork();
  if (process_ < 0) std::abort();
  if (process_ == 0) {
    socket_.reset();
    while (transferAll(other.get(), request_, false) && transferAll(other.get(), reply_, true)) {
    }
    ::_exit(0);
  }
}

RawEcho::~RawEcho() {
  socket_.reset();  // the process ends at the end of its input
  ::waitpid(process_, nullptr, 0);
}

void RawEcho::roundTrip() {
  if (!transferAll(socket_.get(), request_, true) || !transferAll(socket_.get(), reply_, false)) std::abort();
}

}  // namespace bench
