// The same signature without a TA: what a program pays that keeps the sealed key itself and opens it for each use.
#ifndef BENCH_LIBCRYPTO_SIGNER_H_
#define BENCH_LIBCRYPTO_SIGNER_H_

#include "bench/libcrypto_owner.h"
#include "bench/wire.h"

namespace bench {

/// Signs from a sealed blob and the key storage key with libcrypto alone: derives the blob's key, opens the blob, makes
/// an RSA key of the eight components inside, signs, and forgets everything. Algorithms are fetched once.
class libcrypto_signer {
 public:
  libcrypto_signer(bytes ksk, bytes blob, bytes message);
  const bytes& sign();

 private:
  void derive_key();
  void open_blob();
  [[nodiscard]] EVP_PKEY* make_key();
  void sign_message(EVP_PKEY* key);

  bytes ksk_, blob_, message_;
  bytes blob_key_, plaintext_, numbers_, signature_;
  mac_owner hmac_;
  cipher_owner aes_;
  digest_owner sha256_;
};

}  // namespace bench

#endif  // BENCH_LIBCRYPTO_SIGNER_H_
