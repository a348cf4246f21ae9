// The reader: expat's events drive a ValueBuilder. The whole document is checked to be UTF-8 of XML's characters first,
// so that expat never takes it for another encoding. Every fault, expat's too, is kept as an offset into the document
// and becomes line and column at the end.
#include <expat.h>
#include <fmt/format.h>
#include <nettle/base64.h>

#include <charconv>
#include <cmath>
#include <limits>
#include <memory>

#include "platform/plist/PropertyList.h"
#include "platform/value/DateText.h"
#include "platform/value/Utf8.h"
#include "platform/value/ValueBuilder.h"

namespace platform {
namespace {

enum class Element { Unknown, Plist, Dict, Key, Array, String, Integer, Real, True, False, Date, Data };

constexpr std::pair<std::string_view, Element> kElements[] = {
    {"plist", Element::Plist},   {"dict", Element::Dict},       {"key", Element::Key},   {"array", Element::Array},
    {"string", Element::String}, {"integer", Element::Integer}, {"real", Element::Real}, {"true", Element::True},
    {"false", Element::False},   {"date", Element::Date},       {"data", Element::Data}};

Element elementNamed(std::string_view name) noexcept {
  for (const auto& [text, element] : kElements) {
    if (text == name) return element;
  }
  return Element::Unknown;
}

bool isBlank(char c) noexcept {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

std::string_view trimmed(std::string_view text) noexcept {
  while (!text.empty() && isBlank(text.front())) text.remove_prefix(1);
  while (!text.empty() && isBlank(text.back())) text.remove_suffix(1);
  return text;
}

// Nothing when the text is no integer or none of 64 bits.
Value integerValue(std::string_view text) {
  text = trimmed(text);
  const bool negative = text.starts_with('-');
  if (negative || text.starts_with('+')) text.remove_prefix(1);
  int base = 10;
  if (text.starts_with("0x") || text.starts_with("0X")) {
    base = 16;
    text.remove_prefix(2);
  }
  std::uint64_t magnitude = 0;
  const auto [end, fault] = std::from_chars(text.data(), text.data() + text.size(), magnitude, base);
  if (fault != std::errc() || end != text.data() + text.size()) return {};
  constexpr std::uint64_t limit = std::uint64_t{1} << 63;
  if (!negative) return magnitude < limit ? Value(static_cast<std::int64_t>(magnitude)) : Value(magnitude);
  if (magnitude > limit) return {};
  return static_cast<std::int64_t>(~magnitude + 1);
}

Value realValue(std::string_view text) {
  text = trimmed(text);
  if (text.starts_with('+') && !text.starts_with("+-")) text.remove_prefix(1);
  double value = 0;
  const auto [end, fault] = std::from_chars(text.data(), text.data() + text.size(), value);
  if (fault != std::errc() || end != text.data() + text.size() || !std::isfinite(value)) return {};
  return value;
}

Value dataValue(std::string_view text) {
  base64_decode_ctx context;
  base64_decode_init(&context);
  Bytes bytes(BASE64_DECODE_LENGTH(text.size()));
  std::size_t length = bytes.size();
  if (base64_decode_update(&context, &length, bytes.data(), text.size(), text.data()) == 0 ||
      base64_decode_final(&context) == 0) {
    return {};
  }
  bytes.resize(length);
  bytes.shrink_to_fit();
  return Value::data(std::move(bytes));
}

class PropertyListReader {
 public:
  explicit PropertyListReader(std::span<const std::uint8_t> bytes)
      : document_(reinterpret_cast<const char*>(bytes.data()), bytes.size()),
        parser_(XML_ParserCreate("UTF-8"), XML_ParserFree) {
    if (!parser_) throw std::bad_alloc();
    XML_SetUserData(parser_.get(), this);
    XML_SetXmlDeclHandler(parser_.get(),
                          [](void* self, const char*, const char* encoding, int) { as(self).declaration(encoding); });
    XML_SetElementHandler(
        parser_.get(), [](void* self, const char* name, const char** attributes) { as(self).start(name, attributes); },
        [](void* self, const char*) { as(self).end(); });
    XML_SetCharacterDataHandler(parser_.get(), [](void* self, const char* text, int length) {
      as(self).characters({text, static_cast<std::size_t>(length)});
    });
    // A declared entity is refused before it can be used; an undeclared one is expat's error or comes here.
    XML_SetEntityDeclHandler(parser_.get(), [](void* self, const char*, int, const char*, int, const char*, const char*,
                                               const char*, const char*) { as(self).refuseEntity(); });
    XML_SetSkippedEntityHandler(parser_.get(), [](void* self, const char*, int) { as(self).refuseEntity(); });
  }

  Value read(Error* error) {
    if (parse()) return builder_.take();
    const std::string_view before = document_.substr(0, faultAt_);
    const std::size_t lineStart = before.rfind('\n') + 1;  // npos + 1 is 0
    std::size_t line = 1;
    for (const char c : before) line += c == '\n' ? 1U : 0U;
    std::size_t column = 1;
    for (const char c : before.substr(lineStart)) column += (static_cast<unsigned char>(c) & 0xC0) != 0x80 ? 1U : 0U;
    setError(error, {kPropertyListErrorDomain, kPropertyListErrorRead,
                     fmt::format("line {}, column {}: {}", line, column, fault_)});
    return {};
  }

 private:
  static PropertyListReader& as(void* self) noexcept { return *static_cast<PropertyListReader*>(self); }

  bool parse() {
    if (document_.size() > kPropertyListMaxBytes) return failAt(0, "the document is too long");
    const std::size_t sound = xmlTextLength(document_);
    if (sound != document_.size()) return failAt(sound, "not valid UTF-8 text");
    static_assert(kPropertyListMaxBytes <= std::numeric_limits<int>::max());
    const XML_Status status = XML_Parse(parser_.get(), document_.data(), static_cast<int>(document_.size()), XML_TRUE);
    if (!fault_.empty()) return false;
    if (status != XML_STATUS_OK) return failAt(offset(), XML_ErrorString(XML_GetErrorCode(parser_.get())));
    return true;
  }

  std::size_t offset() const {
    const XML_Index index = XML_GetCurrentByteIndex(parser_.get());
    return index < 0 ? 0 : static_cast<std::size_t>(index);
  }

  bool failAt(std::size_t offset, std::string reason) {
    faultAt_ = offset;
    fault_ = std::move(reason);
    return false;
  }
  // The first fault stops the parser; expat may still deliver an event or two.
  void fail(std::string reason) { failFrom(offset(), std::move(reason)); }
  void failFrom(std::size_t offset, std::string reason) {
    (void)failAt(offset, std::move(reason));
    (void)XML_StopParser(parser_.get(), XML_FALSE);
  }
  bool failed() const noexcept { return !fault_.empty(); }

  void refuseEntity() {
    if (!failed()) fail("entities are not supported");
  }

  void declaration(const char* encoding) {
    if (failed() || encoding == nullptr) return;
    std::string upper(encoding);
    for (char& c : upper) c = c >= 'a' && c <= 'z' ? static_cast<char>(c - 'a' + 'A') : c;
    if (upper != "UTF-8") fail(fmt::format("the encoding {} is not supported", encoding));
  }

  void start(const char* name, const char** attributes) {
    if (failed()) return;
    const Element element = elementNamed(name);
    if (open_.empty()) return startRoot(name, element, attributes);
    if (attributes[0] != nullptr) return fail(fmt::format("<{}> has an attribute", name));
    if (element == Element::Unknown || element == Element::Plist) return fail(fmt::format("unexpected <{}>", name));
    const Element parent = open_.back();
    if (parent != Element::Plist && parent != Element::Dict && parent != Element::Array) {
      return fail(fmt::format("unexpected <{}> inside a value without elements", name));
    }
    if (element == Element::Key) {
      if (parent != Element::Dict) return fail("a <key> outside of a <dict>");
      if (keyPending_) return fail("a <key> without a value");
    } else {
      if (parent == Element::Dict && !keyPending_) return fail(fmt::format("<{}> without a <key>", name));
      if (parent == Element::Plist && complete_) return fail("more than one value");
      if (builder_.depth() >= kPropertyListMaxDepth) return fail("nested too deep");
    }
    keyPending_ = false;
    if (element == Element::Dict) builder_.beginDictionary();
    if (element == Element::Array) builder_.beginArray();
    open_.push_back(element);
    text_.clear();
    startedAt_ = offset();
  }

  void startRoot(const char* name, Element element, const char** attributes) {
    if (element != Element::Plist) return fail(fmt::format("<{}> instead of <plist>", name));
    const bool sound = attributes[0] != nullptr && attributes[0] == std::string_view("version") &&
                       attributes[1] == std::string_view("1.0") && attributes[2] == nullptr;
    if (!sound) return fail("the <plist> is not of version 1.0");
    // expat leaves an unknown entity in an attribute out without a word.
    const auto length = static_cast<std::size_t>(XML_GetCurrentByteCount(parser_.get()));
    if (document_.substr(offset(), length).find('&') != std::string_view::npos) return refuseEntity();
    open_.push_back(element);
  }

  void characters(std::string_view text) {
    if (failed()) return;
    switch (open_.back()) {
      case Element::Key:
      case Element::String:
      case Element::Integer:
      case Element::Real:
      case Element::Date:
      case Element::Data:
        text_ += text;
        break;
      default:
        if (!trimmed(text).empty()) fail("text where none belongs");
    }
  }

  void end() {
    if (failed()) return;
    const Element element = open_.back();
    open_.pop_back();
    switch (element) {
      case Element::Plist:
        if (!complete_) fail("no value");
        return;
      case Element::Key:
        builder_.key(text_);
        keyPending_ = true;
        return;
      case Element::Dict:
        if (keyPending_) return fail("a <key> without a value");
        (void)builder_.endDictionary();
        break;
      case Element::Array:
        builder_.endArray();
        break;
      case Element::String:
        builder_.add(std::string_view(text_));
        break;
      case Element::True:
        builder_.add(true);
        break;
      case Element::False:
        builder_.add(false);
        break;
      case Element::Integer:
        addParsed(integerValue(text_), "no integer of 64 bits");
        break;
      case Element::Real:
        addParsed(realValue(text_), "no finite real");
        break;
      case Element::Data:
        addParsed(dataValue(text_), "no base64 data");
        break;
      case Element::Date: {
        const std::optional<Date> date = parseDateText(trimmed(text_));
        addParsed(date ? Value(*date) : Value(), "no date of the form YYYY-MM-DDTHH:MM:SSZ");
        break;
      }
      case Element::Unknown:
        break;
    }
    complete_ = builder_.depth() == 0;
  }

  void addParsed(Value value, const char* reason) {
    if (value.isNothing()) return failFrom(startedAt_, reason);
    builder_.add(std::move(value));
  }

  const std::string_view document_;
  const std::unique_ptr<std::remove_pointer_t<XML_Parser>, decltype(&XML_ParserFree)> parser_;
  ValueBuilder builder_;
  std::vector<Element> open_;
  std::string text_;           // of the innermost element, when it is one that has text
  std::size_t startedAt_ = 0;  // where the innermost element began
  bool keyPending_ = false;    // the innermost dictionary's last key waits for its value
  bool complete_ = false;      // the document's one value is there
  std::size_t faultAt_ = 0;
  std::string fault_;  // empty: none so far
};

}  // namespace

Value parsePropertyList(std::span<const std::uint8_t> bytes, Error* error) {
  return PropertyListReader(bytes).read(error);
}

}  // namespace platform
