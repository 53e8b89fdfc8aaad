// How much of its heap the TA needs at most for one signature with a large key.
#include <benchmark/benchmark.h>

#include <stdexcept>

#include "bench/ta_operation.h"
#include "src/params/keymaster_defs.h"

using namespace keymaster;

namespace bench {
namespace {

void rsa_4096_sign_peak_heap(benchmark::State& state) {
  bench_device device;
  const bytes blob = device.generate(rsa_sign_key(4096));
  device.reopen();  // a fresh instance, whose peak is not the generation's
  const hosted_tee::accounting idle = device.accounting();
  ta_operation signing(device, {KM_PURPOSE_SIGN, blob, rsa_sign_params(), bytes(1024, 0x6B)});
  for ([[maybe_unused]] auto _ : state) benchmark::DoNotOptimize(signing.run().data());
  const hosted_tee::accounting after = device.accounting();
  if (!after.same_holdings(idle)) throw std::runtime_error("the signature left something behind");
  state.counters["peak_bytes"] = after.heap_peak;
  state.counters["idle_bytes"] = idle.heap_bytes;
  state.counters["target_bytes"] = 64 * 1024;
}
BENCHMARK(rsa_4096_sign_peak_heap)->Iterations(1)->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace bench
