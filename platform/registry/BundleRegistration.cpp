#include "platform/registry/BundleRegistration.h"

#include <string_view>

#include "platform/ipc/IpcCodec.h"

namespace platform {
namespace {

constexpr std::size_t kFixedStamps = 3;
constexpr std::size_t kNumbersPerStamp = 3;

void append(Array& numbers, const FileStamp& stamp) {
  numbers.append(stamp.inode);
  numbers.append(stamp.size);
  numbers.append(stamp.modified);
}

FileStamp stampAt(const Value& numbers, std::size_t index) {
  return {numbers.at(index).exactUnsigned(), numbers.at(index + 1).exactUnsigned(),
          numbers.at(index + 2).exactSigned()};
}

std::string localized(const BundleRegistration& bundle, const std::vector<std::string>& languages,
                      std::string LocalizedNames::*name, std::string_view infoKey) {
  for (const std::string& language : languages) {
    for (const LocalizedNames& names : bundle.names) {
      if (names.language == language && !(names.*name).empty()) return names.*name;
    }
  }
  return bundle.info[infoKey].string();
}

}  // namespace

Value BundleRegistration::plugInDictionary() const {
  const Value& newStyle = info["HXExtension"];
  const Value& dictionary = newStyle.isNothing() ? info["Extora"] : newStyle;
  return dictionary.isDictionary() ? dictionary : Value();
}

std::string BundleRegistration::identifier() const {
  const Value dictionary = plugInDictionary();
  const std::string& own = dictionary["HXExtensionAttributes"]["HXExtensionIdentifier"].string();
  return own.empty() ? bundleIdentifier() : own;
}

std::string BundleRegistration::localizedName(const std::vector<std::string>& languages) const {
  std::string found = localized(*this, languages, &LocalizedNames::displayName, "HBBundleDisplayName");
  return found.empty() ? localizedShortName(languages) : found;
}

std::string BundleRegistration::localizedShortName(const std::vector<std::string>& languages) const {
  std::string found = localized(*this, languages, &LocalizedNames::name, "HBBundleName");
  if (!found.empty()) return found;
  const std::string_view directory = std::string_view(path).substr(path.rfind('/') + 1);
  const std::size_t dot = directory.rfind('.');
  return std::string(directory.substr(0, dot == 0 ? std::string_view::npos : dot));
}

Value valueOfStamp(const BundleStamp& stamp) {
  Array numbers;
  append(numbers, stamp.info);
  append(numbers, stamp.entitlements);
  append(numbers, stamp.localization);
  for (const auto& [language, table] : stamp.tables) {
    numbers.append(language);
    append(numbers, table);
  }
  return numbers;
}

BundleStamp stampOfValue(const Value& value) {
  BundleStamp stamp{stampAt(value, 0), stampAt(value, kNumbersPerStamp), stampAt(value, 2 * kNumbersPerStamp), {}};
  for (std::size_t i = kFixedStamps * kNumbersPerStamp; i < value.size(); i += 1 + kNumbersPerStamp) {
    stamp.tables.emplace_back(value.at(i).string(), stampAt(value, i + 1));
  }
  return stamp;
}

Bytes BundleRegistration::encode() const {
  Array localizations;
  for (const LocalizedNames& each : names) {
    localizations.append(Array{Value(each.language), Value(each.displayName), Value(each.name)});
  }
  // Info and entitlements may nest deeper than a body may, so they travel as messages.
  const Value content = Dictionary{{"uuid", uuid},
                                   {"date", date},
                                   {"stamp", valueOfStamp(stamp)},
                                   {"info", toWireMessage(info)},
                                   {"entitlements", entitlements ? toWireMessage(entitlements) : Value()},
                                   {"refused", entitlementsRefused},
                                   {"names", localizations}};
  Bytes bytes;
  encodeValue(content, bytes);
  return bytes;
}

RegistrationPtr BundleRegistration::decode(std::string path, std::span<const std::uint8_t> content) {
  const Value value = decodeValue(content, nullptr);
  auto bundle = std::make_shared<BundleRegistration>();
  bundle->info = fromWireMessage(value["info"]);
  if (!value["uuid"].isUuid() || !bundle->info.isDictionary()) return nullptr;
  bundle->path = std::move(path);
  bundle->uuid = value["uuid"].uuid();
  bundle->date = value["date"].realValue();
  bundle->stamp = stampOfValue(value["stamp"]);
  bundle->entitlements = fromWireMessage(value["entitlements"]);
  bundle->entitlementsRefused = value["refused"].exactBoolean();
  for (const Value& each : value["names"].items()) {
    bundle->names.push_back({each.at(0).string(), each.at(1).string(), each.at(2).string()});
  }
  return bundle;
}

}  // namespace platform
