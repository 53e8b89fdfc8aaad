// A start of the key store on a platform that fails at every step in turn.
#include <fmt/format.h>

#include "tests/keystore/keystore_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;

namespace {

struct step {
  const char* call;
  std::uint32_t n;      // which call of that function
  const char* message;  // without result and newline
  const char* which;    // whose initialisation fails
};

constexpr TEE_Result results[] = {TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_GENERIC, TEE_ERROR_STORAGE_NOT_AVAILABLE,
                                  0x12345678};

constexpr step derived_steps[] = {
    {"TEE_GetPropertyAsUUID", 1, "GetPropertyAsUUID failed", "derived"},
    {"TEE_AllocateTransientObject", 1, "AllocateTransientObject failed", "derived"},
    {"TEE_PopulateTransientObject", 1, "PopulateTransientObject failed", "derived"},
};
constexpr step create_steps[] = {
    {"TEE_OpenPersistentObject", 1, "Open KSK failed", "RPMB"},
    {"TEE_AllocateTransientObject", 2, "AllocateTransientObject failed", "RPMB"},
    {"TEE_GenerateKey", 1, "GenerateKey failed", "RPMB"},
    {"TEE_GetObjectBufferAttribute", 1, "GetObjectBufferAttribute failed", "RPMB"},
    {"TEE_CreatePersistentObject", 1, "CreatePersistentObject failed", "RPMB"},
};
constexpr step load_steps[] = {
    {"TEE_OpenPersistentObject", 1, "Open KSK failed", "RPMB"},
    {"TEE_ReadObjectData", 1, "ReadObjectData failed", "RPMB"},
    {"TEE_ReadObjectData", 2, "ReadObjectData failed", "RPMB"},
    {"TEE_AllocateTransientObject", 2, "AllocateTransientObject failed", "RPMB"},
    {"TEE_PopulateTransientObject", 2, "PopulateTransientObject failed", "RPMB"},
};

class KeyStorageKeyFailureTest : public KeystoreTest {
 protected:
  void expect_failed_start(const step& s, TEE_Result result) {
    SCOPED_TRACE(fmt::format("{} {} {:#x}", s.call, s.n, result));
    const auto stored = stored_ksk();
    ta().clear_trace();
    faults().clear();
    faults().fail_call(s.call, s.n, result);
    EXPECT_EQ(key_store_init(), result);
    EXPECT_TRUE(faults().triggered());
    EXPECT_THAT(errors(), ElementsAre(fmt::format("{} with 0x{:08x}\n", s.message, result),
                                      fmt::format("Init {} KSK failed with 0x{:08x}", s.which, result)));
    EXPECT_EQ(derived_ksk(), nullptr);
    EXPECT_EQ(rpmb_ksk(), nullptr);
    EXPECT_EQ(stored_ksk(), stored) << "the stored KSK is as it was";
    expect_same(ta().holdings(), {});
  }

  void expect_next_start_works() {
    faults().clear();
    ASSERT_EQ(key_store_init(), TEE_SUCCESS);
    EXPECT_EQ(value_of(rpmb_ksk()), rpmb_value());
    key_store_release();
  }
};

TEST_F(KeyStorageKeyFailureTest, WithoutTheDerivedKskTheRpmbKskIsNotAttempted) {
  for (const step& s : derived_steps) {
    for (const TEE_Result result : results) {
      expect_failed_start(s, result);
      EXPECT_EQ(faults().call_count("TEE_RPMB_MakeFileSystem"), 0U);
    }
  }
  expect_next_start_works();
}

TEST_F(KeyStorageKeyFailureTest, AFirstStartThatFailsStoresNothing) {
  for (const step& s : create_steps) {
    for (const TEE_Result result : results) expect_failed_start(s, result);
  }
  ASSERT_EQ(stored_ksk(), std::nullopt);
  expect_next_start_works();
}

TEST_F(KeyStorageKeyFailureTest, ALaterStartThatFailsLosesNothing) {
  expect_next_start_works();
  const auto stored = stored_ksk();
  for (const step& s : load_steps) {
    for (const TEE_Result result : results) expect_failed_start(s, result);
  }
  EXPECT_EQ(stored_ksk(), stored);
  expect_next_start_works();
}

TEST_F(KeyStorageKeyFailureTest, ADrawnKeyOfAnotherSizeIsNotStored) {
  for (const std::uint32_t size : {0U, 16U, 31U, 33U}) {
    ta().clear_trace();
    faults().override_output("TEE_GetObjectBufferAttribute", 1,
                             [size](std::uint32_t* length, TEE_Result&) { *length = size; });
    EXPECT_EQ(key_store_init(), TEE_ERROR_GENERIC);
    EXPECT_THAT(errors(), ElementsAre(fmt::format("Wrong key size, expected 32B, got {}B", size),
                                      "Init RPMB KSK failed with 0xffff0000"));
    EXPECT_EQ(stored_ksk(), std::nullopt);
    expect_same(ta().holdings(), {});
  }
}

}  // namespace
