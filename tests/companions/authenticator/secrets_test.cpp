// Neither freed memory, nor a handle, nor the trace tells a password or a key.
#include "tests/commands/hostile/freed_memory.h"
#include "tests/companions/authenticator/authenticator_fixture.h"

using namespace keymaster::authenticator;

namespace testing_support {
namespace {

class PasswordSecretsTest : public AuthenticatorTest {
 protected:
  const bytes long_right = from_text("a right password of more than one line"),
              long_wrong = from_text("one that is wrong, yet may be nearly right");
  freed_memory freed{tee.world()};

  void expect_no_secrets() {
    const auto seed = tee.world().boot_seed();
    EXPECT_GT(freed.blocks(), 0U);
    EXPECT_FALSE(freed.holds({seed.begin(), seed.end()})) << "the boot seed";
    EXPECT_FALSE(freed.holds(*stored("pwauth.key"))) << "the TA's own key";
    EXPECT_FALSE(freed.holds(long_right)) << "the right password";
    EXPECT_FALSE(freed.holds(long_wrong)) << "a wrong password";
    for (const hosted_tee::trace_line& line : tee.world().trace().lines()) {
      EXPECT_EQ(line.text.find("password of"), std::string::npos) << line.text;
      EXPECT_EQ(line.text.find("nearly right"), std::string::npos) << line.text;
    }
    freed.clear();
  }
};

TEST_F(PasswordSecretsTest, AreWipedBeforeMemoryIsFreed) {
  const bytes handle = must_enrol(alice, long_right).output;
  expect_no_secrets();
  must_verify(alice, handle, long_right);
  expect_no_secrets();
  EXPECT_EQ(verify(alice, handle, long_wrong).result, TEE_ERROR_ACCESS_DENIED);
  expect_no_secrets();
  EXPECT_EQ(enrol(alice, long_wrong, handle, long_right).result, TEE_SUCCESS);
  expect_no_secrets();
}

TEST_F(PasswordSecretsTest, AreWipedWhenACommandFails) {
  const bytes handle = must_enrol(alice, long_right).output;
  freed.clear();
  for (const char* const call : {"TEE_MACComputeFinal", "TEE_SetOperationKey", "TEE_CreatePersistentObject"}) {
    faults().fail_call(call, 1, TEE_ERROR_GENERIC);
    EXPECT_NE(enrol(alice, long_wrong, handle, long_right).result, TEE_SUCCESS);
    faults().clear();
    expect_no_secrets();
  }
}

TEST_F(PasswordSecretsTest, TheWatchSeesWhatIsNotWiped) {
  // A handle is no secret, and the TA frees its copy as it is.
  const bytes handle = must_enrol(alice, long_right).output;
  must_verify(alice, handle, long_right);
  EXPECT_TRUE(freed.holds(handle));
}

}  // namespace
}  // namespace testing_support
