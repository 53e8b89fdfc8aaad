#include "fuzz/request_maker.h"

#include <openssl/core_names.h>
#include <openssl/evp.h>
#include <openssl/hmac.h>
#include <openssl/rsa.h>

#include <array>
#include <utility>

#include "fuzz/fuzz_device.h"
#include "src/params/keymaster_defs.h"

using namespace keymaster;

namespace fuzzing {
namespace {

constexpr std::size_t record_size = 24;
constexpr std::uint32_t largest_quick_key = 768;

constexpr std::array<std::uint32_t, 32> tags = {KM_TAG_PURPOSE,
                                                KM_TAG_ALGORITHM,
                                                KM_TAG_KEY_SIZE,
                                                KM_TAG_BLOCK_MODE,
                                                KM_TAG_DIGEST,
                                                KM_TAG_PADDING,
                                                KM_TAG_CALLER_NONCE,
                                                KM_TAG_MIN_MAC_LENGTH,
                                                KM_TAG_RSA_PUBLIC_EXPONENT,
                                                KM_TAG_BLOB_USAGE_REQUIREMENTS,
                                                KM_TAG_BOOTLOADER_ONLY,
                                                KM_TAG_ACTIVE_DATETIME,
                                                KM_TAG_ORIGINATION_EXPIRE_DATETIME,
                                                KM_TAG_USAGE_EXPIRE_DATETIME,
                                                KM_TAG_MIN_SECONDS_BETWEEN_OPS,
                                                KM_TAG_MAX_USES_PER_BOOT,
                                                KM_TAG_USER_SECURE_ID,
                                                KM_TAG_NO_AUTH_REQUIRED,
                                                KM_TAG_USER_AUTH_TYPE,
                                                KM_TAG_AUTH_TIMEOUT,
                                                KM_TAG_APPLICATION_ID,
                                                KM_TAG_APPLICATION_DATA,
                                                KM_TAG_ORIGIN,
                                                KM_TAG_ROOT_OF_TRUST,
                                                KM_TAG_ASSOCIATED_DATA,
                                                KM_TAG_NONCE,
                                                KM_TAG_AUTH_TOKEN,
                                                KM_TAG_MAC_LENGTH,
                                                KM_TAG_SOTER_KEY,
                                                KM_BIGNUM | 1,
                                                KM_INVALID | 1,
                                                0xF0000001};

constexpr std::array<std::uint64_t, 28> values = {0,          1,          2,          3,
                                                  4,          5,          6,          7,
                                                  32,         64,         128,        512,
                                                  520,        768,        2048,       65537,
                                                  0x7FFFFFFF, 0x80000000, 0xFFFFFFFF, 0x100000000,
                                                  511,        8193,       99,         1'700'000'000'000,
                                                  17,         255,        256,        0xFFFFFFFFFFFFFFFF};

bool has_blob(std::uint32_t tag) {
  return (tag >> 28) == (KM_BIGNUM >> 28) || (tag >> 28) == (KM_BYTES >> 28);
}

void append_big_endian(bytes& body, std::uint64_t value, std::size_t width) {
  for (std::size_t i = width; i-- > 0;) body.push_back(static_cast<std::uint8_t>(value >> (8 * i)));
}

/// An auth token that this boot's authenticators could have issued, now and then with a wrong byte.
bytes read_auth_token(input_reader& in, std::uint32_t handle) {
  bytes token = {0};
  append_u64(token, in.below(2) == 0 ? 0 : handle);
  append_u64(token, 1 + in.below(2));  // the user
  append_u64(token, 3);                // the authenticator
  append_big_endian(token, in.below(4), 4);
  append_big_endian(token, in.pick(values), 8);
  bytes mac(32);
  unsigned length = 0;
  require(HMAC(EVP_sha256(), fuzz_device::boot_seed.data(), static_cast<int>(fuzz_device::boot_seed.size()),
               token.data(), token.size(), mac.data(), &length) != nullptr,
          "libcrypto computes a MAC");
  token.insert(token.end(), mac.begin(), mac.end());
  if (in.below(4) == 0) token[in.below(token.size())] ^= 1;
  return token;
}

void read_param(input_reader& in, std::uint32_t handle, param_writer& params) {
  const std::uint32_t tag = in.below(16) == 15 ? in.u32() : in.pick(tags);
  if (tag == KM_TAG_AUTH_TOKEN) {
    params.add_blob(tag, read_auth_token(in, handle));
  } else if (has_blob(tag)) {
    params.add_blob(tag, in.take(in.below(20)));
  } else {
    params.add(tag, in.below(8) == 7 ? in.number(8) : in.pick(values));
  }
}

/// The parameters that the paths into RSA code ask for, so that an input need not find them one by one.
void add_scheme(input_reader& in, param_writer& params) {
  constexpr std::array<std::uint64_t, 5> paddings = {KM_PAD_NONE, KM_PAD_RSA_PSS, KM_PAD_RSA_PKCS1_1_5_SIGN,
                                                     KM_PAD_RSA_OAEP, KM_PAD_RSA_PKCS1_1_5_ENCRYPT};
  params.add(KM_TAG_DIGEST, in.below(8)).add(KM_TAG_PADDING, in.pick(paddings));
}

/// The same for ciphers and MACs. A nonce is given as often as not.
void add_cipher(input_reader& in, param_writer& params) {
  constexpr std::array<std::uint64_t, 4> block_modes = {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM};
  constexpr std::array<std::uint64_t, 2> paddings = {KM_PAD_NONE, KM_PAD_PKCS7};
  constexpr std::array<std::uint64_t, 5> mac_lengths = {96, 128, 256, 0, 100};
  constexpr std::array<std::size_t, 4> nonce_sizes = {0, 12, 16, 7};
  params.add(KM_TAG_BLOCK_MODE, in.pick(block_modes))
      .add(KM_TAG_PADDING, in.pick(paddings))
      .add(KM_TAG_MAC_LENGTH, in.pick(mac_lengths));
  if (const std::size_t size = in.pick(nonce_sizes); size != 0) params.add_blob(KM_TAG_NONCE, bytes(size, 9));
}

struct rsa_numbers {
  std::array<bytes, 8> parts;
};

rsa_numbers make_numbers() {
  constexpr std::array<const char*, 8> names = {OSSL_PKEY_PARAM_RSA_N,         OSSL_PKEY_PARAM_RSA_E,
                                                OSSL_PKEY_PARAM_RSA_D,         OSSL_PKEY_PARAM_RSA_FACTOR1,
                                                OSSL_PKEY_PARAM_RSA_FACTOR2,   OSSL_PKEY_PARAM_RSA_EXPONENT1,
                                                OSSL_PKEY_PARAM_RSA_EXPONENT2, OSSL_PKEY_PARAM_RSA_COEFFICIENT1};
  EVP_PKEY* const key = EVP_RSA_gen(512);
  require(key != nullptr, "libcrypto makes a key");
  rsa_numbers numbers;
  for (std::size_t i = 0; i < names.size(); ++i) {
    BIGNUM* value = nullptr;
    require(EVP_PKEY_get_bn_param(key, names.at(i), &value) == 1, "the key has eight components");
    numbers.parts.at(i).resize(static_cast<std::size_t>(BN_num_bytes(value)));
    BN_bn2bin(value, numbers.parts.at(i).data());
    BN_free(value);
  }
  EVP_PKEY_free(key);
  return numbers;
}

bytes rsa_material(input_reader& in) {
  static const rsa_numbers own = make_numbers();
  bytes material;
  const std::uint8_t replaced = in.u8();
  for (std::size_t i = 0; i < own.parts.size(); ++i) {
    append_block(material, (replaced >> i & 1U) != 0 ? in.take(in.below(80)) : own.parts.at(i));
  }
  return material;
}

/// X, Y and D of the P-256 key whose private value is 1: the curve's base point (SP 800-186, section 3.2.1.3).
bytes ec_material(input_reader& in) {
  static const std::array<bytes, 3> own = {
      bytes{0x6B, 0x17, 0xD1, 0xF2, 0xE1, 0x2C, 0x42, 0x47, 0xF8, 0xBC, 0xE6, 0xE5, 0x63, 0xA4, 0x40, 0xF2,
            0x77, 0x03, 0x7D, 0x81, 0x2D, 0xEB, 0x33, 0xA0, 0xF4, 0xA1, 0x39, 0x45, 0xD8, 0x98, 0xC2, 0x96},
      bytes{0x4F, 0xE3, 0x42, 0xE2, 0xFE, 0x1A, 0x7F, 0x9B, 0x8E, 0xE7, 0xEB, 0x4A, 0x7C, 0x0F, 0x9E, 0x16,
            0x2B, 0xCE, 0x33, 0x57, 0x6B, 0x31, 0x5E, 0xCE, 0xCB, 0xB6, 0x40, 0x68, 0x37, 0xBF, 0x51, 0xF5},
      bytes{1}};
  bytes material;
  const std::uint8_t replaced = in.u8();
  append_u32(material, (replaced & 8U) != 0 ? static_cast<std::uint32_t>(in.pick(values)) : 256);
  for (std::size_t i = 0; i < own.size(); ++i) {
    append_block(material, (replaced >> i & 1U) != 0 ? in.take(in.below(80)) : own.at(i));
  }
  return material;
}

}  // namespace

void append_u32(bytes& body, std::uint32_t value) {
  for (int shift = 0; shift < 32; shift += 8) body.push_back(static_cast<std::uint8_t>(value >> shift));
}

void append_u64(bytes& body, std::uint64_t value) {
  append_u32(body, static_cast<std::uint32_t>(value));
  append_u32(body, static_cast<std::uint32_t>(value >> 32));
}

void append_block(bytes& body, const bytes& block) {
  append_u32(body, static_cast<std::uint32_t>(block.size()));
  body.insert(body.end(), block.begin(), block.end());
}

std::uint32_t u32_at(const bytes& data, std::size_t offset) {
  std::uint32_t value = 0;
  for (std::size_t i = 0; i < 4 && offset + i < data.size(); ++i) value |= std::uint32_t{data[offset + i]} << (8 * i);
  return value;
}

param_writer& param_writer::add(std::uint32_t tag, std::uint64_t value) {
  append_u32(records_, tag);
  append_u32(records_, 0);
  append_u64(records_, value);
  append_u64(records_, 0);
  ++count_;
  return *this;
}

param_writer& param_writer::add_blob(std::uint32_t tag, const bytes& blob) {
  append_u32(records_, tag);
  append_u32(records_, 0);
  append_u64(records_, 0);
  append_u64(records_, blob.size());
  records_.insert(records_.end(), blob.begin(), blob.end());
  ++count_;
  return *this;
}

bytes param_writer::marshal() const {
  bytes body;
  append_u32(body, count_);
  body.insert(body.end(), records_.begin(), records_.end());
  return body;
}

bytes read_params(input_reader& in, std::uint32_t handle) {
  param_writer params;
  const std::size_t shape = in.u8();
  if ((shape & with_scheme) != 0) add_scheme(in, params);
  if ((shape & with_cipher) != 0) add_cipher(in, params);
  if ((shape & with_token) != 0) params.add_blob(KM_TAG_AUTH_TOKEN, read_auth_token(in, handle));
  if ((shape & with_application) != 0) {
    params.add_blob(KM_TAG_APPLICATION_ID, {1, 2, 3}).add_blob(KM_TAG_APPLICATION_DATA, {4, 5});
  }
  for (std::size_t i = shape & 0x0F; i > 0; --i) read_param(in, handle, params);
  return params.marshal();
}

bytes read_material(input_reader& in, std::uint32_t algorithm) {
  if (algorithm == KM_ALGORITHM_RSA) return rsa_material(in);
  if (algorithm == KM_ALGORITHM_EC) return ec_material(in);
  constexpr std::array<std::size_t, 6> sizes = {16, 24, 32, 64, 0, 15};
  return bytes(in.pick(sizes), in.u8());
}

void damage(input_reader& in, bytes& body) {
  for (std::size_t faults = in.below(8) >= 5 ? in.below(4) : 0; faults > 0; --faults) {
    const std::size_t at = body.empty() ? 0 : in.number(2) % body.size();
    switch (in.below(4)) {
      case 0:
        if (!body.empty()) body[at] ^= in.u8();
        break;
      case 1:
        body.resize(at);
        break;
      case 2: {
        const bytes more = in.take(in.below(32));
        body.insert(body.end(), more.begin(), more.end());
        break;
      }
      default: {  // another number in the place of a word
        const auto value = static_cast<std::uint32_t>(in.pick(values));
        for (std::size_t i = 0; i < 4 && at + i < body.size(); ++i) {
          body[at + i] = static_cast<std::uint8_t>(value >> (8 * i));
        }
      }
    }
  }
}

void limit_key_size(bytes& marshalled) {
  std::size_t at = 4;
  for (std::uint32_t count = u32_at(marshalled, 0); count > 0 && at + record_size <= marshalled.size(); --count) {
    const std::uint32_t tag = u32_at(marshalled, at), size = u32_at(marshalled, at + 8);
    if (tag == KM_TAG_KEY_SIZE && size > largest_quick_key && size <= 8192) {
      marshalled[at + 8] = 0x00;  // 512
      marshalled[at + 9] = 0x02;
    }
    at += record_size + (has_blob(tag) ? u32_at(marshalled, at + 16) : 0);
  }
}

}  // namespace fuzzing
