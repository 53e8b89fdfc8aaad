// What the TA's heap still holds of a key when it is freed: nothing that is secret.
#include "tests/commands/hostile/freed_memory.h"
#include "tests/companions/provisioning/provisioning_fixture.h"
#include "tests/companions/provisioning/reference_box.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

class SecretsTest : public ProvisioningTest {
 protected:
  static void expect_wiped(const freed_memory& freed, const rsa_components& key) {
    EXPECT_GT(freed.blocks(), 0U);
    for (const rsa_component secret : {rsa_d, rsa_p, rsa_q, rsa_dp, rsa_dq, rsa_qinv}) {
      EXPECT_FALSE(freed.holds(key[secret])) << "component " << secret;
    }
  }

  const rsa_components& fixed = rsa_test_key::of_bits(2048).components();
};

TEST_F(SecretsTest, AGeneratedKeyIsWiped) {
  freed_memory freed(tee.world());
  ASSERT_EQ(generate().result, TEE_SUCCESS);
  expect_wiped(freed, components_of(stored("quil.key").value()));
}

TEST_F(SecretsTest, AKeyThatCouldNotBeStoredIsWipedToo) {
  freed_memory freed(tee.world());
  faults().fail_call("TEE_CreatePersistentObject", 1, TEE_ERROR_STORAGE_NO_SPACE);
  ASSERT_EQ(put_key(attestation_key_box(fixed)), TEE_ERROR_STORAGE_NO_SPACE);
  expect_wiped(freed, fixed);
}

TEST_F(SecretsTest, AKeyThatIsPutIsWiped) {
  freed_memory freed(tee.world());
  ASSERT_EQ(put_key(attestation_key_box(fixed)), TEE_SUCCESS);
  expect_wiped(freed, fixed);
}

TEST_F(SecretsTest, AKeyThatIsRefusedIsWiped) {
  freed_memory freed(tee.world());
  ASSERT_EQ(put_key(join({attestation_key_box(fixed), {1}})), TEE_ERROR_BAD_FORMAT);
  expect_wiped(freed, fixed);
}

TEST_F(SecretsTest, AKeyThatIsFetchedIsWiped) {
  ASSERT_EQ(put_key(attestation_key_box(fixed)), TEE_SUCCESS);
  freed_memory freed(tee.world());
  ASSERT_EQ(get_key().result, TEE_SUCCESS);
  ASSERT_EQ(get_key(10).result, TEE_ERROR_SHORT_BUFFER);
  expect_wiped(freed, fixed);
}

// The look itself: a block that nobody wiped is found.
TEST_F(SecretsTest, ThePublicKeyIsFoundWhereItWasFreed) {
  freed_memory freed(tee.world());
  const quil_answer answer = generate();
  ASSERT_EQ(answer.result, TEE_SUCCESS);
  EXPECT_TRUE(freed.holds(answer.data()));
}

}  // namespace
}  // namespace testing_support
