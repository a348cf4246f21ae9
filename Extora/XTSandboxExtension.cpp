#include "Extora/XTSandboxExtension.h"

#include <utility>

#include "Extora/XTHostServices.h"
#include "Extora/XTLog.h"
#include "platform/sandbox/ExtensionTokens.h"

namespace extora {

XTSandboxExtension::~XTSandboxExtension() {
  expel();
}

void XTSandboxExtension::consume() {
  if (handle_ != -1) return;
  const std::string extension = token();
  Error error;
  auto consumed = XTHostServices::consume(extension, &error);
  if (!consumed) {
    XTLogSandbox().def("failed to consume extension {} - errno={}", platform::shownToken(extension), error.code);
    return;
  }
  handle_ = consumed->handle;
  descriptor_ = std::move(consumed->descriptor);
  XTLogSandbox().debug("consuming extension {} -> {}", platform::shownToken(extension), handle_);
}

void XTSandboxExtension::expel() {
  if (handle_ == -1) return;
  if (const auto error = XTHostServices::release(handle_)) {
    XTLogSandbox().def("failed to release extension {} - errno={}", handle_, error->code);
  } else {
    XTLogSandbox().debug("releasing extension {}", handle_);
  }
  handle_ = -1;
  descriptor_.reset();
}

std::string XTSandboxExtension::token() const {
  const platform::MutexLock lock(mutex_);
  return token_;
}

void XTSandboxExtension::setToken(std::string token) {
  const platform::MutexLock lock(mutex_);
  token_.swap(token);
}

}  // namespace extora
