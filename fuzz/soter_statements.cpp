#include "fuzz/soter_statements.h"

#include <openssl/core_names.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <string_view>

#include "fuzz/fuzz_device.h"
#include "fuzz/request_maker.h"

namespace fuzzing {
namespace {

constexpr std::array<const char*, 8> component_names = {
    OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,           OSSL_PKEY_PARAM_RSA_D,
    OSSL_PKEY_PARAM_RSA_FACTOR1,   OSSL_PKEY_PARAM_RSA_FACTOR2,     OSSL_PKEY_PARAM_RSA_EXPONENT1,
    OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};

bytes number(EVP_PKEY* key, const char* name) {
  BIGNUM* value = nullptr;
  require(EVP_PKEY_get_bn_param(key, name, &value) == 1, "the key has eight components");
  bytes magnitude(static_cast<std::size_t>(BN_num_bytes(value)));
  BN_bn2bin(value, magnitude.data());
  BN_free(value);
  return magnitude;
}

}  // namespace

known_key::known_key(unsigned bits) : key_(EVP_RSA_gen(bits), EVP_PKEY_free) {
  require(key_ != nullptr, "libcrypto makes a key");
  for (std::size_t i = 0; i < component_names.size(); ++i) {
    components_.at(i) = number(key_.get(), component_names.at(i));
  }
}

bytes known_key::material() const {
  bytes material;
  for (const bytes& component : components_) append_block(material, component);
  return material;
}

std::string known_key::pem() const {
  unsigned char* der = nullptr;
  const int size = i2d_PUBKEY(key_.get(), &der);
  require(size > 0, "libcrypto encodes a public key");
  std::string base64(static_cast<std::size_t>(size / 3 + 1) * 4 + 1, '\0');
  base64.resize(static_cast<std::size_t>(EVP_EncodeBlock(reinterpret_cast<unsigned char*>(base64.data()), der, size)));
  OPENSSL_free(der);
  return escaped(bytes_of("-----BEGIN PUBLIC KEY-----\n" + base64 + "\n-----END PUBLIC KEY-----"));
}

bool known_key::signed_by(const bytes& text, const bytes& signature, bool pss) const {
  const std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  EVP_PKEY_CTX* of_key = nullptr;
  bool ready = EVP_DigestVerifyInit(context.get(), &of_key, EVP_sha256(), nullptr, key_.get()) == 1;
  if (pss) ready = ready && EVP_PKEY_CTX_set_rsa_padding(of_key, RSA_PKCS1_PSS_PADDING) == 1;
  require(ready, "libcrypto verifies");
  return EVP_DigestVerify(context.get(), signature.data(), signature.size(), text.data(), text.size()) == 1;
}

bytes bytes_of(const std::string& text) {
  return {text.begin(), text.end()};
}

statement take_apart(const bytes& packed) {
  const std::uint32_t size = u32_at(packed, 0);
  require(packed.size() >= 4 && size <= packed.size() - 4, "a statement's text lies in the response");
  const auto end = packed.begin() + 4 + static_cast<std::ptrdiff_t>(size);
  return {{packed.begin() + 4, end}, {end, packed.end()}};
}

std::optional<std::uint64_t> counter_in(const bytes& told, const std::string& text) {
  const std::size_t place = text.rfind(counter_place);
  const std::string_view before = std::string_view(text).substr(0, place),
                         after = std::string_view(text).substr(place + 1);
  std::string_view rest(reinterpret_cast<const char*>(told.data()), told.size());
  if (place == std::string::npos || !rest.starts_with(before)) return std::nullopt;
  rest.remove_prefix(before.size());
  const std::size_t digits = rest.find_first_not_of("0123456789");
  if (digits == 0 || digits > 11 || rest.substr(digits) != after) return std::nullopt;
  return std::stoull(std::string(rest.substr(0, digits)));
}

std::string escaped(const bytes& text) {
  constexpr std::string_view plain = "\"\\/\b\f\n\r\t", letters = "\"\\/bfnrt";
  std::string result;
  for (const std::uint8_t byte : text) {
    const std::size_t place = plain.find(static_cast<char>(byte));
    if (place == std::string_view::npos) {
      result += static_cast<char>(byte);
    } else {
      result += '\\';
      result += letters[place];
    }
  }
  return result;
}

}  // namespace fuzzing
