// A P-256 key pair as raw parts: what both sides make their key of.
#ifndef BENCH_P256_KEY_H_
#define BENCH_P256_KEY_H_

#include "bench/libcrypto_owner.h"
#include "bench/wire.h"

namespace bench {

struct p256_parts {
  bytes point;  // 04, X, Y
  bytes d;
};

p256_parts make_p256_parts();

/// p256_material is the layout in which the TA imports the parts.
bytes p256_material(const p256_parts& parts);

/// p256_key_params asks for a key that signs with SHA-256; p256_sign_params for an operation that does.
bytes p256_key_params();
bytes p256_sign_params();

/// Signs with libcrypto alone, with a key built of its raw parts for each signature.
class libcrypto_p256_signer {
 public:
  libcrypto_p256_signer(p256_parts parts, bytes message);
  const bytes& sign();

  /// verifies says whether `signature` (DER) is one of the message by the key.
  [[nodiscard]] bool verifies(const bytes& signature);

 private:
  [[nodiscard]] key_owner make_key();
  [[nodiscard]] bytes digest_message();

  p256_parts parts_;
  bytes message_, d_, signature_;
  digest_owner sha256_;
};

}  // namespace bench

#endif  // BENCH_P256_KEY_H_
