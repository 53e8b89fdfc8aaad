// Random parameter sets, there and back, against the tests' own encoder.
#include <random>

#include "params/marshal.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;

namespace {

using RoundTripTest = TaUnitTest;

constexpr std::uint32_t hidden_tags[] = {KM_TAG_APPLICATION_ID, KM_TAG_APPLICATION_DATA, KM_TAG_ROOT_OF_TRUST};

std::uint32_t draw(std::mt19937& random) {
  return static_cast<std::uint32_t>(random());
}

/// A list of up to 12 parameters: any type, known or not, hidden ones among them, blobs of 0 to 40 bytes.
param_list random_list(std::mt19937& random) {
  param_list list;
  for (std::uint32_t count = draw(random) % 13; count != 0; --count) {
    std::uint32_t tag = draw(random);
    if (draw(random) % 4 == 0) tag = hidden_tags[draw(random) % 3];
    if (draw(random) % 4 == 0) tag = KM_BYTES | (draw(random) & 0xFFFF);
    if (tag_has_blob(tag)) {
      list.add_blob(tag, pattern(draw(random) % 41, draw(random)));
    } else {
      list.add(tag, (std::uint64_t{draw(random)} << 32) | draw(random));
    }
  }
  return list;
}

TEST_F(RoundTripTest, WhatIsReadAndWrittenIsWhatTheEncoderWrote) {
  std::mt19937 random(4242);
  for (int round = 0; round < 3000; ++round) {
    const param_list list = random_list(random);
    const bytes encoded = list.marshal();
    parameter_set set;
    ASSERT_EQ(unmarshal(encoded, &set), TEE_SUCCESS) << to_hex(encoded);
    ASSERT_EQ(set.length, list.params().size());
    ASSERT_EQ(from_ta(set).marshal(), encoded);

    param_list visible = list;
    for (const std::uint32_t tag : hidden_tags) visible.remove(tag);
    for (const bool include_hidden : {true, false}) {
      std::uint8_t* buffer = nullptr;
      std::uint32_t length = 0;
      ASSERT_EQ(marshal(set, include_hidden, &buffer, &length), TEE_SUCCESS);
      const bytes written(buffer, buffer + length);
      TEE_Free(buffer);
      ASSERT_EQ(written, include_hidden ? encoded : visible.marshal()) << to_hex(encoded);
      ASSERT_EQ(marshal_size(set, include_hidden), written.size());
    }
  }
}

TEST_F(RoundTripTest, WhatTheTaWritesTheTestsOwnParserReads) {
  std::mt19937 random(777);
  for (int round = 0; round < 1000; ++round) {
    const param_list list = random_list(random);
    const parameter_set set = in_ta(list);
    std::uint8_t* buffer = nullptr;
    std::uint32_t length = 0;
    ASSERT_EQ(marshal(set, true, &buffer, &length), TEE_SUCCESS);
    const auto parsed = param_list::parse({buffer, length});
    TEE_Free(buffer);
    ASSERT_TRUE(parsed.has_value());
    ASSERT_EQ(parsed->marshal(), list.marshal());
  }
}

}  // namespace
