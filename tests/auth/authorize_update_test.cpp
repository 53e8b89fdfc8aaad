// Update and finish: keys that need a token per operation get one with each step, and no other policy applies.
#include "params/operation.h"
#include "tests/auth/auth_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

constexpr std::uint32_t handle = 0x80C0FFEE;
constexpr std::uint64_t user = 0xA1A1A1A1A1A1A1A1;
constexpr token_fields answering = {.challenge = handle, .user_id = user, .type = 1};

class AuthorizeUpdateTest : public AuthTest {
 protected:
  /// A key of `user` that needs a token per operation.
  static param_list bound_key(std::uint32_t algorithm = KM_ALGORITHM_AES) {
    return param_list{}.add(KM_TAG_ALGORITHM, algorithm).add(KM_TAG_USER_SECURE_ID, user).add(KM_TAG_USER_AUTH_TYPE, 1);
  }

  param_list token_of(const token_fields& fields) { return param_list{}.add_blob(KM_TAG_AUTH_TOKEN, mint(fields)); }

  keymaster_error_t authorize(const param_list& key, const param_list& params,
                              std::uint32_t purpose = KM_PURPOSE_SIGN) {
    const auto before = ta.holdings();
    keymaster_error_t error = KM_OP_AUTH_NEEDED;  // what an earlier step may have left
    {
      parameter_set owner = in_ta(key);
      const parameter_set in_params = in_ta(params);
      keymaster_operation_t operation;
      operation.purpose = purpose;
      operation.authorization_set = owner;
      ta.clear_trace();
      EXPECT_EQ(authorize_update_or_finish(in_params, operation, handle, &error), TEE_SUCCESS);
    }
    expect_same(ta.holdings(), before);
    return error;
  }
};

