#include "platform/plist/PropertyList.h"

#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <limits>
#include <string>

#include "platform/files/UniqueFd.h"
#include "tests/support/PrintDescribed.h"

namespace platform {
namespace {

Value parse(std::string_view text, Error* error = nullptr) {
  return parsePropertyList({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()}, error);
}

Value parseBody(const std::string& body) {
  return parse("<plist version=\"1.0\">" + body + "</plist>");
}

// "line L, column C: reason", or "" when the text was read.
std::string faultOf(std::string_view text) {
  Error error;
  if (parse(text, &error)) return {};
  EXPECT_EQ(error.domain, "PropertyList");
  EXPECT_EQ(error.code, 1);
  return error.description.value_or("no description");
}

std::string repeated(std::size_t times, std::string_view text) {
  std::string out;
  while (times-- > 0) out += text;
  return out;
}

TEST(PropertyListTest, ReadsADocumentAsOthersWriteIt) {
  const Value value = parse(R"(<?xml version="1.0" encoding="utf-8"?>
<!DOCTYPE plist PUBLIC "-//NOBODY//DTD PLIST 1.0//EN" "http://nobody.example/plist.dtd" [ <!ELEMENT plist ANY> ]>
<!-- comment --><plist version='1.0'>
<dict>
  <key>a &amp; b</key><string> x&lt;<![CDATA[<y>]]>&#233;<!-- inside -->z </string>
  <key>list</key><array><true/><false></false><integer>1</integer><real>-2.5e1</real><string/></array>
  <key>data</key><data>
    AAH/
    /w==
  </data>
  <key>date</key><date>2026-11-22T20:00:00Z</date>
  <key>same</key><integer>1</integer><key>same</key><integer>2</integer>
  <key></key><dict/>
</dict>
</plist>
)");
  EXPECT_EQ(value, Value(Dictionary{{"a & b", " x<<y>\xC3\xA9z "},
                                    {"list", Array{true, false, 1, -25.0, ""}},
                                    {"data", Value::data({0, 1, 255, 255})},
                                    {"date", Date{1'795'377'600, 0}},
                                    {"same", 2},
                                    {"", Dictionary()}}))
      << value.describe();
}

TEST(PropertyListTest, IntegersAreSignedUntilTheyNeedToBeUnsigned) {
  for (const auto& [text, number] : std::initializer_list<std::pair<const char*, Value>>{
           {"0", std::int64_t{0}},
           {"-0", std::int64_t{0}},
           {" +42\n", 42},
           {"007", 7},
           {"0xfF", 255},
           {"-0X10", -16},
           {"9223372036854775807", std::numeric_limits<std::int64_t>::max()},
           {"9223372036854775808", std::uint64_t{1} << 63},
           {"0xFFFFFFFFFFFFFFFF", std::numeric_limits<std::uint64_t>::max()},
           {"-9223372036854775808", std::numeric_limits<std::int64_t>::min()}}) {
    const Value read = parseBody("<integer>" + std::string(text) + "</integer>");
    EXPECT_EQ(read, number) << text;
    EXPECT_EQ(read.kind(), number.kind()) << text;
  }
  for (const char* text : {"", "-", "0x", "1.0", "1 2", "--1", "+-1", "1e3", "18446744073709551616", "0b1",
                           "-9223372036854775809", "0x1FFFFFFFFFFFFFFFF", "- 1"}) {
    EXPECT_TRUE(parseBody("<integer>" + std::string(text) + "</integer>").isNothing()) << text;
  }
}

TEST(PropertyListTest, RefusesWhatIsNoPropertyListAndSaysWhere) {
  EXPECT_EQ(faultOf("<plist version=\"1.0\">\n<array>\n\xC3\xA9</array></plist>"),
            "line 3, column 1: text where none belongs");
  EXPECT_EQ(faultOf("<plist version=\"1.0\">\n <string>\xC3\xA9</string> <integer>1x</integer></plist>"),
            "line 2, column 21: more than one value");
  EXPECT_EQ(faultOf("<plist version=\"1.0\">\r\n<integer>1x</integer></plist>"),
            "line 2, column 1: no integer of 64 bits");
  EXPECT_EQ(faultOf("<plist version=\"1.0\">\n<string>\xFF</string></plist>"),
            "line 2, column 9: not valid UTF-8 text");
  EXPECT_EQ(faultOf("<plist version=\"1.0\">\n<true/>\n</plis>"), "line 3, column 3: mismatched tag");
  for (const char* text : {"", "{}", "<dict/>", "<plist><true/></plist>", "<plist version=\"1.1\"><true/></plist>",
                           "<plist version=\"1.0\"></plist>", "<plist version=\"1.0\"><true/></plist><true/>",
                           "<plist version=\"1.0\"><true/>", "<plist version=\"1.0\"><plist/></plist>",
                           "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?><plist version=\"1.0\"><true/></plist>"}) {
    EXPECT_NE(faultOf(text), "") << text;
  }
  std::ifstream malformed(EXTORA_TEST_DATA "/malformed-values.txt");
  std::size_t count = 0;
  for (std::string body; std::getline(malformed, body);) {
    if (body.starts_with('#')) continue;
    ++count;
    EXPECT_TRUE(parseBody(body).isNothing()) << body;
  }
  EXPECT_GT(count, 20U);
  const std::string little("<\0p\0", 4);
  EXPECT_EQ(faultOf(little), "line 1, column 2: not valid UTF-8 text");
}

TEST(PropertyListTest, RefusesEntitiesOfEverySort) {
  const std::string body = "<plist version=\"1.0\"><string>&e;</string></plist>";
  for (const char* subset : {"<!ENTITY e \"text\">", "<!ENTITY e SYSTEM \"file:///etc/passwd\">",
                             "<!ENTITY % p \"text\">", "<!ENTITY % p SYSTEM \"http://nobody.example\"> %p;", "%p;"}) {
    const std::string text = "<!DOCTYPE plist [" + std::string(subset) + "]>\n";
    EXPECT_NE(faultOf(text + body).find("entities are not supported"), std::string::npos) << subset;
  }
  EXPECT_EQ(faultOf("<!DOCTYPE plist SYSTEM \"a.dtd\">\n" + body), "line 2, column 30: entities are not supported");
  EXPECT_EQ(faultOf(body), "line 1, column 30: undefined entity");
  EXPECT_NE(faultOf("<!DOCTYPE plist SYSTEM \"a.dtd\"><plist version=\"&e;1.0\"><true/></plist>"), "");
}

TEST(PropertyListTest, DepthIsBoundedInBothDirections) {
  const auto document = [](std::size_t levels) { return repeated(levels, "<array>") + repeated(levels, "</array>"); };
  EXPECT_TRUE(parseBody(document(kPropertyListMaxDepth)).isArray());
  EXPECT_TRUE(parseBody(document(kPropertyListMaxDepth + 1)).isNothing());
  EXPECT_TRUE(parseBody(document(100'000)).isNothing());
  Value nested = Array();
  for (std::size_t i = 1; i < kPropertyListMaxDepth; ++i) nested = Array{nested};
  EXPECT_TRUE(serializeXml(nested, nullptr));
  EXPECT_FALSE(serializeXml(Array{nested}, nullptr));
}

TEST(PropertyListTest, WritesSortedIndentedAndEscaped) {
  const Value value = Dictionary{{"b", Array{1, std::numeric_limits<std::uint64_t>::max(), 0.1, true}},
                                 {"a<&>\"", "x\r\n\ty"},
                                 {"c", Dictionary{{"data", Value::data({1, 2, 3, 4})}, {"date", Date{-1, 7}}}},
                                 {"d", Array()},
                                 {"e", Dictionary()}};
  std::ifstream golden(EXTORA_TEST_DATA "/written.plist");
  EXPECT_EQ(serializeXml(value, nullptr), std::string(std::istreambuf_iterator<char>(golden), {}));
}

TEST(PropertyListTest, NamesTheKindThatCannotBeWritten) {
  for (const auto& [value, kind] : std::initializer_list<std::pair<Value, const char*>>{
           {Value(), "nothing"},
           {Uuid(), "UUID"},
           {Value::message({0xC3}), "message"},
           {Value::descriptor(UniqueFd()), "descriptor"},
           {std::numeric_limits<double>::infinity(), "real that is not finite"},
           {Date{253'402'300'800, 0}, "date"},
           {"\x01", "string"},
           {Dictionary{{"\xFF", 1}}, "string"}}) {
    Error error;
    EXPECT_EQ(serializeXml(Array{value}, &error), std::nullopt);
    EXPECT_EQ(error.domain, "PropertyList");
    EXPECT_EQ(error.code, 2);
    EXPECT_NE(error.description->find(kind), std::string::npos) << *error.description;
  }
}

}  // namespace
}  // namespace platform
