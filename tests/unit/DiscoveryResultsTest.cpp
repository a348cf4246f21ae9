#include "xtd/DiscoveryResults.h"

#include <gtest/gtest.h>

#include "Extora/XTProtocol.h"

namespace extora {
namespace {

struct Plug {
  const char* version;  // none: a plug-in without one
  bool onSystemVolume;
  std::int64_t lastModified;
};

// The places in the list of those that stay, in the order of the reply.
std::string kept(std::uint64_t flags, const std::vector<Plug>& plugs) {
  DiscoveryResults results(flags);
  for (std::size_t i = 0; i < plugs.size(); ++i) {
    const auto& [version, onSystemVolume, lastModified] = plugs[i];
    XTPlugInCore core;
    core.setIdentifier("com.example.x");
    core.setOnSystemVolume(onSystemVolume);
    core.setLastModified(lastModified);
    const Dictionary attributes{{XTVersionAttribute, version == nullptr ? Value() : Value(version)}};
    core.setPlugInDictionary(Dictionary{{XTAttributesInfoKey, attributes}});
    if (!results.admit(core)) continue;
    results.append(core, {{XTVersionFormKey, version == nullptr ? XTNoVersion : version},
                          {XTSystemResidentFormKey, onSystemVolume},
                          {XTLastModifiedFormKey, lastModified},
                          {XTUUIDFormKey, std::to_string(i)}});
  }
  std::string places;
  for (const Value& form : results.finish()) places += form[XTUUIDFormKey].string();
  return places;
}

TEST(DiscoveryResults, OfRivalsTheNewestThenTheSystemsThenTheLastRegisteredThenTheFirstStays) {
  EXPECT_EQ(kept(0, {{"1.9", true, 9}, {"1.10", false, 1}, {"1.2", true, 9}}), "1");
  EXPECT_EQ(kept(0, {{"1", false, 9}, {"01", true, 1}, {"1", false, 9}}), "1");
  EXPECT_EQ(kept(0, {{"1", false, 1}, {"1", false, 2}, {"1", false, 2}}), "1");
  EXPECT_EQ(kept(0, {{"1", false, 1}, {nullptr, false, 2}}), "1") << "compares equal to every version";
  EXPECT_EQ(kept(XTDiscoverAllVersions, {{"1", false, 1}, {"2", false, 1}, {"01", false, 2}}), "12");
  EXPECT_EQ(kept(XTDiscoverAllVersions | XTDiscoverDuplicates, {{"1", false, 2}, {"1", true, 1}}), "01");
}

}  // namespace
}  // namespace extora
