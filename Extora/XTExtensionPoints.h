// XTExtensionPoints: the extension points of a device for programs that have no application registry: those of the
// device's own folder, and those that applications declare.
//
// Filled first, by one thread; then for any.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <string_view>

#include "platform/value/Value.h"

namespace extora {

class XTExtensionPoints {
 public:
  /// The sandbox profile of plug-ins that serve this extension point, as far as it follows from that alone; nothing for
  /// a point without one of its own, whose plug-ins get kDefaultProfile.
  static std::optional<std::string_view> sandboxProfile(std::string_view extensionPoint);
  static constexpr const char* kDefaultProfile = "plugin";
  /// Their profile follows from more than the extension point alone.
  static constexpr std::string_view kKeyboardService = "com.orvane.keyboard-service";
  static constexpr std::string_view kNetguardFilterData = "com.orvane.netguard.filter-data";

  /// `folder` holds <identifier>.plist files; it need not exist.
  explicit XTExtensionPoints(std::string folder) : folder_(std::move(folder)) {}
  /// Adds what the Info.plist of an application declares in HXExtensionPoints. Of several that declare the same one the
  /// first counts.
  void addApplication(const platform::Value& info);

  /// The SDK dictionary of `identifier`: the device's own file before any application's; nothing for a point that
  /// nobody has registered. Made for XTPlugInCore::setSDKProvider.
  platform::Value sdkDictionary(const std::string& identifier) const;

 private:
  const std::string folder_;
  std::map<std::string, platform::Value> declared_;
};

}  // namespace extora
