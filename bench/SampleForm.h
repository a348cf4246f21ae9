// What the micro benchmarks work on: plug-ins whose metadata grows with one number, `size` (attributes).
#pragma once

#include <string>

#include "tests/support/FakeRegistry.h"
#include "xtd/XTDPlugIn.h"

namespace bench {

inline platform::Dictionary sampleAttributes(std::int64_t size) {
  platform::Dictionary attributes{{"HXExtensionVersion", "1.10"}, {"HXExtensionPointName", "com.example.point"}};
  for (std::int64_t i = 0; i < size; ++i) {
    attributes.set("attribute" + std::to_string(i), "a value of usual length " + std::to_string(i));
  }
  return attributes;
}

/// A plug-in of the daemon over a registry of its own. Keep `registry` as long as it.
inline std::shared_ptr<extora::XTDPlugIn> samplePlugIn(const std::shared_ptr<tests::FakeRegistry>& registry,
                                                       std::int64_t size) {
  auto record = tests::sampleRecord("com.example.sample", sampleAttributes(size));
  record.plugInUUID = platform::Uuid::random();
  record.localizedName = "Sample";
  return extora::XTDPlugIn::initWithARData(registry->install(record), registry, {});
}

}  // namespace bench
