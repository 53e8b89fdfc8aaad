// Owners of libcrypto's objects.
#ifndef BENCH_LIBCRYPTO_OWNER_H_
#define BENCH_LIBCRYPTO_OWNER_H_

#include <openssl/evp.h>

#include <memory>
#include <stdexcept>

namespace bench {

template <auto Free>
struct freed_by {
  template <class T>
  void operator()(T* item) const {
    Free(item);
  }
};

using mac_owner = std::unique_ptr<EVP_MAC, freed_by<EVP_MAC_free>>;
using mac_context_owner = std::unique_ptr<EVP_MAC_CTX, freed_by<EVP_MAC_CTX_free>>;
using cipher_owner = std::unique_ptr<EVP_CIPHER, freed_by<EVP_CIPHER_free>>;
using cipher_context_owner = std::unique_ptr<EVP_CIPHER_CTX, freed_by<EVP_CIPHER_CTX_free>>;
using digest_owner = std::unique_ptr<EVP_MD, freed_by<EVP_MD_free>>;
using digest_context_owner = std::unique_ptr<EVP_MD_CTX, freed_by<EVP_MD_CTX_free>>;
using key_owner = std::unique_ptr<EVP_PKEY, freed_by<EVP_PKEY_free>>;
using key_context_owner = std::unique_ptr<EVP_PKEY_CTX, freed_by<EVP_PKEY_CTX_free>>;

/// expect stops a benchmark whose libcrypto side fails.
inline void expect(bool done) {
  if (!done) throw std::runtime_error("libcrypto refuses");
}

}  // namespace bench

#endif  // BENCH_LIBCRYPTO_OWNER_H_
