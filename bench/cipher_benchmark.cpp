// AES streams: 1 MiB in updates of 4 KiB and of 64 KiB, by the TA and by libcrypto with the same key in the same steps.
#include <benchmark/benchmark.h>

#include <algorithm>

#include "bench/libcrypto_owner.h"
#include "bench/side_by_side.h"
#include "bench/ta_operation.h"
#include "src/params/keymaster_defs.h"

using namespace keymaster;

namespace bench {
namespace {

constexpr std::size_t stream_size = 1U << 20U;
constexpr std::size_t small_step = 4096, large_step = 65536;
constexpr std::uint32_t tag_bits = 128;

/// Encrypts with a warm context: each run takes a new nonce, as an operation of the TA does.
class libcrypto_stream {
 public:
  libcrypto_stream(const char* cipher, bytes key, std::size_t step, bool gcm)
      : cipher_(EVP_CIPHER_fetch(nullptr, cipher, nullptr)),
        context_(EVP_CIPHER_CTX_new()),
        key_(std::move(key)),
        step_(step),
        gcm_(gcm),
        input_(stream_size, 0x6B),
        output_(stream_size) {}

  void run() {
    std::fill(nonce_.begin(), nonce_.end(), ++runs_);
    expect(EVP_EncryptInit_ex2(context_.get(), cipher_.get(), key_.data(), nonce_.data(), nullptr) == 1);
    expect(EVP_CIPHER_CTX_set_padding(context_.get(), 0) == 1);
    int written = 0;
    for (std::size_t at = 0; at < stream_size; at += step_) {
      expect(EVP_EncryptUpdate(context_.get(), &output_[at], &written, &input_[at], static_cast<int>(step_)) == 1);
    }
    expect(EVP_EncryptFinal_ex(context_.get(), tag_.data(), &written) == 1);
    if (gcm_) {
      expect(EVP_CIPHER_CTX_ctrl(context_.get(), EVP_CTRL_AEAD_GET_TAG, static_cast<int>(tag_.size()), tag_.data()) ==
             1);
    }
    benchmark::DoNotOptimize(output_.data());
  }

 private:
  cipher_owner cipher_;
  cipher_context_owner context_;
  bytes key_;
  std::size_t step_;
  bool gcm_;
  bytes input_, output_;
  bytes nonce_ = bytes(16);
  bytes tag_ = bytes(16);
  std::uint8_t runs_ = 0;
};

void stream_beside_libcrypto(benchmark::State& state, std::uint32_t block_mode, const bytes& key, const char* cipher,
                             std::size_t step, double target) {
  bench_device device;
  const bytes blob = device.import_key(key_params(KM_ALGORITHM_AES, static_cast<std::uint32_t>(key.size() * 8),
                                                  {{KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT},
                                                   {KM_TAG_BLOCK_MODE, block_mode},
                                                   {KM_TAG_PADDING, KM_PAD_NONE},
                                                   {KM_TAG_MIN_MAC_LENGTH, tag_bits}}),
                                       key);
  const bytes params =
      marshal({{KM_TAG_BLOCK_MODE, block_mode}, {KM_TAG_PADDING, KM_PAD_NONE}, {KM_TAG_MAC_LENGTH, tag_bits}});
  ta_operation ta(device, {KM_PURPOSE_ENCRYPT, blob, params, bytes(stream_size, 0x6B), step});
  libcrypto_stream libcrypto(cipher, key, step, block_mode == KM_MODE_GCM);
  run_side_by_side(
      state, {.target = target}, [&] { benchmark::DoNotOptimize(ta.run().data()); }, [&] { libcrypto.run(); });
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(stream_size));
}

void cbc(benchmark::State& state, std::size_t step, double target) {
  stream_beside_libcrypto(state, KM_MODE_CBC, bytes(16, 0x42), "AES-128-CBC", step, target);
}
void gcm(benchmark::State& state, std::size_t step, double target) {
  stream_beside_libcrypto(state, KM_MODE_GCM, bytes(32, 0x42), "AES-256-GCM", step, target);
}
BENCHMARK_CAPTURE(cbc, aes_128_in_4_kib_updates, small_step, 0.85)->UseManualTime()->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(cbc, aes_128_in_64_kib_updates, large_step, 0.92)->UseManualTime()->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(gcm, aes_256_in_4_kib_updates, small_step, 0.60)->UseManualTime()->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(gcm, aes_256_in_64_kib_updates, large_step, 0.85)->UseManualTime()->Unit(benchmark::kMicrosecond);

}  // namespace
}  // namespace bench
