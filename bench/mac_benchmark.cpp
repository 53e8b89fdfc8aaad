// HMAC-SHA-256 of 1 KiB: by the TA from begin to finish with the sealed key, and by libcrypto with a warm key.
#include <openssl/core_names.h>

#include <array>
#include <stdexcept>

#include "bench/libcrypto_owner.h"
#include "bench/side_by_side.h"
#include "bench/ta_operation.h"
#include "src/params/keymaster_defs.h"

using namespace keymaster;

namespace bench {
namespace {

constexpr std::size_t message_size = 1024;
constexpr std::uint32_t mac_bits = 256;
/// The wish is 90,000 MACs a second on a machine whose libcrypto does 1.4 million.
constexpr double target_ratio = 90'000.0 / 1'400'000.0;

class libcrypto_mac {
 public:
  libcrypto_mac(const bytes& key, bytes message)
      : hmac_(EVP_MAC_fetch(nullptr, "HMAC", nullptr)),
        context_(EVP_MAC_CTX_new(hmac_.get())),
        message_(std::move(message)) {
    char digest[] = "SHA2-256";
    const std::array<OSSL_PARAM, 2> params = {OSSL_PARAM_construct_utf8_string(OSSL_MAC_PARAM_DIGEST, digest, 0),
                                              OSSL_PARAM_construct_end()};
    expect(EVP_MAC_init(context_.get(), key.data(), key.size(), params.data()) == 1);
  }

  const bytes& run() {
    std::size_t length = 0;
    expect(EVP_MAC_init(context_.get(), nullptr, 0, nullptr) == 1 &&
           EVP_MAC_update(context_.get(), message_.data(), message_.size()) == 1 &&
           EVP_MAC_final(context_.get(), mac_.data(), &length, mac_.size()) == 1);
    return mac_;
  }

 private:
  mac_owner hmac_;
  mac_context_owner context_;
  bytes message_;
  bytes mac_ = bytes(mac_bits / 8);
};

void hmac_sha256_of_1_kib_beside_libcrypto(benchmark::State& state) {
  bench_device device;
  const bytes key(32, 0x42), message(message_size, 0x6B);
  const bytes blob = device.import_key(
      key_params(
          KM_ALGORITHM_HMAC, 256,
          {{KM_TAG_PURPOSE, KM_PURPOSE_SIGN}, {KM_TAG_DIGEST, KM_DIGEST_SHA_2_256}, {KM_TAG_MIN_MAC_LENGTH, 64}}),
      key);
  const bytes params = marshal({{KM_TAG_DIGEST, KM_DIGEST_SHA_2_256}, {KM_TAG_MAC_LENGTH, mac_bits}});
  ta_operation ta(device, {KM_PURPOSE_SIGN, blob, params, message});
  libcrypto_mac libcrypto(key, message);
  if (ta.run() != libcrypto.run()) throw std::runtime_error("the two MACs differ");
  run_side_by_side(
      state, {.target = target_ratio, .rounds = 16}, [&] { benchmark::DoNotOptimize(ta.run().data()); },
      [&] { benchmark::DoNotOptimize(libcrypto.run().data()); });
  state.counters["ta_per_second"] = 1e6 / state.counters["ta_us"];
  state.counters["libcrypto_per_second"] = 1e6 / state.counters["libcrypto_us"];
}
BENCHMARK(hmac_sha256_of_1_kib_beside_libcrypto)->UseManualTime()->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace bench
