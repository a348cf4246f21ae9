// Url: the location of a file or directory. Only file URLs (RFC 8089) name anything here.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace platform {

class Url {
 public:
  Url() = default;
  /// The file URL of `path`; a trailing slash is left out (but for "/").
  static Url file(std::string_view path);
  /// Parses URL text: scheme "file", no host or "localhost"; the path is percent-decoded, a trailing slash, a query and
  /// a fragment are left out. Any other text (a bare path too), a decoded NUL or invalid UTF-8 gives nothing.
  static std::optional<Url> parse(std::string_view text);

  const std::string& path() const noexcept { return path_; }
  bool empty() const noexcept { return path_.empty(); }
  /// "file://" and the percent-encoded path; parses back to an equal URL.
  std::string absoluteString() const;
  std::string describe() const { return absoluteString(); }
  /// This location with one path component (or a relative path) appended.
  Url appending(std::string_view component) const;
  std::string lastComponent() const;

  friend bool operator==(const Url&, const Url&) = default;

 private:
  std::string path_;
};

}  // namespace platform
