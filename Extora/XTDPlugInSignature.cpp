#include "Extora/XTDPlugInSignature.h"

#include <utility>

#include "platform/signing/Sha1.h"

namespace extora {
namespace {

platform::Value uniqueHash() {
  const std::string text = platform::Uuid::random().text();
  const auto digest = platform::sha1({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
  return platform::Value::data({digest.begin(), digest.end()});
}

}  // namespace

XTDPlugInSignature::XTDPlugInSignature() : cdhash_(uniqueHash()) {}

std::shared_ptr<XTDPlugInSignature> XTDPlugInSignature::initWithURL(const platform::Url& /*url*/,
                                                                    platform::Error* /*error*/) {
  return std::shared_ptr<XTDPlugInSignature>(new XTDPlugInSignature());
}

platform::Value XTDPlugInSignature::cdhash() const {
  const platform::MutexLock lock(mutex_);
  return cdhash_;
}

void XTDPlugInSignature::setCdhash(platform::Value value) {
  const platform::MutexLock lock(mutex_);
  cdhash_ = std::move(value);
}

std::string XTDPlugInSignature::requirement() const {
  const platform::MutexLock lock(mutex_);
  return requirement_;
}

void XTDPlugInSignature::setRequirement(std::string value) {
  const platform::MutexLock lock(mutex_);
  requirement_ = std::move(value);
}

}  // namespace extora
