// The names that plug-in bundles, export forms, entitlements and annotations are made of. Each constant says its kind
// by its ending; the old-style name of a key carries the ending _L. Constants only: for any thread.
#pragma once

#include <string_view>

namespace extora {

// Level 1: keys of the Info.plist, read with infoKey.

/// The plug-in dictionary of a new-style plug-in.
inline constexpr std::string_view XTExtoraInfoKey = "HXExtension";
/// The plug-in dictionary of an old-style plug-in.
inline constexpr std::string_view XTExtoraInfoKey_L = "Extora";

// Keys that every bundle has, plug-in or not.
inline constexpr std::string_view HBBundleShortVersionStringKey = "HBBundleShortVersionString";
inline constexpr std::string_view HBBundleDisplayNameKey = "HBBundleDisplayName";
inline constexpr std::string_view HBBundleNameKey = "HBBundleName";
/// Location of the Info.plist file; never leaves the process in an export form.
inline constexpr std::string_view HBBundleInfoPlistURLKey = "HBBundleInfoPlistURL";
inline constexpr std::string_view HBBundleIdentifierKey = "HBBundleIdentifier";

// Level 2: keys of the plug-in dictionary, read with pluginKey.

/// The attributes dictionary (level 3).
inline constexpr std::string_view XTAttributesInfoKey = "HXExtensionAttributes";
/// Name of the protocol (kind of service) that the plug-in provides.
inline constexpr std::string_view XTProtocolInfoKey = "HXExtensionProtocol";
inline constexpr std::string_view XTPrincipalClassInfoKey = "PrincipalClass";
/// Identifier of the extension point that the plug-in serves; the key of its SDK dictionary.
inline constexpr std::string_view XTSDKInfoKey = "HXExtensionPointIdentifier";
/// Its presence marks a hybrid plug-in.
inline constexpr std::string_view XTEmbeddedCodeInfoKey = "EmbeddedCode";
inline constexpr std::string_view XTEmbeddedProtocolInfoKey = "EmbeddedProtocol";
inline constexpr std::string_view XTDedicatedInfoKey = "Dedicated";
/// Not supported.
inline constexpr std::string_view XTPassProxyInfoKey = "PassProxy";
/// Obsolete multiplexing, logged and ignored.
inline constexpr std::string_view XTMultipleInfoKey = "Multiple";
inline constexpr std::string_view XTHubProtocolVersionInfoKey = "HubProtocolVersion";
/// Array of bundle-relative paths of the resources that the plug-in shares with its hosts.
inline constexpr std::string_view XTSharedResourcesInfoKey = "Shared";
/// The one key whose SDK value replaces the plug-in's own.
inline constexpr std::string_view XTCleanTimeoutInfoKey = "CleanTimeout";
/// Entitlement that a host must hold to use the plug-in.
inline constexpr std::string_view XTHostEntitlementInfoKey = "HXExtensionHostEntitlement";

// Further plug-in dictionary names; nothing here reads them.
inline constexpr std::string_view XTSubsystemsInfoKey = "Subsystems";
inline constexpr std::string_view XTDelegateInfoKey = "Delegate";
inline constexpr std::string_view XTExtoraHostInfoKey = "ExtoraHost";
inline constexpr std::string_view XTUsesEmbeddedInfoKey = "UsesEmbeddedCode";
inline constexpr std::string_view XTSDKSpecInfoKey = "HXExtensionSDK";
inline constexpr std::string_view XTAttributesInfoKey_L = "Attributes";
inline constexpr std::string_view XTProtocolInfoKey_L = "Protocol";
inline constexpr std::string_view XTSDKInfoKey_L = "SDK";

// Level 3: names of attributes, read with attribute. All but the version stand for a fact of the record in match rules.

inline constexpr std::string_view XTVersionAttribute = "HXExtensionVersion";
inline constexpr std::string_view XTIdentifierAttribute = "HXExtensionIdentifier";
inline constexpr std::string_view XTUUIDAttribute = "com.orvane.uuid";
inline constexpr std::string_view XTUserElectionAttribute = "HXUserElection";
inline constexpr std::string_view XTContainingAppAttribute = "HXExtensionContainingApp";

// Attribute names without effect.
inline constexpr std::string_view XTProtocolAttribute = "HXExtensionPointName";
inline constexpr std::string_view XTIdentifierAttribute_L = "com.orvane.identifier";
inline constexpr std::string_view XTProtocolAttribute_L = "com.orvane.protocol";
inline constexpr std::string_view XTVersionAttribute_L = "com.orvane.version";

// Values.

/// The protocol of a data-only plug-in.
inline constexpr std::string_view XTDataProtocol = "#Data";
/// Protocol and principal class of an app extension that names none.
inline constexpr std::string_view XTObjectClassName = "HXObject";
/// The ending of an app extension's bundle path.
inline constexpr std::string_view XTAppExtensionSuffix = ".appex";
/// Stands in a form for the version of a record that has none.
inline constexpr std::string_view XTNoVersion = "<none>";

// Keys of the export form.

inline constexpr std::string_view XTHubProtocolVersionFormKey = "hubProtocolVersion";
inline constexpr std::string_view XTPathFormKey = "path";
inline constexpr std::string_view XTSystemResidentFormKey = "systemResident";
inline constexpr std::string_view XTIdentifierFormKey = "identifier";
inline constexpr std::string_view XTOriginalIdentifierFormKey = "original-identifier";
inline constexpr std::string_view XTVersionFormKey = "version";
inline constexpr std::string_view XTBundleInfoFormKey = "bundleInfo";
inline constexpr std::string_view XTInfoFormKey = "info";
/// UUID text.
inline constexpr std::string_view XTUUIDFormKey = "uuid";
/// Signed seconds since the epoch.
inline constexpr std::string_view XTLastModifiedFormKey = "lastmodified";
inline constexpr std::string_view XTAnnotationsFormKey = "annotations";
inline constexpr std::string_view XTEntitlementsFormKey = "entitlements";
inline constexpr std::string_view XTContainingPathFormKey = "containingPath";
inline constexpr std::string_view XTLocalizedContainingNameFormKey = "localizedContainingDisplayName";
inline constexpr std::string_view XTLocalizedNameFormKey = "localizedDisplayName";
inline constexpr std::string_view XTLocalizedShortNameFormKey = "localizedShortName";
inline constexpr std::string_view XTLocalizedDocSourceActionNamesFormKey = "localizedDocSourceActionNames";
inline constexpr std::string_view XTHashFormKey = "hash";
inline constexpr std::string_view XTRequirementFormKey = "requirement";
/// Bundle-relative path -> sandbox extension token.
inline constexpr std::string_view XTExtensionsFormKey = "extensions";
/// Sandbox extension token for the plug-in's service.
inline constexpr std::string_view XTServiceExtensionFormKey = "service-extension";
/// UUID text of the plug-in that replaces this one.
inline constexpr std::string_view XTOverriderFormKey = "overrider";
/// Identifier of the plug-in that this one replaces.
inline constexpr std::string_view XTOverridingFormKey = "overriding";

// Form names that nothing reads or writes.
inline constexpr std::string_view XTPlugInsFormKey = "plugins";
inline constexpr std::string_view XTBookmarkFormKey = "bookmark";
inline constexpr std::string_view XTURLFormKey = "url";

// Entitlements.

/// Host: remove plug-ins, discover without the host's own restrictions.
inline constexpr std::string_view XTManagerEntitlement = "com.orvane.private.extora.manager";
/// Host: rules dictionary of the only plug-ins that it may use.
inline constexpr std::string_view XTAllowedPlugInsEntitlement = "com.orvane.developer.extora.allowedplugins";
/// Host: may hand environment variables to plug-ins.
inline constexpr std::string_view XTEnvironmentProvisionEntitlement = "com.orvane.developer.extora.provide-environment";
/// Plug-in: stands in for the plug-in of the identifier that it names.
inline constexpr std::string_view XTOverrideEntitlement = "com.orvane.developer.replace-plugin";
/// Plug-in: elected without asking the user.
inline constexpr std::string_view XTAutoElectEntitlement = "com.orvane.developer.auto-elect-plugin";

// Annotations: keys of a plug-in's annotation dictionary, then those of the annotation file.

inline constexpr std::string_view XTAnnotationElectionKey = "election";
inline constexpr std::string_view XTAnnotationExtensionKey = "extension";
inline constexpr std::string_view XTVersionAnnotationsKey = "version";
inline constexpr std::string_view XTDataAnnotationsKey = "data";

// The user's preferences, and the notification that tells hosts to look again.

inline constexpr std::string_view XTPreferenceDomain = "com.orvane.extora.userprefs";
inline constexpr std::string_view XTExclusionsPreferenceKey = "exclusions";
/// Posted after every change of annotations and of holds.
inline constexpr std::string_view XTNotifyAnnotationChange = "com.orvane.extora.annotation-change";

}  // namespace extora
