// Values as one line of text.
#include <fmt/format.h>

#include <iterator>

#include "platform/value/DateText.h"
#include "platform/value/Value.h"

namespace platform {
namespace {

// A log line or a probe must not explode, whatever a client sent.
constexpr std::size_t kLongest = std::size_t{64} << 10;
constexpr std::size_t kShownBytes = 32;

void appendQuoted(std::string& out, std::string_view text) {
  out += '"';
  for (const char c : text.substr(0, kLongest)) {
    if (c == '"' || c == '\\') out += '\\';
    out += c;
  }
  out += '"';
}

void appendBytes(std::string& out, const Bytes& bytes) {
  fmt::format_to(std::back_inserter(out), "<{} bytes", bytes.size());
  if (!bytes.empty() && bytes.size() <= kShownBytes) {
    out += ' ';
    for (const std::uint8_t byte : bytes) fmt::format_to(std::back_inserter(out), "{:02x}", byte);
  }
  out += '>';
}

}  // namespace

void Value::appendDescription(std::string& out, bool quoted) const {
  switch (kind_) {
    case Kind::Nothing:
      out += "(null)";
      break;
    case Kind::Boolean:
      out += payload_.boolean ? "true" : "false";
      break;
    case Kind::Signed:
      fmt::format_to(std::back_inserter(out), "{}", payload_.integer);
      break;
    case Kind::Unsigned:
      fmt::format_to(std::back_inserter(out), "{}", payload_.natural);
      break;
    case Kind::Real:
      fmt::format_to(std::back_inserter(out), "{}", payload_.real);
      break;
    case Kind::Date:
      out += describeDate(date());
      break;
    case Kind::String:
      if (quoted) {
        appendQuoted(out, string());
      } else {
        out += std::string_view(string()).substr(0, kLongest + 1);
      }
      break;
    case Kind::Data:
      appendBytes(out, bytes());
      break;
    case Kind::Uuid:
      out += uuid().text();
      break;
    case Kind::Message:
      fmt::format_to(std::back_inserter(out), "<message {} bytes>", bytes().size());
      break;
    case Kind::Descriptor:
      fmt::format_to(std::back_inserter(out), "<descriptor {}>", descriptor());
      break;
    case Kind::Array: {
      out += '[';
      const char* separator = "";
      for (const Value& item : items()) {
        if (out.size() > kLongest) return;
        out += std::exchange(separator, ", ");
        item.appendDescription(out, true);
      }
      out += ']';
      break;
    }
    case Kind::Dictionary: {
      out += '{';
      const char* separator = "";
      for (const Entry& entry : entries()) {
        if (out.size() > kLongest) return;
        out += std::exchange(separator, ", ");
        out += std::string_view(entry.key).substr(0, kLongest);
        out += ": ";
        entry.value.appendDescription(out, true);
      }
      out += '}';
      break;
    }
  }
}

std::string Value::describe() const {
  std::string out;
  appendDescription(out, false);
  if (out.size() <= kLongest) return out;
  std::size_t end = kLongest;
  // Not in the middle of a character.
  while (end > kLongest - 4 && (static_cast<unsigned char>(out[end]) & 0xC0) == 0x80) --end;
  out.resize(end);
  return out += "...";
}

}  // namespace platform
