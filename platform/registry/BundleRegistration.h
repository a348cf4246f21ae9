// BundleRegistration: what the registry keeps of one bundle: its identity in time, the state of its files when they
// were read, and what was in them. Immutable once shared. It survives a restart in the registry store and is reused
// while the bundle's files are unchanged.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/value/Uuid.h"
#include "platform/value/Value.h"

namespace platform {

/// The state of one file or directory; all zero when there is none.
struct FileStamp {
  std::uint64_t inode = 0;
  std::uint64_t size = 0;
  std::int64_t modified = 0;  ///< nanoseconds since the epoch
  bool present() const { return inode != 0; }
  friend bool operator==(const FileStamp&, const FileStamp&) = default;
};

/// The state of all files of a bundle that a registration is made from. Equal stamps mean: nothing to read.
struct BundleStamp {
  FileStamp info;          ///< Info.plist
  FileStamp entitlements;  ///< Entitlements.plist
  FileStamp localization;  ///< the directory Localization
  /// Language -> its InfoPlist.plist, in the order of the languages' names; one entry for each folder of Localization.
  std::vector<std::pair<std::string, FileStamp>> tables;
  friend bool operator==(const BundleStamp&, const BundleStamp&) = default;
};

/// The names that one language's InfoPlist table gives; empty: none.
struct LocalizedNames {
  std::string language;
  std::string displayName;
  std::string name;
};

struct BundleRegistration {
  std::string path;  ///< canonical
  Uuid uuid;
  double date = 0;  ///< seconds since the epoch
  BundleStamp stamp;
  Value info;                        ///< the Info.plist, a dictionary
  Value entitlements;                ///< a dictionary, or nothing
  bool entitlementsRefused = false;  ///< there are some, but they could not be read or do not count
  std::vector<LocalizedNames> names;

  /// A plug-in has one of the two plug-in dictionaries, whatever their kind.
  bool isPlugIn() const { return !info["HXExtension"].isNothing() || !info["Extora"].isNothing(); }
  /// "HXExtension", or "Extora" when there is none; nothing when it is no dictionary.
  Value plugInDictionary() const;
  /// The string "HXExtensionIdentifier" of its attributes, else bundleIdentifier(); empty: it has none.
  std::string identifier() const;
  /// The string HBBundleIdentifier; empty: it has none.
  const std::string& bundleIdentifier() const { return info["HBBundleIdentifier"].string(); }
  /// Whether it is read and never run, so that it needs no data container.
  bool isDataOnly() const { return info["HXExtension"]["HXExtensionProtocol"].string() == "#Data"; }

  // Names for `languages`, best first; the bundle's plain Info.plist comes after all of them.
  /// HBBundleDisplayName, else the short name.
  std::string localizedName(const std::vector<std::string>& languages) const;
  /// HBBundleName, else the directory's name without its ending.
  std::string localizedShortName(const std::vector<std::string>& languages) const;

  /// The form of the store; the path is kept beside it.
  Bytes encode() const;
  /// Null when `content` is not what encode() made.
  static std::shared_ptr<const BundleRegistration> decode(std::string path, std::span<const std::uint8_t> content);
};

using RegistrationPtr = std::shared_ptr<const BundleRegistration>;

/// A stamp's property-list form and back; damaged forms give a stamp that equals none.
Value valueOfStamp(const BundleStamp& stamp);
BundleStamp stampOfValue(const Value& value);

}  // namespace platform
