#include "tools/MetadataKeys.h"

#include <fmt/format.h>

#include <algorithm>
#include <cctype>
#include <numeric>
#include <vector>

#include "Extora/XTVocabulary.h"

namespace tools {

using platform::Value;
using namespace extora;  // the names of the keys

namespace {

enum class Kind { Any, Text, TextOrNumber, Boolean, Number, Texts, Dictionaries, Dictionary };

struct KnownKey {
  KeyPlace place;
  std::string_view name;
  Kind kind;
  const char* otherwise;  // what becomes of a value of another kind
};

constexpr const char* kIgnored = "it is ignored";
constexpr const char* kNoVersion = "the plug-in counts as without a version";

constexpr KnownKey kKeys[] = {
    {KeyPlace::Info, HBBundleIdentifierKey, Kind::Text, "the bundle counts as without an identifier"},
    {KeyPlace::Info, HBBundleDisplayNameKey, Kind::Text, kIgnored},
    {KeyPlace::Info, HBBundleNameKey, Kind::Text, kIgnored},
    {KeyPlace::Info, "HBBundleVersion", Kind::TextOrNumber, "it counts as 1"},
    {KeyPlace::Info, HBBundleShortVersionStringKey, Kind::Text, kIgnored},
    {KeyPlace::Info, "HBBundleExecutable", Kind::Text, "the bundle counts as without an executable"},
    {KeyPlace::Info, "HBBundlePlaceholder", Kind::Boolean, kIgnored},
    {KeyPlace::Info, "HXTypeDeclarations", Kind::Dictionaries, kIgnored},
    {KeyPlace::Info, "HXExtensionPoints", Kind::Dictionary, kIgnored},
    {KeyPlace::Info, "IPCService", Kind::Dictionary, kIgnored},
    {KeyPlace::Info, XTExtoraInfoKey, Kind::Any, nullptr},
    {KeyPlace::Info, XTExtoraInfoKey_L, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTAttributesInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTSDKInfoKey, Kind::Text, "the plug-in serves no extension point"},
    {KeyPlace::PlugIn, XTProtocolInfoKey, Kind::Text, kIgnored},
    {KeyPlace::PlugIn, XTPrincipalClassInfoKey, Kind::Text, kIgnored},
    {KeyPlace::PlugIn, XTDedicatedInfoKey, Kind::Boolean, kIgnored},
    {KeyPlace::PlugIn, XTHostEntitlementInfoKey, Kind::Text, "no host may use the plug-in"},
    {KeyPlace::PlugIn, XTHubProtocolVersionInfoKey, Kind::Number, "it counts as 0"},
    {KeyPlace::PlugIn, XTSharedResourcesInfoKey, Kind::Texts, kIgnored},
    {KeyPlace::PlugIn, XTCleanTimeoutInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTMultipleInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTPassProxyInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTEmbeddedCodeInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTEmbeddedProtocolInfoKey, Kind::Text, kIgnored},
    {KeyPlace::PlugIn, XTSubsystemsInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTDelegateInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTExtoraHostInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTUsesEmbeddedInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, XTSDKSpecInfoKey, Kind::Any, nullptr},
    {KeyPlace::PlugIn, "HXExtensionDocSourceActions", Kind::Dictionaries, kIgnored},
    {KeyPlace::Attributes, XTVersionAttribute, Kind::Text, kNoVersion},
    {KeyPlace::Attributes, XTIdentifierAttribute, Kind::Text, kIgnored},
    {KeyPlace::Attributes, XTProtocolAttribute, Kind::Text, kIgnored},
    {KeyPlace::Attributes, "RequestsOpenAccess", Kind::Boolean, kIgnored},
    {KeyPlace::Entitlements, XTManagerEntitlement, Kind::Boolean, "any text or dictionary counts as true"},
    {KeyPlace::Entitlements, XTAllowedPlugInsEntitlement, Kind::Dictionary, "the host may use no plug-in at all"},
    {KeyPlace::Entitlements, XTEnvironmentProvisionEntitlement, Kind::Boolean, "any text or dictionary counts as true"},
    {KeyPlace::Entitlements, XTOverrideEntitlement, Kind::Text, kIgnored},
    {KeyPlace::Entitlements, XTAutoElectEntitlement, Kind::Boolean, "any text or dictionary counts as true"},
};

struct OldName {
  std::string_view old;
  std::string_view now;
};
constexpr OldName kOldNames[] = {{XTAttributesInfoKey_L, XTAttributesInfoKey},
                                 {XTProtocolInfoKey_L, XTProtocolInfoKey},
                                 {XTSDKInfoKey_L, XTSDKInfoKey}};

const char* nameOf(Kind kind) {
  switch (kind) {
    case Kind::Text:
      return "a string";
    case Kind::TextOrNumber:
      return "a string or a number";
    case Kind::Boolean:
      return "true or false";
    case Kind::Number:
      return "a number";
    case Kind::Texts:
      return "an array of strings";
    case Kind::Dictionaries:
      return "an array of dictionaries";
    case Kind::Dictionary:
      return "a dictionary";
    case Kind::Any:
      break;
  }
  return "";
}

const char* nameOf(KeyPlace place) {
  switch (place) {
    case KeyPlace::Info:
      return "the Info.plist itself";
    case KeyPlace::PlugIn:
      return "HXExtension";
    case KeyPlace::Attributes:
      return "HXExtensionAttributes";
    case KeyPlace::Entitlements:
      return "Entitlements.plist";
  }
  return "";
}

bool isOf(Kind kind, const Value& value) {
  const auto all = [&](auto&& test) {
    return value.isArray() && std::all_of(value.items().begin(), value.items().end(), test);
  };
  switch (kind) {
    case Kind::Text:
      return value.isString();
    case Kind::TextOrNumber:
      return value.isString() || value.isNumber();
    case Kind::Boolean:
      return value.isNumber();
    case Kind::Number:
      return value.isNumber() && !value.isBoolean();
    case Kind::Texts:
      return all([](const Value& each) { return each.isString(); });
    case Kind::Dictionaries:
      return all([](const Value& each) { return each.isDictionary(); });
    case Kind::Dictionary:
      return value.isDictionary();
    case Kind::Any:
      break;
  }
  return true;
}

std::string lowered(std::string_view text) {
  std::string result(text);
  std::transform(result.begin(), result.end(), result.begin(), [](unsigned char c) { return std::tolower(c); });
  return result;
}

// How many characters must be added, left out or changed to make `b` of `a` (Levenshtein 1966), whatever their case.
std::size_t distance(std::string_view first, std::string_view second) {
  const std::string a = lowered(first);
  const std::string b = lowered(second);
  std::vector<std::size_t> row(b.size() + 1);
  std::iota(row.begin(), row.end(), std::size_t{0});
  for (std::size_t i = 0; i < a.size(); ++i) {
    std::size_t diagonal = std::exchange(row[0], i + 1);
    for (std::size_t j = 0; j < b.size(); ++j) {
      const std::size_t changed = diagonal + (a[i] == b[j] ? 0 : 1);
      diagonal = row[j + 1];
      row[j + 1] = std::min({changed, row[j] + 1, row[j + 1] + 1});
    }
  }
  return row.back();
}

// The known key that was probably meant by one that is not known at its place; null for none. A key that belongs to
// another place is one, too.
const KnownKey* meantBy(std::string_view key, KeyPlace place) {
  constexpr std::size_t kClose = 2;
  constexpr std::size_t kShort = 6;  // of names as short as this too many are close to each other
  const KnownKey* best = nullptr;
  std::size_t bestDistance = kClose + 1;
  for (const KnownKey& known : kKeys) {
    const std::size_t apart = distance(key, known.name);
    // Authors name their attributes and their entitlements as they like; only a key with a meaning is misplaced.
    if (apart > 0 && (known.place != place || key.size() <= kShort)) continue;
    if (apart < bestDistance) {
      best = &known;
      bestDistance = apart;
    }
  }
  return best;
}

}  // namespace

void checkKeys(KeyPlace place, const Value& dictionary, const std::string& file, const Report& report) {
  for (const auto& [name, value] : dictionary.entries()) {
    const std::string key = name;
    const auto warn = [&](std::string problem, std::string advice) {
      report({Finding::Severity::Warning, file, key, std::move(problem), std::move(advice)});
    };
    const auto is = [&](const KnownKey& known) { return known.place == place && known.name == key; };
    const KnownKey* const known = std::find_if(std::begin(kKeys), std::end(kKeys), is);
    if (known != std::end(kKeys)) {
      if (!isOf(known->kind, value)) {
        warn(fmt::format("it is not {}: {}", nameOf(known->kind), known->otherwise),
             fmt::format("make it {}", nameOf(known->kind)));
      }
      continue;
    }
    const auto old =
        std::find_if(std::begin(kOldNames), std::end(kOldNames), [&](const OldName& each) { return each.old == key; });
    if (place == KeyPlace::PlugIn && old != std::end(kOldNames)) {
      warn("it is an old name, which nothing reads", fmt::format("name it {}", old->now));
    } else if (const KnownKey* meant = meantBy(key, place); meant == nullptr) {
      continue;
    } else if (meant->place != place && meant->name == key) {
      warn("it means nothing here", fmt::format("put it into {}", nameOf(meant->place)));
    } else {
      warn("there is no such key", fmt::format("is it {} that you mean?", meant->name));
    }
  }
}

}  // namespace tools
