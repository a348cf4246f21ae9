#include "platform/registry/TypeRegistry.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

Value type(const char* identifier, const Value& conformsTo) {
  return Dictionary{{"HXTypeIdentifier", identifier}, {"HXTypeConformsTo", conformsTo}};
}

Value items(std::initializer_list<std::initializer_list<const char*>> all) {
  Array list;
  for (const auto& each : all) {
    Array types;
    for (const char* identifier : each) types.append(identifier);
    list.append(Dictionary{{"types", types}});
  }
  return Dictionary{{"items", list}};
}

class TypeRegistryTest : public ::testing::Test {
 protected:
  TypeRegistryTest() {
    types_.declare(Array{type("png", "image"), type("image", Array{Value("data"), Value("content")}),
                         type("ring.a", "ring.b"), type("ring.b", "ring.a")});
    // A second application says more about a type, and nonsense.
    types_.declare(Array{type("image", "visible"), type("", "image"), Value("png"), type("odd", 7),
                         type("mixed", Array{Value(1), Value("image")})});
    types_.declare("not an array");
  }
  TypeRegistry types_;
};

TEST_F(TypeRegistryTest, ATypeConformsToItselfItsParentsAndTheirsWhoeverDeclaredThem) {
  for (const char* other : {"png", "image", "data", "content", "visible"}) {
    EXPECT_TRUE(types_.conformsTo("png", other)) << other;
  }
  EXPECT_TRUE(types_.conformsTo("mixed", "visible"));
  EXPECT_FALSE(types_.conformsTo("image", "png"));
  EXPECT_FALSE(types_.conformsTo("data", "content"));
  EXPECT_TRUE(types_.conformsTo("nobody's", "nobody's"));
  EXPECT_FALSE(types_.conformsTo("nobody's", "data"));
  EXPECT_FALSE(types_.conformsTo("png", "nobody's"));
}

TEST_F(TypeRegistryTest, ACycleOfDeclarationsIsHarmless) {
  EXPECT_TRUE(types_.conformsTo("ring.a", "ring.b"));
  EXPECT_TRUE(types_.conformsTo("ring.b", "ring.a"));
  EXPECT_FALSE(types_.conformsTo("ring.a", "image"));
  EXPECT_TRUE(types_.evaluateActivationRule(Dictionary{{"ring.b", 1}}, items({{"ring.a"}})));
}

TEST_F(TypeRegistryTest, ARuleAcceptsWhenEveryItemConformsAndNoTypeIsMetTooOften) {
  const Value rule = Dictionary{{"image", 2}, {"text", 1}};
  EXPECT_TRUE(types_.evaluateActivationRule(rule, items({{"png"}, {"text"}, {"image"}})));
  EXPECT_FALSE(types_.evaluateActivationRule(rule, items({{"png"}, {"png"}, {"image"}})));
  EXPECT_FALSE(types_.evaluateActivationRule(rule, items({{"png"}, {"sound"}})));
  EXPECT_FALSE(types_.evaluateActivationRule(rule, items({{"data"}}))) << "a parent is no image";
  EXPECT_FALSE(types_.evaluateActivationRule(rule, items({})));
  EXPECT_TRUE(types_.evaluateActivationRule(rule, items({{"sound", "text"}}))) << "one type of an item suffices";
  // An item is met once by a named type, however many of its types conform, and by every named type it conforms to.
  EXPECT_TRUE(types_.evaluateActivationRule(Dictionary{{"image", 1}}, items({{"png", "image", "png"}})));
  EXPECT_FALSE(types_.evaluateActivationRule(Dictionary{{"data", 0}, {"png", 5}}, items({{"png"}})));
  // A type that nobody declared is named by itself.
  EXPECT_TRUE(types_.evaluateActivationRule(Dictionary{{"sound", true}}, items({{"sound"}})));
  EXPECT_FALSE(types_.evaluateActivationRule(Dictionary{{"sound", true}}, items({{"sound"}, {"sound"}})));
  EXPECT_TRUE(types_.evaluateActivationRule(Dictionary{{"image", ~std::uint64_t{0}}}, items({{"png"}, {"png"}})));
}

}  // namespace
}  // namespace platform
