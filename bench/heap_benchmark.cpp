// How much of its heap the TA needs at most for one signature with a large key.
#include <benchmark/benchmark.h>

#include "bench/bench_device.h"

namespace bench {
namespace {

void rsa_4096_sign_peak_heap(benchmark::State& state) {
  bench_device device;
  const bytes blob = device.generate(rsa_sign_key(4096));
  device.reopen();  // a fresh instance, whose peak is not the generation's
  const hosted_tee::accounting idle = device.accounting();
  ta_signer signer(device, blob, bytes(1024, 0x6B));
  for ([[maybe_unused]] auto _ : state) benchmark::DoNotOptimize(signer.sign().data());
  const hosted_tee::accounting after = device.accounting();
  if (!after.same_holdings(idle)) state.SkipWithError("the signature left something behind");
  state.counters["peak_bytes"] = after.heap_peak;
  state.counters["idle_bytes"] = idle.heap_bytes;
  state.counters["target_bytes"] = 64 * 1024;
}
BENCHMARK(rsa_4096_sign_peak_heap)->Iterations(1)->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace bench
