#include "tests/support/ec_test_key.h"

#include <fmt/format.h>
#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/ec.h>
#include <openssl/param_build.h>
#include <openssl/pem.h>
#include <openssl/x509.h>

#include <map>
#include <stdexcept>

#include "tests/support/libcrypto_digest.h"

using namespace keymaster;

namespace testing_support {
namespace {

template <class Type>
using owner = std::unique_ptr<Type, void (*)(Type*)>;

void must(bool done, const char* what) {
  if (!done) throw std::runtime_error(fmt::format("libcrypto refuses: {}", what));
}

const char* curve_name(std::uint32_t bits) {
  static const std::map<std::uint32_t, const char*> names = {
      {192, "P-192"}, {224, "P-224"}, {256, "P-256"}, {384, "P-384"}, {521, "P-521"}};
  return names.at(bits);
}

EVP_PKEY* read_pem(std::uint32_t bits) {
  const std::string name = fmt::format("tests/data/ec_{}.pem", bits);
  const std::unique_ptr<BIO, decltype(&BIO_free)> file(BIO_new_file(name.c_str(), "r"), BIO_free);
  must(file != nullptr, name.c_str());
  EVP_PKEY* const key = PEM_read_bio_PrivateKey(file.get(), nullptr, nullptr, nullptr);
  must(key != nullptr, name.c_str());
  return key;
}

bytes magnitude(const BIGNUM* value) {
  bytes number(static_cast<std::size_t>(BN_num_bytes(value)));
  BN_bn2bin(value, number.data());
  return number;
}

bytes number(EVP_PKEY* key, const char* name) {
  BIGNUM* value = nullptr;
  must(EVP_PKEY_get_bn_param(key, name, &value) == 1, name);
  const owner<BIGNUM> owned(value, BN_free);
  return magnitude(value);
}

owner<BIGNUM> bignum(const bytes& value) {
  return {BN_bin2bn(value.data(), static_cast<int>(value.size()), nullptr), BN_free};
}

bytes padded(const bytes& value, std::size_t width) {
  return value.size() < width ? join({bytes(width - value.size()), value}) : value;
}

/// Reads the field behind its length word at `*at`.
bytes read_field(std::span<const std::uint8_t> data, std::size_t* at) {
  if (data.size() < *at + 4) throw std::runtime_error("key data ends too soon");
  const std::uint32_t length = u32_at(data, *at);
  *at += 4;
  if (data.size() - *at < length) throw std::runtime_error("key data ends too soon");
  const auto field = data.subspan(*at, length);
  *at += length;
  return {field.begin(), field.end()};
}

}  // namespace

bytes ec_fields::public_material() const {
  return join({u32(bits), prefixed(x), prefixed(y)});
}

bytes ec_fields::material() const {
  return join({public_material(), prefixed(d)});
}

ec_fields ec_fields::parse(std::span<const std::uint8_t> data, bool with_d) {
  ec_fields fields;
  std::size_t at = 4;
  if (data.size() < at) throw std::runtime_error("key data ends too soon");
  fields.bits = u32_at(data, 0);
  fields.x = read_field(data, &at);
  fields.y = read_field(data, &at);
  if (with_d) fields.d = read_field(data, &at);
  if (at != data.size()) throw std::runtime_error("key data goes on");
  return fields;
}

ec_test_key::ec_test_key(EVP_PKEY* key, ec_fields fields) : key_(key, EVP_PKEY_free), fields_(std::move(fields)) {}

const ec_test_key& ec_test_key::of_bits(std::uint32_t bits) {
  static std::map<std::uint32_t, ec_test_key> loaded;
  if (const auto found = loaded.find(bits); found != loaded.end()) return found->second;
  EVP_PKEY* const key = read_pem(bits);
  const ec_fields fields = {bits, number(key, OSSL_PKEY_PARAM_EC_PUB_X), number(key, OSSL_PKEY_PARAM_EC_PUB_Y),
                            number(key, OSSL_PKEY_PARAM_PRIV_KEY)};
  return loaded.emplace(bits, ec_test_key(key, fields)).first->second;
}

ec_test_key ec_test_key::from_fields(const ec_fields& fields) {
  const bytes point = join({{4}, padded(fields.x, fields.half()), padded(fields.y, fields.half())});
  const owner<BIGNUM> d = bignum(fields.d);
  const owner<OSSL_PARAM_BLD> builder(OSSL_PARAM_BLD_new(), OSSL_PARAM_BLD_free);
  OSSL_PARAM_BLD_push_utf8_string(builder.get(), OSSL_PKEY_PARAM_GROUP_NAME, curve_name(fields.bits), 0);
  OSSL_PARAM_BLD_push_octet_string(builder.get(), OSSL_PKEY_PARAM_PUB_KEY, point.data(), point.size());
  if (!fields.d.empty()) OSSL_PARAM_BLD_push_BN(builder.get(), OSSL_PKEY_PARAM_PRIV_KEY, d.get());
  const owner<OSSL_PARAM> params(OSSL_PARAM_BLD_to_param(builder.get()), OSSL_PARAM_free);
  const owner<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new_from_name(nullptr, "EC", nullptr), EVP_PKEY_CTX_free);
  EVP_PKEY* key = nullptr;
  must(EVP_PKEY_fromdata_init(context.get()) == 1, "EVP_PKEY_fromdata_init");
  must(EVP_PKEY_fromdata(context.get(), &key, fields.d.empty() ? EVP_PKEY_PUBLIC_KEY : EVP_PKEY_KEYPAIR,
                         params.get()) == 1,
       "the coordinates");
  return {key, fields};
}

