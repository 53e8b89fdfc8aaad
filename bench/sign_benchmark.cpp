// RSA-2048 signatures from a sealed blob: by the TA, and by plain libcrypto from the same blob, in one process.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <chrono>
#include <stdexcept>
#include <string_view>

#include "bench/libcrypto_signer.h"
#include "src/params/keymaster_protocol.h"

namespace bench {
namespace {

using namespace std::literals;
using seconds = std::chrono::duration<double>;

constexpr std::size_t message_size = 1024;
constexpr double target_ratio = 0.95;

/// The key under which the TA seals, as the device's storage keeps it.
bytes stored_ksk(bench_device& device) {
  const auto stored = device.world().read_object(KEYMASTER_TA_UUID, TEE_STORAGE_RPMB, "Keymaster KSK\0"sv);
  if (!stored) throw std::runtime_error("the device has no stored key storage key");
  return {stored->begin(), stored->end()};
}

template <class Signer>
double time_one(Signer& signer) {
  const auto start = std::chrono::steady_clock::now();
  benchmark::DoNotOptimize(signer.sign().data());
  return seconds(std::chrono::steady_clock::now() - start).count();
}

double median(std::vector<double>& times) {
  const auto middle = times.begin() + static_cast<std::ptrdiff_t>(times.size() / 2);
  std::nth_element(times.begin(), middle, times.end());
  return *middle;
}

/// One iteration is one signature of each, in turns: whatever the machine does meanwhile, it does to both. The ratio is
/// that of the rates (the medians', so that an interrupted signature doesn't count): 1 would be a TA that costs
/// nothing.
void rsa_2048_sign_beside_libcrypto(benchmark::State& state) {
  bench_device device;
  const bytes blob = device.generate(rsa_sign_key(2048));
  const bytes message(message_size, 0x6B);
  ta_signer ta(device, blob, message);
  libcrypto_signer libcrypto(stored_ksk(device), blob, message);
  if (ta.sign() != libcrypto.sign()) {
    state.SkipWithError("the two signatures differ");
    return;
  }
  std::vector<double> ta_times, libcrypto_times;
  bool ta_first = false;
  for ([[maybe_unused]] auto _ : state) {
    ta_first = !ta_first;
    if (ta_first) ta_times.push_back(time_one(ta));
    libcrypto_times.push_back(time_one(libcrypto));
    if (!ta_first) ta_times.push_back(time_one(ta));
    state.SetIterationTime(ta_times.back());
  }
  const double ta_median = median(ta_times), libcrypto_median = median(libcrypto_times);
  state.counters["ta_us"] = ta_median * 1e6;
  state.counters["libcrypto_us"] = libcrypto_median * 1e6;
  state.counters["ratio"] = libcrypto_median / ta_median;
  state.counters["target"] = target_ratio;
}
BENCHMARK(rsa_2048_sign_beside_libcrypto)->UseManualTime()->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace bench
