// How it goes: the encoder writes into the caller's buffer through msgpack's packer, in one pass and without memory of
// its own. The decoder is a visitor of msgpack's parser that hands each value to a ValueBuilder, whose working memory
// each thread keeps. What the visitor does not allow stops the parser; nothing is allocated for a length before as many
// bytes are there.
#include "platform/ipc/IpcCodec.h"

#include <fmt/format.h>

#include <algorithm>
#include <bit>
#include <cstring>
#include <limits>
#include <msgpack.hpp>

#include "platform/ipc/IpcFrame.h"
#include "platform/value/InternalInconsistency.h"
#include "platform/value/Utf8.h"
#include "platform/value/ValueBuilder.h"

namespace platform {
namespace {

enum Extension : std::int8_t { kTimestamp = -1, kUuid = 1, kMessage = 2, kDescriptor = 3 };

constexpr std::uint32_t kNanosecondsPerSecond = 1'000'000'000;

template <typename T>
void storeBigEndian(std::uint8_t* to, T value) noexcept {
  for (std::size_t i = sizeof value; i-- > 0; value = static_cast<T>(value >> 8))
    to[i] = static_cast<std::uint8_t>(value);
}

template <typename T>
T loadBigEndian(const std::uint8_t* from) noexcept {
  T value = 0;
  for (std::size_t i = 0; i < sizeof value; ++i) value = static_cast<T>(value << 8) | from[i];
  return value;
}

// The stream that msgpack's packer writes to: the caller's buffer, made larger by doubling and cut at the end, so that
// a piece costs a comparison and a copy.
class Output {
 public:
  explicit Output(Bytes& bytes) : bytes_(bytes), initial_(bytes.size()), at_(end()), end_(end()) {}
  Output(const Output&) = delete;
  Output& operator=(const Output&) = delete;
  ~Output() { bytes_.resize(finished_ ? used() : initial_); }

  void write(const char* data, std::size_t size) {
    if (static_cast<std::size_t>(end_ - at_) < size) [[unlikely]]
      grow(size);
    if (size != 0) std::memcpy(at_, data, size);
    at_ += size;
  }
  void finish() noexcept { finished_ = true; }

 private:
  static constexpr std::size_t kLeast = 256;

  std::uint8_t* end() noexcept { return bytes_.data() + bytes_.size(); }
  std::size_t used() const noexcept { return static_cast<std::size_t>(at_ - bytes_.data()); }
  void grow(std::size_t size) {
    const std::size_t before = used();
    bytes_.resize(std::max(bytes_.size() * 2, before + size + kLeast));
    at_ = bytes_.data() + before;
    end_ = end();
  }

  Bytes& bytes_;
  const std::size_t initial_;
  std::uint8_t* at_;
  std::uint8_t* end_;
  bool finished_ = false;
};

class Encoder {
 public:
  Encoder(Output& output, std::vector<int>* descriptors)
      : output_(output), packer_(output), descriptors_(descriptors) {}

  void encode(const Value& value) {
    switch (value.kind()) {
      case Kind::Nothing:
        throw InternalInconsistency("the nothing value cannot be encoded");
      case Kind::Boolean:
        value.exactBoolean() ? packer_.pack_true() : packer_.pack_false();
        break;
      case Kind::Signed:
        encodeSigned(value.exactSigned());
        break;
      case Kind::Unsigned:
        packer_.pack_uint64(value.exactUnsigned());
        break;
      case Kind::Real:
        encodeReal(value.realValue());
        break;
      case Kind::Date:
        encodeDate(value.date());
        break;
      case Kind::String:
        encodeString(value.string());
        break;
      case Kind::Data:
        packer_.pack_bin(length(value.bytes().size()));
        packer_.pack_bin_body(reinterpret_cast<const char*>(value.bytes().data()), length(value.bytes().size()));
        break;
      case Kind::Uuid:
        encodeExtension(kUuid, value.uuid().bytes());
        break;
      case Kind::Message:
        encodeExtension(kMessage, value.bytes());
        break;
      case Kind::Descriptor:
        encodeDescriptor(value.descriptor());
        break;
      case Kind::Array:
        packer_.pack_array(length(value.size()));
        for (const Value& item : value.items()) encode(item);
        break;
      case Kind::Dictionary:
        packer_.pack_map(length(value.size()));
        for (const Value::Entry& entry : value.entries()) {
          encodeString(entry.key);
          encode(entry.value);
        }
        break;
    }
  }

 private:
  static std::uint32_t length(std::size_t size) {
    if (size > std::numeric_limits<std::uint32_t>::max()) throw InternalInconsistency("a value is too long to encode");
    return static_cast<std::uint32_t>(size);
  }

