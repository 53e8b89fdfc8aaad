#include "tests/companions/authenticator/authenticator_fixture.h"

#include <fmt/format.h>

#include <stdexcept>

using namespace keymaster::authenticator;

namespace testing_support {

bytes enrol_request(const bytes& handle, const bytes& present, const bytes& password) {
  return join({prefixed(handle), prefixed(present), prefixed(password)});
}

bytes verify_request(std::uint64_t challenge, const bytes& handle, const bytes& password) {
  return join({u64(challenge), prefixed(handle), prefixed(password)});
}

password_answer AuthenticatorTest::enrol(std::uint32_t uid, const bytes& password, const bytes& handle,
                                         const bytes& present, std::size_t capacity) {
  bytes request = enrol_request(handle, present, password);
  password_answer got;
  got.output.assign(capacity, canary);
  TEE_Param params[4] = {value_slot(uid), memory_slot(request), memory_slot(got.output)};
  got.result = invoke(COMMAND_ENROL, enrol_types, params);
  got.size = params[2].memref.size;
  got.a = params[3].value.a;
  got.b = params[3].value.b;
  return got;
}

password_answer AuthenticatorTest::verify(std::uint32_t uid, const bytes& handle, const bytes& password,
                                          std::uint64_t challenge, std::size_t capacity) {
  bytes request = verify_request(challenge, handle, password);
  password_answer got;
  got.output.assign(capacity, canary);
  TEE_Param params[4] = {value_slot(uid), memory_slot(request), memory_slot(got.output)};
  got.result = invoke(COMMAND_VERIFY, verify_types, params);
  got.size = params[2].memref.size;
  got.a = params[0].value.a;
  got.b = params[0].value.b;
  return got;
}

password_answer AuthenticatorTest::must_enrol(std::uint32_t uid, const bytes& password) {
  const password_answer got = enrol(uid, password);
  if (got.result != TEE_SUCCESS || got.size != 61) throw std::runtime_error("the password can't be enrolled");
  return got;
}

bytes AuthenticatorTest::must_verify(std::uint32_t uid, const bytes& handle, const bytes& password,
                                     std::uint64_t challenge) {
  const password_answer got = verify(uid, handle, password, challenge);
  if (got.result != TEE_SUCCESS || got.size != 69) {
    throw std::runtime_error(fmt::format("the password yields no token: {:#x}", got.result));
  }
  return got.output;
}

void AuthenticatorTest::expect_denied(std::uint32_t uid, const bytes& handle, const bytes& password) {
  const record before = failures(uid);
  const hosted_tee::accounting held = holdings();
  tee.clear_trace();
  const password_answer got = verify(uid, handle, password);
  EXPECT_EQ(got.result, TEE_ERROR_ACCESS_DENIED);
  EXPECT_THAT(errors(), ::testing::ElementsAre("Wrong password or handle\n"));
  EXPECT_EQ(got.a, 0U);
  EXPECT_EQ(got.size, 0U);
  EXPECT_EQ(got.output, bytes(got.output.size(), canary));
  EXPECT_EQ(failures(uid), (record{before.count + 1, now_ms()}));
  expect_same_holdings(held);
}

void AuthenticatorTest::expect_busy(std::uint32_t uid, const bytes& handle, const bytes& password,
                                    std::uint32_t wait_ms) {
  const std::vector<std::string> lines = {fmt::format("{} failures, wait for {} ms\n", failures(uid).count, wait_ms)};
  expect_refused(TEE_ERROR_BUSY, lines, [&] {
    const password_answer got = verify(uid, handle, password);
    EXPECT_EQ(got.a, wait_ms);
    EXPECT_EQ(got.size, 0U);
    EXPECT_EQ(got.output, bytes(got.output.size(), canary));
    return got.result;
  });
}

void AuthenticatorTest::fail(std::uint32_t uid, const bytes& handle, int times) {
  for (int i = 0; i < times; ++i) {
    password_answer got = verify(uid, handle, wrong);
    if (got.result == TEE_ERROR_BUSY) {
      advance(got.a);
      got = verify(uid, handle, wrong);
    }
    ASSERT_EQ(got.result, TEE_ERROR_ACCESS_DENIED);
  }
}

AuthenticatorTest::record AuthenticatorTest::failures(std::uint32_t uid) {
  const auto kept = stored(fmt::format("pwauth.fail.{}", uid));
  if (!kept) return {};
  if (kept->size() != 12) throw std::runtime_error("the record of failures has another size");
  return {u32_at(*kept, 0), u32_at(*kept, 4) | std::uint64_t{u32_at(*kept, 8)} << 32};
}

void AuthenticatorTest::set_failures(std::uint32_t uid, const record& content) {
  store(fmt::format("pwauth.fail.{}", uid), join({u32(content.count), u64(content.last_ms)}));
}

}  // namespace testing_support
