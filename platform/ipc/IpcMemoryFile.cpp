#include "platform/ipc/IpcMemoryFile.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

// Older system headers lack it.
#ifndef MFD_NOEXEC_SEAL
#define MFD_NOEXEC_SEAL 0x0008U
#endif

namespace platform {
namespace {

constexpr int kRequiredSeals = F_SEAL_WRITE | F_SEAL_GROW | F_SEAL_SHRINK;

UniqueFd createMemoryFile() {
  const char* const name = "extora-reply";
  UniqueFd file(::memfd_create(name, MFD_CLOEXEC | MFD_ALLOW_SEALING | MFD_NOEXEC_SEAL));
  if (!file && errno == EINVAL) file.reset(::memfd_create(name, MFD_CLOEXEC | MFD_ALLOW_SEALING));
  return file;
}

}  // namespace

UniqueFd createSealedMemoryFile(std::span<const std::uint8_t> bytes) {
  UniqueFd file = createMemoryFile();
  for (std::size_t written = 0; file && written < bytes.size();) {
    const ssize_t size = ::write(file.get(), bytes.data() + written, bytes.size() - written);
    if (size > 0) {
      written += static_cast<std::size_t>(size);
    } else if (size == 0 || errno != EINTR) {
      return {};
    }
  }
  if (file && ::fcntl(file.get(), F_ADD_SEALS, kRequiredSeals | F_SEAL_SEAL) != 0) return {};
  return file;
}

bool IpcMemoryFileView::map(int file, std::size_t size, std::string* reason) {
  const int seals = ::fcntl(file, F_GET_SEALS);
  if (seals < 0 || (seals & kRequiredSeals) != kRequiredSeals) {
    *reason = "malformed frame: its memory file is not sealed";
    return false;
  }
  struct stat status = {};
  if (::fstat(file, &status) != 0 || status.st_size < 0 || static_cast<std::size_t>(status.st_size) != size ||
      size == 0) {
    *reason = fmt::format("malformed frame: its memory file has not the {} bytes it claims", size);
    return false;
  }
  void* const address = ::mmap(nullptr, size, PROT_READ, MAP_PRIVATE | MAP_POPULATE, file, 0);
  if (address == MAP_FAILED) {
    *reason = fmt::format("its memory file cannot be mapped: {}", std::strerror(errno));
    return false;
  }
  bytes_ = {static_cast<std::uint8_t*>(address), size};
  return true;
}

IpcMemoryFileView::~IpcMemoryFileView() {
  if (!bytes_.empty()) ::munmap(bytes_.data(), bytes_.size());
}

}  // namespace platform
