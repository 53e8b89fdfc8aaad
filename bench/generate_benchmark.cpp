// Key generation, sealing included, beside libcrypto's bare one. RSA's time is a matter of luck: the ratio of a short
// run says little.
#include <openssl/ec.h>
#include <openssl/rsa.h>

#include "bench/bench_device.h"
#include "bench/libcrypto_owner.h"
#include "bench/p256_key.h"
#include "bench/side_by_side.h"

namespace bench {
namespace {

void generate_beside_libcrypto(benchmark::State& state, const bytes& params, EVP_PKEY* (*libcrypto)()) {
  bench_device device;
  run_side_by_side(
      state, {}, [&] { benchmark::DoNotOptimize(device.generate(params).data()); },
      [&] { expect(key_owner(libcrypto()) != nullptr); });
}

void generate_p256(benchmark::State& state) {
  generate_beside_libcrypto(state, p256_key_params(), [] { return EVP_EC_gen("P-256"); });
}
BENCHMARK(generate_p256)->UseManualTime()->Unit(benchmark::kMicrosecond);

void generate_rsa_2048(benchmark::State& state) {
  generate_beside_libcrypto(state, rsa_sign_key(2048), [] { return EVP_RSA_gen(2048); });
}
BENCHMARK(generate_rsa_2048)->UseManualTime()->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace bench
