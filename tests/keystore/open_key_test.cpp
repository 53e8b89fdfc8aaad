// Opening: forged blobs, and a platform that fails at every step.
#include <fmt/format.h>

#include "tests/keystore/keystore_fixture.h"

using namespace keymaster;
using namespace testing_support;

namespace {

class OpenKeyTest : public BlobTest {
 protected:
  void SetUp() override {
    BlobTest::SetUp();
    blob = must_save(key_data, characteristics);
    faults().clear();
  }

  void expect_forged(const bytes& forged) {
    expect_not_opened(open(forged), TEE_ERROR_MAC_INVALID, untouched, {"AEDecryptFinal failed with 0xffff3071\n"});
  }

  [[nodiscard]] std::uint32_t ciphertext_size() const { return static_cast<std::uint32_t>(blob.size() - 93); }

  bytes blob;
};

TEST_F(OpenKeyTest, ABlobYieldsItsKeyAndItsCharacteristics) {
  const opened answer = open(blob);
  EXPECT_EQ(answer.result, TEE_SUCCESS);
  EXPECT_EQ(answer.error, KM_ERROR_OK);
  EXPECT_EQ(answer.key_data, key_data);
  EXPECT_EQ(answer.characteristics.marshal(), characteristics.marshal());
}

TEST_F(OpenKeyTest, AnyBitBehindTheProtectionTypeIsCoveredByTheSeal) {
  // Nonce (1 to 64), IV (65 to 76), tag (77 to 92) and ciphertext alike.
  for (std::size_t at = 1; at < blob.size(); ++at) {
    SCOPED_TRACE(at);
    bytes forged = blob;
    forged[at] = static_cast<std::uint8_t>(forged[at] ^ (1 << (at % 8)));
    expect_forged(forged);
  }
}

TEST_F(OpenKeyTest, EveryBitOfTheTagCounts) {
  for (std::size_t at = 77; at < 93; ++at) {
    for (int bit = 0; bit < 8; ++bit) {
      bytes forged = blob;
      forged[at] = static_cast<std::uint8_t>(forged[at] ^ (1 << bit));
      expect_forged(forged);
    }
  }
}

TEST_F(OpenKeyTest, TheOtherProtectionTypeIsTheOtherKey) {
  bytes forged = blob;
  forged[0] = KEY_PROTECTION_DERIVED;
  expect_forged(forged);
}

TEST_F(OpenKeyTest, ThereAreTwoProtectionTypes) {
  for (std::uint32_t type = 2; type < 256; ++type) {
    bytes unknown = blob;
    unknown[0] = static_cast<std::uint8_t>(type);
    expect_not_opened(open(unknown), TEE_SUCCESS, KM_ERROR_INVALID_KEY_BLOB, {"Unknown key protection"});
  }
  EXPECT_EQ(faults().call_count("TEE_AllocateOperation"), 0U);
}

TEST_F(OpenKeyTest, ABlobMustBeLongerThanItsHeader) {
  for (std::size_t size = 0; size <= 93; ++size) {
    expect_not_opened(open({blob.begin(), blob.begin() + static_cast<std::ptrdiff_t>(size)}), TEE_SUCCESS,
                      KM_ERROR_INVALID_KEY_BLOB, {"Too short key blob"});
  }
  EXPECT_EQ(faults().call_count("TEE_AllocateOperation"), 0U);
}

TEST_F(OpenKeyTest, TheLengthIsLookedAtBeforeTheType) {
  expect_not_opened(open(bytes(93, 0xFF)), TEE_SUCCESS, KM_ERROR_INVALID_KEY_BLOB, {"Too short key blob"});
  expect_not_opened(open(bytes(94, 0xFF)), TEE_SUCCESS, KM_ERROR_INVALID_KEY_BLOB, {"Unknown key protection"});
}

TEST_F(OpenKeyTest, ATruncatedOrExtendedBlobIsForged) {
  for (std::size_t size = 94; size < blob.size(); ++size) {
    expect_forged({blob.begin(), blob.begin() + static_cast<std::ptrdiff_t>(size)});
  }
  expect_forged(join({blob, bytes{0}}));
  expect_forged(join({blob, blob}));
}

TEST_F(OpenKeyTest, ABlobOfAnotherDeviceIsForged) {
  expect_forged(seal(0, pattern(32), pattern(64), pattern(12), pattern(50)));
  expect_forged(seal(1, derived_value(), pattern(64), pattern(12), pattern(50)));
}

TEST_F(OpenKeyTest, EachPlatformFailureIsToldAndLeavesNothing) {
  struct row {
    const char* call;
    std::uint32_t n;
    const char* message;
    bool derives;
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
                       {"TEE_AEDecryptFinal", 1, "AEDecryptFinal", false}}) {
    for (const TEE_Result result : {TEE_ERROR_GENERIC, TEE_ERROR_OUT_OF_MEMORY}) {
      SCOPED_TRACE(fmt::format("{} {}", r.call, r.n));
      faults().clear();
      faults().fail_call(r.call, r.n, result);
      std::vector<std::string> lines = {fmt::format("{} failed with 0x{:08x}\n", r.message, result)};
      if (r.derives) lines.push_back(fmt::format("DeriveKK failed with 0x{:08x}\n", result));
      expect_not_opened(open(blob), result, untouched, lines);
    }
  }
}

