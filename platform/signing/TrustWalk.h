// TrustWalk: the way from "/" to a file, every directory of it held open, with what the rule of trust says of each.
//
// Everything is judged as it was opened and nothing is looked up by path twice, so that nobody can put something else
// in its place between the judgement and the reading. A trusted way stays trusted: only its owners can change it. Used
// by one thread; lives as long as one question.
#pragma once

#include <sys/stat.h>

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

namespace platform {

class TrustWalk {
 public:
  /// One opened file or directory. It was not read, and opening it had no effect on it.
  struct Item {
    UniqueFd fd;
    std::string path;
    struct stat status {};
    /// Why it does not count, all that is above it aside; nothing when it does.
    std::optional<Error> problem;
  };

  /// Opens the directory `path`, after resolving the links in it, and all directories above it. Nothing and `error`
  /// when one cannot be opened (code 260 when it does not exist).
  static std::optional<TrustWalk> to(const std::string& path, Error* error);
  /// Goes on to the directory `name` of the deepest one, which must not be a link. False and `error` on failure.
  [[nodiscard]] bool descend(const std::string& name, Error* error);

  /// The directories, "/" first; never empty.
  const std::vector<Item>& directories() const noexcept { return directories_; }
  /// The first problem of all directories.
  std::optional<Error> problem() const;

  /// Opens `name` in `directory`, whatever it is, a link itself and not what it leads to. Nothing and `error` when that
  /// fails (code 260 when there is none). Its problem says too when it is neither a regular file nor a directory.
  static std::optional<Item> open(const Item& directory, const std::string& name, Error* error);
  /// The same, and a problem when it is not a regular file.
  static std::optional<Item> openFile(const Item& directory, const std::string& name, Error* error);

 private:
  TrustWalk() = default;
  std::vector<Item> directories_;
};

/// The dictionary in the property list `file`. Nothing and `error`, which names the file, when it holds no dictionary
/// or cannot be read.
Value readDictionary(const TrustWalk::Item& file, Error* error);

}  // namespace platform
