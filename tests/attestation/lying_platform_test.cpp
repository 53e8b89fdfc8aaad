// A platform that reports a longer digest than it had room for: nothing beyond the room is read.
#include "tests/attestation/attested_device.h"

using namespace keymaster;

namespace testing_support {
namespace {

class LongDigestTest : public AttestationTest {
 protected:
  LongDigestTest() { EXPECT_EQ(soter_command(KM_COMMAND_SOTER_GENERATE_ATTK_KEY_PAIR), SOTER_STATUS_OK); }

  /// The next digest is said to be of `length` bytes.
  void lie(std::uint32_t length) {
    tee.world().faults().override_output("TEE_DigestDoFinal", 1,
                                         [=](std::uint32_t* told, TEE_Result&) { *told = length; });
  }
  /// Signs with the lie at finish.
  void expect_no_signature(const failure& expected, const bytes& blob) {
    for (const std::uint32_t length : {129U, 0x1000U, 0xFFFFFFFFU}) {
      const hosted_tee::accounting before = tee.accounting();
      const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, pkcs1);
      EXPECT_TRUE(client().update(handle, from_text("message")).ok());
      lie(length);
      (void)expect_lost(expected, handle, before, [&] { return client().finish(handle); });
    }
  }
};

TEST_F(LongDigestTest, IsNotSignedByAnOrdinaryKey) {
  expect_no_signature(broken(TEEC_ERROR_GENERIC, {"DigestDoFinal failed with 0xffff0000\n", "Finish failed"}),
                      import_fixed(1024));
}

TEST_F(LongDigestTest, IsNotSignedIntoAStatement) {
  expect_no_signature(refused(KM_ERROR_UNKNOWN_ERROR, {"DigestDoFinal failed with 0xffff0000\n",
                                                       "soter enhance error ffff0000", "Finish failed"}),
                      soter_key(1024, {}));
}

TEST_F(LongDigestTest, IsNotSignedIntoAnExportStatement) {
  const bytes blob = soter_key(1024, param_list{}.add(KM_TAG_SOTER_SIGNED_BY_ATTK));
  for (const std::uint32_t length : {257U, 0xFFFFFFFFU}) {
    lie(length);
    expect_failure(broken(TEEC_ERROR_GENERIC, {"TEE_DigestDoFinal failed: ffff0000\n",
                                               "digest message error 0xffff0000\n", "sign data error 0xffff0000\n"}),
                   [&] { return client().export_key(blob); });
  }
}

}  // namespace
}  // namespace testing_support