TEST_F(AuthorizeUpdateTest, ATokenThatAnswersTheOperationAuthorizesEachStep) {
  for (int step = 0; step < 3; ++step) EXPECT_EQ(authorize(bound_key(), token_of(answering)), KM_ERROR_OK);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(AuthorizeUpdateTest, AStepWithoutTokenIsRefusedEvenAfterOneWithIt) {
  EXPECT_EQ(authorize(bound_key(), token_of(answering)), KM_ERROR_OK);
  EXPECT_EQ(authorize(bound_key(), {}), KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_THAT(ta.errors(), ElementsAre("Auth token check failed"));
}

TEST_F(AuthorizeUpdateTest, ARepeatedTokenIsNone) {
  const bytes token = mint(answering);
  EXPECT_EQ(authorize(bound_key(), param_list{}.add_blob(KM_TAG_AUTH_TOKEN, token).add_blob(KM_TAG_AUTH_TOKEN, token)),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_THAT(ta.errors(), ElementsAre("Auth token check failed"));
}

TEST_F(AuthorizeUpdateTest, AnInvalidTokenIsAnInvalidArgument) {
  EXPECT_EQ(authorize(bound_key(), param_list{}.add_blob(KM_TAG_AUTH_TOKEN, flip(mint(answering), 40))),
            KM_ERROR_INVALID_ARGUMENT);
  EXPECT_THAT(ta.errors(), IsEmpty());
  EXPECT_EQ(authorize(bound_key(), param_list{}.add_blob(KM_TAG_AUTH_TOKEN, pattern(68))), KM_ERROR_INVALID_ARGUMENT);
  EXPECT_THAT(ta.errors(), ElementsAre("Wrong auth token size, expected 69B, got 68B"));
  EXPECT_EQ(authorize(bound_key(), param_list{}.add_blob(KM_TAG_AUTH_TOKEN, {})), KM_ERROR_INVALID_ARGUMENT);
}

TEST_F(AuthorizeUpdateTest, ATokenForAnotherOperationIsRefused) {
  for (const std::uint64_t challenge :
       {std::uint64_t{0}, std::uint64_t{handle} ^ 1, std::uint64_t{handle} | (std::uint64_t{1} << 32),
        std::uint64_t{handle} << 32}) {
    token_fields other = answering;
    other.challenge = challenge;
    EXPECT_EQ(authorize(bound_key(), token_of(other)), KM_ERROR_KEY_USER_NOT_AUTHENTICATED) << challenge;
    EXPECT_THAT(ta.errors(), ElementsAre("Challenge mismatch", "Auth token check failed"));
  }
}

TEST_F(AuthorizeUpdateTest, ATokenOfAnotherUserOrTypeIsRefused) {
  token_fields other = answering;
  other.user_id = 5;
  EXPECT_EQ(authorize(bound_key(), token_of(other)), KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_THAT(ta.errors(), ElementsAre("User id mismatch", "Auth token check failed"));
  other = answering;
  other.type = 2;
  EXPECT_EQ(authorize(bound_key(), token_of(other)), KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_THAT(ta.errors(), ElementsAre("Auth type mismatch", "Auth token check failed"));
}

TEST_F(AuthorizeUpdateTest, AnyOfTheKeysSecureIdsWillDo) {
  const param_list key = param_list{}
                             .add(KM_TAG_USER_SECURE_ID, 5)
                             .add(KM_TAG_ALGORITHM, KM_ALGORITHM_AES)
                             .add(KM_TAG_USER_AUTH_TYPE, 3)
                             .add(KM_TAG_USER_SECURE_ID, user)
                             .add(KM_TAG_USER_SECURE_ID, 6);
  EXPECT_EQ(authorize(key, token_of(answering)), KM_ERROR_OK);
  EXPECT_THAT(ta.errors(), ElementsAre("User id mismatch")) << "the first that matches ends the search";
}

TEST_F(AuthorizeUpdateTest, WithoutAnAuthTypeNoTokenMatches) {
  EXPECT_EQ(authorize(bound_key().remove(KM_TAG_USER_AUTH_TYPE), token_of(answering)),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
  EXPECT_THAT(ta.errors(), ElementsAre("Auth token check failed"));
}

TEST_F(AuthorizeUpdateTest, KeysThatNeedNoTokenPerOperationDoNotLookAtOne) {
  const param_list garbage = param_list{}.add_blob(KM_TAG_AUTH_TOKEN, pattern(5));
  for (const param_list& key :
       {param_list{}.add(KM_TAG_ALGORITHM, KM_ALGORITHM_AES), bound_key().add(KM_TAG_NO_AUTH_REQUIRED),
        bound_key().add(KM_TAG_AUTH_TIMEOUT, 30), bound_key().add(KM_TAG_AUTH_TIMEOUT, 0)}) {
    EXPECT_EQ(authorize(key, {}), KM_ERROR_OK);
    EXPECT_EQ(authorize(key, garbage), KM_ERROR_OK);
    EXPECT_THAT(ta.errors(), IsEmpty());
  }
  EXPECT_EQ(ta.faults().call_count("TEE_AllocateOperation"), 0U);
}

TEST_F(AuthorizeUpdateTest, ARepeatedTimeoutIsNone) {
  EXPECT_EQ(authorize(bound_key().add(KM_TAG_AUTH_TIMEOUT, 30).add(KM_TAG_AUTH_TIMEOUT, 30), {}),
            KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
}

TEST_F(AuthorizeUpdateTest, PublicKeyOperationsStayUnrestricted) {
  for (const std::uint32_t algorithm : {KM_ALGORITHM_RSA, KM_ALGORITHM_EC}) {
    for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_VERIFY}) {
      EXPECT_EQ(authorize(bound_key(algorithm), {}, purpose), KM_ERROR_OK);
    }
    for (const std::uint32_t purpose : {KM_PURPOSE_DECRYPT, KM_PURPOSE_SIGN}) {
      EXPECT_EQ(authorize(bound_key(algorithm), {}, purpose), KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
    }
  }
  for (const std::uint32_t algorithm : {KM_ALGORITHM_AES, KM_ALGORITHM_HMAC}) {
    for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_VERIFY}) {
      EXPECT_EQ(authorize(bound_key(algorithm), {}, purpose), KM_ERROR_KEY_USER_NOT_AUTHENTICATED);
    }
  }
}

TEST_F(AuthorizeUpdateTest, DatesAndLimitsWereSettledAtBegin) {
  const param_list key = param_list{}
                             .add(KM_TAG_ALGORITHM, KM_ALGORITHM_AES)
                             .add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, 1)
                             .add(KM_TAG_USAGE_EXPIRE_DATETIME, 1)
                             .add(KM_TAG_ACTIVE_DATETIME, ~std::uint64_t{0})
                             .add(KM_TAG_BOOTLOADER_ONLY)
                             .add(KM_TAG_MAX_USES_PER_BOOT, 0)
                             .add(KM_TAG_MIN_SECONDS_BETWEEN_OPS, 1000);
  for (int step = 0; step < 3; ++step) EXPECT_EQ(authorize(key, {}), KM_ERROR_OK);
}

}  // namespace
