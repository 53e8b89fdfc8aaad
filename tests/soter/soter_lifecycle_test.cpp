// From the instance's start to its end: what stays loaded, what is asked for again, and what the end wipes.
#include <algorithm>
#include <map>

#include "keystore/key_storage_key.h"
#include "params/keymaster_protocol.h"
#include "soter/soter_handlers.h"
#include "ta/dispatch.h"
#include "tests/soter/soter_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

using hosted_tee::trace_level;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

class SoterLifecycleTest : public SoterTest {
 protected:
  void SetUp() override { provision(); }

  std::int32_t generate() {
    TEE_Param slot0 = {};
    quil.calls.clear();
    EXPECT_EQ(soter_handle_generate_attk_key_pair(0, &slot0), TEE_SUCCESS);
    return static_cast<std::int32_t>(slot0.value.a);
  }
  std::int32_t verify() {
    TEE_Param slot0 = {};
    quil.calls.clear();
    EXPECT_EQ(soter_handle_verify_attk_key_pair(&slot0), TEE_SUCCESS);
    return static_cast<std::int32_t>(slot0.value.a);
  }
  /// Loads with a platform property of so many characters.
  TEE_Result load_with(const char* property, std::size_t characters) {
    ta().instance().device.text_properties[property] = std::string(characters, 'v');
    ta().clear_trace();
    return soter_ensure_ready();
  }
};

TEST_F(SoterLifecycleTest, TheEndOfTheInstanceWipesTheKeyAndThenFreesIt) {
  ASSERT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
  const auto started = ta().holdings();
  ASSERT_EQ(generate(), SOTER_STATUS_OK);
  EXPECT_GT(ta().holdings().heap_blocks, started.heap_blocks);

  std::map<std::uint8_t*, std::size_t> components;  // address and size, its zero byte included
  for (const vlb_t* const block : {&attk_key_pair.n, &attk_key_pair.e, &attk_key_pair.d, &attk_key_pair.p,
                                   &attk_key_pair.q, &attk_key_pair.dp, &attk_key_pair.dq, &attk_key_pair.qinv}) {
    components[block->buf] = block->length;
  }
  ASSERT_EQ(components.size(), 8U);
  ta().on_free([&](std::span<const std::uint8_t> block) {
    const auto found = std::find_if(components.begin(), components.end(),
                                    [&](const auto& each) { return each.first == block.data(); });
    if (found == components.end()) return;
    EXPECT_EQ(block.size(), found->second + 1);
    EXPECT_EQ(std::count(block.begin(), block.end(), 0), static_cast<std::ptrdiff_t>(block.size()));
    components.erase(found);
  });
  TA_DestroyEntryPoint();
  ta().on_free({});
  EXPECT_THAT(components, IsEmpty()) << "each was freed";
  EXPECT_FALSE(soter_ready());
  EXPECT_EQ(attk_key_pair.d.buf, nullptr);
  // All that an instance keeps to its end is the key storage key, which the platform reclaims.
  EXPECT_EQ(ta().holdings().heap_blocks, 0U);
  EXPECT_EQ(ta().holdings().operations, 0U);
  EXPECT_EQ(ta().holdings().persistent_objects, 0U);
  key_store_release();
}

TEST_F(SoterLifecycleTest, AnInstanceThatLoadedNothingEndsWithoutAFetch) {
  ASSERT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
  TA_DestroyEntryPoint();
  EXPECT_THAT(quil.calls, IsEmpty());
  EXPECT_EQ(ta().holdings().heap_blocks, 0U);
  key_store_release();
}

TEST_F(SoterLifecycleTest, GeneratingTwiceFetchesOnce) {
  ASSERT_EQ(generate(), SOTER_STATUS_OK);
  EXPECT_THAT(quil.calls, ElementsAre("2", "12 34180000", "12 34173a17"));
  EXPECT_EQ(generate(), SOTER_STATUS_OK);
  EXPECT_THAT(quil.calls, IsEmpty());
}

TEST_F(SoterLifecycleTest, VerifyingAsksAnewAndLeavesWhatIsLoadedAlone) {
  ASSERT_EQ(generate(), SOTER_STATUS_OK);
  const auto loaded = ta().holdings();
  const attk_key_pair_t key = attk_key_pair;
  const bytes d(key.d.buf, key.d.buf + key.d.length);
  EXPECT_EQ(verify(), SOTER_STATUS_OK);
  EXPECT_THAT(quil.calls, ElementsAre("2"));
  // The factory took the key back, or wrote another: the instance goes on with its own.
  quil.key.result = TEE_ERROR_ITEM_NOT_FOUND;
  EXPECT_EQ(verify(), SOTER_STATUS_NO_ATTK);
  EXPECT_EQ(SOTER_STATUS_NO_ATTK, -1);
  EXPECT_THAT(quil.calls, ElementsAre("2"));
  quil.key = {TEE_SUCCESS, attestation_key_box(rsa_test_key::of_bits(1024).components()), {}};
  EXPECT_EQ(verify(), SOTER_STATUS_OK);
  EXPECT_TRUE(soter_ready());
  EXPECT_EQ(attk_key_pair.d.buf, key.d.buf);
  EXPECT_EQ(bytes(attk_key_pair.d.buf, attk_key_pair.d.buf + attk_key_pair.d.length), d);
  EXPECT_EQ(d, rsa_test_key::of_bits(2048).component(rsa_d));
  expect_same(ta().holdings(), loaded);
}

TEST_F(SoterLifecycleTest, APropertyOfThePlatformHas63CharactersAtMost) {
  for (const char* const property : {"gpd.tee.trustedos.manufacturer", "gpd.tee.trustedos.implementation.version"}) {
    SCOPED_TRACE(property);
    EXPECT_EQ(load_with(property, 64), TEE_ERROR_SHORT_BUFFER);
    EXPECT_FALSE(soter_ready());
    EXPECT_THAT(ta().traced(trace_level::debug), Contains("get client id property error, 0xffff0010\n"));
    EXPECT_THAT(ta().traced(trace_level::debug), Contains("Init soter data fails, 0xffff0010\n"));
    EXPECT_THAT(errors(), IsEmpty());
    expect_same(ta().holdings(), {});
    EXPECT_EQ(load_with(property, 63), TEE_SUCCESS);
    soter_release_resources();
  }
}

}  // namespace
}  // namespace testing_support
