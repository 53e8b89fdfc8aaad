// Encryption and decryption from the client's side: what to ask for, whole operations over data in pieces, and what
// libcrypto makes of the same data in one go.
#ifndef TESTS_SUPPORT_ENCRYPTION_H_
#define TESTS_SUPPORT_ENCRYPTION_H_

#include <random>

#include "tests/support/ta_client.h"

namespace testing_support {

/// aes_key asks for an AES key of any block mode and padding that needs no user, takes the client's nonces and makes
/// tags from 96 bits on.
param_list aes_key(std::uint32_t bits = 128);

/// rsa_cipher_key asks for an RSA key that encrypts and decrypts with any of its paddings and needs no user. It lists
/// no digest but none: OAEP's are part of the padding.
param_list rsa_cipher_key(std::uint32_t bits = 2048);

/// cipher asks for an AES operation, gcm for one with a tag of `tag_bits`; with a nonce, the client's own.
param_list cipher(std::uint32_t block_mode, std::uint32_t padding = keymaster::KM_PAD_NONE, const bytes& nonce = {});
param_list gcm(std::uint32_t tag_bits, const bytes& nonce = {});

/// cut makes pieces of random sizes, empty ones among them, that join to `data`. cut_every makes pieces of `size`.
std::vector<bytes> cut(const bytes& data, std::mt19937& random);
std::vector<bytes> cut_every(const bytes& data, std::size_t size);

/// What a whole operation gave: the answer that ended it, begin's parameters, and all its output in one piece. `data`
/// is what finish gave of that.
struct cipher_answer : finish_answer {
  param_list begun;
  bytes text;
};

/// run_cipher runs an operation over `pieces`, each in an update with room for 32 bytes more than it has; `aad`, unless
/// it is empty, is an update of its own before them. It stops at the first failure.
cipher_answer run_cipher(ta_client& client, std::uint32_t purpose, const bytes& blob, const param_list& params,
                         const std::vector<bytes>& pieces, const bytes& aad = {});

/// What AES is to do, in libcrypto's hands.
struct aes_job {
  std::uint32_t block_mode;
  std::uint32_t padding;
  bytes key;
  bytes nonce;                // none for ECB
  bytes aad = {};             // GCM
  std::size_t tag_size = 16;  // GCM
};

/// aes_encrypt encrypts `text` in one go; GCM's tag stands behind the ciphertext. Throws std::runtime_error for what
/// libcrypto refuses.
bytes aes_encrypt(const aes_job& job, const bytes& text);

}  // namespace testing_support

#endif  // TESTS_SUPPORT_ENCRYPTION_H_
