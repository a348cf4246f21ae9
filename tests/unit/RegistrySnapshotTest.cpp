#include "platform/registry/RegistrySnapshot.h"

#include <gtest/gtest.h>

#include <random>
#include <set>

#include "platform/value/NumericOrder.h"
#include "tests/support/PrintDescribed.h"

namespace platform {
namespace {

RegistrationPtr registration(const std::string& path, const Dictionary& info, const Value& entitlements = {}) {
  auto bundle = std::make_shared<BundleRegistration>();
  bundle->path = path;
  bundle->uuid = Uuid::random();
  bundle->info = info;
  bundle->entitlements = entitlements;
  return bundle;
}

// The rules as the daemon applies them, written as plainly as possible.
namespace oracle {

bool matchesPattern(const Value& value, const Value& pattern) {
  if (!value.isString() || !pattern.isString()) return false;
  const std::string& text = pattern.string();
  const auto order = [&](std::size_t prefix) { return compareNumeric(value.string(), text.substr(prefix)); };
  if (text.starts_with("?")) return text == "?KD-IS:x" && value.string() == "x";
  if (text.starts_with("<>")) return order(2) != 0;
  if (text.starts_with("<=")) return order(2) <= 0;
  if (text.starts_with(">=")) return order(2) >= 0;
  if (text.starts_with("=")) return order(1) == 0;
  if (text.starts_with("<")) return order(1) < 0;
  if (text.starts_with(">")) return order(1) > 0;
  return order(0) == 0;
}

bool matchesPatterns(const Value& value, const Value& pattern) {
  if (!pattern.isArray()) return matchesPattern(value, pattern);
  const auto all = pattern.items();
  return std::any_of(all.begin(), all.end(), [&](const Value& each) { return matchesPattern(value, each); });
}

bool matchesRule(const ARExtoraProxy& record, const std::string& key, const Value& pattern) {
  Value value;
  if (key.starts_with("ENTITLEMENT:")) {
    value = record.entitlements[key.substr(12)];
  } else if (key == "HXExtensionContainingApp") {
    if (record.containingApplication == nullptr) return false;
    value = record.containingApplication->bundleURL->path();
  } else {
    if (key == "HXExtensionIdentifier" && !record.plugInIdentifier.empty()) value = record.plugInIdentifier;
    if (key == "com.orvane.uuid") value = record.plugInUUID->text();
    if (key == "HXUserElection") value = "0";
    if (value.isNothing()) value = record.infoDictionary["HXExtension"]["HXExtensionAttributes"][key];
    if (value.isNothing()) value = record.infoDictionary[key];
  }
  if (pattern == Value(true)) return !value.isNothing() && value != Value(false);
  if (pattern == Value(false)) return value.isNothing() || value == Value(false);
  if (pattern.isDictionary()) return !value.isNothing();  // at most
  if (!value.isArray()) return matchesPatterns(value, pattern);
  const auto all = value.items();
  return std::any_of(all.begin(), all.end(), [&](const Value& each) { return matchesPatterns(each, pattern); });
}

bool matches(const ARExtoraProxy& record, const Value& rules) {
  const auto all = rules.entries();
  return std::all_of(all.begin(), all.end(),
                     [&](const Value::Entry& rule) { return matchesRule(record, rule.key, rule.value); });
}

}  // namespace oracle

class QueryIndexTest : public ::testing::Test {
 protected:
  static constexpr const char* kTexts[] = {"a", "a1", "a01", "a001b", "b", "", "1.10", "1.9", "=x", "x", "<"};
  static constexpr const char* kKeys[] = {"Kind",          "Plain",  "HXExtensionIdentifier",    "com.orvane.uuid",
                                          "ENTITLEMENT:e", "Absent", "HXExtensionContainingApp", "HXUserElection"};

  std::size_t below(std::size_t limit) { return std::uniform_int_distribution<std::size_t>(0, limit - 1)(random_); }
  Value text() { return kTexts[below(std::size(kTexts))]; }
  Value property() {
    switch (below(8)) {
      case 0:
        return Array{text(), text(), Value(1), Array{text()}};
      case 1:
        return Value(below(2) == 0);
      case 2:
        return below(3);
      case 3:
        return Value();
      default:
        return text();
    }
  }

