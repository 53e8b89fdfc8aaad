// The same signature without a TA: what a program pays that keeps the sealed key itself and opens it for each use.
#ifndef BENCH_LIBCRYPTO_SIGNER_H_
#define BENCH_LIBCRYPTO_SIGNER_H_

#include <openssl/evp.h>

#include <memory>

#include "bench/bench_device.h"

namespace bench {

/// Signs from a sealed blob and the key storage key with libcrypto alone: derives the blob's key, opens the blob, makes
/// an RSA key of the eight components inside, signs, and forgets everything. Algorithms are fetched once.
class libcrypto_signer {
 public:
  libcrypto_signer(bytes ksk, bytes blob, bytes message);
  const bytes& sign();

 private:
  template <auto Free>
  struct freed_by {
    template <class T>
    void operator()(T* item) const {
      Free(item);
    }
  };

  void derive_key();
  void open_blob();
  [[nodiscard]] EVP_PKEY* make_key();
  void sign_message(EVP_PKEY* key);

  bytes ksk_, blob_, message_;
  bytes blob_key_, plaintext_, numbers_, signature_;
  std::unique_ptr<EVP_MAC, freed_by<EVP_MAC_free>> hmac_;
  std::unique_ptr<EVP_CIPHER, freed_by<EVP_CIPHER_free>> aes_;
  std::unique_ptr<EVP_MD, freed_by<EVP_MD_free>> sha256_;
};

}  // namespace bench

#endif  // BENCH_LIBCRYPTO_SIGNER_H_
