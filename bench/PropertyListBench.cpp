// How long does an Info.plist take to parse? This is what a cold start pays for each bundle.
#include <benchmark/benchmark.h>

#include "bench/SampleForm.h"
#include "platform/plist/PropertyList.h"

namespace {

void parseInfoPlist(benchmark::State& state) {
  const platform::Dictionary info{
      {"HBBundleIdentifier", "com.example.sample"},
      {"HXExtension", platform::Dictionary{{"HXExtensionAttributes", bench::sampleAttributes(state.range(0))}}}};
  const std::string text = platform::serializeXml(info, nullptr).value();
  const platform::Bytes bytes(text.begin(), text.end());
  for (auto _ : state) benchmark::DoNotOptimize(platform::parsePropertyList(bytes, nullptr));
  state.SetBytesProcessed(static_cast<std::int64_t>(bytes.size()) * state.iterations());
}
BENCHMARK(parseInfoPlist)->Arg(10)->Arg(100)->Arg(1000);

}  // namespace
