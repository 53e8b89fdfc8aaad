// A device with all its TAs, provisioned as a factory does it, and its statements as somebody else takes them apart.
#ifndef TESTS_ATTESTATION_ATTESTED_DEVICE_H_
#define TESTS_ATTESTATION_ATTESTED_DEVICE_H_

#include <nlohmann/json.hpp>
#include <string>

#include "tests/commands/command_fixture.h"
#include "tests/companions/companion_fixture.h"
#include "tests/openssl/openssl_command.h"
#include "tests/support/rsa_test_key.h"

namespace testing_support {

/// A statement: its length word, its text, NUL included where there is one, and the signature.
struct statement {
  std::uint32_t length = 0;
  bytes text;
  bytes signature;

  /// What a JSON parser makes of the text, members in their order.
  [[nodiscard]] nlohmann::ordered_json json() const;
  [[nodiscard]] std::vector<std::string> members() const;
};

/// take_apart expects a signature of `signature_size` bytes behind the text.
[[nodiscard]] statement take_apart(const bytes& data, std::size_t signature_size);

inline constexpr std::size_t attk_size = 256;

/// The attestation key is the fixed key of 2048 bits. The Keymaster TA has not looked at anything yet.
class AttestationTest : public CommandTest {
 protected:
  AttestationTest() { provision(); }

  void provision();
  /// soter_command runs one of 0xFF00 to 0xFF03 and answers its status.
  std::int32_t soter_command(std::uint32_t command, bytes* out = nullptr);

  std::uint32_t enrol_finger(std::uint64_t user = 7);
  /// What a touch answers: the token, and what the Keymaster TA said to it.
  struct touched {
    TEE_Result result;
    bytes token;
    TEE_Result noticed;
  };
  touched touch(std::uint32_t finger, std::uint64_t challenge = 0);

  /// A soter key for signatures, imported: fixed keys keep the tests fast.
  [[nodiscard]] bytes soter_key(unsigned bits, const param_list& tags);
  statement exported(const bytes& blob, std::size_t signature_size);
  statement signed_statement(const bytes& blob, const param_list& scheme, std::string_view raw,
                             std::size_t signature_size);

  /// openssl_verifies asks the openssl command, which knows the public key as PEM, with these options of `dgst`.
  [[nodiscard]] bool openssl_verifies(const std::string& pem, const bytes& text, const bytes& signature,
                                      const std::vector<std::string>& options = {});
  [[nodiscard]] std::optional<std::uint64_t> stored_counter();

  const param_list pkcs1 = signature(keymaster::KM_DIGEST_SHA_2_256, keymaster::KM_PAD_RSA_PKCS1_1_5_SIGN);
};

}  // namespace testing_support

#endif  // TESTS_ATTESTATION_ATTESTED_DEVICE_H_
