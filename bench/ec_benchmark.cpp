// P-256 signatures with the sealed key each time, beside libcrypto with a key built of the same raw parts each time.
#include <stdexcept>

#include "bench/p256_key.h"
#include "bench/side_by_side.h"
#include "bench/ta_operation.h"
#include "src/params/keymaster_defs.h"

using namespace keymaster;

namespace bench {
namespace {

void p256_sign_beside_libcrypto(benchmark::State& state) {
  bench_device device;
  const p256_parts parts = make_p256_parts();
  const bytes message(1024, 0x6B);
  const bytes blob = device.import_key(p256_key_params(), p256_material(parts));
  ta_operation ta(device, {KM_PURPOSE_SIGN, blob, p256_sign_params(), message});
  libcrypto_p256_signer libcrypto(parts, message);
  if (!libcrypto.verifies(ta.run()) || !libcrypto.verifies(libcrypto.sign()))
    throw std::runtime_error("a signature doesn't verify");
  run_side_by_side(
      state, {.target = 0.80, .rounds = 4}, [&] { benchmark::DoNotOptimize(ta.run().data()); },
      [&] { benchmark::DoNotOptimize(libcrypto.sign().data()); });
}
BENCHMARK(p256_sign_beside_libcrypto)->UseManualTime()->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace bench
