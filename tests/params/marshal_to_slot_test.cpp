// Marshalling into client memory, which is no heap block and must only ever be written whole.
#include "params/marshal.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

constexpr std::uint8_t filler = 0xA5;

class MarshalToSlotTest : public TaUnitTest {
 protected:
  /// A refused slot is untouched, and the heap is as before.
  void expect_refused(const keymaster_key_param_set_t& set, std::size_t capacity, TEE_Result result,
                      const std::string& line) {
    bytes slot(capacity, filler);
    std::uint32_t written = 0xDEADBEEF;
    const auto before = ta.holdings();
    ta.clear_trace();
    EXPECT_EQ(marshal_to_slot(set, slot, &written), result);
    EXPECT_EQ(written, 0U);
    EXPECT_EQ(slot, bytes(capacity, filler));
    EXPECT_THAT(ta.errors(), ElementsAre(line));
    expect_same(ta.holdings(), before);
  }
};

param_list with_hidden() {
  return param_list{}
      .add_blob(KM_TAG_APPLICATION_ID, from_text("hidden"))
      .add(KM_TAG_KEY_SIZE, 2048)
      .add_blob(KM_TAG_NONCE, pattern(12))
      .add_blob(KM_TAG_ROOT_OF_TRUST, pattern(32));
}
param_list without_hidden() {
  return param_list{}.add(KM_TAG_KEY_SIZE, 2048).add_blob(KM_TAG_NONCE, pattern(12));
}

TEST_F(MarshalToSlotTest, TheClientGetsTheVisibleParameters) {
  const parameter_set set = in_ta(with_hidden());
  const bytes expected = without_hidden().marshal();
  for (const std::size_t surplus : {0U, 1U, 7U, 500U}) {
    bytes slot(expected.size() + surplus, filler);
    std::uint32_t written = 0;
    const auto before = ta.holdings();
    ASSERT_EQ(marshal_to_slot(set, slot, &written), TEE_SUCCESS);
    EXPECT_EQ(written, expected.size());
    EXPECT_EQ(slot, join({expected, bytes(surplus, filler)})) << "nothing behind the set is written";
    expect_same(ta.holdings(), before);
  }
  EXPECT_THAT(ta.errors(), IsEmpty());
}

TEST_F(MarshalToSlotTest, TheSlotMayStandAtAnyAddress) {
  const parameter_set set = in_ta(with_hidden());
  const bytes expected = without_hidden().marshal();
  for (std::size_t shift = 0; shift < 8; ++shift) {
    bytes memory(expected.size() + shift, filler);
    std::uint32_t written = 0;
    ASSERT_EQ(marshal_to_slot(set, std::span(memory).subspan(shift), &written), TEE_SUCCESS);
    EXPECT_EQ(memory, join({bytes(shift, filler), expected}));
  }
}

TEST_F(MarshalToSlotTest, AnEmptySetNeedsFourBytes) {
  bytes slot(4, filler);
  std::uint32_t written = 0;
  EXPECT_EQ(marshal_to_slot({nullptr, 0}, slot, &written), TEE_SUCCESS);
  EXPECT_EQ(written, 4U);
  EXPECT_EQ(slot, bytes(4, 0));
}

TEST_F(MarshalToSlotTest, ASlotThatIsTooSmallIsUntouched) {
  const parameter_set set = in_ta(with_hidden());
  const std::size_t size = without_hidden().marshal().size();
  for (std::size_t capacity = 0; capacity < size; ++capacity) {
    SCOPED_TRACE(capacity);
    expect_refused(set, capacity, TEE_ERROR_SHORT_BUFFER, "Too short marshalling buffer");
  }
}

TEST_F(MarshalToSlotTest, ASlotThatIsNotThereIsTooSmall) {
  std::uint32_t written = 0xDEADBEEF;
  EXPECT_EQ(marshal_to_slot({nullptr, 0}, {}, &written), TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(written, 0U);
  EXPECT_THAT(ta.errors(), ElementsAre("Too short marshalling buffer"));
}

TEST_F(MarshalToSlotTest, AnExhaustedHeapLeavesTheSlotUntouched) {
  const parameter_set set = in_ta(with_hidden());
  ta.faults().fail_allocation(1);
  expect_refused(set, 200, TEE_ERROR_OUT_OF_MEMORY, "Out of memory, need 64B");
}

TEST_F(MarshalToSlotTest, AnInvalidSetLeavesTheSlotUntouched) {
  parameter_set set = in_ta(without_hidden());
  keymaster_free_param_array(set.params, set.length);
  expect_refused(set, 200, TEE_ERROR_BAD_PARAMETERS, "Invalid keymaster_key_param_set_t");
}

}  // namespace
