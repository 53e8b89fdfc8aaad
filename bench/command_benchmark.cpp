// Commands that compute little: what the way into the TA and back costs.
#include <benchmark/benchmark.h>

#include <stdexcept>

#include "bench/ta_operation.h"
#include "src/params/keymaster_defs.h"
#include "src/params/keymaster_protocol.h"

using namespace keymaster;

namespace bench {
namespace {

void get_key_character_size(benchmark::State& state) {
  bench_device device;
  bytes request;
  append_block(request, device.generate(rsa_sign_key(2048)));
  append_block(request, {});
  append_block(request, {});
  for ([[maybe_unused]] auto _ : state) {
    benchmark::DoNotOptimize(device.must_invoke(KM_COMMAND_GET_KEY_CHARACTER_SIZE, 0, &request, nullptr).b);
  }
}
BENCHMARK(get_key_character_size)->Unit(benchmark::kMicrosecond);

void begin_and_abort(benchmark::State& state) {
  bench_device device;
  ta_operation signing(device, {KM_PURPOSE_SIGN, device.generate(rsa_sign_key(2048)), rsa_sign_params(), {}});
  for ([[maybe_unused]] auto _ : state) device.must_invoke(KM_COMMAND_ABORT, signing.begin(), nullptr, nullptr);
}
BENCHMARK(begin_and_abort)->Unit(benchmark::kMicrosecond);

void unknown_command(benchmark::State& state) {
  bench_device device;
  constexpr std::uint32_t unknown = 0xFEFE;
  for ([[maybe_unused]] auto _ : state) {
    const reply answer = device.invoke(unknown, 0, nullptr, nullptr);
    if (answer.result != TEEC_ERROR_BAD_PARAMETERS) throw std::runtime_error("an unknown command was not refused");
  }
}
BENCHMARK(unknown_command)->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace bench
