// Begin: when a key may be used.
#include "tests/auth/authorize_begin_fixture.h"

using namespace keymaster;
using namespace testing_support;

namespace {

class AuthorizeBeginDatesTest : public AuthorizeBeginTest {
 protected:
  /// The TA's wall clock at the start of a test.
  static constexpr std::uint64_t today = std::uint64_t{start_ree.seconds} * 1000 + start_ree.millis;
  static constexpr std::uint32_t all_purposes[] = {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT, KM_PURPOSE_SIGN,
                                                   KM_PURPOSE_VERIFY};
};

TEST_F(AuthorizeBeginDatesTest, AKeyIsValidFromItsFirstMillisecond) {
  for (const std::uint32_t purpose : all_purposes) {
    expect_granted(begin(key_of().add(KM_TAG_ACTIVE_DATETIME, 0), purpose));
    expect_granted(begin(key_of().add(KM_TAG_ACTIVE_DATETIME, today), purpose));
    for (const std::uint64_t date : {today + 1, today + (std::uint64_t{1} << 32), ~std::uint64_t{0}}) {
      expect_refused(begin(key_of().add(KM_TAG_ACTIVE_DATETIME, date), purpose), KM_ERROR_KEY_NOT_YET_VALID,
                     {"Key not yet valid"});
    }
  }
}

TEST_F(AuthorizeBeginDatesTest, OriginationExpiresForEncryptAndSign) {
  for (const std::uint32_t purpose : all_purposes) {
    const bool originates = purpose == KM_PURPOSE_ENCRYPT || purpose == KM_PURPOSE_SIGN;
    for (const std::uint64_t date : {std::uint64_t{0}, today - 1}) {
      const begin_answer answer = begin(key_of().add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, date), purpose);
      if (originates) {
        expect_refused(answer, KM_ERROR_KEY_EXPIRED, {"Key expired"});
      } else {
        expect_granted(answer);
      }
    }
    expect_granted(begin(key_of().add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, today), purpose));
    expect_granted(begin(key_of().add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, ~std::uint64_t{0}), purpose));
  }
}

TEST_F(AuthorizeBeginDatesTest, UsageExpiresForDecryptAndVerify) {
  for (const std::uint32_t purpose : all_purposes) {
    const bool uses = purpose == KM_PURPOSE_DECRYPT || purpose == KM_PURPOSE_VERIFY;
    for (const std::uint64_t date : {std::uint64_t{0}, today - 1}) {
      const begin_answer answer = begin(key_of().add(KM_TAG_USAGE_EXPIRE_DATETIME, date), purpose);
      if (uses) {
        expect_refused(answer, KM_ERROR_KEY_EXPIRED, {"Key expired"});
      } else {
        expect_granted(answer);
      }
    }
    expect_granted(begin(key_of().add(KM_TAG_USAGE_EXPIRE_DATETIME, today), purpose));
    expect_granted(begin(key_of().add(KM_TAG_USAGE_EXPIRE_DATETIME, ~std::uint64_t{0}), purpose));
  }
}

TEST_F(AuthorizeBeginDatesTest, AKeyExpiresAsTimeGoesBy) {
  const param_list key = key_of().add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, today + 60'000);
  expect_granted(begin(key));
  device.clock.advance(60'000);
  expect_granted(begin(key));
  device.clock.advance(1);
  expect_refused(begin(key), KM_ERROR_KEY_EXPIRED, {"Key expired"});
}

TEST_F(AuthorizeBeginDatesTest, AKeyBecomesValidAsTimeGoesBy) {
  const param_list key = key_of().add(KM_TAG_ACTIVE_DATETIME, today + 500);
  expect_refused(begin(key), KM_ERROR_KEY_NOT_YET_VALID, {"Key not yet valid"});
  device.clock.advance(500);
  expect_granted(begin(key));
}

TEST_F(AuthorizeBeginDatesTest, TheNormalWorldCannotTurnBackAnExpiry) {
  const param_list key = key_of().add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, today - 1);
  device.clock.set_ree({1, 0});
  expect_refused(begin(key), KM_ERROR_KEY_EXPIRED, {"Key expired"});
}

TEST_F(AuthorizeBeginDatesTest, ADateBeyond32BitsOfSecondsIsComparedWhole) {
  restart({100, 0}, {0xFFFFFFFF, 999});
  const std::uint64_t now = 0xFFFFFFFFULL * 1000 + 999;
  expect_granted(begin(key_of().add(KM_TAG_ACTIVE_DATETIME, now).add(KM_TAG_ORIGINATION_EXPIRE_DATETIME, now)));
  expect_refused(begin(key_of().add(KM_TAG_ACTIVE_DATETIME, now + 1)), KM_ERROR_KEY_NOT_YET_VALID,
                 {"Key not yet valid"});
}

}  // namespace
