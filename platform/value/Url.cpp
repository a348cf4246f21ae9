#include "platform/value/Url.h"

#include <strings.h>

#include "platform/value/Hex.h"
#include "platform/value/Utf8.h"

namespace platform {
namespace {

constexpr std::string_view kScheme = "file:";

bool equalIgnoringCase(std::string_view a, std::string_view b) noexcept {
  return a.size() == b.size() && strncasecmp(a.data(), b.data(), a.size()) == 0;
}

void dropTrailingSlashes(std::string& path) {
  while (path.size() > 1 && path.back() == '/') path.pop_back();
}

std::optional<std::string> percentDecoded(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '%') {
      out += text[i];
      continue;
    }
    if (text.size() - i < 3) return std::nullopt;
    const int high = hexDigit(text[i + 1]);
    const int low = hexDigit(text[i + 2]);
    if (high < 0 || low < 0) return std::nullopt;
    out += static_cast<char>(high << 4 | low);
    i += 2;
  }
  return out;
}

// What RFC 3986 lets stand plainly in a path.
bool isPathCharacter(char c) noexcept {
  if ((c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9')) return true;
  return std::string_view("/-._~!$&'()*+,;=:@").find(c) != std::string_view::npos;
}

}  // namespace

Url Url::file(std::string_view path) {
  Url url;
  url.path_ = path;
  dropTrailingSlashes(url.path_);
  return url;
}

std::optional<Url> Url::parse(std::string_view text) {
  if (!equalIgnoringCase(text.substr(0, kScheme.size()), kScheme)) return std::nullopt;
  text.remove_prefix(kScheme.size());
  text = text.substr(0, text.find_first_of("?#"));
  if (text.starts_with("//")) {
    text.remove_prefix(2);
    const std::string_view host = text.substr(0, text.find('/'));
    if (!host.empty() && !equalIgnoringCase(host, "localhost")) return std::nullopt;
    text.remove_prefix(host.size());
  }
  if (!text.starts_with('/')) return std::nullopt;
  const std::optional<std::string> path = percentDecoded(text);
  if (!path || path->find('\0') != std::string::npos || !isUtf8(*path)) return std::nullopt;
  return file(*path);
}

std::string Url::absoluteString() const {
  if (empty()) return {};
  std::string out = "file://";
  for (const char c : path_) {
    if (isPathCharacter(c)) {
      out += c;
      continue;
    }
    const auto byte = static_cast<unsigned char>(c);
    out += '%';
    out += kUpperHexDigits[byte >> 4];
    out += kUpperHexDigits[byte & 0x0F];
  }
  return out;
}

Url Url::appending(std::string_view component) const {
  while (component.starts_with('/')) component.remove_prefix(1);
  if (component.empty()) return *this;
  std::string path = path_;
  if (!path.ends_with('/')) path += '/';
  path += component;
  return file(path);
}

std::string Url::lastComponent() const {
  return path_ == "/" ? path_ : path_.substr(path_.rfind('/') + 1);
}

}  // namespace platform
