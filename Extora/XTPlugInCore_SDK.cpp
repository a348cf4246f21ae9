// What a record inherits from the extension point that it serves.
#include <algorithm>
#include <utility>

#include "Extora/XTLog.h"
#include "Extora/XTPlugInCore.h"
#include "platform/queue/Mutex.h"
#include "platform/value/InternalInconsistency.h"

namespace extora {
namespace {

struct Provider {
  platform::Mutex mutex;
  XTPlugInCore::SDKProvider function XT_GUARDED_BY(mutex);
};

Provider& provider() {
  static Provider& instance = *new Provider();
  return instance;
}

XTPlugInCore::SDKProvider currentProvider() {
  const platform::MutexLock lock(provider().mutex);
  return provider().function;
}

}  // namespace

void XTPlugInCore::setSDKProvider(SDKProvider function) {
  const platform::MutexLock lock(provider().mutex);
  provider().function.swap(function);
}

void XTPlugInCore::resolveSDK() {
  const Value info = bundleInfoDictionary();
  if (!info.isDictionary()) {
    throw platform::InternalInconsistency("cannot resolve SDK without materialized Info.plist");
  }
  const Value key = sdkSpec();
  if (!key.isNothing() && !key.isString()) {
    XTLogOps().error("invalid SDK key:{}", key);
    return;
  }
  const Value sdk = key.isString() ? readSDKDictionary(key.string()) : Value();
  if (!sdk.isNothing()) {
    const Dictionary merged = mergeDictionaryInto(sdk, info);
    // A merged "HXExtension" that is no dictionary leaves the plug-in dictionary as it was.
    (void)setDictionaries(merged);
    if (XTLogAr().enabled(platform::LogLevel::Debug)) {
      XTLogAr().debug("{} {} merged with SDK", "resolveSDK", merged[HBBundleDisplayNameKey]);
    }
  }
  canonicalize();
}

Value XTPlugInCore::readSDKDictionary(const std::string& key) const {
  const SDKProvider ask = currentProvider();
  Value sdk = ask ? ask(key) : Value();
  if (sdk.isDictionary()) return sdk;
  XTLogOps().def("plug-in sdk \"{}\" not registered", key);
  return {};
}

Dictionary XTPlugInCore::mergeDictionaryInto(const Value& source, const Value& target) {
  Dictionary result(target);
  for (const auto& [key, value] : source.entries()) {
    const Value own = result[key];
    if (own.isNothing() || sdkOverridesKey(key)) {
      result.set(key, value);
    } else if (key == XTSharedResourcesInfoKey) {
      if (own.isArray() && value.isArray()) result.set(key, mergeSharedResourcesInto(value, own));
    } else if (own.isDictionary() && value.isDictionary()) {
      result.set(key, mergeDictionaryInto(value, own));
    }
  }
  return result;
}

bool XTPlugInCore::sdkOverridesKey(std::string_view key) {
  return key == XTCleanTimeoutInfoKey;
}

Array XTPlugInCore::mergeSharedResourcesInto(const Value& source, const Value& target) {
  Array result;
  for (const auto items : {target.items(), source.items()}) {
    for (const Value& item : items) {
      if (std::find(result.begin(), result.end(), item) == result.end()) result.append(item);
    }
  }
  return result;
}

}  // namespace extora
