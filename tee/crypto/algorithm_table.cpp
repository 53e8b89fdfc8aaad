#include "tee/crypto/algorithm_table.h"

#include <openssl/rsa.h>

#include <algorithm>
#include <array>

#include "tee/crypto/ae_operation.h"
#include "tee/crypto/cipher_operation.h"
#include "tee/crypto/digest_operation.h"
#include "tee/crypto/ecdsa_operation.h"
#include "tee/crypto/mac_operation.h"
#include "tee/crypto/rsa_operation.h"

namespace hosted_tee {

namespace {

using enum digest_kind;

template <class... Modes>
constexpr std::uint32_t modes(Modes... each) {
  return ((1U << each) | ...);
}
constexpr std::uint32_t cipher_modes = modes(TEE_MODE_ENCRYPT, TEE_MODE_DECRYPT);
constexpr std::uint32_t signature_modes = modes(TEE_MODE_SIGN, TEE_MODE_VERIFY);

template <class Operation>
std::unique_ptr<operation> make(const algorithm& kind, std::uint32_t mode, std::uint32_t max_bits) {
  return std::make_unique<Operation>(kind, mode, max_bits);
}

constexpr algorithm digest(std::uint32_t id, digest_kind kind) {
  return {.id = id,
          .group = operation_class::digest,
          .modes = modes(TEE_MODE_DIGEST),
          .digest = kind,
          .make = make<digest_operation>};
}

constexpr algorithm hmac(std::uint32_t id, digest_kind kind, std::uint32_t key_type) {
  return {.id = id,
          .group = operation_class::mac,
          .modes = modes(TEE_MODE_MAC),
          .digest = kind,
          .key_type = key_type,
          .make = make<mac_operation>};
}

/// A derived key that is meant for AES may arrive as a generic secret.
constexpr algorithm aes(std::uint32_t id, block_mode chaining) {
  const bool authenticated = chaining == block_mode::gcm;
  return {.id = id,
          .group = authenticated ? operation_class::ae : operation_class::cipher,
          .modes = cipher_modes,
          .chaining = chaining,
          .key_type = TEE_TYPE_AES,
          .other_key_type = TEE_TYPE_GENERIC_SECRET,
          .make = authenticated ? make<ae_operation> : make<cipher_operation>};
}

constexpr algorithm rsa_cipher(std::uint32_t id, int padding, digest_kind label = none, digest_kind mask = none,
                               std::uint32_t offered = cipher_modes) {
  return {.id = id,
          .group = operation_class::asymmetric_cipher,
          .modes = offered,
          .digest = label,
          .mask = mask,
          .padding = padding,
          .key_type = TEE_TYPE_RSA_KEYPAIR,
          .other_key_type = TEE_TYPE_RSA_PUBLIC_KEY,
          .make = make<rsa_cipher_operation>};
}

constexpr algorithm oaep(std::uint32_t id, digest_kind kind) {
  return rsa_cipher(id, RSA_PKCS1_OAEP_PADDING, kind, kind);
}

/// The OAEP identifiers with bit 0x2000 stand beside the standard's: the label's digest is chosen, the mask's is SHA-1,
/// with which the clients of this bit pair every digest.
constexpr std::uint32_t oaep_sha1_mask = 0x2000;
constexpr algorithm oaep_masked_by_sha1(std::uint32_t id, digest_kind kind) {
  return rsa_cipher(id | oaep_sha1_mask, RSA_PKCS1_OAEP_PADDING, kind, sha1);
}

constexpr algorithm rsa_signature(std::uint32_t id, int padding, digest_kind kind) {
  return {.id = id,
          .group = operation_class::asymmetric_signature,
          .modes = signature_modes,
          .digest = kind,
          .padding = padding,
          .key_type = TEE_TYPE_RSA_KEYPAIR,
          .other_key_type = TEE_TYPE_RSA_PUBLIC_KEY,
          .make = make<rsa_signature_operation>};
}

constexpr algorithm ecdsa(std::uint32_t id, std::uint32_t bits) {
  return {.id = id,
          .group = operation_class::asymmetric_signature,
          .modes = signature_modes,
          .exact_bits = bits,
          .key_type = TEE_TYPE_ECDSA_KEYPAIR,
          .other_key_type = TEE_TYPE_ECDSA_PUBLIC_KEY,
          .make = make<ecdsa_operation>};
}

constexpr std::array table = {
    digest(TEE_ALG_MD5, md5),
    digest(TEE_ALG_SHA1, sha1),
    digest(TEE_ALG_SHA224, sha224),
    digest(TEE_ALG_SHA256, sha256),
    digest(TEE_ALG_SHA384, sha384),
    digest(TEE_ALG_SHA512, sha512),

    hmac(TEE_ALG_HMAC_MD5, md5, TEE_TYPE_HMAC_MD5),
    hmac(TEE_ALG_HMAC_SHA1, sha1, TEE_TYPE_HMAC_SHA1),
    hmac(TEE_ALG_HMAC_SHA224, sha224, TEE_TYPE_HMAC_SHA224),
    hmac(TEE_ALG_HMAC_SHA256, sha256, TEE_TYPE_HMAC_SHA256),
    hmac(TEE_ALG_HMAC_SHA384, sha384, TEE_TYPE_HMAC_SHA384),
    hmac(TEE_ALG_HMAC_SHA512, sha512, TEE_TYPE_HMAC_SHA512),

    aes(TEE_ALG_AES_ECB_NOPAD, block_mode::ecb),
    aes(TEE_ALG_AES_CBC_NOPAD, block_mode::cbc),
    aes(TEE_ALG_AES_CTR, block_mode::ctr),
    aes(TEE_ALG_AES_GCM, block_mode::gcm),

    rsa_cipher(TEE_ALG_RSA_NOPAD, RSA_NO_PADDING, none, none, cipher_modes | modes(TEE_MODE_EXPORT)),
    rsa_cipher(TEE_ALG_RSAES_PKCS1_V1_5, RSA_PKCS1_PADDING),
    oaep(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA1, sha1),
    oaep(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA224, sha224),
    oaep(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA256, sha256),
    oaep(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA384, sha384),
    oaep(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA512, sha512),
    oaep_masked_by_sha1(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA1, sha1),
    oaep_masked_by_sha1(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA224, sha224),
    oaep_masked_by_sha1(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA256, sha256),
    oaep_masked_by_sha1(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA384, sha384),
    oaep_masked_by_sha1(TEE_ALG_RSAES_PKCS1_OAEP_MGF1_SHA512, sha512),

    rsa_signature(TEE_ALG_RSASSA_PKCS1_V1_5_MD5, RSA_PKCS1_PADDING, md5),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_V1_5_SHA1, RSA_PKCS1_PADDING, sha1),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_V1_5_SHA224, RSA_PKCS1_PADDING, sha224),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, RSA_PKCS1_PADDING, sha256),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_V1_5_SHA384, RSA_PKCS1_PADDING, sha384),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_V1_5_SHA512, RSA_PKCS1_PADDING, sha512),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA1, RSA_PKCS1_PSS_PADDING, sha1),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA224, RSA_PKCS1_PSS_PADDING, sha224),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA256, RSA_PKCS1_PSS_PADDING, sha256),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA384, RSA_PKCS1_PSS_PADDING, sha384),
    rsa_signature(TEE_ALG_RSASSA_PKCS1_PSS_MGF1_SHA512, RSA_PKCS1_PSS_PADDING, sha512),

    ecdsa(TEE_ALG_ECDSA_P192, 192),
    ecdsa(TEE_ALG_ECDSA_P224, 224),
    ecdsa(TEE_ALG_ECDSA_P256, 256),
    ecdsa(TEE_ALG_ECDSA_P384, 384),
    ecdsa(TEE_ALG_ECDSA_P521, 521),
};

}  // namespace

const algorithm* find_algorithm(std::uint32_t id) {
  const auto found = std::find_if(table.begin(), table.end(), [&](const algorithm& each) { return each.id == id; });
  return found == table.end() ? nullptr : &*found;
}

}  // namespace hosted_tee
