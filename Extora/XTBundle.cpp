#include "Extora/XTBundle.h"

#include <utility>

#include "Extora/XTLog.h"
#include "Extora/XTVocabulary.h"

namespace extora {

using platform::PlatformBundle;
using platform::Url;
using platform::Value;

XTBundle::XTBundle(std::shared_ptr<PlatformBundle> bundle) : bundle_(std::move(bundle)) {}

std::shared_ptr<XTBundle> XTBundle::initForMainBundle() {
  return initWithIPCBundle(PlatformBundle::main());
}

std::shared_ptr<XTBundle> XTBundle::initWithURL(const Url& url) {
  return initWithPath(url.path());
}

std::shared_ptr<XTBundle> XTBundle::initWithPath(const std::string& path) {
  return initWithIPCBundle(PlatformBundle::create(path, PlatformBundle::PathKind::Bundle));
}

std::shared_ptr<XTBundle> XTBundle::initWithExecutableURL(const Url& url) {
  return initWithExecutablePath(url.path());
}

std::shared_ptr<XTBundle> XTBundle::initWithExecutablePath(const std::string& path) {
  auto bundle = PlatformBundle::create(path, PlatformBundle::PathKind::Executable);
  if (!bundle->property(Property::BundlePath)) return initWithPath(path);
  return initWithIPCBundle(std::move(bundle));
}

std::shared_ptr<XTBundle> XTBundle::initWithIPCBundle(std::shared_ptr<PlatformBundle> bundle) {
  return std::shared_ptr<XTBundle>(new XTBundle(std::move(bundle)));
}

std::optional<std::string> XTBundle::stringProperty(Property number) const {
  return bundle_->property(number);
}

std::optional<std::string> XTBundle::path() const {
  return stringProperty(Property::BundlePath);
}

std::optional<Url> XTBundle::url() const {
  const std::optional<std::string> bundlePath = path();
  if (!bundlePath) return std::nullopt;
  return Url::file(*bundlePath);
}

std::optional<std::string> XTBundle::executablePath() const {
  if (auto executable = stringProperty(Property::ExecutablePath)) return executable;
  return path();
}

std::optional<std::string> XTBundle::supportPath() const {
  const platform::MutexLock lock(mutex_);
  if (!supportPath_) supportPath_ = stringProperty(Property::SupportPath);
  return supportPath_;
}

std::optional<std::string> XTBundle::bundleDirectory(const std::string& name) const {
  const std::optional<std::string> support = supportPath();
  if (!support) return std::nullopt;
  return Url::file(*support).appending(name).path();
}

std::optional<std::string> XTBundle::plugInsPath() const {
  return bundleDirectory("PlugIns");
}

std::optional<std::string> XTBundle::bundleIdentifier() const {
  const Value info = bundle_->info();
  const Value& identifier = info[HBBundleIdentifierKey];
  if (!identifier.isString()) return std::nullopt;
  return identifier.string();
}

Value XTBundle::infoDictionary() const {
  Value info = bundle_->info();
  if (info.isDictionary()) return info;
  const std::string bundlePath = path().value_or("(null)");
  if (info.isNothing()) XTLogOps().info("failed to retrieve Info.plist for {} through {}", bundlePath, *bundle_);
  XTLogOps().info("failed to convert Info.plist to dictionary: {} source={}", bundlePath, info);
  return {};
}

std::string XTBundle::describe() const {
  return bundle_->describe();
}

}  // namespace extora
