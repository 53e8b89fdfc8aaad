// RSA-2048 signatures from a sealed blob: by the TA, and by plain libcrypto from the same blob, in one process.
#include <benchmark/benchmark.h>

#include <stdexcept>
#include <string_view>

#include "bench/libcrypto_signer.h"
#include "bench/side_by_side.h"
#include "bench/ta_operation.h"
#include "src/params/keymaster_defs.h"
#include "src/params/keymaster_protocol.h"

using namespace keymaster;

namespace bench {
namespace {

using namespace std::literals;

constexpr std::size_t message_size = 1024;

/// The key under which the TA seals, as the device's storage keeps it.
bytes stored_ksk(bench_device& device) {
  const auto stored = device.world().read_object(KEYMASTER_TA_UUID, TEE_STORAGE_RPMB, "Keymaster KSK\0"sv);
  if (!stored) throw std::runtime_error("the device has no stored key storage key");
  return {stored->begin(), stored->end()};
}

/// Both sides open the blob and build the key anew for each signature.
void rsa_2048_sign_beside_libcrypto(benchmark::State& state) {
  bench_device device;
  const bytes blob = device.generate(rsa_sign_key(2048));
  const bytes message(message_size, 0x6B);
  ta_operation ta(device, {KM_PURPOSE_SIGN, blob, rsa_sign_params(), message});
  libcrypto_signer libcrypto(stored_ksk(device), blob, message);
  if (ta.run() != libcrypto.sign()) throw std::runtime_error("the two signatures differ");
  run_side_by_side(
      state, {.target = 0.95}, [&] { benchmark::DoNotOptimize(ta.run().data()); },
      [&] { benchmark::DoNotOptimize(libcrypto.sign().data()); });
}
BENCHMARK(rsa_2048_sign_beside_libcrypto)->UseManualTime()->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace bench