  // The packer's own signed forms turn what is not negative into unsigned ones.
  void encodeSigned(std::int64_t value) {
    if (value < 0) {
      packer_.pack_int64(value);
    } else if (value <= std::numeric_limits<std::int8_t>::max()) {
      packer_.pack_fix_int8(static_cast<std::int8_t>(value));
    } else if (value <= std::numeric_limits<std::int16_t>::max()) {
      packer_.pack_fix_int16(static_cast<std::int16_t>(value));
    } else if (value <= std::numeric_limits<std::int32_t>::max()) {
      packer_.pack_fix_int32(static_cast<std::int32_t>(value));
    } else {
      packer_.pack_fix_int64(value);
    }
  }

  // Written here, because the packer turns a real without a fraction into an integer.
  void encodeReal(double value) {
    std::array<std::uint8_t, 9> bytes{0xCB};
    storeBigEndian(&bytes[1], std::bit_cast<std::uint64_t>(value));
    output_.write(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  }

  void encodeString(const std::string& text) {
    if (!isXmlText(text)) [[unlikely]] {
      packString(repairedXmlText(text));
    } else {
      packString(text);
    }
  }
  void packString(const std::string& text) {
    packer_.pack_str(length(text.size()));
    packer_.pack_str_body(text.data(), length(text.size()));
  }

  void encodeExtension(Extension type, std::span<const std::uint8_t> bytes) {
    packer_.pack_ext(length(bytes.size()), type);
    packer_.pack_ext_body(reinterpret_cast<const char*>(bytes.data()), length(bytes.size()));
  }

  void encodeDate(const Date& date) {
    std::array<std::uint8_t, 12> bytes{};
    if (date.seconds < 0 || date.seconds >> 34 != 0) {
      storeBigEndian(&bytes[0], date.nanoseconds);
      storeBigEndian(&bytes[4], static_cast<std::uint64_t>(date.seconds));
      encodeExtension(kTimestamp, bytes);
    } else if (date.nanoseconds != 0 || date.seconds >> 32 != 0) {
      storeBigEndian(&bytes[0], std::uint64_t{date.nanoseconds} << 34 | static_cast<std::uint64_t>(date.seconds));
      encodeExtension(kTimestamp, std::span(bytes).first(8));
    } else {
      storeBigEndian(&bytes[0], static_cast<std::uint32_t>(date.seconds));
      encodeExtension(kTimestamp, std::span(bytes).first(4));
    }
  }

  void encodeDescriptor(int descriptor) {
    if (descriptors_ == nullptr) throw InternalInconsistency("a descriptor cannot be encoded here");
    if (descriptors_->size() > std::numeric_limits<std::uint8_t>::max()) {
      throw InternalInconsistency("too many descriptors in one body");
    }
    const std::array<std::uint8_t, 1> index{static_cast<std::uint8_t>(descriptors_->size())};
    descriptors_->push_back(descriptor);
    encodeExtension(kDescriptor, index);
  }

  Output& output_;
  msgpack::packer<Output> packer_;
  std::vector<int>* const descriptors_;
};

class Decoder : public msgpack::null_visitor {
 public:
  Decoder(ValueBuilder& builder, std::size_t maxDepth, std::size_t maxValues, std::span<UniqueFd> descriptors)
      : builder_(builder), maxDepth_(maxDepth), valuesLeft_(maxValues), descriptors_(descriptors) {}

  /// Why the parser stopped.
  const char* reason() const noexcept { return reason_; }

  bool visit_nil() { return refuse("nil"); }
  bool visit_boolean(bool value) { return admit() && add(value); }
  bool visit_positive_integer(std::uint64_t value) { return admit() && add(value); }
  bool visit_negative_integer(std::int64_t value) { return admit() && add(value); }
  bool visit_float32(float value) { return admit() && add(value); }
  bool visit_float64(double value) { return admit() && add(value); }

  bool visit_str(const char* data, std::uint32_t size) {
    const std::string_view text(data, size);
    if (!isXmlText(text)) return refuse("a string that is no valid text");
    if (!atKey_) return admit() && add(text);
    builder_.key(text);
    return true;
  }

  bool visit_bin(const char* data, std::uint32_t size) { return admit() && add(Value::data(Bytes(data, data + size))); }

  bool visit_ext(const char* data, std::uint32_t size) {
    if (!admit()) return false;
    if (size == 0) return refuse("an extension without a type");
    const std::span<const std::uint8_t> body(reinterpret_cast<const std::uint8_t*>(data) + 1, size - 1);
    switch (static_cast<std::int8_t>(*data)) {
      case kTimestamp:
        return addDate(body);
      case kUuid:
        if (body.size() != 16) return refuse("a UUID of another length than 16");
        return add(Uuid(body.first<16>()));
      case kMessage:
        return add(Value::message(Bytes(body.begin(), body.end())));
      case kDescriptor:
        return addDescriptor(body);
      default:
        return refuse("an unknown extension");
    }
  }

