// How long does a plug-in's export form take on its way into and out of a message? The sweep is over its size.
#include <benchmark/benchmark.h>

#include "bench/SampleForm.h"
#include "platform/ipc/IpcCodec.h"

namespace {

platform::Value sampleForm(std::int64_t size) {
  const auto registry = std::make_shared<tests::FakeRegistry>();
  return bench::samplePlugIn(registry, size)->exportForm(nullptr);
}

void encodeForm(benchmark::State& state) {
  const platform::Value form = sampleForm(state.range(0));
  platform::Bytes bytes;
  for (auto _ : state) {
    bytes.clear();
    platform::encodeValue(form, bytes);
    benchmark::DoNotOptimize(bytes.data());
  }
  state.SetBytesProcessed(static_cast<std::int64_t>(bytes.size()) * state.iterations());
}
BENCHMARK(encodeForm)->Arg(10)->Arg(100)->Arg(1000);

void decodeForm(benchmark::State& state) {
  platform::Bytes bytes;
  platform::encodeValue(sampleForm(state.range(0)), bytes);
  for (auto _ : state) benchmark::DoNotOptimize(platform::decodeValue(bytes, nullptr));
  state.SetBytesProcessed(static_cast<std::int64_t>(bytes.size()) * state.iterations());
}
BENCHMARK(decodeForm)->Arg(10)->Arg(100)->Arg(1000);

}  // namespace
