#include <fmt/format.h>
#include <nettle/base64.h>

#include <cmath>
#include <cstring>
#include <string_view>

#include "platform/plist/PropertyList.h"
#include "platform/value/DateText.h"
#include "platform/value/Utf8.h"

namespace platform {
namespace {

constexpr const char* kTooLong = "a document of this length";

class PropertyListWriter {
 public:
  std::optional<std::string> write(const Value& value, Error* error) {
    out_ = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
    bool written = writeValue(value, 0);
    out_ += "</plist>\n";
    if (written && out_.size() > kPropertyListMaxBytes) written = refuse(kTooLong);
    if (written) return std::move(out_);
    setError(error, {kPropertyListErrorDomain, kPropertyListErrorWrite,
                     fmt::format("{} cannot be written as a property list", refused_)});
    return std::nullopt;
  }

 private:
  bool writeValue(const Value& value, std::size_t depth) {
    if (depth >= kPropertyListMaxDepth) return refuse("a value nested this deep");
    if (out_.size() > kPropertyListMaxBytes) return refuse(kTooLong);  // no more of it than one value
    switch (value.kind()) {
      case Kind::Nothing:
        return refuse("the nothing value");
      case Kind::Boolean:
        return line(depth, value.exactBoolean() ? "<true/>" : "<false/>");
      case Kind::Signed:
        return writeElement("integer", fmt::format_int(value.exactSigned()).c_str(), depth);
      case Kind::Unsigned:
        return writeElement("integer", fmt::format_int(value.exactUnsigned()).c_str(), depth);
      case Kind::Real:
        if (!std::isfinite(value.realValue())) return refuse("a real that is not finite");
        return writeElement("real", fmt::format("{}", value.realValue()), depth);
      case Kind::Date: {
        const std::optional<std::string> text = dateText(value.date());
        return text ? writeElement("date", *text, depth) : refuse("a date beyond the year 9999");
      }
      case Kind::String:
        return writeText(value.string(), "string", depth);
      case Kind::Data:
        return writeData(value.bytes(), depth);
      case Kind::Uuid:
        return refuse("a UUID");
      case Kind::Message:
        return refuse("a message");
      case Kind::Descriptor:
        return refuse("a descriptor");
      case Kind::Array:
        return writeArray(value, depth);
      case Kind::Dictionary:
        return writeDictionary(value, depth);
    }
    return false;
  }

  bool writeArray(const Value& value, std::size_t depth) {
    if (value.size() == 0) return line(depth, "<array/>");
    line(depth, "<array>");
    for (const Value& item : value.items()) {
      if (!writeValue(item, depth + 1)) return false;
    }
    return line(depth, "</array>");
  }

  bool writeDictionary(const Value& value, std::size_t depth) {
    if (value.size() == 0) return line(depth, "<dict/>");
    line(depth, "<dict>");
    for (const Value::Entry& entry : value.entries()) {
      if (!writeText(entry.key, "key", depth + 1) || !writeValue(entry.value, depth + 1)) return false;
    }
    return line(depth, "</dict>");
  }

  bool writeText(const std::string& text, std::string_view element, std::size_t depth) {
    if (!isXmlText(text)) return refuse("a string with characters that XML lacks");
    open(element, depth);
    // There is no NUL in such a text, and the library looks at many characters at once.
    for (const char* rest = text.c_str(); *rest != '\0';) {
      const std::size_t plain = std::strcspn(rest, "&<>\r");
      out_.append(rest, plain);
      rest += plain;
      if (*rest != '\0') out_ += escapeOf(*rest++);
    }
    return close(element);
  }

  static std::string_view escapeOf(char c) {
    switch (c) {
      case '&':
        return "&amp;";
      case '<':
        return "&lt;";
      case '>':
        return "&gt;";
      default:
        return "&#13;";  // a carriage return, of which a reader would make a line feed
    }
  }

  bool writeData(const Bytes& bytes, std::size_t depth) {
    std::string text(BASE64_ENCODE_RAW_LENGTH(bytes.size()), '\0');
    base64_encode_raw(text.data(), bytes.size(), bytes.data());
    return writeElement("data", text, depth);
  }

  // `text` needs no escape.
  bool writeElement(std::string_view element, std::string_view text, std::size_t depth) {
    open(element, depth);
    out_ += text;
    return close(element);
  }

  void open(std::string_view element, std::size_t depth) {
    out_.append(depth, '\t');
    (out_ += '<').append(element) += '>';
  }

  bool close(std::string_view element) {
    (out_ += "</").append(element) += ">\n";
    return true;
  }

  bool line(std::size_t depth, std::string_view text) {
    out_.append(depth, '\t');
    out_ += text;
    out_ += '\n';
    return true;
  }

  bool refuse(const char* what) {
    refused_ = what;
    return false;
  }

  std::string out_;
  const char* refused_ = "";
};

}  // namespace

std::optional<std::string> serializeXml(const Value& value, Error* error) {
  return PropertyListWriter().write(value, error);
}

}  // namespace platform
