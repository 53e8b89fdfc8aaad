#include "client/lib/key_material.h"

#include <openssl/core_names.h>
#include <openssl/err.h>
#include <openssl/pem.h>
#include <openssl/x509.h>

#include <algorithm>
#include <array>

#include "client/lib/openssl_handles.h"

namespace keymaster::client {
namespace {

struct curve {
  std::uint32_t bits;
  std::string_view name;
};

constexpr std::array curves = std::to_array<curve>(
    {{192, "prime192v1"}, {224, "secp224r1"}, {256, "prime256v1"}, {384, "secp384r1"}, {521, "secp521r1"}});

/// The numbers of an RSA key in the order of the import layout.
constexpr std::array rsa_components{
    OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,
    OSSL_PKEY_PARAM_RSA_D,         OSSL_PKEY_PARAM_RSA_FACTOR1,
    OSSL_PKEY_PARAM_RSA_FACTOR2,   OSSL_PKEY_PARAM_RSA_EXPONENT1,
    OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1,
};

constexpr std::array ec_components{OSSL_PKEY_PARAM_EC_PUB_X, OSSL_PKEY_PARAM_EC_PUB_Y, OSSL_PKEY_PARAM_PRIV_KEY};

/// The reason is told in the caller's words; libcrypto's own queue must not leak into a later call.
[[noreturn]] void refuse(const std::string& why) {
  ERR_clear_error();
  throw format_error(why);
}

void append_component(secret_bytes& out, const EVP_PKEY* key, const char* name) {
  BIGNUM* raw = nullptr;
  if (EVP_PKEY_get_bn_param(key, name, &raw) != 1) {
    refuse(std::string("the key has no component ") + name);
  }
  const bignum_ptr number(raw);
  secret_bytes magnitude(static_cast<std::size_t>(BN_num_bytes(number.get())));
  BN_bn2bin(number.get(), magnitude.data());
  append_block(out, magnitude);
}

bool has_component(const EVP_PKEY* key, const char* name) {
  BIGNUM* raw = nullptr;
  const bool found = EVP_PKEY_get_bn_param(key, name, &raw) == 1;
  BN_clear_free(raw);
  ERR_clear_error();
  return found;
}

private_key_material rsa_material(const EVP_PKEY* key) {
  if (has_component(key, OSSL_PKEY_PARAM_RSA_FACTOR3)) {
    refuse("an RSA key with more than two primes can't be imported");
  }
  private_key_material out{
      .algorithm = KM_ALGORITHM_RSA, .key_size = static_cast<std::uint32_t>(EVP_PKEY_get_bits(key)), .material = {}};
  for (const char* const name : rsa_components) {
    append_component(out.material, key, name);
  }
  return out;
}

private_key_material ec_material(const EVP_PKEY* key) {
  std::array<char, 64> group{};
  if (EVP_PKEY_get_group_name(key, group.data(), group.size(), nullptr) != 1) {
    refuse("the EC key does not name its curve");
  }
  const auto row = std::ranges::find(curves, std::string_view(group.data()), &curve::name);
  if (row == curves.end()) {
    refuse("the curve " + std::string(group.data()) + " is not one of the NIST prime curves P-192 to P-521");
  }
  private_key_material out{.algorithm = KM_ALGORITHM_EC, .key_size = row->bits, .material = {}};
  append_u32(out.material, row->bits);
  for (const char* const name : ec_components) {
    append_component(out.material, key, name);
  }
  return out;
}

struct key_type {
  const char* name;
  private_key_material (*convert)(const EVP_PKEY* key);
};
constexpr std::array key_types = std::to_array<key_type>({{"RSA", rsa_material}, {"EC", ec_material}});

/// Gives libcrypto the passphrase, and keeps it from asking on the terminal when there is none.
struct passphrase_answer {
  std::optional<std::string_view> passphrase;
  bool asked = false;