  bool start_array(std::uint32_t /*size*/) {
    if (!admit()) return false;
    builder_.beginArray();
    return true;
  }
  bool end_array() {
    builder_.endArray();
    return true;
  }
  bool start_map(std::uint32_t /*size*/) {
    if (!admit()) return false;
    builder_.beginDictionary();
    return true;
  }
  bool start_map_key() { return atKey_ = true; }
  bool end_map_key() {
    atKey_ = false;
    return true;
  }
  bool end_map() { return builder_.endDictionary() || refuse("the same key twice"); }

  void parse_error(std::size_t /*parsed*/, std::size_t /*error*/) { (void)refuse("a reserved byte"); }
  void insufficient_bytes(std::size_t /*parsed*/, std::size_t /*error*/) { (void)refuse("cut short"); }

 private:
  bool refuse(const char* reason) {
    reason_ = reason;
    return false;
  }

  // What is asked of every value before it is made.
  bool admit() {
    if (atKey_) return refuse("a key that is no string");
    if (builder_.depth() >= maxDepth_) return refuse("nested too deep");
    if (valuesLeft_-- == 0) return refuse("too many values");
    return true;
  }

  bool add(Value value) {
    builder_.add(std::move(value));
    return true;
  }

  bool addDate(std::span<const std::uint8_t> body) {
    Date date;
    if (body.size() == 4) {
      date.seconds = loadBigEndian<std::uint32_t>(body.data());
    } else if (body.size() == 8) {
      const auto both = loadBigEndian<std::uint64_t>(body.data());
      date = {static_cast<std::int64_t>(both & ((std::uint64_t{1} << 34) - 1)), static_cast<std::uint32_t>(both >> 34)};
    } else if (body.size() == 12) {
      date = {static_cast<std::int64_t>(loadBigEndian<std::uint64_t>(&body[4])),
              loadBigEndian<std::uint32_t>(body.data())};
    } else {
      return refuse("a timestamp of another length than 4, 8 or 12");
    }
    if (date.nanoseconds >= kNanosecondsPerSecond) return refuse("a timestamp of more than 999,999,999 nanoseconds");
    return add(date);
  }

  bool addDescriptor(std::span<const std::uint8_t> body) {
    if (body.size() != 1) return refuse("a descriptor's index of another length than 1");
    if (body[0] >= descriptors_.size() || !descriptors_[body[0]]) return refuse("a descriptor that was not passed");
    return add(Value::descriptor(std::move(descriptors_[body[0]])));
  }

  ValueBuilder& builder_;
  const std::size_t maxDepth_;
  std::size_t valuesLeft_;
  const std::span<UniqueFd> descriptors_;
  bool atKey_ = false;
  const char* reason_ = "malformed";
};

Value decode(std::span<const std::uint8_t> bytes, std::size_t maxDepth, Error* error, std::span<UniqueFd> descriptors) {
  const auto fail = [&](const char* reason, std::size_t offset) {
    setError(error,
             {kIpcErrorDomain, kIpcErrorMalformed, fmt::format("malformed body: {} at byte {}", reason, offset)});
    return Value();
  };
  // The parser counts in 32 bits.
  if (bytes.size() > std::numeric_limits<std::uint32_t>::max()) return fail("too long", 0);
  thread_local ValueBuilder builder;
  builder.clear();
  Decoder decoder(builder, maxDepth, kIpcMaxValues + bytes.size() / kIpcBytesPerValue, descriptors);
  std::size_t offset = 0;
  if (!msgpack::parse(reinterpret_cast<const char*>(bytes.data()), bytes.size(), offset, decoder)) {
    builder.clear();
    return fail(decoder.reason(), offset);
  }
  if (offset != bytes.size()) {
    builder.clear();
    return fail("trailing bytes", offset);
  }
  Value result = builder.take();
  builder.clear();
  return result;
}

}  // namespace

void encodeValue(const Value& value, Bytes& out, std::vector<int>* descriptors) {
  Output output(out);
  Encoder(output, descriptors).encode(value);
  output.finish();
}

Value decodeValue(std::span<const std::uint8_t> bytes, Error* error, std::span<UniqueFd> descriptors) {
  return decode(bytes, kIpcMaxDepth, error, descriptors);
}

Value toWireMessage(const Value& value) {
  // Encoded in memory that the thread keeps, so that the message gets exactly what it needs, at once.
  constexpr std::size_t kept = std::size_t{1} << 20;
  thread_local Bytes scratch;
  scratch.clear();
  encodeValue(value, scratch);
  Value message = Value::message(scratch);
  if (scratch.capacity() > kept) Bytes().swap(scratch);
  return message;
}

Value fromWireMessage(const Value& message) {
  if (!message.isMessage()) return {};
  return decode(message.bytes(), kIpcMaxMessageDepth, nullptr, {});
}

}  // namespace platform
