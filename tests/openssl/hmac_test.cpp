// MACs between the TA and the `openssl` command, both ways, with every digest.
#include "tests/openssl/openssl_fixture.h"
#include "tests/support/hmac_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

class OpensslHmacTest : public OpensslTest {
 protected:
  /// The MAC as openssl computes it.
  bytes openssl_mac(const digest_name& digest, const bytes& key, const bytes& message) {
    write_file(file("message"), message);
    const openssl_result made = run({"dgst", digest.option, "-mac", "hmac", "-macopt", "hexkey:" + to_hex(key),
                                     "-binary", "-out", "mac", "message"});
    EXPECT_EQ(made.status, 0);
    return read_file(file("mac"));
  }
};

TEST_F(OpensslHmacTest, BothSidesMakeTheSameMacsAndTheTaTakesOpenssls) {
  for (const digest_name& digest : all_digests) {
    const auto bits = static_cast<std::uint32_t>(digest.size * 8);
    for (const std::size_t key_size : {32U, 64U}) {
      for (int round = 0; round < 3; ++round) {
        SCOPED_TRACE(digest.option + " with a key of " + std::to_string(key_size) + " bytes");
        const bytes key = pattern(key_size, static_cast<std::uint32_t>(round));
        const bytes message = round == 0 ? bytes{} : random_message(5000);
        const bytes blob = client().must_import(hmac_key(digest.digest, 0), key);
        const bytes theirs = openssl_mac(digest, key, message);
        EXPECT_EQ(to_hex(client().sign(blob, hmac_length(bits), message).data), to_hex(theirs));
        EXPECT_TRUE(client().verify(blob, hmac_length(bits), message, theirs).ok());
        EXPECT_EQ(client().verify(blob, hmac_length(bits), message, flip(theirs, digest.size - 1)).error,
                  KM_ERROR_VERIFICATION_FAILED);
        EXPECT_EQ(client().verify(blob, hmac_length(bits), join({message, {0}}), theirs).error,
                  KM_ERROR_VERIFICATION_FAILED);
      }
    }
  }
}

TEST_F(OpensslHmacTest, AShorterMacIsTheBeginningOfOpenssls) {
  for (const digest_name& digest : all_digests) {
    SCOPED_TRACE(digest.option);
    const bytes key = pattern(40), message = random_message(1000);
    const bytes blob = client().must_import(hmac_key(digest.digest, 0), key);
    bytes theirs = openssl_mac(digest, key, message);
    theirs.resize(10);
    EXPECT_EQ(client().sign(blob, hmac_length(80), message).data, theirs);
    EXPECT_TRUE(client().verify(blob, hmac_length(80), message, theirs).ok());
  }
}

}  // namespace
}  // namespace testing_support
