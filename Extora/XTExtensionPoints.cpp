#include "Extora/XTExtensionPoints.h"

#include "platform/files/Directories.h"
#include "platform/registry/BundleFiles.h"

namespace extora {

using platform::Value;

namespace {

struct ProfileRow {
  std::string_view extensionPoint;
  std::string_view profile;
};
constexpr ProfileRow kProfiles[] = {
    {"com.orvane.glance.extension.preview", "glanced"},
    {"com.orvane.glance.preview", "glance-preview"},
    {"com.orvane.glance.preview.highmemory", "glance-preview"},
    {"com.orvane.glance.thumbnail", "glance-thumbnail"},
    {"com.orvane.glance.thumbnail.highmemory", "glance-thumbnail"},
    {"com.orvane.app.non-ui-extension", "sketchpad-devtools"},
    {"com.orvane.app.non-ui-extension.multiple-instances", "sketchpad-devtools"},
    {"com.orvane.callscreen.message-filter", "message-filter"},
    {"com.orvane.callscreen.classification-ui", "classification-ui"},
};

}  // namespace

std::optional<std::string_view> XTExtensionPoints::sandboxProfile(std::string_view extensionPoint) {
  for (const ProfileRow& row : kProfiles) {
    if (row.extensionPoint == extensionPoint) return row.profile;
  }
  return std::nullopt;
}

void XTExtensionPoints::addApplication(const Value& info) {
  for (const Value::Entry& each : info["HXExtensionPoints"].entries()) {
    if (each.value.isDictionary()) declared_.emplace(each.key, each.value);
  }
}

Value XTExtensionPoints::sdkDictionary(const std::string& identifier) const {
  if (platform::isPathSafeName(identifier)) {
    const auto folder = platform::openDirectory(folder_);
    platform::FileStamp stamp;
    Value own = platform::readPropertyListIn(folder.get(), identifier + ".plist", &stamp, nullptr);
    if (own.isDictionary()) return own;
  }
  const auto found = declared_.find(identifier);
  return found == declared_.end() ? Value() : found->second;
}

}  // namespace extora
