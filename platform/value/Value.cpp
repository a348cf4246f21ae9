#include "platform/value/Value.h"

#include <algorithm>

#include "platform/value/ValueNodes.h"

namespace platform {
namespace {

// Never destroyed: values may be read while the process ends.
const std::string& emptyString = *new std::string();
const Bytes& emptyBytes = *new Bytes();
const Value nothing;
constexpr Uuid nilUuid;

// Up to this many entries a scan that compares lengths first beats a binary search.
constexpr std::size_t kLinear = 8;

}  // namespace

Value::Value(Kind kind, Node* node) noexcept : kind_(kind) {
  payload_.node = node;
}
Value::Value(Date date) noexcept : kind_(Kind::Date), nanoseconds_(date.nanoseconds) {
  payload_.integer = date.seconds;
}
Value::Value(const char* text) : Value(std::string_view(text)) {}
Value::Value(std::string_view text) : Value(Kind::String, new StringNode(text)) {}
Value::Value(std::string text) : Value(Kind::String, new StringNode(std::move(text))) {}
Value::Value(const platform::Uuid& uuid) : Value(Kind::Uuid, new UuidNode(uuid)) {}
Value::Value(platform::Array array) {
  *this = array.value_.isNothing() ? Value(Kind::Array, new ArrayNode()) : std::move(array.value_);
}
Value::Value(platform::Dictionary dictionary) {
  *this = dictionary.value_.isNothing() ? Value(Kind::Dictionary, new DictionaryNode()) : std::move(dictionary.value_);
}
Value Value::data(Bytes bytes) {
  return {Kind::Data, new BytesNode(std::move(bytes))};
}
Value Value::message(Bytes encoded) {
  return {Kind::Message, new BytesNode(std::move(encoded))};
}
Value Value::descriptor(UniqueFd fd) {
  return {Kind::Descriptor, new DescriptorNode(std::move(fd))};
}

Value::Value(const Value& other) noexcept
    : kind_(other.kind_), nanoseconds_(other.nanoseconds_), payload_(other.payload_) {
  if (hasNode()) payload_.node->references.fetch_add(1, std::memory_order_relaxed);
}

Value& Value::operator=(const Value& other) noexcept {
  Value copy(other);
  return *this = std::move(copy);
}

void Value::release() noexcept {
  if (payload_.node->references.fetch_sub(1, std::memory_order_acq_rel) != 1) return;
  switch (kind_) {
    case Kind::String:
      delete static_cast<StringNode*>(payload_.node);
      break;
    case Kind::Data:
    case Kind::Message:
      delete static_cast<BytesNode*>(payload_.node);
      break;
    case Kind::Uuid:
      delete static_cast<UuidNode*>(payload_.node);
      break;
    case Kind::Array:
      delete static_cast<ArrayNode*>(payload_.node);
      break;
    case Kind::Dictionary:
      delete static_cast<DictionaryNode*>(payload_.node);
      break;
    case Kind::Descriptor:
      delete static_cast<DescriptorNode*>(payload_.node);
      break;
    default:
      break;
  }
}

const std::string& Value::string() const noexcept {
  return isString() ? static_cast<const StringNode*>(payload_.node)->text : emptyString;
}

const Bytes& Value::bytes() const noexcept {
  return isData() || isMessage() ? static_cast<const BytesNode*>(payload_.node)->bytes : emptyBytes;
}

const Uuid& Value::uuid() const noexcept {
  return isUuid() ? static_cast<const UuidNode*>(payload_.node)->uuid : nilUuid;
}

Date Value::date() const noexcept {
  return isDate() ? Date{payload_.integer, nanoseconds_} : Date{};
}

int Value::descriptor() const noexcept {
  return isDescriptor() ? static_cast<const DescriptorNode*>(payload_.node)->fd.get() : -1;
}

std::span<const Value> Value::items() const noexcept {
  if (!isArray()) return {};
  return static_cast<const ArrayNode*>(payload_.node)->items;
}

std::span<const Value::Entry> Value::entries() const noexcept {
  if (!isDictionary()) return {};
  return static_cast<const DictionaryNode*>(payload_.node)->entries;
}

std::size_t Value::size() const noexcept {
  return isArray() ? items().size() : entries().size();
}

const Value& Value::operator[](std::string_view key) const noexcept {
  const std::span<const Entry> all = entries();
  if (all.size() <= kLinear) {
    for (const Entry& entry : all) {
      if (entry.key == key) return entry.value;
    }
    return nothing;
  }
  const auto found = std::lower_bound(all.begin(), all.end(), key,
                                      [](const Entry& entry, std::string_view k) { return entry.key < k; });
  return found != all.end() && found->key == key ? found->value : nothing;
}

const Value& Value::at(std::size_t index) const noexcept {
  const std::span<const Value> all = items();
  return index < all.size() ? all[index] : nothing;
}

bool Value::identicalTo(const Value& other) const noexcept {
  if (kind_ != other.kind_ || nanoseconds_ != other.nanoseconds_) return false;
  if (isBoolean()) return payload_.boolean == other.payload_.boolean;
  return isNothing() || payload_.natural == other.payload_.natural;
}

bool operator==(const Value& a, const Value& b) noexcept {
  if (a.isNumber() && b.isNumber()) return Value::equalNumbers(a, b);
  if (a.kind_ != b.kind_) return false;
  if (a.hasNode() && a.payload_.node == b.payload_.node) return true;
  switch (a.kind_) {
    case Kind::Date:
      return a.date() == b.date();
    case Kind::String:
      return a.string() == b.string();
    case Kind::Data:
    case Kind::Message:
      return a.bytes() == b.bytes();
    case Kind::Uuid:
      return a.uuid() == b.uuid();
    case Kind::Array: {
      const auto left = a.items();
      const auto right = b.items();
      return std::equal(left.begin(), left.end(), right.begin(), right.end());
    }
    case Kind::Dictionary: {
      const auto left = a.entries();
      const auto right = b.entries();
      return std::equal(left.begin(), left.end(), right.begin(), right.end());
    }
    case Kind::Descriptor:
      return a.descriptor() == b.descriptor();
    default:
      return true;  // nothing equals nothing
  }
}

}  // namespace platform
