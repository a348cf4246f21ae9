// XTPlugInCore: the one description of a plug-in that daemon and hosts share.
//
// The daemon builds one per installed plug-in (its subclass XTDPlugIn); the client library rebuilds one from the export
// form that crosses the wire. Identity is the UUID alone. Everything that is not stored is derived on demand through
// three look-up levels: infoKey (the Info.plist), pluginKey ("HXExtension" inside it), attribute
// ("HXExtensionAttributes" inside that). A record has no lock: whoever owns it serializes changes.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "Extora/XTError.h"
#include "Extora/XTVocabulary.h"
#include "platform/value/Url.h"
#include "platform/value/Uuid.h"
#include "platform/value/Value.h"

namespace extora {

using platform::Array;
using platform::Dictionary;
using platform::Url;
using platform::Uuid;
using platform::Value;

class XTPlugInCore {
 public:
  /// Given a dictionary and no error, or the nothing value and an error.
  using LocalizedInfoCompletion = std::function<void(const Value& dictionary, const std::optional<Error>& error)>;

  /// An empty record.
  XTPlugInCore() = default;
  virtual ~XTPlugInCore() = default;
  XTPlugInCore(const XTPlugInCore&) = default;
  XTPlugInCore& operator=(const XTPlugInCore&) = default;

  /// Null when the setup fails. `bundleInfo` and `info` may be nothing; a record that has no plug-in dictionary after
  /// the setup takes `info`.
  static std::shared_ptr<XTPlugInCore> initWithName(const std::optional<std::string>& name,
                                                    const std::optional<Url>& url, const Value& bundleInfo,
                                                    const Value& info, const std::optional<Uuid>& uuid);
  /// Null when the form does not set up.
  static std::shared_ptr<XTPlugInCore> initWithForm(const Value& form);

  /// True on success. `info` is not consulted here. A failed setup may leave the dictionaries already replaced.
  [[nodiscard]] bool setupWithName(const std::optional<std::string>& name, const std::optional<Url>& url,
                                   const Value& bundleInfo, const Value& info, const std::optional<Uuid>& uuid);
  [[nodiscard]] bool setupWithForm(const Value& form);
  /// Takes the form's annotations and nothing else (absent clears them).
  void updateFromForm(const Value& form);
  /// Installs an Info.plist and the plug-in dictionary inside it; false when either is no dictionary.
  bool setDictionaries(const Value& info);
  /// Completes the plug-in dictionary: attributes and version are present afterwards.
  void canonicalize();

  /// One thing that is wrong with the configuration: the key at fault (empty: none) and its error (code 12).
  struct Problem {
    std::string_view key;
    Error error;
  };
  /// Nothing for a usable plug-in, else the error of the first problem.
  virtual std::optional<Error> diagnose() const;
  /// Everything that is wrong with the record itself, in the order in which it is looked at.
  std::vector<Problem> configurationProblems() const;
  /// Everything that is wrong with where it is installed: no data container, or outside of an application.
  std::vector<Problem> installationProblems() const;
  /// The export form as a new dictionary value. A record that lacks what every form has (Info.plist, path, identifier,
  /// plug-in dictionary, UUID) answers the nothing value and an error (code 12) that names the first thing missing:
  /// "no Info.plist" before all others. A missing original identifier is the identifier.
  Value exportForm(Error* error) const;

  // Look-ups; nothing when the key or any level above it is missing.
  virtual Value infoKey(std::string_view key) const;
  virtual Value pluginKey(std::string_view key) const;
  virtual Value attribute(std::string_view key) const;

  // Stored fields.
  bool onSystemVolume() const { return onSystemVolume_; }
  void setOnSystemVolume(bool value) { onSystemVolume_ = value; }
  const Value& plugInDictionary() const { return plugInDictionary_; }
  void setPlugInDictionary(Value value) { plugInDictionary_ = std::move(value); }
  /// Empty only before a successful setup.
  const std::string& identifier() const { return identifier_; }
  void setIdentifier(std::string value) { identifier_ = std::move(value); }
  virtual std::optional<std::string> originalIdentifier() const { return originalIdentifier_; }
  void setOriginalIdentifier(std::optional<std::string> value) { originalIdentifier_ = std::move(value); }
  const Url& url() const { return url_; }
  void setUrl(Url value) { url_ = std::move(value); }
  const std::optional<Url>& containingUrl() const { return containingUrl_; }
  void setContainingUrl(std::optional<Url> value) { containingUrl_ = std::move(value); }
  virtual Value bundleInfoDictionary() const { return bundleInfoDictionary_; }
  void setBundleInfoDictionary(Value value) { bundleInfoDictionary_ = std::move(value); }
  virtual Value entitlements() const { return entitlements_; }
  void setEntitlements(Value value) { entitlements_ = std::move(value); }
  std::uint64_t hubProtocolVersion() const { return hubProtocolVersion_; }
  void setHubProtocolVersion(std::uint64_t value) { hubProtocolVersion_ = value; }
  virtual std::optional<std::string> localizedName() const { return localizedName_; }
  virtual void setLocalizedName(std::optional<std::string> value) { localizedName_ = std::move(value); }
  virtual std::optional<std::string> localizedShortName() const { return localizedShortName_; }
  virtual void setLocalizedShortName(std::optional<std::string> value) { localizedShortName_ = std::move(value); }
  virtual std::optional<std::string> localizedContainingName() const { return localizedContainingName_; }
  virtual void setLocalizedContainingName(std::optional<std::string> value) {
    localizedContainingName_ = std::move(value);
  }
  virtual Value localizedDocSourceActionNames() const { return localizedDocSourceActionNames_; }
  virtual void setLocalizedDocSourceActionNames(Value value) { localizedDocSourceActionNames_ = std::move(value); }
  const Value& annotations() const { return annotations_; }
  void setAnnotations(Value value) { annotations_ = std::move(value); }
  /// Seconds since the epoch.
  std::int64_t lastModified() const { return lastModified_; }
  void setLastModified(std::int64_t seconds) { lastModified_ = seconds; }
  /// The nil UUID only before a successful setup.
  const Uuid& uuid() const;
  void setUuid(const Uuid& value) { uuid_ = value; }
  const Value& cdhash() const { return cdhash_; }
  void setCdhash(Value value) { cdhash_ = std::move(value); }
  const std::optional<std::string>& requirement() const { return requirement_; }
  void setRequirement(std::optional<std::string> value) { requirement_ = std::move(value); }
  /// Only the subclass has one.
  virtual std::optional<Url> dataContainerURL() const { return std::nullopt; }

