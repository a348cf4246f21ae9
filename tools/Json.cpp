#include "tools/Json.h"

#include <fmt/format.h>
#include <nettle/base64.h>

#include <cmath>
#include <optional>
#include <string_view>

#include "platform/ipc/IpcCodec.h"
#include "platform/value/DateText.h"
#include "platform/value/Utf8.h"

namespace tools {

using platform::Kind;
using platform::Value;

namespace {

// Control characters are those below U+0020, U+007F, and U+0080 to U+009F (C2 80 to C2 9F).
void appendString(std::string& out, std::string_view text) {
  out += '"';
  for (std::size_t i = 0; i < text.size(); ++i) {
    const auto byte = static_cast<unsigned char>(text[i]);
    const auto next = static_cast<unsigned char>(i + 1 < text.size() ? text[i + 1] : 0);
    if (byte == '"' || byte == '\\') {
      out += '\\';
      out += text[i];
    } else if (byte == '\n') {
      out += "\\n";
    } else if (byte == '\t') {
      out += "\\t";
    } else if (byte < 0x20 || byte == 0x7f) {
      out += fmt::format("\\u{:04x}", byte);
    } else if (byte == 0xc2 && next >= 0x80 && next < 0xa0) {
      out += fmt::format("\\u{:04x}", next);
      ++i;
    } else {
      out += text[i];
    }
  }
  out += '"';
}

std::string base64(const platform::Bytes& bytes) {
  std::string out(BASE64_ENCODE_RAW_LENGTH(bytes.size()), '\0');
  ::base64_encode_raw(out.data(), bytes.size(), bytes.data());
  return out;
}

// Lines are broken unless `indent` is nothing.
void append(std::string& out, const Value& value, std::optional<std::size_t> indent) {
  const auto lineBreak = [](std::optional<std::size_t> at) { return at ? "\n" + std::string(*at, ' ') : ""; };
  const auto inner = indent ? std::optional(*indent + 2) : std::nullopt;
  switch (value.kind()) {
    case Kind::Nothing:
      out += "null";
      break;
    case Kind::Boolean:
      out += value.exactBoolean() ? "true" : "false";
      break;
    case Kind::Signed:
      out += fmt::format("{}", value.exactSigned());
      break;
    case Kind::Unsigned:
      out += fmt::format("{}", value.exactUnsigned());
      break;
    case Kind::Real:
      out += std::isfinite(value.realValue()) ? fmt::format("{}", value.realValue()) : "null";
      break;
    case Kind::Date:
      appendString(out, platform::dateText(value.date()).value_or(platform::describeDate(value.date())));
      break;
    case Kind::String:
      appendString(out, platform::repairedXmlText(value.string()));
      break;
    case Kind::Data:
      appendString(out, base64(value.bytes()));
      break;
    case Kind::Uuid:
      appendString(out, value.uuid().text());
      break;
    case Kind::Message:
      append(out, platform::fromWireMessage(value), indent);
      break;
    case Kind::Descriptor:
      out += fmt::format("{}", value.descriptor());
      break;
    case Kind::Array: {
      out += '[';
      const char* separator = "";
      for (const Value& item : value.items()) {
        out += separator + lineBreak(inner);
        append(out, item, inner);
        separator = indent ? "," : ", ";
      }
      if (value.size() > 0) out += lineBreak(indent);
      out += ']';
      break;
    }
    case Kind::Dictionary: {
      out += '{';
      const char* separator = "";
      for (const auto& [key, item] : value.entries()) {
        out += separator + lineBreak(inner);
        appendString(out, platform::repairedXmlText(key));
        out += ": ";
        append(out, item, inner);
        separator = indent ? "," : ", ";
      }
      if (value.size() > 0) out += lineBreak(indent);
      out += '}';
      break;
    }
  }
}

}  // namespace

std::string jsonText(const Value& value) {
  std::string out;
  append(out, value, 0);
  out += '\n';
  return out;
}

std::string jsonLine(const Value& value) {
  std::string out;
  append(out, value, std::nullopt);
  out += '\n';
  return out;
}

}  // namespace tools
