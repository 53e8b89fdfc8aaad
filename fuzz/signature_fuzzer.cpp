// ECDSA signatures from any bytes: what decodes has the one byte form that the encoder gives it, which is also the one
// that libcrypto reads and writes, and nothing stays on the heap.
#include <openssl/ecdsa.h>

#include <algorithm>
#include <array>
#include <memory>

#include "algorithms/ec/ec_signature_der.h"
#include "fuzz/fuzz_device.h"

using namespace keymaster;

namespace fuzzing {
namespace {

constexpr std::array<std::size_t, 5> field_sizes = {24, 28, 32, 48, 66};

bool is_zero(const bytes& number) {
  return std::ranges::all_of(number, [](std::uint8_t byte) { return byte == 0; });
}

bytes encoded(const bytes& r, const bytes& s) {
  heap_bytes der;
  require(der_encode_ec_signature(r, s, der), "what decodes encodes");
  return {der.data(), der.data() + der.size()};
}

/// The form that libcrypto gives the same numbers. It knows no INTEGER without content, which is how the TA writes 0.
void compare_with_libcrypto(const bytes& r, const bytes& s, const bytes& der) {
  if (is_zero(r) || is_zero(s)) return;
  ECDSA_SIG* const signature = ECDSA_SIG_new();
  ECDSA_SIG_set0(signature, BN_bin2bn(r.data(), static_cast<int>(r.size()), nullptr),
                 BN_bin2bn(s.data(), static_cast<int>(s.size()), nullptr));
  unsigned char* form = nullptr;
  const int size = i2d_ECDSA_SIG(signature, &form);
  require(size >= 0 && std::ranges::equal(std::span(form, static_cast<std::size_t>(size)), der),
          "a signature has the form that libcrypto gives it");
  OPENSSL_free(form);
  ECDSA_SIG_free(signature);
}

void check(const bytes& der, std::size_t field_size) {
  // Blocks of exactly their size: the sanitizer sees a byte too much.
  const std::unique_ptr<std::uint8_t[]> input(new std::uint8_t[der.size()]);
  std::copy(der.begin(), der.end(), input.get());
  bytes r(field_size, 0xA5), s(field_size, 0xA5);
  if (der_decode_ec_signature({input.get(), der.size()}, r, s) != TEE_SUCCESS) return;
  require(encoded(r, s) == der, "a signature that decodes has one byte form");
  compare_with_libcrypto(r, s, der);
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  in_fresh_instance([&](hosted_tee::instance&) {
    input_reader in({data, size});
    const std::size_t field_size = in.pick(field_sizes);
    check(in.take(size), field_size);
  });
  return 0;
}
