#include "tests/auth/auth_fixture.h"

#include <algorithm>

using namespace keymaster;

namespace testing_support {
namespace {

bytes big_endian(bytes number) {
  std::reverse(number.begin(), number.end());
  return number;
}

}  // namespace

bytes token_fields::mint(std::span<const std::uint8_t> seed) const {
  const bytes message = join({bytes{version}, u64(challenge), u64(user_id), u64(authenticator_id),
                              big_endian(u32(type)), big_endian(u64(timestamp))});
  return join({message, hmac_sha256(seed, message)});
}

keymaster_key_param_t number_param(std::uint32_t tag, std::uint64_t value) {
  keymaster_key_param_t param = {};
  param.tag = tag;
  param.long_integer = value;
  return param;
}

void AuthTest::SetUp() {
  const bytes seed = pattern(32, 77);
  std::copy(seed.begin(), seed.end(), device.boot_seed.begin());
  device.clock.set_system(start_system);
  device.clock.set_ree(start_ree);
  ASSERT_EQ(authorizaiton_init(), TEE_SUCCESS);
  ta.clear_trace();
  ta.faults().clear();
}

void AuthTest::TearDown() {
  authorizaiton_release();
  TaUnitTest::TearDown();
}

void AuthTest::restart(TEE_Time system, TEE_Time ree) {
  authorizaiton_release();
  device.clock.set_system(system);
  device.clock.set_ree(ree);
  ASSERT_EQ(authorizaiton_init(), TEE_SUCCESS);
}

}  // namespace testing_support
