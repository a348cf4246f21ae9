// XTDPlugInSignature: the code-signature facts of a plug-in bundle. The bundle itself is not inspected: each object
// gets a unique hash and a fixed requirement text. Safe for use by several threads.
#pragma once

#include <memory>
#include <string>

#include "platform/queue/Mutex.h"
#include "platform/value/Error.h"
#include "platform/value/Url.h"
#include "platform/value/Value.h"

namespace extora {

class XTDPlugInSignature {
 public:
  /// Never null; neither argument is looked at.
  static std::shared_ptr<XTDPlugInSignature> initWithURL(const platform::Url& url, platform::Error* error);

  /// Data of 20 bytes.
  platform::Value cdhash() const;
  void setCdhash(platform::Value value);
  std::string requirement() const;
  void setRequirement(std::string value);

 private:
  XTDPlugInSignature();
  mutable platform::Mutex mutex_;
  platform::Value cdhash_ XT_GUARDED_BY(mutex_);
  std::string requirement_ XT_GUARDED_BY(mutex_) = "dummy requirement";
};

}  // namespace extora
