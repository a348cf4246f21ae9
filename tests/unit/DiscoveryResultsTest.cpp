#include "xtd/DiscoveryResults.h"

#include <gtest/gtest.h>

#include <random>

#include "Extora/XTProtocol.h"
#include "Extora/XTUtilities.h"

namespace extora {
namespace {

struct Plug {
  std::string identifier;
  std::optional<std::string> version;
  bool onSystemVolume = false;
  std::int64_t lastModified = 0;
  Value overrides;
  Uuid uuid = Uuid::random();
};

XTPlugInCore record(const Plug& plug) {
  XTPlugInCore core;
  core.setIdentifier(plug.identifier);
  core.setUuid(plug.uuid);
  core.setOnSystemVolume(plug.onSystemVolume);
  core.setLastModified(plug.lastModified);
  core.setEntitlements(Dictionary{{XTOverrideEntitlement, plug.overrides}});
  Dictionary attributes;
  if (plug.version) attributes.set(XTVersionAttribute, *plug.version);
  core.setPlugInDictionary(Dictionary{{XTAttributesInfoKey, std::move(attributes)}});
  return core;
}

Dictionary form(const Plug& plug) {
  return {{XTIdentifierFormKey, plug.identifier},
          {XTVersionFormKey, plug.version.value_or(std::string(XTNoVersion))},
          {XTSystemResidentFormKey, plug.onSystemVolume},
          {XTLastModifiedFormKey, plug.lastModified},
          {XTUUIDFormKey, plug.uuid.text()}};
}

bool add(DiscoveryResults& results, const Plug& plug) {
  const auto core = record(plug);
  if (!results.admit(core)) return false;
  results.append(core, form(plug));
  return true;
}

platform::Array discover(std::uint64_t flags, const std::vector<Plug>& plugs) {
  DiscoveryResults results(flags);
  for (const auto& plug : plugs) add(results, plug);
  return results.finish();
}

// The rules as one walk over all forms.
class NaiveWalk {
 public:
  explicit NaiveWalk(std::uint64_t flags) : flags_(flags) {}

  void add(const Plug& p) {
    for (auto e = forms_.begin(); e != forms_.end(); ++e) {
      if ((*e)[XTIdentifierFormKey].string() != p.identifier) continue;
      auto order = std::weak_ordering::equivalent;
      if (p.version) order = compareVersionString(*p.version, (*e)[XTVersionFormKey].string());
      if ((flags_ & XTDiscoverAllVersions) != 0) {
        if (order != 0 || (flags_ & XTDiscoverDuplicates) != 0) continue;
      } else if (order < 0) {
        return;
      }
      if (order == 0) {
        const bool resident = (*e)[XTSystemResidentFormKey].booleanValue();
        if (!p.onSystemVolume && resident) return;
        const bool wins = p.onSystemVolume && !resident;
        if (!wins && p.lastModified <= (*e)[XTLastModifiedFormKey].integerValue()) return;
      }
      forms_.erase(e);
      break;
    }
    forms_.push_back(form(p));
  }

  const std::vector<Dictionary>& forms() const { return forms_; }

 private:
  std::uint64_t flags_;
  std::vector<Dictionary> forms_;
};

TEST(DiscoveryResults, AnswersWhatAWalkOverAllFormsAnswers) {
  std::mt19937 random(20261122);
  const auto pick = [&](int count) { return std::uniform_int_distribution<int>(0, count - 1)(random); };
  const std::vector<std::optional<std::string>> versions = {"1.9", "1.10", "1.09",   "01.9",       "2",    "2a",
                                                            "2A",  "",     "<none>", std::nullopt, "1.9b", "10.0.0"};
  for (int round = 0; round < 640; ++round) {
    const std::uint64_t flags = static_cast<std::uint64_t>(round % 16);  // with bits that mean nothing here
    NaiveWalk expected(flags);
    DiscoveryResults results(flags);
    const int identifiers = 1 + pick(3);
    for (int i = 0, count = pick(40); i < count; ++i) {
      const Plug plug{"com.example." + std::to_string(pick(identifiers)),
                      versions[static_cast<std::size_t>(pick(static_cast<int>(versions.size())))],
                      pick(2) == 0,
                      pick(3),
                      {}};
      expected.add(plug);
      add(results, plug);
    }
    const auto forms = results.finish();
    ASSERT_EQ(forms.size(), expected.forms().size()) << "flags " << flags << " round " << round;
    for (std::size_t i = 0; i < forms.size(); ++i) {
      ASSERT_EQ(forms[i], Value(expected.forms()[i])) << "flags " << flags << " round " << round << " form " << i;
    }
  }
}

TEST(DiscoveryResults, OverridesLinkBothForms) {
  const Plug plain{"com.example.q", "1", false, 0, {}};
  const Plug first{"com.example.p", "1", false, 0, "com.example.q"};
  const Plug later{"com.example.r", "1", false, 0, platform::Array{"com.example.x", std::uint64_t{7}, "com.example.q"}};

  const auto forms = discover(0, {first, plain, later});
  EXPECT_TRUE(forms[0][XTOverridingFormKey].isNothing()) << "the later of two overriders counts";
  EXPECT_EQ(forms[1][XTOverriderFormKey], later.uuid.text());
  EXPECT_EQ(forms[2][XTOverridingFormKey], "com.example.q");

  // An overrider that gave way to a newer version of itself still overrides.
  const Plug newer{"com.example.p", "2", false, 0, {}};
  const auto replaced = discover(0, {first, newer, plain});
  ASSERT_EQ(replaced.size(), 2U);
  EXPECT_EQ(replaced[1][XTOverriderFormKey], first.uuid.text());
}

}  // namespace
}  // namespace extora
