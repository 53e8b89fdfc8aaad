// The kinds of operations beside RSA signatures, as scenarios play them.
#ifndef TESTS_FAULTS_ALGORITHM_KINDS_H_
#define TESTS_FAULTS_ALGORITHM_KINDS_H_

#include "tests/faults/stage.h"

namespace testing_support {

/// A kind of operation: how its key is made, and what begin is asked for. What decrypts names its nonce, so that the
/// ciphertext can be made with the same.
struct kind {
  std::string name;
  param_list key;
  bytes material;  // empty: the key is generated
  std::uint32_t purpose;
  param_list params;
  bool finishes_despite_platform = false;
  bytes aad = {};  // comes with the first input

  [[nodiscard]] param_list update_params() const {
    return aad.empty() ? param_list{} : param_list{}.add_blob(keymaster::KM_TAG_ASSOCIATED_DATA, aad);
  }
};

/// arrange makes the key, and what the operation is fed: a text, a ciphertext of it, or a text with its signature.
void arrange(stage& on, const kind& what);

/// One of every kind.
std::vector<kind> every_kind();

// Some of them by name; `name` is how their scenarios show.
kind aes_kind(std::string name, std::uint32_t purpose, std::uint32_t block_mode, std::uint32_t padding,
              std::size_t nonce);
kind gcm_encrypt();
kind gcm_decrypt();
kind cbc_decrypt();
kind with_aad(kind what);
kind ec_kind(std::string name, std::uint32_t purpose, std::uint32_t digest);
kind hmac_kind(std::string name, std::uint32_t purpose);
kind rsa_kind(std::string name, std::uint32_t purpose, std::uint32_t digest, std::uint32_t padding);

// What is asked of keys and operations.
param_list aes_kind_key(std::uint32_t block_mode, std::uint32_t padding);
param_list aes_kind_operation(std::uint32_t block_mode, std::uint32_t padding, std::size_t nonce);
param_list ec_kind_key();
param_list hmac_kind_key();
param_list hmac_kind_operation();

}  // namespace testing_support

#endif  // TESTS_FAULTS_ALGORITHM_KINDS_H_
