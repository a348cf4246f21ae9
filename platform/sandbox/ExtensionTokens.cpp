// A token is <signature in hex>;<class>;<flags>;<number>;<device>;<inode>;<birth time>;<directory or not>;<subject>,
// the numbers in hex. The subject comes last, so that it may hold anything.
#include "platform/sandbox/ExtensionTokens.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <linux/openat2.h>
#include <nettle/memops.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <charconv>
#include <climits>
#include <iterator>
#include <string_view>

#include "platform/files/UniqueFd.h"
#include "platform/value/InternalInconsistency.h"
#include "platform/value/Utf8.h"

namespace platform {
namespace {

constexpr char kSeparator = ';';
constexpr std::size_t kSignatureLength = 2 * SHA256_DIGEST_SIZE;
constexpr std::size_t kShownLength = 8;
constexpr std::uint64_t kNanoseconds = 1'000'000'000;
// The path was made canonical when the token was issued.
constexpr unsigned kCanonicalFlag = 1;

// A path as realpath would write it, as far as that can be seen without looking at the links on it.
bool isWrittenCanonically(std::string_view path) {
  if (!path.starts_with('/') || (path.size() > 1 && path.ends_with('/'))) return false;
  for (const char* detour : {"//", "/./", "/../"}) {
    if (path.find(detour) != std::string_view::npos) return false;
  }
  return !path.ends_with("/.") && !path.ends_with("/..");
}

// The kernel's own name of an opened file.
std::optional<std::string> nameOf(int fd, int* errorNumber) {
  std::array<char, PATH_MAX + 1> buffer;
  const ssize_t size = ::readlink(fmt::format("/proc/self/fd/{}", fd).c_str(), buffer.data(), buffer.size());
  if (size < 0) {
    *errorNumber = errno;
  } else if (buffer[0] != '/' || static_cast<std::size_t>(size) == buffer.size()) {
    *errorNumber = EPERM;  // it lies outside of what this process sees, or too deep
  } else {
    return std::string(buffer.data(), static_cast<std::size_t>(size));
  }
  return std::nullopt;
}

struct Place {
  UniqueFd fd;  ///< opened without any effect on what is opened, whatever it is
  std::string canonicalPath;
};

// What is asked for lies as a rule where its path says, and one call both opens it and shows that no link is on the
// way. Asking the kernel for its name costs some 30 microseconds more.
std::optional<Place> openPlace(const std::string& path, int* errorNumber) {
  if (path.find('\0') != std::string::npos) {
    *errorNumber = EINVAL;
    return std::nullopt;
  }
  if (isWrittenCanonically(path)) {
    struct open_how how = {};
    how.flags = O_PATH | O_CLOEXEC;
    how.resolve = RESOLVE_NO_SYMLINKS;
    const int fd = static_cast<int>(::syscall(SYS_openat2, AT_FDCWD, path.c_str(), &how, sizeof how));
    if (fd >= 0) return Place{UniqueFd(fd), path};
  }
  UniqueFd fd(::open(path.c_str(), O_PATH | O_CLOEXEC));
  if (!fd) {
    *errorNumber = errno;
    return std::nullopt;
  }
  auto name = nameOf(fd.get(), errorNumber);
  if (!name) return std::nullopt;
  return Place{std::move(fd), std::move(*name)};
}

bool liesAtOrBelow(const std::string& path, const std::string& boundary) {
  if (boundary == "/") return true;
  if (boundary.empty()) return false;
  return path.starts_with(boundary) && (path.size() == boundary.size() || path[boundary.size()] == '/');
}

// Takes the text up to the next separator off `rest`; false when there is none.
bool takeField(std::string_view& rest, std::string_view* field) {
  const std::size_t end = rest.find(kSeparator);
  if (end == std::string_view::npos) return false;
  *field = rest.substr(0, end);
  rest.remove_prefix(end + 1);
  return true;
}

bool takeNumber(std::string_view& rest, std::uint64_t* number) {
  std::string_view field;
  if (!takeField(rest, &field)) return false;
  const auto [end, bad] = std::from_chars(field.data(), field.data() + field.size(), *number, 16);
  return bad == std::errc() && end == field.data() + field.size();
}

std::optional<SandboxGrant> parseClaims(std::string_view rest) {
  std::string_view extensionClass;
  std::uint64_t flags = 0;
  std::uint64_t number = 0;
  std::uint64_t directory = 0;
  SandboxGrant grant;
  const bool sound = takeField(rest, &extensionClass) && takeNumber(rest, &flags) && takeNumber(rest, &number) &&
                     takeNumber(rest, &grant.place.device) && takeNumber(rest, &grant.place.inode) &&
                     takeNumber(rest, &grant.place.born) && takeNumber(rest, &directory);
  if (!sound) return std::nullopt;
  grant.extensionClass = extensionClass;
  grant.place.isDirectory = directory != 0;
  grant.subject = rest;
  return grant;
}

void fillRandom(void* bytes, std::size_t size) {
  // So few bytes come at once, or not at all.
  if (::getrandom(bytes, size, 0) != static_cast<ssize_t>(size)) throw InternalInconsistency("no random bytes");
}

}  // namespace

std::optional<PlaceIdentity> PlaceIdentity::of(int fd, int* errorNumber) {
  struct statx status {};
  if (::statx(fd, "", AT_EMPTY_PATH, STATX_TYPE | STATX_INO | STATX_BTIME, &status) != 0) {
    *errorNumber = errno;
    return std::nullopt;
  }
  if (!S_ISREG(status.stx_mode) && !S_ISDIR(status.stx_mode)) {
    *errorNumber = EINVAL;
    return std::nullopt;
  }
  PlaceIdentity place;
  place.device = (std::uint64_t{status.stx_dev_major} << 32) | status.stx_dev_minor;
  place.inode = status.stx_ino;
  if ((status.stx_mask & STATX_BTIME) != 0) {
    place.born = static_cast<std::uint64_t>(status.stx_btime.tv_sec) * kNanoseconds + status.stx_btime.tv_nsec;
  }
  place.isDirectory = S_ISDIR(status.stx_mode);
  return place;
}

ExtensionTokens::ExtensionTokens() {
  std::array<std::uint8_t, SHA256_DIGEST_SIZE> secret;
  fillRandom(secret.data(), secret.size());
  hmac_sha256_set_key(&key_, secret.size(), secret.data());
  explicit_bzero(secret.data(), secret.size());
  std::uint64_t first = 0;
  fillRandom(&first, sizeof first);
  next_ = first;
}

std::string ExtensionTokens::sign(const std::string& claims) const {
  static constexpr char kDigits[] = "0123456789abcdef";
  struct hmac_sha256_ctx context = key_;
  std::array<std::uint8_t, SHA256_DIGEST_SIZE> digest;
  hmac_sha256_update(&context, claims.size(), reinterpret_cast<const std::uint8_t*>(claims.data()));
  hmac_sha256_digest(&context, digest.size(), digest.data());
  std::string text;
  text.reserve(kSignatureLength + 1 + claims.size());
  for (const std::uint8_t byte : digest) {
    text += kDigits[byte >> 4U];
    text += kDigits[byte & 0xFU];
  }
  return text;
}

std::string ExtensionTokens::issue(const std::string& extensionClass, const PlaceIdentity& place, unsigned flags,
                                   const std::string& subject) {
  const std::string claims =
      fmt::format("{};{:x};{:x};{:x};{:x};{:x};{:x};{}", extensionClass, flags, next_.fetch_add(1), place.device,
                  place.inode, place.born, place.isDirectory ? 1 : 0, subject);
  std::string token = sign(claims);
  token += kSeparator;
  return token += claims;
}

std::optional<std::string> ExtensionTokens::issueFileRead(const std::string& path, const std::string& boundary,
                                                          int* errorNumber) {
  const auto opened = openPlace(path, errorNumber);
  if (!opened) return std::nullopt;
  // The boundary of a canonical path that begins with it is canonical too.
  if (!liesAtOrBelow(opened->canonicalPath, boundary)) {
    const auto limit = openPlace(boundary, errorNumber);
    if (!limit) return std::nullopt;
    if (!liesAtOrBelow(opened->canonicalPath, limit->canonicalPath)) {
      *errorNumber = EPERM;
      return std::nullopt;
    }
  }
  if (!isXmlText(opened->canonicalPath)) {
    *errorNumber = EILSEQ;
    return std::nullopt;
  }
  const auto place = PlaceIdentity::of(opened->fd.get(), errorNumber);
  if (!place) return std::nullopt;
  return issue(kFileReadExtensionClass, *place, kCanonicalFlag, opened->canonicalPath);
}

std::optional<std::string> ExtensionTokens::issueService(const std::string& extensionClass, const std::string& name,
                                                         int* errorNumber) {
  if (name.empty() || extensionClass.find(kSeparator) != std::string::npos) {
    *errorNumber = EINVAL;
    return std::nullopt;
  }
  return issue(extensionClass, {}, 0, name);
}

std::optional<SandboxGrant> ExtensionTokens::verify(const std::string& token, int* errorNumber) const {
  if (token.size() > kSignatureLength && token[kSignatureLength] == kSeparator) {
    const std::string claims = token.substr(kSignatureLength + 1);
    const std::string expected = sign(claims);
    if (memeql_sec(expected.data(), token.data(), kSignatureLength) != 0) {
      if (auto grant = parseClaims(claims)) return grant;
    }
  }
  *errorNumber = EACCES;
  return std::nullopt;
}

std::string shownToken(const std::string& token) {
  return token.substr(0, kShownLength);
}

}  // namespace platform
