#include "platform/ipc/IpcCodec.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <fstream>
#include <limits>
#include <map>

#include "platform/ipc/IpcFrame.h"
#include "platform/value/InternalInconsistency.h"
#include "tests/support/PrintDescribed.h"

namespace platform {
namespace {

Bytes fromHex(std::string_view hex) {
  Bytes bytes;
  for (std::size_t i = 0; i + 1 < hex.size(); i += 2) {
    bytes.push_back(static_cast<std::uint8_t>(std::stoi(std::string(hex.substr(i, 2)), nullptr, 16)));
  }
  return bytes;
}

std::string toHex(std::span<const std::uint8_t> bytes) {
  std::string out;
  for (const std::uint8_t byte : bytes) out += fmt::format("{:02x}", byte);
  return out;
}

Bytes encoded(const Value& value) {
  Bytes out;
  encodeValue(value, out);
  return out;
}

Value decodedHex(std::string_view hex) {
  return decodeValue(fromHex(hex), nullptr);
}

std::string repeated(std::size_t times, std::string_view text) {
  std::string out;
  while (times-- > 0) out += text;
  return out;
}

// The lines of the golden file below the heading that begins with `section`: what stands left of the bar, and right.
std::vector<std::pair<std::string, std::string>> goldenLines(std::string_view section,
                                                             const char* name = "/wire-vectors.txt") {
  std::ifstream file(std::string(EXTORA_TEST_DATA) + name);
  std::vector<std::pair<std::string, std::string>> lines;
  bool inside = false;
  for (std::string line; std::getline(file, line);) {
    if (line.starts_with("#")) {
      if (line != "#") inside = line.starts_with("# " + std::string(section));
    } else if (const std::size_t bar = line.find(" |"); inside && bar != std::string::npos) {
      lines.emplace_back(line.substr(0, bar), line.size() > bar + 3 ? line.substr(bar + 3) : "");
    }
  }
  return lines;
}

const Uuid kUuid = *Uuid::parse("8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8");
constexpr std::uint64_t kTwo32 = std::uint64_t{1} << 32;
constexpr std::int64_t kLeast = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kMost = std::numeric_limits<std::int64_t>::max();

const std::map<std::string, Value>& goldenValues() {
  static const std::map<std::string, Value> values{
      {"unsigned 0", 0U},
      {"unsigned 127", 127U},
      {"unsigned 128", 128U},
      {"unsigned 65535", 65535U},
      {"unsigned 65536", 65536U},
      {"unsigned 2^32", kTwo32},
      {"unsigned 2^64-1", std::numeric_limits<std::uint64_t>::max()},
      {"signed 0", std::int64_t{0}},
      {"signed 5", 5},
      {"signed 127", 127},
      {"signed 128", 128},
      {"signed -1", -1},
      {"signed -32", -32},
      {"signed -33", -33},
      {"signed -129", -129},
      {"signed 40000", 40000},
      {"signed 2^31", std::int64_t{1} << 31},
      {"signed -2^63", kLeast},
      {"signed 2^63-1", kMost},
      {"boolean true", true},
      {"boolean false", false},
      {"real 1.5", 1.5},
      {"real -0.0", -0.0},
      {"string empty", ""},
      {"string of 31 a", std::string(31, 'a')},
      {"string of 32 a", std::string(32, 'a')},
      {"string Grüße", "Grüße"},
      {"data empty", Value::data({})},
      {"data 00 ff", Value::data({0, 255})},
      {"UUID 8C0A1B2C-3D4E-4F60-8182-93A4B5C6D7E8", kUuid},
      {"date 1970-01-01T00:00:00Z", Date{}},
      {"date 2026-11-22T20:00:00Z", Date{1'795'377'600, 0}},
      {"date 1969-12-31T23:59:59Z", Date{-1, 0}},
      {"date 2026-11-22T20:00:00.5Z", Date{1'795'377'600, 500'000'000}},
      {"array empty", Array()},
      {"array of unsigned 1 and string b", Array{1U, "b"}},
      {"array of 16 times true", Array(std::vector<Value>(16, true))},
      {"dictionary empty", Dictionary()},
      {"dictionary {b: unsigned 1, a: signed 1, aa: true, Z: []}",
       Dictionary{{"b", 1U}, {"a", 1}, {"aa", true}, {"Z", Array()}}},
      {"message holding signed 1", toWireMessage(1)},
      {"message holding {identifier: com.example.a}", toWireMessage(Dictionary{{"identifier", "com.example.a"}})},
  };
  return values;
}

TEST(IpcCodecTest, EveryKindHasItsGoldenBytes) {
  const auto lines = goldenLines("values");
  EXPECT_EQ(lines.size(), goldenValues().size());
  for (const auto& [name, hex] : lines) {
    ASSERT_TRUE(goldenValues().contains(name)) << name;
    const Value& value = goldenValues().at(name);
    EXPECT_EQ(toHex(encoded(value)), hex) << name;
    const Value read = decodedHex(hex);
    EXPECT_EQ(read, value) << name;
    EXPECT_EQ(read.kind(), value.kind()) << name;
    EXPECT_EQ(toHex(encoded(read)), hex) << name;
  }
}

TEST(IpcCodecTest, WholeFramesHaveTheirGoldenBytes) {
  using Type = IpcFrameType;
  const std::map<std::string, std::pair<Type, Value>> frames{
      {"request {request: match, version: unsigned 3}",
       {Type::Request, Dictionary{{"request", "match"}, {"version", 3U}}}},
      {"request {request: find, uuids: the UUID above, version: unsigned 3}",
       {Type::Request, Dictionary{{"request", "find"}, {"uuids", kUuid}, {"version", 3U}}}},
      {"reply, empty", {Type::Reply, Dictionary()}},
      {"reply {error: Cannot locate PlugIn, errorcode: unsigned 15}",
       {Type::Reply, Dictionary{{"error", "Cannot locate PlugIn"}, {"errorcode", 15U}}}},
      {"request without reply {request: bulk, version: unsigned 3, flags: unsigned 0}",
       {Type::RequestWithoutReply, Dictionary{{"request", "bulk"}, {"version", 3U}, {"flags", 0U}}}},
      {"my termination is imminent", {Type::TerminationImminent, Value()}},
  };
  const auto lines = goldenLines("whole frames");
  EXPECT_EQ(lines.size(), frames.size());
  for (const auto& [name, hex] : lines) {
    ASSERT_TRUE(frames.contains(name)) << name;
    const auto& [type, body] = frames.at(name);
    Bytes bytes;
    if (body) encodeValue(body, bytes);
    const IpcFrameHeader header{static_cast<std::uint32_t>(bytes.size()), type, 0, 0, 1};
    EXPECT_EQ(toHex(header.serialize()) + toHex(bytes), hex) << name;

    const Bytes frame = fromHex(hex);
    EXPECT_EQ(IpcFrameHeader::parse(std::span(frame).first<IpcFrameHeader::kSize>(), nullptr), header) << name;
    EXPECT_EQ(decodeValue(std::span(frame).subspan(IpcFrameHeader::kSize), nullptr), body) << name;
  }
}

TEST(IpcCodecTest, MalformedBodiesAreRefusedWithAReason) {
  auto lines = goldenLines("malformed");
  EXPECT_EQ(lines.size(), 14U);
  const auto more = goldenLines("further malformed", "/malformed-bodies.txt");
  EXPECT_EQ(more.size(), 18U);
  lines.insert(lines.end(), more.begin(), more.end());
  for (const auto& [name, hex] : lines) {
    Error error;
    EXPECT_TRUE(decodeValue(fromHex(hex), &error).isNothing()) << name;
    EXPECT_EQ(error.domain, "IPC") << name;
    EXPECT_EQ(error.code, 1) << name;
    EXPECT_TRUE(error.description && error.description->starts_with("malformed body: ")) << name;
  }
}

TEST(IpcCodecTest, AValueCutAnywhereIsMalformed) {
  Array everything;
  for (const auto& [name, value] : goldenValues()) everything.append(value);
  const Bytes bytes = encoded(everything);
  ASSERT_EQ(decodeValue(bytes, nullptr), Value(everything));
  for (std::size_t length = 0; length < bytes.size(); ++length) {
    EXPECT_TRUE(decodeValue(std::span(bytes).first(length), nullptr).isNothing()) << length;
  }
}

TEST(IpcCodecTest, AnyOrderAndAnyLengthFormIsRead) {
  EXPECT_EQ(decodedHex("82a162c2a161c3"), Value(Dictionary{{"a", true}, {"b", false}}));
  EXPECT_EQ(decodedHex("de0001d90161db0000000178"), Value(Dictionary{{"a", "x"}}));
  EXPECT_EQ(decodedHex("dd00000001da000178"), Value(Array{"x"}));
  EXPECT_EQ(decodedHex("cf0000000000000007").exactUnsigned(), 7U);
  EXPECT_EQ(decodedHex("d3fffffffffffffffb").exactSigned(), -5);
  EXPECT_EQ(decodedHex("d3fffffffffffffffb").kind(), Kind::Signed);
  EXPECT_EQ(decodedHex("ca3fc00000"), Value(1.5));
  EXPECT_EQ(decodedHex("c71001000102030405060708090a0b0c0d0e0f").uuid().bytes()[15], 15);
  EXPECT_EQ(decodedHex("c70cff00000000000000006b0349c0"), Value(Date{1'795'377'600, 0}));
  EXPECT_EQ(decodedHex("c6000000020102"), Value::data({1, 2}));
}

TEST(IpcCodecTest, DepthIsBoundedAndCountsAnewInsideAMessage) {
  const auto arrays = [](std::size_t levels) { return repeated(levels - 1, "91") + "90"; };
  const auto maps = [](std::size_t levels) { return repeated(levels - 1, "81a0") + "01"; };
  EXPECT_TRUE(decodedHex(arrays(kIpcMaxDepth)).isArray());
  EXPECT_TRUE(decodedHex(arrays(kIpcMaxDepth + 1)).isNothing());
  EXPECT_TRUE(decodedHex(maps(kIpcMaxDepth)).isDictionary());
  EXPECT_TRUE(decodedHex(maps(kIpcMaxDepth + 1)).isNothing());
  EXPECT_TRUE(decodedHex(repeated(1'000'000, "91")).isNothing());

  Value deep = Array();
  for (std::size_t i = 1; i < kIpcMaxMessageDepth; ++i) deep = Array{deep};
  EXPECT_EQ(fromWireMessage(toWireMessage(deep)), deep);
  EXPECT_TRUE(fromWireMessage(toWireMessage(Array{deep})).isNothing());
  // A message is one level of what it travels in, whatever it holds.
  Value carried = toWireMessage(deep);
  for (std::size_t i = 1; i < kIpcMaxDepth; ++i) carried = Array{carried};
  EXPECT_EQ(decodeValue(encoded(carried), nullptr), carried);
}

TEST(IpcCodecTest, ManySmallValuesAreBounded) {
  const auto array = [](std::size_t count) {
    Bytes bytes{0xDD, static_cast<std::uint8_t>(count >> 24), static_cast<std::uint8_t>(count >> 16),
                static_cast<std::uint8_t>(count >> 8), static_cast<std::uint8_t>(count)};
    bytes.resize(bytes.size() + count, 0x90);
    return bytes;
  };
  // The array itself is a value too, and some are allowed for the body's own length.
  const std::size_t allowed = (kIpcMaxValues - 1) * kIpcBytesPerValue / (kIpcBytesPerValue - 1);
  EXPECT_EQ(decodeValue(array(allowed), nullptr).size(), allowed);
  EXPECT_TRUE(decodeValue(array(allowed + 16), nullptr).isNothing());
}

TEST(IpcCodecTest, WhatCannotBeEncodedLeavesTheBufferAsItWas) {
  Bytes bytes{1, 2, 3};
  EXPECT_THROW(encodeValue(Value(), bytes), InternalInconsistency);
  EXPECT_THROW(encodeValue(Array{std::string(5000, 'x'), Value::descriptor(UniqueFd())}, bytes), InternalInconsistency);
  EXPECT_EQ(bytes, (Bytes{1, 2, 3}));
  // A string that could not travel is repaired, so that the body stays well-formed.
  EXPECT_EQ(decodeValue(encoded(Dictionary{{"k\xFF", "a\x01z"}}), nullptr),
            Value(Dictionary{{"k\xEF\xBF\xBD", "a\xEF\xBF\xBDz"}}));
}

}  // namespace
}  // namespace platform
