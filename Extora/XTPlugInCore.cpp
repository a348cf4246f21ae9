// The record: setup, look-ups, what is derived from them. Its export form is in XTPlugInCore_Form.cpp, the merge with
// the dictionary of its extension point in XTPlugInCore_SDK.cpp.
#include "Extora/XTPlugInCore.h"

#include "Extora/XTLog.h"
#include "Extora/XTProtocol.h"
#include "Extora/XTUtilities.h"
#include "platform/value/InternalInconsistency.h"

namespace extora {
namespace {

using platform::LogLevel;

// "operation display name", looked up only for those who read it.
void logDisplayName(const platform::Log& log, std::string_view operation, const Value& info) {
  if (log.enabled(LogLevel::Debug)) log.debug("{} {}", operation, info[HBBundleDisplayNameKey]);
}

// Kinds whose decoding verifies what it finds: those of property lists.
bool isSecurelySerializable(const Value& value) {
  return value.isString() || value.isNumber() || value.isDate() || value.isData() || value.isArray() ||
         value.isDictionary();
}

}  // namespace

std::shared_ptr<XTPlugInCore> XTPlugInCore::initWithName(const std::optional<std::string>& name,
                                                         const std::optional<Url>& url, const Value& bundleInfo,
                                                         const Value& info, const std::optional<Uuid>& uuid) {
  auto record = std::make_shared<XTPlugInCore>();
  if (!record->setupWithName(name, url, bundleInfo, info, uuid)) return nullptr;
  if (record->plugInDictionary_.isNothing() && info.isDictionary()) record->plugInDictionary_ = info;
  return record;
}

bool XTPlugInCore::setupWithName(const std::optional<std::string>& name, const std::optional<Url>& url,
                                 const Value& bundleInfo, const Value& /*info*/, const std::optional<Uuid>& uuid) {
  if (!url || url->empty()) return false;
  if (!name || name->empty()) {
    XTLogOps().error("missing identifier in plug-in at {}", url->path());
    return false;
  }
  if (!bundleInfo.isNothing()) {
    if (!setDictionaries(normalizeInfoDictionary(bundleInfo))) {
      XTLogOps().def("malformed plug-in dictionary in plug-in {} at {}: {}", *name, *url, bundleInfo);
      return false;
    }
    logDisplayName(XTLogAr(), "setupWithName:url:bundleInfo:info:uuid:", bundleInfo);
  }
  identifier_ = *name;
  url_ = *url;
  uuid_ = uuid ? *uuid : Uuid::random();
  return true;
}

bool XTPlugInCore::setDictionaries(const Value& info) {
  if (!info.isDictionary()) return false;
  bundleInfoDictionary_ = info;
  logDisplayName(XTLogOps(), "setDictionaries:", bundleInfoDictionary_);
  const Value& plugIn = bundleInfoDictionary_[XTExtoraInfoKey];
  if (!plugIn.isDictionary()) return false;
  plugInDictionary_ = plugIn;
  if (!plugInDictionary_[XTMultipleInfoKey].isNothing()) {
    XTLogOps().def("multiplexed plug-ins ({} key) obsolete and ignored", XTMultipleInfoKey);
  }
  return true;
}

void XTPlugInCore::canonicalize() {
  Dictionary attributesCopy(attributes());
  if (!attributesCopy.contains(XTVersionAttribute)) {
    const Value marketingVersion = infoKey(HBBundleShortVersionStringKey);
    attributesCopy.set(XTVersionAttribute, marketingVersion.isString() ? marketingVersion : Value("1"));
  }
  Dictionary dictionary(plugInDictionary_);
  dictionary.set(XTAttributesInfoKey, std::move(attributesCopy));
  plugInDictionary_ = std::move(dictionary);
}

Value XTPlugInCore::infoKey(std::string_view key) const {
  Value value = bundleInfoDictionary()[key];
  XTLogAr().debug("{} {} => {}", "infoKey:", key, value);
  return value;
}

Value XTPlugInCore::pluginKey(std::string_view key) const {
  return plugInDictionary_[key];
}

Value XTPlugInCore::attribute(std::string_view key) const {
  return attributes()[key];
}

const Uuid& XTPlugInCore::uuid() const {
  static constexpr Uuid nil;
  return uuid_ ? *uuid_ : nil;
}

std::optional<std::string> XTPlugInCore::containingPath() const {
  if (!containingUrl_) return std::nullopt;
  return containingUrl_->path();
}

Value XTPlugInCore::attributes() const {
  Value value = pluginKey(XTAttributesInfoKey);
  return value.isDictionary() ? value : Value();
}

std::optional<std::string> XTPlugInCore::version() const {
  const Value value = attribute(XTVersionAttribute);
  if (!value.isString()) return std::nullopt;
  return value.string();
}

Value XTPlugInCore::protocolSpec() const {
  Value value = pluginKey(XTProtocolInfoKey);
  if (value.isNothing() && isAppExtension()) return XTObjectClassName;
  return value;
}

Value XTPlugInCore::principalSpec() const {
  Value value = pluginKey(XTPrincipalClassInfoKey);
  if (value.isNothing() && isAppExtension()) return XTObjectClassName;
  return value;
}

Value XTPlugInCore::sdkSpec() const {
  return pluginKey(XTSDKInfoKey);
}

Value XTPlugInCore::embeddedProtocolSpec() const {
  Value value = pluginKey(XTEmbeddedProtocolInfoKey);
  return value.isNothing() ? protocolSpec() : value;
}

bool XTPlugInCore::isAppExtension() const {
  return std::string_view(path()).ends_with(XTAppExtensionSuffix);
}

bool XTPlugInCore::isHybrid() const {
  return !pluginKey(XTEmbeddedCodeInfoKey).isNothing();
}

bool XTPlugInCore::isDedicated() const {
  return pluginKey(XTDedicatedInfoKey).booleanValue();
}

bool XTPlugInCore::isData() const {
  return protocolSpec().string() == XTDataProtocol;
}

bool XTPlugInCore::oldStyle() const {
  if (!infoKey(XTExtoraInfoKey).isNothing()) return false;
  if (!infoKey(XTExtoraInfoKey_L).isNothing()) return true;
  throw platform::InternalInconsistency("unknown plug-in configuration style");
}

void XTPlugInCore::setAnnotation(std::string_view key, const Value& value) {
  annotations_ = dictionaryChanging(Dictionary(annotations_), key, value);
}

void XTPlugInCore::localizedInfoDictionaryForKeys(const std::vector<std::string>& keys,
                                                  const LocalizedInfoCompletion& completion) const {
  const auto finish = [&completion](const Value& result, const std::optional<Error>& error) {
    XTLogAr().debug("localized values {}", result);
    completion(result, error);
  };
  if (bundleInfoDictionary_.isNothing()) {
    finish({}, makeErrorWithFormat(XTErrorLocalizedInfo, "Unable to resolve plugin for {}", identifier_));
    return;
  }
  Dictionary result;
  for (const std::string& key : keys) {
    std::optional<std::string> localized;
    if (key == HBBundleNameKey) localized = localizedShortName();
    if (key == HBBundleDisplayNameKey) localized = localizedName();
    Value value = localized ? Value(std::move(*localized)) : infoKey(key);
    if (value.isNothing()) value = bundleInfoDictionary_[key];
    if (value.isNothing()) continue;
    if (!isSecurelySerializable(value)) {
      finish({},
             makeErrorWithFormat(XTErrorLocalizedInfo,
                                 "Value of info dictionary key \"{}\" for plugin {} does not conform to secure coding!",
                                 key, identifier_));
      return;
    }
    result.set(key, std::move(value));
  }
  finish(std::move(result), std::nullopt);
}

Value XTPlugInCore::augmentInterface(const Value& /*interface*/) const {
  return {};
}

std::string XTPlugInCore::describe() const {
  return fmt::format("{}({}) {} at {}", identifier_, version().value_or(std::string(XTNoVersion)), uuid(), path());
}

}  // namespace extora
