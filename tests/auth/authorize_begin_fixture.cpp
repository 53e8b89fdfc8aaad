#include "tests/auth/authorize_begin_fixture.h"

#include "ta/algorithm_registry.h"

using namespace keymaster;
using ::testing::IsEmpty;

namespace testing_support {
namespace {

/// The value of `Tag` in the request, where it has it exactly once.
template <std::uint32_t Tag>
int from_request(const keymaster_key_param_set_t& params, std::uint32_t* value) {
  const keymaster_key_param_t* found = nullptr;
  for (std::uint32_t i = 0; params.params != nullptr && i < params.length; ++i) {
    if (params.params[i].tag != Tag) continue;
    if (found != nullptr) return parameter_not_applicable;
    found = &params.params[i];
  }
  if (found == nullptr) return parameter_not_applicable;
  *value = found->enumerated;
  return parameter_found;
}

constexpr keymaster_algorithm_descriptor descriptor = {};

}  // namespace

fake_registry registry;

fake_registry::fake_registry() : ops{} {
  ops.get_padding = from_request<KM_TAG_PADDING>;
  ops.get_block_mode = from_request<KM_TAG_BLOCK_MODE>;
  ops.get_digest = from_request<KM_TAG_DIGEST>;
}

void AuthorizeBeginTest::SetUp() {
  AuthTest::SetUp();
  registry = fake_registry();
}

begin_answer AuthorizeBeginTest::begin(const param_list& key, std::uint32_t purpose, const param_list& params) {
  return begin_blob(blob, key, purpose, params);
}

begin_answer AuthorizeBeginTest::begin_blob(const bytes& of_key, const param_list& key, std::uint32_t purpose,
                                            const param_list& params) {
  const auto before = ta.holdings();
  begin_answer answer{static_cast<keymaster_error_t>(0x7777), {}};
  {
    const parameter_set characteristics = in_ta(key), in_params = in_ta(params);
    ta.clear_trace();
    EXPECT_EQ(authorize_begin(of_key, purpose, in_params, characteristics, &answer.error), TEE_SUCCESS);
    answer.errors = ta.errors();
  }
  expect_same(ta.holdings(), before);
  return answer;
}

void AuthorizeBeginTest::expect_granted(const begin_answer& answer) {
  EXPECT_EQ(answer.error, KM_ERROR_OK);
  EXPECT_THAT(answer.errors, IsEmpty());
}

void AuthorizeBeginTest::expect_refused(const begin_answer& answer, keymaster_error_t error,
                                        const std::vector<std::string>& lines) {
  EXPECT_EQ(answer.error, error);
  EXPECT_EQ(answer.errors, lines);
}

param_list AuthorizeBeginTest::key_of(std::uint32_t algorithm) {
  return param_list{}
      .add(KM_TAG_ALGORITHM, algorithm)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_DECRYPT)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY);
}

}  // namespace testing_support

namespace keymaster {

const keymaster_algorithm_descriptor* find_algorithm(uint32_t /*algorithm*/) {
  return testing_support::registry.has_algorithm ? &testing_support::descriptor : nullptr;
}

const keymaster_purpose_ops* find_purpose_ops(uint32_t /*algorithm*/, uint32_t /*purpose*/) {
  return testing_support::registry.has_purpose_ops ? &testing_support::registry.ops : nullptr;
}

}  // namespace keymaster
