#include "xtd/XTDPlugIn.h"

#include <set>
#include <utility>

#include "Extora/XTLog.h"
#include "Extora/XTProtocol.h"
#include "xtd/Probes.h"

namespace extora {
namespace {

constexpr std::string_view kDocSourceActionsKey = "HXExtensionDocSourceActions";
constexpr std::string_view kDocSourceActionNameKey = "HXExtensionDocSourceActionName";

std::optional<std::string> orNothing(const std::string& text) {
  return text.empty() ? std::nullopt : std::optional(text);
}

}  // namespace

std::shared_ptr<XTDPlugIn> XTDPlugIn::initWithARData(const platform::PlugInRecord& record,
                                                     std::shared_ptr<platform::ApplicationRegistry> registry,
                                                     std::weak_ptr<XTDatabase> database) {
  const probes::ARInitializationInterval interval;
  std::shared_ptr<XTDPlugIn> plugIn(new XTDPlugIn());
  plugIn->registry_ = std::move(registry);
  plugIn->database_ = std::move(database);
  return plugIn->setupWithARData(record) ? plugIn : nullptr;
}

bool XTDPlugIn::setupWithARData(const platform::PlugInRecord& record) {
  if (!record->bundleURL) return false;
  if (!setupWithName(orNothing(record->plugInIdentifier), record->bundleURL, Value(), Value(), record->plugInUUID)) {
    return false;
  }
  setPlugInDictionary(record->plugInDictionary);
  setLastModified(Value(record->registrationDate).integerValue());
  setOnSystemVolume(record->onSystemPartition);
  originalIdentifier_ = orNothing(record->originalIdentifier);
  entitlements_ = record->entitlements;
  dataContainerURL_ = record->dataContainerURL;
  {
    const platform::MutexLock lock(mutex_);
    infoPlist_ = record->infoDictionary;
  }
  const Value& hubVersion = record->plugInDictionary[XTHubProtocolVersionInfoKey];
  if (hubVersion) {
    setHubProtocolVersion(hubVersion.unsignedValue());
  } else {
    setHubProtocolVersion(infoKey(XTExtoraInfoKey_L) ? 1 : 2);
  }
  if (record->containingApplication != nullptr) setContainingUrl(record->containingApplication->bundleURL);
  if (const std::optional<Error> error = diagnose()) {
    XTLogOps().info("ignoring mis-configured plug-in at {}: {}", path(), error->localizedDescription());
    return false;
  }
  return true;
}

platform::PlugInRecord XTDPlugIn::getProxy() const {
  if (platform::PlugInRecord record = registry_->registryPlugInByUUID(uuid())) return record;
  XTLogAr().def("Failed to find Plugin by {} fallback to path {}", uuid(), url());
  return registry_->registryPlugInByURL(url());
}

platform::PlugInRecord XTDPlugIn::freshProxy(const std::optional<Uuid>& stamp) const {
  platform::PlugInRecord record = getProxy();
  if (!record) XTLogOps().error("could not obtain fresh proxy for {}", uuid());
  arKnowledgeUUID_ = stamp;
  return record;
}

std::optional<Error> XTDPlugIn::diagnose() const {
  if (std::optional<Error> error = XTPlugInCore::diagnose()) return error;
  const auto problems = installationProblems();
  return problems.empty() ? std::nullopt : std::optional(problems.front().error);
}

Value XTDPlugIn::infoKey(std::string_view key) const {
  return bundleInfoDictionary()[key];
}

Value XTDPlugIn::pluginKey(std::string_view key) const {
  return infoKey(XTExtoraInfoKey)[key];
}

Value XTDPlugIn::attribute(std::string_view key) const {
  return pluginKey(XTAttributesInfoKey)[key];
}

Value XTDPlugIn::bundleInfoDictionary() const {
  const std::optional<Uuid> stamp = registry_->registryKnowledgeUUID();
  const platform::MutexLock lock(mutex_);
  if (!isCurrent(stamp)) {
    const platform::PlugInRecord record = freshProxy(stamp);
    infoPlist_ = record ? record->infoDictionary : Value();
  }
  return infoPlist_;
}

std::optional<std::string> XTDPlugIn::localizedName() const {
  const std::optional<Uuid> stamp = registry_->registryKnowledgeUUID();
  const platform::MutexLock lock(mutex_);
  if (!localizedName_ || !isCurrent(stamp)) {
    const platform::PlugInRecord record = freshProxy(stamp);
    localizedName_ = record ? orNothing(record->localizedName) : std::nullopt;
  }
  return localizedName_.value_or("");
}

std::optional<std::string> XTDPlugIn::localizedShortName() const {
  const std::optional<Uuid> stamp = registry_->registryKnowledgeUUID();
  const platform::MutexLock lock(mutex_);
  if (!localizedShortName_ || !isCurrent(stamp)) {
    const platform::PlugInRecord record = freshProxy(stamp);
    localizedShortName_ = record ? orNothing(record->localizedShortName) : std::nullopt;
  }
  return localizedShortName_.value_or("");
}

std::optional<std::string> XTDPlugIn::localizedContainingName() const {
  const std::optional<Uuid> stamp = registry_->registryKnowledgeUUID();
  const platform::MutexLock lock(mutex_);
  if (!localizedContainingName_ || !isCurrent(stamp)) {
    const platform::PlugInRecord record = freshProxy(stamp);
    const bool contained = record && record->containingApplication != nullptr;
    localizedContainingName_ = contained ? orNothing(record->containingApplication->localizedName) : std::nullopt;
  }
  return localizedContainingName_.value_or("");
}

Value XTDPlugIn::localizedDocSourceActionNames() const {
  const std::optional<Uuid> stamp = registry_->registryKnowledgeUUID();
  const platform::MutexLock lock(mutex_);
  if (!localizedDocSourceActionNames_ || !isCurrent(stamp)) {
    const platform::PlugInRecord record = freshProxy(stamp);
    localizedDocSourceActionNames_ =
        record ? Value(localizedDocSourceActionNamesForXTDict(*registry_, record, plugInDictionary())) : Value();
  }
  return localizedDocSourceActionNames_ ? localizedDocSourceActionNames_ : Value(Dictionary());
}

void XTDPlugIn::setLocalizedName(std::optional<std::string> value) {
  const platform::MutexLock lock(mutex_);
  localizedName_ = std::move(value);
}

void XTDPlugIn::setLocalizedShortName(std::optional<std::string> value) {
  const platform::MutexLock lock(mutex_);
  localizedShortName_ = std::move(value);
}

void XTDPlugIn::setLocalizedContainingName(std::optional<std::string> value) {
  const platform::MutexLock lock(mutex_);
  localizedContainingName_ = std::move(value);
}

void XTDPlugIn::setLocalizedDocSourceActionNames(Value value) {
  const platform::MutexLock lock(mutex_);
  localizedDocSourceActionNames_ = std::move(value);
}

bool XTDPlugIn::hasEntitlement(std::string_view name) const {
  const Value value = valueForEntitlement(name);
  return value && value != Value(false);
}

std::string XTDPlugIn::annotationKey() const {
  const Value override = valueForEntitlement(XTOverrideEntitlement);
  return override.isString() ? override.string() : identifier();
}

Dictionary XTDPlugIn::prunedInfoDictionaryFor(const Dictionary& dictionary) {
  Dictionary pruned;
  for (const auto& [key, value] : dictionary) {
    if (!key.starts_with("DT")) pruned.set(key, value);
  }
  return pruned;
}

Value XTDPlugIn::infoPlist() const {
  const platform::MutexLock lock(mutex_);
  return infoPlist_;
}

std::optional<Uuid> XTDPlugIn::arKnowledgeUUID() const {
  const platform::MutexLock lock(mutex_);
  return arKnowledgeUUID_;
}

Dictionary localizedDocSourceActionNamesForXTDict(platform::ApplicationRegistry& registry,
                                                  const platform::PlugInRecord& record, const Value& plugInDictionary) {
  const Value& actions = plugInDictionary[kDocSourceActionsKey];
  if (!actions.isArray()) {
    XTLogAr().def("no actions found in xtdict");
    return {};
  }
  std::set<std::string> keys;
  for (const Value& action : actions.items()) {
    const Value& name = action[kDocSourceActionNameKey];
    if (name.isString()) {
      keys.insert(name.string());
    } else {
      XTLogAr().error("missing {} for plugin {}", kDocSourceActionNameKey, *record);
    }
  }
  if (keys.empty()) return {};
  const Dictionary localized =
      registry.registryLocalizedValues(record, std::vector<std::string>(keys.begin(), keys.end()), "Localizable");
  Dictionary names;
  for (const std::string& key : keys) names.set(key, localized.contains(key) ? localized[key] : Value(key));
  return names;
}

}  // namespace extora