TEST_F(OpenKeyTest, AMacOfAnotherLengthOpensNothing) {
  faults().override_output("TEE_MACComputeFinal", 1, [](std::uint32_t* length, TEE_Result&) { *length = 33; });
  expect_not_opened(open(blob), TEE_ERROR_BAD_PARAMETERS, untouched,
                    {"Wrong MAC length, expected 32B, got 33B\n", "DeriveKK failed with 0xffff0006\n"});
}

TEST_F(OpenKeyTest, AnExhaustedHeapIsToldAtEachPlace) {
  // The fixture takes three blocks before: old key data, and a set with a blob.
  struct row {
    std::uint32_t n;
    keymaster_error_t error;
    std::vector<std::string> lines;
  };
  for (const row& r : {row{1, KM_ERROR_MEMORY_ALLOCATION_FAILED, {"Out of memory"}},
                       row{2, KM_ERROR_MEMORY_ALLOCATION_FAILED, {"Out of memory"}},
                       row{3, KM_ERROR_INVALID_ARGUMENT, {"Out of memory", "Unmarshal failed"}},
                       row{4, KM_ERROR_INVALID_ARGUMENT, {"Out of memory, require 20B", "Unmarshal failed"}},
                       row{5, KM_ERROR_INVALID_ARGUMENT, {"Out of memory, require 3B", "Unmarshal failed"}},
                       row{6, KM_ERROR_INVALID_ARGUMENT, {"Out of memory, require 32B", "Unmarshal failed"}}}) {
    SCOPED_TRACE(r.n);
    faults().clear();
    faults().fail_allocation(3 + r.n);
    expect_not_opened(open(blob), TEE_SUCCESS, r.error, r.lines);
    EXPECT_TRUE(faults().triggered());
  }
}

TEST_F(OpenKeyTest, OutputOfAnotherLengthIsToldOnceTheTagIsVerified) {
  const std::uint32_t size = ciphertext_size();
  struct row {
    const char* call;
    std::uint32_t reported;
    std::uint32_t total;
  };
  for (const row& r : {row{"TEE_AEUpdate", size - 3, size - 3},
                       {"TEE_AEUpdate", 0, 0},
                       {"TEE_AEUpdate", size + 5, size + 5},
                       {"TEE_AEDecryptFinal", 7, size + 7}}) {
    faults().clear();
    faults().override_output(r.call, 1, [&r](std::uint32_t* length, TEE_Result&) { *length = r.reported; });
    expect_not_opened(open(blob), TEE_SUCCESS, KM_ERROR_UNKNOWN_ERROR,
                      {fmt::format("Too short output of AES, expect {}B, got {}B", size, r.total)});
    faults().clear();
    faults().override_output(r.call, 1, [&r](std::uint32_t* length, TEE_Result&) { *length = r.reported; });
    expect_forged(flip(blob, 80));
  }
}

TEST_F(OpenKeyTest, APlatformThatClaimsMoreThanItHadRoomForGetsNoRoomBehindTheBuffer) {
  const std::uint32_t size = ciphertext_size();
  for (const std::uint32_t claim : {size, size + 5, 0x80000000U, 0xFFFFFFFFU}) {
    spy.final_rooms.clear();
    faults().override_output("TEE_AEUpdate", 1, [claim](std::uint32_t* length, TEE_Result&) { *length = claim; });
    (void)open(blob);
    EXPECT_THAT(spy.final_rooms, ::testing::ElementsAre(0U)) << claim;
  }
}

TEST_F(OpenKeyTest, NoSecretIsLeftInFreedMemory) {
  const bytes hidden = characteristics.blob(KM_TAG_APPLICATION_ID);
  std::size_t blocks = 0, leaks = 0;
  ta().on_free([&](std::span<const std::uint8_t> block) {
    ++blocks;
    for (const bytes& secret : {key_data, hidden}) leaks += contains(block, std::span(secret).first(12));
  });
  (void)open(blob);
  for (const std::uint32_t n : {2U, 3U, 4U, 6U}) {
    faults().clear();
    faults().fail_allocation(3 + n);
    (void)open(blob);
  }
  ta().on_free({});
  EXPECT_GE(blocks, 20U);
  EXPECT_EQ(leaks, 0U);
}

}  // namespace