bytes ec_test_key::spki() const {
  unsigned char* der = nullptr;
  const int length = i2d_PUBKEY(key_.get(), &der);
  must(length > 0, "i2d_PUBKEY");
  bytes encoded(der, der + length);
  OPENSSL_free(der);
  return encoded;
}

bytes ec_test_key::sign(std::uint32_t digest, const bytes& message) const {
  const bytes value = digest == KM_DIGEST_NONE ? message : digest_of(digest, message);
  const owner<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new(key_.get(), nullptr), EVP_PKEY_CTX_free);
  bytes signature(static_cast<std::size_t>(EVP_PKEY_get_size(key_.get())));
  std::size_t length = signature.size();
  must(EVP_PKEY_sign_init(context.get()) == 1 &&
           EVP_PKEY_sign(context.get(), signature.data(), &length, value.data(), value.size()) == 1,
       "signing");
  signature.resize(length);
  return signature;
}

bool ec_test_key::verifies(std::uint32_t digest, const bytes& message, const bytes& signature) const {
  const bytes value = digest == KM_DIGEST_NONE ? message : digest_of(digest, message);
  const owner<EVP_PKEY_CTX> context(EVP_PKEY_CTX_new(key_.get(), nullptr), EVP_PKEY_CTX_free);
  must(EVP_PKEY_verify_init(context.get()) == 1, "EVP_PKEY_verify_init");
  return EVP_PKEY_verify(context.get(), signature.data(), signature.size(), value.data(), value.size()) == 1;
}

bytes raw_of(const bytes& der, std::size_t half) {
  const unsigned char* at = der.data();
  const owner<ECDSA_SIG> parsed(d2i_ECDSA_SIG(nullptr, &at, static_cast<long>(der.size())), ECDSA_SIG_free);
  must(parsed != nullptr, "the form of a signature");
  return join({padded(magnitude(ECDSA_SIG_get0_r(parsed.get())), half),
               padded(magnitude(ECDSA_SIG_get0_s(parsed.get())), half)});
}

bytes der_of(const bytes& r, const bytes& s) {
  const owner<ECDSA_SIG> signature(ECDSA_SIG_new(), ECDSA_SIG_free);
  must(ECDSA_SIG_set0(signature.get(), bignum(r).release(), bignum(s).release()) == 1, "ECDSA_SIG_set0");
  unsigned char* der = nullptr;
  const int length = i2d_ECDSA_SIG(signature.get(), &der);
  must(length > 0, "i2d_ECDSA_SIG");
  bytes encoded(der, der + length);
  OPENSSL_free(der);
  return encoded;
}

bytes ec_order(std::uint32_t bits) {
  const owner<EC_GROUP> group(EC_GROUP_new_by_curve_name(EC_curve_nist2nid(curve_name(bits))), EC_GROUP_free);
  must(group != nullptr, curve_name(bits));
  return padded(magnitude(EC_GROUP_get0_order(group.get())), (bits + 7) / 8);
}

param_list ec_key(std::uint32_t bits) {
  param_list list;
  list.add(KM_TAG_ALGORITHM, KM_ALGORITHM_EC)
      .add(KM_TAG_KEY_SIZE, bits)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add(KM_TAG_NO_AUTH_REQUIRED)
      .add(KM_TAG_DIGEST, KM_DIGEST_NONE);
  for (const std::uint32_t digest : every_digest) list.add(KM_TAG_DIGEST, digest);
  return list;
}

param_list ec_digest(std::uint32_t digest) {
  return param_list{}.add(KM_TAG_DIGEST, digest);
}

}  // namespace testing_support
