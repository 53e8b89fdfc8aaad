// Sealing: capacities, a platform that fails at every step, a client that meddles, and secrets left behind.
#include <fmt/format.h>

#include "tests/keystore/keystore_fixture.h"

using namespace keymaster;
using namespace testing_support;

namespace {

using SaveKeyTest = BlobTest;

TEST_F(SaveKeyTest, TheExactCapacityIsEnough) {
  const saved answer = save(key_data, characteristics, blob_size());
  EXPECT_EQ(answer.result, TEE_SUCCESS);
  EXPECT_EQ(answer.length, blob_size());
  EXPECT_EQ(open(answer.blob()).key_data, key_data);
}

TEST_F(SaveKeyTest, NothingIsWrittenBehindTheBlob) {
  const saved answer = save(key_data, characteristics, blob_size() + 50);
  EXPECT_EQ(answer.length, blob_size());
  EXPECT_EQ(bytes(answer.buffer.end() - 50, answer.buffer.end()), bytes(50, filler));
}

TEST_F(SaveKeyTest, ASmallerCapacityIsTooShort) {
  for (const std::size_t capacity :
       {blob_size() - 1, std::size_t{105}, std::size_t{93}, std::size_t{1}, std::size_t{0}}) {
    expect_not_saved(save(key_data, characteristics, capacity), TEE_ERROR_SHORT_BUFFER, {"Too short key blob"});
  }
  EXPECT_EQ(faults().call_count("TEE_AllocateOperation"), 0U);
}

TEST_F(SaveKeyTest, AnUnmarshallableSetIsNotSealed) {
  parameter_set set = in_ta(param_list{}.add_blob(KM_TAG_NONCE, {}));
  keymaster_free_param_array(set.params, set.length);
  bytes buffer(500, filler);
  std::uint32_t length = 0xDEADBEEF;
  EXPECT_EQ(save_key(key_data, set, buffer, &length), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(length, 0U);
  EXPECT_EQ(buffer, bytes(500, filler));
  EXPECT_EQ(errors(), (std::vector<std::string>{"Invalid keymaster_key_param_set_t", "Marshal failed"}));
}

TEST_F(SaveKeyTest, AnExhaustedHeapIsTold) {
  // in_ta takes one block for the records and one for each of the three blobs.
  faults().fail_allocation(4 + 1);
  expect_not_saved(save(key_data, characteristics), TEE_ERROR_OUT_OF_MEMORY,
                   {fmt::format("Out of memory, need {}B", characteristics.marshal().size()), "Marshal failed"});
  faults().clear();
  faults().fail_allocation(4 + 2);
  expect_not_saved(save(key_data, characteristics), TEE_ERROR_OUT_OF_MEMORY, {"Out of memory"});
  faults().clear();
  EXPECT_EQ(save(key_data, characteristics).result, TEE_SUCCESS);
}

TEST_F(SaveKeyTest, EachPlatformFailureIsToldAndLeavesNothing) {
  struct row {
    const char* call;
    std::uint32_t n;
    const char* message;
    bool derives;  // the derivation fails, and is told too
  };
  for (const row& r : {row{"TEE_AllocateOperation", 1, "AllocateOperation", true},
                       {"TEE_SetOperationKey", 1, "SetOperationKey", true},
                       {"TEE_MACComputeFinal", 1, "MACComputeFinal", true},
                       {"TEE_AllocateTransientObject", 1, "AllocateTransientObject", true},
                       {"TEE_PopulateTransientObject", 1, "PopulateTransientObject", true},
                       {"TEE_AllocateOperation", 2, "AllocateOperation", false},
                       {"TEE_SetOperationKey", 2, "SetOperationKey", false},
                       {"TEE_AEInit", 1, "AEInit", false},
                       {"TEE_AEUpdate", 1, "AEUpdate", false},
                       {"TEE_AEUpdate", 2, "AEUpdate", false},
                       {"TEE_AEUpdate", 3, "AEUpdate", false},
                       {"TEE_AEUpdate", 4, "AEUpdate", false},
                       {"TEE_AEEncryptFinal", 1, "AEEncryptFinal", false}}) {
    for (const TEE_Result result : {TEE_ERROR_GENERIC, TEE_ERROR_OUT_OF_MEMORY}) {
      SCOPED_TRACE(fmt::format("{} {}", r.call, r.n));
      faults().clear();
      faults().fail_call(r.call, r.n, result);
      std::vector<std::string> lines = {fmt::format("{} failed with 0x{:08x}\n", r.message, result)};
      if (r.derives) lines.push_back(fmt::format("DeriveKK failed with 0x{:08x}\n", result));
      expect_not_saved(save(key_data, characteristics), result, lines);
    }
  }
}

TEST_F(SaveKeyTest, AMacOfAnotherLengthSealsNothing) {
  faults().override_output("TEE_MACComputeFinal", 1, [](std::uint32_t* length, TEE_Result&) { *length = 20; });
  expect_not_saved(save(key_data, characteristics), TEE_ERROR_BAD_PARAMETERS,
                   {"Wrong MAC length, expected 32B, got 20B\n", "DeriveKK failed with 0xffff0006\n"});
}

TEST_F(SaveKeyTest, ATagOfAnotherSizeIsToldWithTheFinalStepsByteCount) {
  for (const std::uint32_t size : {0U, 12U, 15U, 17U}) {
    spy.falsify_tag_length = size;
    expect_not_saved(save(key_data, characteristics), TEE_ERROR_GENERIC, {"Wrong tag size, expect 16B, got 0B"});
  }
  // The number is the ciphertext that the final step put out, and not the tag's size.
  spy.falsify_tag_length = 12;
  faults().override_output("TEE_AEEncryptFinal", 1, [](std::uint32_t* length, TEE_Result&) { *length = 5; });
  expect_not_saved(save(key_data, characteristics), TEE_ERROR_GENERIC, {"Wrong tag size, expect 16B, got 5B"});
}

TEST_F(SaveKeyTest, CiphertextOfAnotherSizeIsToldWithBothSizes) {
  for (const std::uint32_t piece : {1U, 2U, 3U, 4U}) {
    faults().clear();
    faults().override_output("TEE_AEUpdate", piece, [](std::uint32_t* length, TEE_Result&) { *length -= 3; });
    expect_not_saved(save(key_data, characteristics), TEE_ERROR_GENERIC,
                     {fmt::format("Unmatched total size, expected: {} actual: {}\n", blob_size(), blob_size() - 3)});
  }
}

TEST_F(SaveKeyTest, APlatformThatClaimsMoreThanItHadRoomForIsNotBelieved) {
  struct row {
    const char* call;
    std::size_t written_before;
  };
  for (const row& r : {row{"TEE_AEUpdate", 93}, row{"TEE_AEEncryptFinal", blob_size()}}) {
    for (const std::uint32_t claim : {5000U, 0x7FFFFFFFU, 0xFFFFFFFFU}) {
      faults().clear();
      faults().override_output(r.call, 1, [claim](std::uint32_t* length, TEE_Result&) { *length = claim; });
      const auto actual = static_cast<std::int32_t>(static_cast<std::uint32_t>(r.written_before) + claim);
      expect_not_saved(save(key_data, characteristics), TEE_ERROR_GENERIC,
                       {fmt::format("Unmatched total size, expected: {} actual: {}\n", blob_size(), actual)});
    }
  }
}

TEST_F(SaveKeyTest, AClientThatMeddlesWithItsBufferMeanwhileChangesNothing) {
  // An old blob's nonce and IV, slipped in between drawing and use, would have two keys sealed with one key stream.
  const bytes old = must_save(key_data, characteristics);
  struct row {
    const char* call;
    std::uint32_t n;
  };
  for (const row& r : {row{"TEE_AllocateOperation", 1},
                       {"TEE_MACComputeFinal", 1},
                       {"TEE_AllocateOperation", 2},
                       {"TEE_SetOperationKey", 2},
                       {"TEE_AEInit", 1},
                       {"TEE_AEUpdate", 1},
                       {"TEE_AEUpdate", 4},
                       {"TEE_AEEncryptFinal", 1}}) {
    SCOPED_TRACE(fmt::format("{} {}", r.call, r.n));
    const parameter_set set = in_ta(characteristics);
    bytes buffer(blob_size());
    std::uint32_t length = 0;
    faults().clear();
    faults().override_output(r.call, r.n, [&](std::uint32_t*, TEE_Result&) { buffer = old; });
    ASSERT_EQ(save_key(key_data, set, buffer, &length), TEE_SUCCESS);
    EXPECT_TRUE(faults().triggered());
    EXPECT_NE(bytes(buffer.begin() + 1, buffer.begin() + 65), bytes(old.begin() + 1, old.begin() + 65));
    EXPECT_NE(bytes(buffer.begin() + 65, buffer.begin() + 77), bytes(old.begin() + 65, old.begin() + 77));
    EXPECT_EQ(open(buffer).key_data, key_data);
  }
}

TEST_F(SaveKeyTest, NoSecretIsLeftInFreedMemory) {
  const bytes hidden = characteristics.blob(KM_TAG_APPLICATION_ID);
  const parameter_set set = in_ta(characteristics);
  bytes buffer(blob_size());
  std::size_t blocks = 0, leaks = 0;
  ta().on_free([&](std::span<const std::uint8_t> block) {
    ++blocks;
    for (const bytes& secret : {key_data, hidden, rpmb_value()}) leaks += contains(block, std::span(secret).first(12));
  });
  std::uint32_t length = 0;
  ASSERT_EQ(save_key(key_data, set, buffer, &length), TEE_SUCCESS);
  faults().fail_call("TEE_AEEncryptFinal", 1, TEE_ERROR_GENERIC);
  EXPECT_EQ(save_key(key_data, set, buffer, &length), TEE_ERROR_GENERIC);
  ta().on_free({});
  EXPECT_GE(blocks, 4U);
  EXPECT_EQ(leaks, 0U);
}

}  // namespace
