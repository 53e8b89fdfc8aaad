// The algorithms that operations can have.
#ifndef TEE_CRYPTO_ALGORITHM_TABLE_H_
#define TEE_CRYPTO_ALGORITHM_TABLE_H_

#include <cstdint>
#include <memory>

#include "tee/crypto/algorithms.h"
#include "tee_api_constants.h"

namespace hosted_tee {

class operation;

/// Classes of operations, by the API's numbers.
enum class operation_class : std::uint32_t {
  cipher = TEE_OPERATION_CIPHER,
  mac = TEE_OPERATION_MAC,
  ae = TEE_OPERATION_AE,
  digest = TEE_OPERATION_DIGEST,
  asymmetric_cipher = TEE_OPERATION_ASYMMETRIC_CIPHER,
  asymmetric_signature = TEE_OPERATION_ASYMMETRIC_SIGNATURE,
};

struct algorithm {
  std::uint32_t id;  ///< TEE_ALG_*
  operation_class group;
  std::uint32_t modes;                     ///< bit m is set when mode m (TEE_MODE_*) is offered
  digest_kind digest = digest_kind::none;  ///< of the algorithm; of the label in OAEP
  digest_kind mask = digest_kind::none;    ///< MGF1's in OAEP
  block_mode chaining = block_mode::ecb;   ///< of AES
  int padding = 0;                         ///< libcrypto's number of an RSA padding
  std::uint32_t exact_bits = 0;            ///< the one key size of an elliptic curve; 0: any that the key type has
  std::uint32_t key_type = 0;              ///< object type of its keys; 0: needs no key
  std::uint32_t other_key_type = 0;        ///< another object type that serves; 0: none
  std::unique_ptr<operation> (*make)(const algorithm& kind, std::uint32_t mode, std::uint32_t max_bits) = nullptr;
};

/// find_algorithm gives the row of a TEE_ALG_* number, or null.
[[nodiscard]] const algorithm* find_algorithm(std::uint32_t id);

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_ALGORITHM_TABLE_H_
