// What does one candidate of a discovery cost: the test of a host's rules, the export of its form, and, on the host's
// side, the record built from it?
#include <benchmark/benchmark.h>

#include "Extora/XTPlugInCore.h"
#include "bench/SampleForm.h"

namespace {

void matchRules(benchmark::State& state) {
  const auto registry = std::make_shared<tests::FakeRegistry>();
  const auto plugIn = bench::samplePlugIn(registry, 10);
  platform::Dictionary rules{{"HXExtensionPointName", "com.example.point"}};
  for (std::int64_t i = 1; i < state.range(0); ++i) {
    rules.set("attribute" + std::to_string(i), ">=a value of usual length 0");
  }
  const platform::Value query(rules);
  if (!plugIn->match(query)) state.SkipWithError("the rules do not match");
  for (auto _ : state) benchmark::DoNotOptimize(plugIn->match(query));
}
BENCHMARK(matchRules)->Arg(1)->Arg(3)->Arg(9);

void exportForm(benchmark::State& state) {
  const auto registry = std::make_shared<tests::FakeRegistry>();
  const auto plugIn = bench::samplePlugIn(registry, state.range(0));
  for (auto _ : state) benchmark::DoNotOptimize(plugIn->exportForm(nullptr));
}
BENCHMARK(exportForm)->Arg(10)->Arg(1000);

void buildRecord(benchmark::State& state) {
  const auto registry = std::make_shared<tests::FakeRegistry>();
  const platform::Value form = bench::samplePlugIn(registry, state.range(0))->exportForm(nullptr);
  for (auto _ : state) benchmark::DoNotOptimize(extora::XTPlugInCore::initWithForm(form));
}
BENCHMARK(buildRecord)->Arg(10)->Arg(1000);

}  // namespace
