// A broken contract inside the program: never caused by input, never answered as an error. The daemon logs it at fault
// and aborts; it never crosses a queue or a socket.
#pragma once

#include <stdexcept>
#include <string>

namespace platform {

class InternalInconsistency : public std::logic_error {
 public:
  explicit InternalInconsistency(const std::string& description) : std::logic_error(description) {}
};

}  // namespace platform
