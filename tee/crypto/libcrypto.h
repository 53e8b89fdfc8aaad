// Owners for what libcrypto allocates.
#ifndef TEE_CRYPTO_LIBCRYPTO_H_
#define TEE_CRYPTO_LIBCRYPTO_H_

#include <openssl/bn.h>
#include <openssl/ec.h>
#include <openssl/err.h>
#include <openssl/evp.h>

#include <memory>
#include <new>

namespace hosted_tee {

template <auto Free>
struct freed_by {
  template <class T>
  void operator()(T* item) const {
    Free(item);
  }
};

using bignum = std::unique_ptr<BIGNUM, freed_by<BN_clear_free>>;
using evp_cipher = std::unique_ptr<EVP_CIPHER, freed_by<EVP_CIPHER_free>>;
using evp_cipher_context = std::unique_ptr<EVP_CIPHER_CTX, freed_by<EVP_CIPHER_CTX_free>>;
using evp_digest = std::unique_ptr<EVP_MD, freed_by<EVP_MD_free>>;
using evp_digest_context = std::unique_ptr<EVP_MD_CTX, freed_by<EVP_MD_CTX_free>>;
using evp_mac = std::unique_ptr<EVP_MAC, freed_by<EVP_MAC_free>>;
using evp_mac_context = std::unique_ptr<EVP_MAC_CTX, freed_by<EVP_MAC_CTX_free>>;
using evp_key = std::unique_ptr<EVP_PKEY, freed_by<EVP_PKEY_free>>;
using evp_key_context = std::unique_ptr<EVP_PKEY_CTX, freed_by<EVP_PKEY_CTX_free>>;
using ec_group = std::unique_ptr<EC_GROUP, freed_by<EC_GROUP_free>>;
using ecdsa_signature = std::unique_ptr<ECDSA_SIG, freed_by<ECDSA_SIG_free>>;

/// owned takes what a libcrypto constructor returned; null means that the host ran out of memory.
template <class Owner>
[[nodiscard]] Owner owned(typename Owner::pointer item) {
  if (item == nullptr) throw std::bad_alloc();
  return Owner(item);
}

/// shared gives one more owner of the same key; libcrypto counts them.
[[nodiscard]] inline evp_key shared(const evp_key& key) {
  if (key != nullptr) EVP_PKEY_up_ref(key.get());
  return evp_key(key.get());
}

/// Takes back what libcrypto queued as errors during its life, and leaves alone what the program queued before.
class error_queue_scope {
 public:
  error_queue_scope() { ERR_set_mark(); }
  ~error_queue_scope() { ERR_pop_to_mark(); }
  error_queue_scope(const error_queue_scope&) = delete;
  error_queue_scope& operator=(const error_queue_scope&) = delete;
};

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_LIBCRYPTO_H_
