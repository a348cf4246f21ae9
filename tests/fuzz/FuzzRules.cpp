// Rules as a client sends them, tested against one plug-in: nothing in a rule may do harm, and the answer to equal
// rules is the same every time.
#include <cstdlib>
#include <memory>

#include "platform/ipc/IpcCodec.h"
#include "platform/log/Log.h"
#include "platform/value/PropertyListKinds.h"
#include "tests/support/FakeRegistry.h"
#include "xtd/ElectionFilter.h"
#include "xtd/XTDPlugIn.h"

namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

std::shared_ptr<extora::XTDPlugIn> makePlugIn() {
  platform::Log::configure("fault");
  const auto registry = std::make_shared<tests::FakeRegistry>();
  registry->conformances = {{"jpeg", "image"}};
  const platform::PlugInRecord record = registry->install(tests::sampleRecord(
      "com.a",
      {{"version", "1.10"}, {"type", "jpeg"}, {"list", Array{"x", 5, "b"}}, {"rule", Dictionary{{"image", 2}}}},
      Dictionary{{"on", true}, {"text", "t"}}));
  return extora::XTDPlugIn::initWithARData(record, registry, {});
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const std::shared_ptr<extora::XTDPlugIn> plugIn = makePlugIn();
  const Value rules = platform::toPropertyListKinds(platform::decodeValue({data, size}, nullptr));
  const bool matches = plugIn->match(rules);
  if (plugIn->match(rules) != matches) std::abort();
  bool all = rules.isDictionary() || rules.isNothing();
  for (const auto& [key, pattern] : rules.entries()) all = all && plugIn->match(Dictionary{{key, pattern}});
  if (all != matches) std::abort();
  if (const auto elections = extora::ElectionFilter::fromQuery(rules)) (void)elections->accepts(rules["election"]);
  return 0;
}
