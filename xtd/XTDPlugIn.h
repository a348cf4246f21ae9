// XTDPlugIn: the daemon's plug-in, an XTPlugInCore built from the application registry's record.
//
// Identity fields never change after construction and need no lock. The Info.plist and the localized values are re-read
// from a fresh registry record whenever the registry's knowledge has changed; that refresh runs under the object's own
// lock. Built on the database's queue; used by any thread.
#pragma once

#include <memory>
#include <optional>
#include <set>
#include <string>

#include "Extora/XTPlugInCore.h"
#include "platform/assertions/ProcessAssertions.h"
#include "platform/queue/Mutex.h"
#include "platform/registry/ApplicationRegistry.h"
#include "platform/sandbox/Sandbox.h"

namespace extora {

class XTDatabase;
class XTDIpcClient;

/// The names of a plug-in's document-source actions: action key -> localized name, possibly empty.
Dictionary localizedDocSourceActionNamesForXTDict(platform::ApplicationRegistry& registry,
                                                  const platform::PlugInRecord& record, const Value& plugInDictionary);

class XTDPlugIn : public XTPlugInCore {
 public:
  /// Null for a record without a bundle URL or one that fails its self-check (logged).
  static std::shared_ptr<XTDPlugIn> initWithARData(const platform::PlugInRecord& record,
                                                   std::shared_ptr<platform::ApplicationRegistry> registry,
                                                   std::weak_ptr<XTDatabase> database);

  /// A fresh registry record by UUID, falling back to the bundle URL; null when there is none.
  platform::PlugInRecord getProxy() const;

  std::optional<Error> diagnose() const override;
  Value infoKey(std::string_view key) const override;
  Value pluginKey(std::string_view key) const override;
  Value attribute(std::string_view key) const override;
  std::optional<std::string> originalIdentifier() const override { return originalIdentifier_; }
  Value bundleInfoDictionary() const override;
  Value entitlements() const override { return entitlements_; }
  std::optional<Url> dataContainerURL() const override { return dataContainerURL_; }

  // Refreshed; never absent (an empty string or an empty dictionary instead). The setters store without a stamp check.
  std::optional<std::string> localizedName() const override;
  void setLocalizedName(std::optional<std::string> value) override;
  std::optional<std::string> localizedShortName() const override;
  void setLocalizedShortName(std::optional<std::string> value) override;
  std::optional<std::string> localizedContainingName() const override;
  void setLocalizedContainingName(std::optional<std::string> value) override;
  Value localizedDocSourceActionNames() const override;
  void setLocalizedDocSourceActionNames(Value value) override;

  /// The value of one of the plug-in's entitlements, or nothing.
  Value valueForEntitlement(std::string_view name) const { return entitlements_[name]; }
  /// Present and not equal to boolean false (0 counts as false).
  bool hasEntitlement(std::string_view name) const;
  /// What the annotation store files this plug-in's annotations under.
  std::string annotationKey() const;
  bool isStillValid() const { return true; }
  /// A copy without the keys that begin with "DT".
  static Dictionary prunedInfoDictionaryFor(const Dictionary& dictionary);
  Value infoPlist() const;
  std::optional<Uuid> arKnowledgeUUID() const;

  // Matching (XTDPlugIn_Matching.cpp). Never called on the database's queue.
  /// True when every rule holds; no rules (nothing, or an empty dictionary) match everything.
  bool match(const Value& rules) const;
  bool matchKey(const std::string& key, const Value& pattern) const;
  bool matchValuePatterns(const Value& value, const Value& pattern) const;
  bool matchValuePattern(const Value& value, const std::string& pattern) const;
  bool matchDictionary(const Value& value, const Value& pattern) const;

  // Host access (XTDPlugIn_Access.cpp).
  /// The reason why the host may not use this plug-in, or nothing when it may.
  std::optional<std::string> allowForClient(XTDIpcClient& client) const;
  /// The same with the host's restriction entitlement (or nothing) already at hand, for a request that asks about many
  /// plug-ins: looking an entitlement up costs some 50 system calls.
  std::optional<std::string> allowForClient(XTDIpcClient& client, const Value& restriction) const;

  // Privacy consent (XTDPlugIn_Consent.cpp).
  /// The identifiers of the consent services that the user has granted to the containing application; empty without
  /// one, or when the consent service cannot answer (logged).
  std::set<std::string> allowedConsentServices() const;

  // Activation (XTDPlugIn_Activation.cpp).
  /// Registers the plug-in with the job manager for this very host, with the environment's entries (a dictionary, or
  /// nothing); nothing on success, else an error of code 4.
  std::optional<Error> enableForClient(XTDIpcClient& client, const Value& environment) const;
  /// The name of the sandbox profile that follows from the plug-in's extension point.
  std::string_view sandboxProfile() const;

  // Sandbox extensions (XTDPlugIn_Sandbox.cpp). Tokens are issued afresh on every call.
  /// Adds "extensions" and "service-extension" to an export form.
  void augmentForm(platform::Sandbox& sandbox, Dictionary& form) const;
  /// path -> token of a string or a list of strings, paths relative to the bundle; what cannot be served is logged and
  /// left out.
  Dictionary issueResourceExtensions(platform::Sandbox& sandbox, const Value& paths) const;
  /// A read-only token for `location`, at or below the bundle; nothing and a system error number on failure.
  std::optional<std::string> issueFileExtension(platform::Sandbox& sandbox, const Url& location,
                                                int* errorNumber) const;
  std::optional<std::string> issueServiceExtension(platform::Sandbox& sandbox, const std::string& name,
                                                   int* errorNumber) const;

  // Use (XTDPlugIn_Busy.cpp).
  /// The description of the first busy instance, a dictionary of one entry; nothing when none is busy.
  Value checkBusy(platform::ProcessAssertions& assertions) const;

 private:
  XTDPlugIn() = default;
  // What the setup with the record's own facts and the self-check leave to say: whether the plug-in is usable.
  [[nodiscard]] bool setupWithARData(const platform::PlugInRecord& record);
  Value ruleValue(const std::string& key) const;
  // Whether what was read last was read under `stamp`, the registry's knowledge now; nothing is never current.
  bool isCurrent(const std::optional<Uuid>& stamp) const XT_REQUIRES(mutex_) {
    return stamp.has_value() && stamp == arKnowledgeUUID_;
  }
  // A record to read from again, null (logged) when there is none; either way `stamp` is noted.
  platform::PlugInRecord freshProxy(const std::optional<Uuid>& stamp) const XT_REQUIRES(mutex_);

  std::shared_ptr<platform::ApplicationRegistry> registry_;
  std::weak_ptr<XTDatabase> database_;
  // Constant after construction.
  Value entitlements_;
  std::optional<std::string> originalIdentifier_;
  std::optional<Url> dataContainerURL_;
  // Refreshed when the registry's knowledge changes; all share one stamp.
  mutable platform::Mutex mutex_;
  mutable std::optional<std::string> localizedName_ XT_GUARDED_BY(mutex_);
  mutable std::optional<std::string> localizedShortName_ XT_GUARDED_BY(mutex_);
  mutable std::optional<std::string> localizedContainingName_ XT_GUARDED_BY(mutex_);
  mutable Value localizedDocSourceActionNames_ XT_GUARDED_BY(mutex_);
  mutable Value infoPlist_ XT_GUARDED_BY(mutex_);
  mutable std::optional<Uuid> arKnowledgeUUID_ XT_GUARDED_BY(mutex_);
};

}  // namespace extora
