// PosixFiles: the file service over the system calls. Without state; callable from any thread.
//
// writeFileAtomic is made of single steps, each a virtual operation that answers as its system call does (-1 and errno
// on failure), so that a disk fault is one override: fail the n-th step, for n = 1, 2, 3 ... until the whole succeeds.
#pragma once

#include <sys/types.h>

#include "platform/files/Files.h"

namespace platform {

class PosixFiles : public Files {
 public:
  [[nodiscard]] std::optional<Bytes> readFileData(const std::string& path, Error* error) override;
  [[nodiscard]] std::optional<Error> writeFileAtomic(const std::string& path,
                                                     std::span<const std::uint8_t> bytes) override;
  [[nodiscard]] std::optional<Error> createDirectory(const std::string& path, bool intermediates,
                                                     unsigned mode) override;
  [[nodiscard]] std::optional<Error> linkFile(const std::string& from, const std::string& to) override;
  [[nodiscard]] std::optional<std::string> resolvePath(const std::string& path) override;

 protected:
  // The steps in their order. unlinkFile comes when a step failed, and when a dead process left its temporary file.
  virtual int openDirectory(const char* path);
  virtual int openTemporary(int directory, const char* name);
  virtual ssize_t writeSome(int fd, const std::uint8_t* bytes, std::size_t size);
  virtual int syncFile(int fd);
  virtual int renameFile(int directory, const char* from, const char* to);
  virtual int syncDirectory(int directory);
  virtual int unlinkFile(int directory, const char* name);

 private:
  std::optional<Error> writeTemporary(int directory, const char* name, const std::string& path,
                                      std::span<const std::uint8_t> bytes);
};

}  // namespace platform
