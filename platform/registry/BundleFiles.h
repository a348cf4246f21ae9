// BundleFiles: how the registry reads bundle folders that it does not trust: no link is followed below a folder,
// nothing but regular files is read (a pipe never blocks a reader), and no file is read without a limit. Free
// functions, for any thread.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "platform/files/UniqueFd.h"
#include "platform/registry/BundleRegistration.h"
#include "platform/value/Error.h"

namespace platform {

/// The largest property list that is read from a bundle, in bytes.
inline constexpr std::size_t kLargestBundleFile = std::size_t{16} << 20;

/// Opens the directory at `path`, whose last component must not be a link; empty with errno set on failure.
UniqueFd openDirectory(const std::string& path);
/// Opens the directory `relative` ("a/b") below `directory` without following a link in any component.
UniqueFd openDirectoryBelow(int directory, std::string_view relative);

/// The state of `name` in `directory` (of the link itself when it is one); all zero when there is none.
FileStamp stampOf(int directory, const std::string& name);

/// The property list in the regular file `name` of `directory`, and its state when it was opened (all zero when there
/// is none). Nothing and `error` on failure: code 260 of domain "POSIX" for a missing file.
Value readPropertyListIn(int directory, const std::string& name, FileStamp* stamp, Error* error);

struct DirectoryEntry {
  enum class Kind { Directory, Link, Other };
  std::string name;
  Kind kind = Kind::Other;
};
/// The entries of `directory` but for "." and "..", sorted by name; empty when it cannot be read.
std::vector<DirectoryEntry> entriesOf(int directory);

}  // namespace platform
