#include "tests/companions/provisioning/reference_box.h"

#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/param_build.h>
#include <openssl/pem.h>
#include <openssl/x509.h>

#include <algorithm>
#include <stdexcept>

namespace testing_support {
namespace {

using evp_key = std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)>;
using key_context = std::unique_ptr<EVP_PKEY_CTX, decltype(&EVP_PKEY_CTX_free)>;
using number = std::unique_ptr<BIGNUM, decltype(&BN_clear_free)>;

template <class T>
T* must(T* made, const char* what) {
  if (made == nullptr) throw std::runtime_error(what);
  return made;
}

constexpr std::array<const char*, 8> parameter_names = {
    OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,           OSSL_PKEY_PARAM_RSA_D,
    OSSL_PKEY_PARAM_RSA_FACTOR1,   OSSL_PKEY_PARAM_RSA_FACTOR2,     OSSL_PKEY_PARAM_RSA_EXPONENT1,
    OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};

evp_key key_of(const rsa_components& key) {
  const std::unique_ptr<OSSL_PARAM_BLD, decltype(&OSSL_PARAM_BLD_free)> builder(
      must(OSSL_PARAM_BLD_new(), "OSSL_PARAM_BLD_new"), OSSL_PARAM_BLD_free);
  std::vector<number> numbers;
  for (std::size_t i = 0; i < key.size(); ++i) {
    numbers.emplace_back(BN_bin2bn(key[i].data(), static_cast<int>(key[i].size()), nullptr), BN_clear_free);
    OSSL_PARAM_BLD_push_BN(builder.get(), parameter_names[i], must(numbers.back().get(), "BN_bin2bn"));
  }
  const std::unique_ptr<OSSL_PARAM, decltype(&OSSL_PARAM_free)> params(OSSL_PARAM_BLD_to_param(builder.get()),
                                                                       OSSL_PARAM_free);
  const key_context context(EVP_PKEY_CTX_new_from_name(nullptr, "RSA", nullptr), EVP_PKEY_CTX_free);
  EVP_PKEY* made = nullptr;
  if (EVP_PKEY_fromdata_init(context.get()) != 1 ||
      EVP_PKEY_fromdata(context.get(), &made, EVP_PKEY_KEYPAIR, params.get()) != 1) {
    throw std::runtime_error("libcrypto makes no key of the components");
  }
  return {made, EVP_PKEY_free};
}

bytes spki_of_key(EVP_PKEY* key) {
  std::uint8_t* der = nullptr;
  const int length = i2d_PUBKEY(key, &der);
  if (length <= 0) throw std::runtime_error("libcrypto does not encode the key");
  const bytes encoded(der, der + length);
  OPENSSL_free(der);
  return encoded;
}

}  // namespace

std::vector<std::pair<std::uint16_t, bytes>> box_entries(const bytes& box) {
  std::vector<std::pair<std::uint16_t, bytes>> entries;
  std::size_t at = 0;
  while (at < box.size()) {
    if (box.size() - at < 4) throw std::runtime_error("the box ends within a header");
    const auto tag = static_cast<std::uint16_t>(box[at] | box[at + 1] << 8);
    const std::size_t length = box[at + 2] | static_cast<std::size_t>(box[at + 3]) << 8;
    at += 4;
    if (box.size() - at < length) throw std::runtime_error("the box ends within a value");
    entries.emplace_back(tag, bytes(box.begin() + static_cast<std::ptrdiff_t>(at),
                                    box.begin() + static_cast<std::ptrdiff_t>(at + length)));
    at += length;
  }
  return entries;
}

rsa_components components_of(const bytes& box) {
  const auto entries = box_entries(box);
  rsa_components components;
  for (std::size_t i = 0; i < components.size(); ++i) {
    const auto found =
        std::find_if(entries.begin(), entries.end(), [i](const auto& entry) { return entry.first == 17 + i; });
    if (found == entries.end()) throw std::runtime_error("the box lacks a component");
    components[i] = found->second;
  }
  return components;
}

bytes spki_of(const rsa_components& key) {
  return spki_of_key(key_of(key).get());
}

bool is_key_pair(const rsa_components& key) {
  const evp_key made = key_of(key);
  const key_context context(EVP_PKEY_CTX_new_from_pkey(nullptr, made.get(), nullptr), EVP_PKEY_CTX_free);
  return EVP_PKEY_check(context.get()) == 1;
}

bytes spki_of_pem(const bytes& pem) {
  const std::unique_ptr<BIO, decltype(&BIO_free)> text(BIO_new_mem_buf(pem.data(), static_cast<int>(pem.size())),
                                                       BIO_free);
  const evp_key key(must(PEM_read_bio_PUBKEY(text.get(), nullptr, nullptr, nullptr), "libcrypto reads no public key"),
                    EVP_PKEY_free);
  return spki_of_key(key.get());
}

}  // namespace testing_support
