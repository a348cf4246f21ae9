// The export form of a record: what crosses the wire, how it is read back, and the self-check that decides whether a
// plug-in is offered at all.
#include <utility>

#include "Extora/XTLog.h"
#include "Extora/XTPlugInCore.h"
#include "Extora/XTProtocol.h"

namespace extora {
namespace {

// The most that a record writes, and what the daemon adds to it.
constexpr std::size_t kFormEntries = 17 + 4;

Value asDictionary(const Value& value) {
  return value.isDictionary() ? value : Value();
}

std::optional<std::string> asText(const Value& value) {
  if (!value.isString()) return std::nullopt;
  return value.string();
}

Value asValue(const std::optional<std::string>& text) {
  return text ? Value(*text) : Value();
}

std::optional<Url> asFileUrl(const Value& value) {
  if (!value.isString()) return std::nullopt;
  return Url::file(value.string());
}

// The Info.plist as hosts see it: localized, and without the place where it lies here. The node is shared when nothing
// changes.
Value exportedBundleInfo(const Value& info, const std::optional<std::string>& localizedName) {
  Dictionary copy(info);
  copy.remove(HBBundleInfoPlistURLKey);
  if (localizedName) {
    const Value& was = copy[HBBundleDisplayNameKey];
    XTLogAr().debug("{} BundleInfo[BundleDisplayName] was {}", "export:", was);
    if (!was.isString() || was.string() != *localizedName) copy.set(HBBundleDisplayNameKey, *localizedName);
    XTLogAr().debug("{} BundleInfo[BundleDisplayName] is {}", "export:", *localizedName);
  }
  return copy;
}

}  // namespace

std::shared_ptr<XTPlugInCore> XTPlugInCore::initWithForm(const Value& form) {
  auto record = std::make_shared<XTPlugInCore>();
  return record->setupWithForm(form) ? record : nullptr;
}

Value XTPlugInCore::exportForm(Error* error) const {
  const auto lacking = [error](const char* what) {
    platform::setError(error, makeErrorWithFormat(XTErrorConfiguration, "no {}", what));
    return Value();
  };
  const Value info = bundleInfoDictionary();
  if (!info.isDictionary()) return lacking("Info.plist");
  if (url_.empty()) return lacking("path");
  if (identifier_.empty()) return lacking("identifier");
  if (!plugInDictionary_.isDictionary()) return lacking("plug-in dictionary");
  if (!uuid_) return lacking("UUID");

  const std::optional<std::string> name = localizedName();
  // In ascending order of the keys; the dictionary takes them as they are and drops those that are nothing.
  std::vector<Value::Entry> form;
  form.reserve(kFormEntries);
  const auto add = [&form](std::string_view key, Value value) { form.push_back({std::string(key), std::move(value)}); };
  add(XTAnnotationsFormKey, annotations_.isDictionary() ? annotations_ : Value(Dictionary()));
  add(XTBundleInfoFormKey, exportedBundleInfo(info, name));
  add(XTContainingPathFormKey, asValue(containingPath()));
  add(XTEntitlementsFormKey, asDictionary(entitlements()));
  add(XTHubProtocolVersionFormKey, hubProtocolVersion_);
  add(XTIdentifierFormKey, identifier_);
  add(XTInfoFormKey, plugInDictionary_);
  add(XTLastModifiedFormKey, lastModified_);
  add(XTLocalizedContainingNameFormKey, asValue(localizedContainingName()));
  add(XTLocalizedNameFormKey, asValue(name));
  add(XTLocalizedDocSourceActionNamesFormKey, asDictionary(localizedDocSourceActionNames()));
  add(XTLocalizedShortNameFormKey, asValue(localizedShortName()));
  add(XTOriginalIdentifierFormKey, originalIdentifier().value_or(identifier_));
  add(XTPathFormKey, path());
  add(XTSystemResidentFormKey, onSystemVolume_);
  add(XTUUIDFormKey, uuid_->text());
  add(XTVersionFormKey, version().value_or(std::string(XTNoVersion)));
  return Dictionary(std::move(form));
}

bool XTPlugInCore::setupWithForm(const Value& form) {
  const std::optional<Uuid> uuid = Uuid::parse(form[XTUUIDFormKey].string());
  if (!setupWithName(asText(form[XTIdentifierFormKey]), asFileUrl(form[XTPathFormKey]), form[XTBundleInfoFormKey],
                     form[XTInfoFormKey], uuid)) {
    return false;
  }
  const Value& hubProtocolVersion = form[XTHubProtocolVersionFormKey];
  hubProtocolVersion_ = hubProtocolVersion.isNothing() ? 1 : hubProtocolVersion.unsignedValue();
  setOriginalIdentifier(asText(form[XTOriginalIdentifierFormKey]));
  cdhash_ = form[XTHashFormKey].isData() ? form[XTHashFormKey] : Value();
  requirement_ = asText(form[XTRequirementFormKey]);
  lastModified_ = form[XTLastModifiedFormKey].integerValue();
  setEntitlements(asDictionary(form[XTEntitlementsFormKey]));
  if (auto containing = asFileUrl(form[XTContainingPathFormKey])) containingUrl_ = std::move(containing);
  onSystemVolume_ = form[XTSystemResidentFormKey].booleanValue();
  updateFromForm(form);
  setLocalizedName(asText(form[XTLocalizedNameFormKey]));
  setLocalizedShortName(asText(form[XTLocalizedShortNameFormKey]));
  setLocalizedContainingName(asText(form[XTLocalizedContainingNameFormKey]));
  setLocalizedDocSourceActionNames(asDictionary(form[XTLocalizedDocSourceActionNamesFormKey]));
  return true;
}

void XTPlugInCore::updateFromForm(const Value& form) {
  annotations_ = asDictionary(form[XTAnnotationsFormKey]);
}

}  // namespace extora