  SnapshotPtr randomSnapshot() {
    std::vector<RegisteredGroupPtr> groups;
    for (int i = 0; i < 60; ++i) {
      const Dictionary attributes{{"Kind", property()}, {"HXExtensionIdentifier", property()}, {"Odd", property()}};
      const Dictionary plugIn{{"HXExtensionAttributes", below(5) == 0 ? Value("none") : Value(attributes)}};
      const Dictionary info{{below(6) == 0 ? "Extora" : "HXExtension", plugIn},
                            {"Kind", property()},
                            {"Plain", property()},
                            {"HXExtensionIdentifier", property()},
                            {"HXUserElection", property()},
                            {"HBBundleIdentifier", property()}};
      const bool inApplication = below(3) != 0;
      const std::string root = fmt::format("/a{}{}", i, inApplication ? ".app" : "");
      const auto one = registration(inApplication ? root + "/PlugIns/p" : root, info, Dictionary{{"e", property()}});
      groups.push_back(
          RegisteredGroup::make(inApplication ? registration(root, {}) : nullptr, {one}, {std::string()}, {}));
    }
    return RegistrySnapshot().changed(std::move(groups), {});
  }

  Value pattern(const RegistrySnapshot& snapshot) {
    static constexpr const char* kOperators[] = {"", "", "", "=", "=", "<>", "<=", ">=", "<", ">", "?KD-IS:", "?"};
    const PlugInRecord& some = snapshot.plugIns()[below(snapshot.plugIns().size())];
    const auto one = [&]() -> Value {
      const std::string op = kOperators[below(std::size(kOperators))];
      if (below(8) == 0) return op + some->plugInUUID->text();
      if (below(8) == 0 && some->containingApplication != nullptr) {
        return op + some->containingApplication->bundleURL->path();
      }
      return op + text().string();
    };
    switch (below(10)) {
      case 0:
        return Value(below(2) == 0);
      case 1:
        return below(3);
      case 2:
        return Dictionary{{"items", Array()}};
      case 3:
        return Array{one(), one(), Value(3)};
      case 4:
        return Array();
      default:
        return one();
    }
  }

  std::mt19937 random_{20260117};
};

TEST_F(QueryIndexTest, NoRecordThatTheRulesAcceptIsEverLost) {
  std::size_t accepted = 0;
  std::size_t narrowed = 0;
  for (int round = 0; round < 40; ++round) {
    const SnapshotPtr snapshot = randomSnapshot();
    for (int query = 0; query < 100; ++query) {
      Dictionary rules;
      for (std::size_t i = below(3) + 1; i > 0; --i) rules.set(kKeys[below(std::size(kKeys))], pattern(*snapshot));
      const PlugInRecords candidates = snapshot->candidates(rules);
      ASSERT_TRUE(std::is_sorted(candidates.begin(), candidates.end(), [](const auto& a, const auto& b) {
        return a->bundleURL->path() < b->bundleURL->path();
      }));
      const std::set<PlugInRecord> among(candidates.begin(), candidates.end());
      ASSERT_EQ(among.size(), candidates.size());
      narrowed += snapshot->plugIns().size() - among.size();
      for (const PlugInRecord& record : snapshot->plugIns()) {
        if (!oracle::matches(*record, rules)) continue;
        ++accepted;
        ASSERT_TRUE(among.contains(record)) << Value(rules).describe() << "\n" << record->infoDictionary.describe();
      }
    }
  }
  EXPECT_GT(accepted, 10'000U);
  EXPECT_GT(narrowed, 10'000U);
}

TEST_F(QueryIndexTest, KeepsTheMostUsedKeysAndUsesFewRulesOfOneQuery) {
  Dictionary info{{"HXExtension", Dictionary{}}};
  for (int i = 0; i < 20; ++i) info.set(fmt::format("key{}", i), "a");
  std::vector<RegisteredGroupPtr> groups;
  for (int i = 0; i < 20; ++i) {
    groups.push_back(RegisteredGroup::make(nullptr, {registration(fmt::format("/p{}", i), info)}, {std::string()}, {}));
  }
  const SnapshotPtr snapshot = RegistrySnapshot().changed(std::move(groups), {});
  const QueryIndex index(snapshot->plugIns());
  EXPECT_EQ(index.candidates(info).value().size(), 20U);
  EXPECT_EQ(index.keyCount(), 8U) << "a query orders no more indexes than that";

  for (int i = 0; i < 3; ++i) (void)index.candidates(Dictionary{{"key0", "a"}});
  for (std::size_t i = 0; i < 3 * kQueryIndexKeys; ++i) {
    (void)index.candidates(Dictionary{{fmt::format("other{}", i), "a"}});
  }
  EXPECT_EQ(index.keyCount(), kQueryIndexKeys);
  EXPECT_TRUE(index.hasKey("key0"));
  EXPECT_FALSE(index.hasKey("other0"));
}

}  // namespace
}  // namespace platform
