// ExtensionTokens: the strings by which this process grants read access to a place, or the use of a service, to whoever
// hands them back.
//
// A token is readable text with a signature before it: HMAC-SHA-256 with a key that is made with the object and never
// leaves it, over class, flags, a number that no other token has, device, inode and birth time of the place, and its
// canonical path or the name. So it is worth nothing to another object, and nothing in it can be changed. Callable from
// any thread.
#pragma once

#include <nettle/hmac.h>

#include <atomic>
#include <cstdint>
#include <optional>
#include <string>

namespace platform {

/// The class of tokens for reading below a path.
inline constexpr const char* kFileReadExtensionClass = "com.orvane.platform.read-only";
/// The class of tokens for the use of a plug-in's service.
inline constexpr const char* kPlugInServiceExtensionClass = "com.orvane.extora.plugin-service";

/// Which file or directory lies at a path: another one that got the inode of the first differs in its birth time, where
/// the file system has one.
struct PlaceIdentity {
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
  std::uint64_t born = 0;  ///< nanoseconds since the epoch; 0: the file system does not say
  bool isDirectory = false;

  /// Of an opened file, also one opened with O_PATH; nothing and an error number when it cannot be looked at (EINVAL:
  /// neither a regular file nor a directory).
  static std::optional<PlaceIdentity> of(int fd, int* errorNumber);
  friend bool operator==(const PlaceIdentity&, const PlaceIdentity&) = default;
};

/// What a sound token grants.
struct SandboxGrant {
  std::string extensionClass;
  std::string subject;  ///< a canonical path, or a name
  PlaceIdentity place;  ///< of a path, when the token was issued
};

class ExtensionTokens {
 public:
  ExtensionTokens();
  ExtensionTokens(const ExtensionTokens&) = delete;
  ExtensionTokens& operator=(const ExtensionTokens&) = delete;

  /// A token for reading at and below `path`. Nothing and an error number: EPERM when its canonical form does not lie
  /// at or below the canonical form of `boundary`, EINVAL for what is neither a regular file nor a directory, EILSEQ
  /// for a path that cannot travel as text, or what the system says about either path.
  [[nodiscard]] std::optional<std::string> issueFileRead(const std::string& path, const std::string& boundary,
                                                         int* errorNumber);
  /// A token for `name`; EINVAL for an empty name or a class that is no plain word.
  [[nodiscard]] std::optional<std::string> issueService(const std::string& extensionClass, const std::string& name,
                                                        int* errorNumber);
  /// What the token grants, if this object has issued it and not a byte is different; nothing and EACCES otherwise.
  /// Whether the place is still the same is for who opens it to say.
  [[nodiscard]] std::optional<SandboxGrant> verify(const std::string& token, int* errorNumber) const;

 private:
  std::string sign(const std::string& claims) const;
  std::string issue(const std::string& extensionClass, const PlaceIdentity& place, unsigned flags,
                    const std::string& subject);

  struct hmac_sha256_ctx key_;  // constant after construction; copied for each use
  std::atomic<std::uint64_t> next_;
};

/// As much of a token as a log line may show: its first 8 characters.
std::string shownToken(const std::string& token);

}  // namespace platform
