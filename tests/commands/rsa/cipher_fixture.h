// RSA encryption and decryption with a fixed key.
#ifndef TESTS_COMMANDS_RSA_CIPHER_FIXTURE_H_
#define TESTS_COMMANDS_RSA_CIPHER_FIXTURE_H_

#include "tests/commands/command_fixture.h"
#include "tests/support/encryption.h"

namespace testing_support {

/// A padding of encryption with its digest, and how many bytes it takes of a block.
struct cipher_scheme {
  std::uint32_t padding, digest;
  int overhead;
};
inline constexpr cipher_scheme padded_schemes[] = {
    {keymaster::KM_PAD_RSA_PKCS1_1_5_ENCRYPT, keymaster::KM_DIGEST_NONE, 11},
    {keymaster::KM_PAD_RSA_OAEP, keymaster::KM_DIGEST_SHA1, 42},
    {keymaster::KM_PAD_RSA_OAEP, keymaster::KM_DIGEST_SHA_2_224, 58},
    {keymaster::KM_PAD_RSA_OAEP, keymaster::KM_DIGEST_SHA_2_256, 66},
    {keymaster::KM_PAD_RSA_OAEP, keymaster::KM_DIGEST_SHA_2_384, 98},
    {keymaster::KM_PAD_RSA_OAEP, keymaster::KM_DIGEST_SHA_2_512, 130}};

class RsaCipherTest : public CommandTest {
 protected:
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes blob = import_fixed(1024, rsa_cipher_key(1024));
  const param_list bare = signature(keymaster::KM_DIGEST_NONE, keymaster::KM_PAD_NONE);

  cipher_answer run(std::uint32_t purpose, const bytes& with, const param_list& params, const bytes& input) {
    return run_cipher(client(), purpose, with, params, {input});
  }
  /// expect_finish_fails feeds `input` and expects finish to fail.
  void expect_finish_fails(failure expected, std::uint32_t purpose, const bytes& with, const param_list& params,
                           const bytes& input) {
    expected.lines.emplace_back("Finish failed");
    const hosted_tee::accounting before = tee.accounting();
    const std::uint32_t handle = client().must_begin(purpose, with, params);
    EXPECT_EQ(client().update(handle, input).b, input.size());
    (void)expect_lost(expected, handle, before, [&] { return client().finish(handle); });
  }
};

}  // namespace testing_support

#endif  // TESTS_COMMANDS_RSA_CIPHER_FIXTURE_H_