  // Derived on every call, never stored.
  const std::string& path() const { return url_.path(); }
  std::optional<std::string> containingPath() const;
  /// Nothing when there are none or when they are no dictionary.
  Value attributes() const;
  /// Nothing when the attributes hold no version string.
  std::optional<std::string> version() const;
  Value protocolSpec() const;
  Value principalSpec() const;
  Value sdkSpec() const;
  std::optional<std::string> embeddedCodePath() const { return std::nullopt; }
  Value embeddedProtocolSpec() const;
  bool isAppExtension() const;
  bool isMultiplexed() const { return false; }
  bool isHybrid() const;
  bool isDedicated() const;
  bool isData() const;
  /// A record with neither configuration key is a broken contract ("unknown plug-in configuration style").
  bool oldStyle() const;
  platform::Date timestamp() const { return {lastModified_, 0}; }

  /// Replaces the annotations by a copy in which `key` is `value`; the nothing value removes the key.
  void setAnnotation(std::string_view key, const Value& value);

  /// Calls `completion` exactly once, on the calling thread, before it returns.
  void localizedInfoDictionaryForKeys(const std::vector<std::string>& keys,
                                      const LocalizedInfoCompletion& completion) const;

  // The merge with the dictionary of the extension point (XTPlugInCore_SDK.cpp).
  /// Given an extension point's identifier; answers its SDK dictionary or nothing. Called by any thread.
  using SDKProvider = std::function<Value(const std::string& extensionPoint)>;
  /// Where the records of this process take SDK dictionaries from; without a provider no extension point is registered.
  static void setSDKProvider(SDKProvider provider);
  /// Fills the Info.plist from the SDK dictionary of the record's extension point and canonicalizes. A key that is no
  /// string is logged and leaves the record as it is; a record without Info.plist is a broken contract.
  void resolveSDK();
  /// The SDK dictionary under `key`, or nothing (logged); the base asks the provider.
  virtual Value readSDKDictionary(const std::string& key) const;
  /// `target` filled from `source`: the target's values stay, but for "CleanTimeout" (the source wins) and "Shared"
  /// (the union); dictionaries are merged by the same rules. Where the kinds of two such values clash, the target's
  /// stays.
  static Dictionary mergeDictionaryInto(const Value& source, const Value& target);
  /// True only for "CleanTimeout".
  static bool sdkOverridesKey(std::string_view key);
  /// Each element of either array once.
  static Array mergeSharedResourcesInto(const Value& source, const Value& target);

  friend bool operator==(const XTPlugInCore& a, const XTPlugInCore& b) { return a.uuid() == b.uuid(); }
  std::size_t hash() const { return std::hash<Uuid>{}(uuid()); }
  /// "identifier(version) UUID at path" for log lines.
  std::string describe() const;

 protected:
  // Hooks for subclasses.
  virtual Value normalizeInfoDictionary(const Value& info) const { return info; }
  virtual Value augmentInterface(const Value& interface) const;

  /// The stored Info.plist itself, not the overridable getter.
  const Value& storedBundleInfoDictionary() const { return bundleInfoDictionary_; }

 private:
  bool onSystemVolume_ = false;
  Value plugInDictionary_;
  std::string identifier_;
  std::optional<std::string> originalIdentifier_;
  Url url_;
  std::optional<Url> containingUrl_;
  Value bundleInfoDictionary_;
  Value entitlements_;
  std::uint64_t hubProtocolVersion_ = 0;
  std::optional<std::string> localizedName_;
  std::optional<std::string> localizedShortName_;
  std::optional<std::string> localizedContainingName_;
  Value localizedDocSourceActionNames_;
  Value annotations_;
  std::int64_t lastModified_ = 0;
  std::optional<Uuid> uuid_;
  Value cdhash_;
  std::optional<std::string> requirement_;
};

}  // namespace extora
