#include "tests/vectors/vector_file.h"

#include <fmt/format.h>
#include <openssl/core_names.h>
#include <openssl/evp.h>
#include <openssl/x509.h>

#include <array>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <stdexcept>

#include "tests/support/rsa_test_key.h"

namespace testing_support {
namespace {

verdict verdict_of(const std::string& result) {
  if (result == "valid") return verdict::valid;
  if (result == "acceptable") return verdict::acceptable;
  if (result == "invalid") return verdict::invalid;
  throw std::runtime_error("unknown verdict: " + result);
}

std::string joined(const nlohmann::json& words) {
  std::string all;
  for (const auto& word : words) all += (all.empty() ? "" : ",") + word.get<std::string>();
  return all;
}

/// The files write numbers as signed ones: a zero byte stands in front where the highest bit is set.
bytes magnitude(const std::string& hex) {
  bytes number = from_hex(hex);
  while (!number.empty() && number.front() == 0) number.erase(number.begin());
  return number;
}

bytes component(const EVP_PKEY* key, const char* name) {
  BIGNUM* value = nullptr;
  if (EVP_PKEY_get_bn_param(key, name, &value) != 1) throw std::runtime_error(fmt::format("no component {}", name));
  bytes number(static_cast<std::size_t>(BN_num_bytes(value)));
  BN_bn2bin(value, number.data());
  BN_free(value);
  return number;
}

}  // namespace

std::optional<nlohmann::json> read_vectors(const std::string& name) {
  const char* const folder = std::getenv("KEYMASTER_VECTORS");
  if (folder == nullptr || *folder == '\0') return std::nullopt;
  std::ifstream file(std::filesystem::path(folder) / name);
  if (!file) throw std::runtime_error(fmt::format("KEYMASTER_VECTORS is {}, and there is no {} in it", folder, name));
  return nlohmann::json::parse(file);
}

void for_each_case(const nlohmann::json& group, const std::function<void(const vector_case&)>& check) {
  for (const auto& test : group.at("tests")) {
    check({test.at("tcId").get<int>(), test.at("comment").get<std::string>(), joined(test.at("flags")),
           from_hex(test.at("msg").get<std::string>()), from_hex(test.at("sig").get<std::string>()),
           verdict_of(test.at("result").get<std::string>())});
  }
}

bytes public_material(const nlohmann::json& group) {
  const auto& key = group.at("publicKey");
  const bytes placeholder = {1};
  rsa_components components;
  components.fill(placeholder);
  components[rsa_n] = magnitude(key.at("modulus").get<std::string>());
  components[rsa_e] = magnitude(key.at("publicExponent").get<std::string>());
  return rsa_material(components);
}

bytes private_material(const nlohmann::json& group) {
  const bytes der = from_hex(group.at("privateKeyPkcs8").get<std::string>());
  const unsigned char* at = der.data();
  const std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> key(
      d2i_AutoPrivateKey(nullptr, &at, static_cast<long>(der.size())), EVP_PKEY_free);
  if (key == nullptr) throw std::runtime_error("libcrypto does not read the vectors' private key");
  constexpr std::array<const char*, 8> names = {OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,
                                                OSSL_PKEY_PARAM_RSA_D,         OSSL_PKEY_PARAM_RSA_FACTOR1,
                                                OSSL_PKEY_PARAM_RSA_FACTOR2,   OSSL_PKEY_PARAM_RSA_EXPONENT1,
                                                OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};
  rsa_components components;
  for (std::size_t i = 0; i < names.size(); ++i) components.at(i) = component(key.get(), names.at(i));
  return rsa_material(components);
}

}  // namespace testing_support
