// The parameter list from which libcrypto builds a key. It owns the values and wipes them.
#ifndef TEE_CRYPTO_KEY_PARAMS_H_
#define TEE_CRYPTO_KEY_PARAMS_H_

#include <openssl/core.h>

#include <span>
#include <vector>

#include "tee/crypto/libcrypto.h"
#include "tee/crypto/secret_bytes.h"

namespace hosted_tee {

class key_params {
 public:
  void add_number(const char* name, std::span<const std::uint8_t> big_endian);
  void add_octets(const char* name, std::span<const std::uint8_t> octets);
  void add_name(const char* name, std::string_view value);

  /// build makes the key of `type` ("RSA", "EC"). What libcrypto doesn't accept is refused with
  /// TEE_ERROR_BAD_PARAMETERS. `selection` is EVP_PKEY_KEYPAIR or EVP_PKEY_PUBLIC_KEY.
  [[nodiscard]] evp_key build(const char* type, int selection);

 private:
  std::vector<secret_bytes> values_;
  std::vector<OSSL_PARAM> list_;
};

/// number_of reads one of a key's numbers, big-endian without leading zero bytes.
[[nodiscard]] secret_bytes number_of(const evp_key& key, const char* name);

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_KEY_PARAMS_H_