  static int give(char* out, std::size_t capacity, std::size_t* length, const OSSL_PARAM* /*params*/, void* self) {
    auto& answer = *static_cast<passphrase_answer*>(self);
    answer.asked = true;
    if (!answer.passphrase || answer.passphrase->size() > capacity) {
      return 0;
    }
    std::ranges::copy(*answer.passphrase, out);
    *length = answer.passphrase->size();
    return 1;
  }
};

pkey_ptr decode_private_key(byte_view file, std::optional<std::string_view> passphrase) {
  EVP_PKEY* raw = nullptr;
  const decoder_ctx_ptr decoder(OSSL_DECODER_CTX_new_for_pkey(&raw, nullptr, nullptr, nullptr,
                                                              OSSL_KEYMGMT_SELECT_PRIVATE_KEY, nullptr, nullptr));
  passphrase_answer answer{.passphrase = passphrase};
  if (decoder == nullptr || OSSL_DECODER_CTX_set_passphrase_cb(decoder.get(), passphrase_answer::give, &answer) != 1) {
    refuse("libcrypto offers no decoder for private keys");
  }
  const unsigned char* at = file.data();
  std::size_t left = file.size();
  const bool decoded = !file.empty() && OSSL_DECODER_from_data(decoder.get(), &at, &left) == 1;
  pkey_ptr key(raw);
  if (decoded && key != nullptr) {
    return key;
  }
  if (answer.asked) {
    refuse(passphrase ? "the passphrase does not open the key" : "the key is encrypted and needs its passphrase");
  }
  refuse("no private key found: neither PEM nor DER of PKCS#8, PKCS#1 or SEC 1");
}

pkey_ptr decode_public_key(byte_view der) {
  const unsigned char* at = der.data();
  pkey_ptr key(d2i_PUBKEY(nullptr, &at, static_cast<long>(der.size())));
  if (key == nullptr || at != der.data() + der.size()) {
    refuse("the exported key is not a SubjectPublicKeyInfo");
  }
  return key;
}

bytes encode_public_key(const EVP_PKEY* key) {
  unsigned char* raw = nullptr;
  const int length = i2d_PUBKEY(key, &raw);
  if (length <= 0) {
    refuse("the public key can't be encoded");
  }
  bytes out(raw, raw + length);
  OPENSSL_free(raw);
  return out;
}

/// An uncompressed point: 04, then x and y, each filled up to the length of the field.
bytes ec_point(byte_view x, byte_view y, std::uint32_t bits) {
  const std::size_t width = (bits + 7) / 8;
  if (x.size() > width || y.size() > width) {
    refuse("a coordinate of the exported key is longer than its curve");
  }
  bytes point(1 + 2 * width);
  point[0] = 4;
  std::ranges::copy(x, point.begin() + static_cast<std::ptrdiff_t>(1 + width - x.size()));
  std::ranges::copy(y, point.begin() + static_cast<std::ptrdiff_t>(1 + 2 * width - y.size()));
  return point;
}

bytes built_public_key_der(const char* type, const param_bld_ptr& builder, const char* otherwise) {
  const params_ptr params(OSSL_PARAM_BLD_to_param(builder.get()));
  const pkey_ctx_ptr context(EVP_PKEY_CTX_new_from_name(nullptr, type, nullptr));
  EVP_PKEY* raw = nullptr;
  if (params == nullptr || context == nullptr || EVP_PKEY_fromdata_init(context.get()) != 1 ||
      EVP_PKEY_fromdata(context.get(), &raw, EVP_PKEY_PUBLIC_KEY, params.get()) != 1) {
    refuse(otherwise);
  }
  return encode_public_key(pkey_ptr(raw).get());
}

bytes ec_public_key_der(byte_view exported) {
  byte_reader in{exported};
  const std::uint32_t bits = in.read_u32();
  const byte_view x = in.read_block();
  const byte_view y = in.read_block();
  const auto row = std::ranges::find(curves, bits, &curve::bits);
  if (row == curves.end()) {
    refuse("the exported key has an unknown size of " + std::to_string(bits) + " bits");
  }
  const bytes point = ec_point(x, y, bits);

  const param_bld_ptr builder(OSSL_PARAM_BLD_new());
  OSSL_PARAM_BLD_push_utf8_string(builder.get(), OSSL_PKEY_PARAM_GROUP_NAME, row->name.data(), row->name.size());
  OSSL_PARAM_BLD_push_octet_string(builder.get(), OSSL_PKEY_PARAM_PUB_KEY, point.data(), point.size());
  return built_public_key_der("EC", builder, "the exported key is not a point of its curve");
}

bignum_ptr read_bignum(byte_view magnitude) {
  return bignum_ptr(BN_bin2bn(magnitude.data(), static_cast<int>(magnitude.size()), nullptr));
}

}  // namespace

private_key_material read_private_key(byte_view file, std::optional<std::string_view> passphrase) {
  const pkey_ptr key = decode_private_key(file, passphrase);
  const auto type =
      std::ranges::find_if(key_types, [&](const key_type& row) { return EVP_PKEY_is_a(key.get(), row.name) == 1; });
  if (type == key_types.end()) {
    refuse("the key is neither an RSA nor an EC key");
  }
  private_key_material out = type->convert(key.get());
  const pkey_ctx_ptr context(EVP_PKEY_CTX_new_from_pkey(nullptr, key.get(), nullptr));
  if (context == nullptr || EVP_PKEY_pairwise_check(context.get()) != 1) {
    refuse("the parts of the key don't belong together");
  }
  return out;
}

bytes public_key_der(keymaster_algorithm_t algorithm, byte_view exported) {
  switch (algorithm) {
    case KM_ALGORITHM_RSA:
      return encode_public_key(decode_public_key(exported).get());
    case KM_ALGORITHM_EC:
      return ec_public_key_der(exported);
    default:
      refuse("keys of this algorithm have no public part");
  }
}

std::string public_key_pem(keymaster_algorithm_t algorithm, byte_view exported) {
  const pkey_ptr key = decode_public_key(public_key_der(algorithm, exported));
  const bio_ptr out(BIO_new(BIO_s_mem()));
  if (out == nullptr || PEM_write_bio_PUBKEY(out.get(), key.get()) != 1) {
    refuse("the public key can't be written as PEM");
  }
  const char* text = nullptr;
  const long length = BIO_get_mem_data(out.get(), &text);
  return {text, static_cast<std::size_t>(length)};
}

bytes public_half_der(const private_key_material& rsa_key) {
  byte_reader in{rsa_key.material};
  const bignum_ptr modulus = read_bignum(in.read_block());
  const bignum_ptr exponent = read_bignum(in.read_block());
  const param_bld_ptr builder(OSSL_PARAM_BLD_new());
  OSSL_PARAM_BLD_push_BN(builder.get(), OSSL_PKEY_PARAM_RSA_N, modulus.get());
  OSSL_PARAM_BLD_push_BN(builder.get(), OSSL_PKEY_PARAM_RSA_E, exponent.get());
  return built_public_key_der("RSA", builder, "the key has no public half");
}

}  // namespace keymaster::client
