// Generating on P-521, whose values may need 66 bytes where 65 are offered: a key that doesn't fit is thrown away and
// another one made, so often and no more.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"
#include "tests/support/ec_test_key.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint32_t most_attempts = 128;
constexpr const char* read_call = "TEE_GetObjectBufferAttribute";

class EcGenerateP521Test : public CommandTest {
 protected:
  void SetUp() override { (void)client().must_generate(ec_key(256)); }  // the key storage key exists from here on

  [[nodiscard]] std::uint32_t calls(const char* name) { return tee.world().faults().call_count(name); }

  /// short_reads makes the first `count` attempts find a value that doesn't fit, by the first value already.
  void short_reads(std::uint32_t count) {
    for (std::uint32_t n = 1; n <= count; ++n) tee.world().faults().fail_call(read_call, n, TEE_ERROR_SHORT_BUFFER);
  }

  void expect_given_up(TEEC_Result result, const char* line, std::uint32_t attempts) {
    const std::uint32_t generated = calls("TEE_GenerateKey"), allocated = calls("TEE_AllocateTransientObject"),
                        freed = calls("TEE_FreeTransientObject");
    const answer a = expect_failure(broken(result, {line}), [&] { return client().generate(ec_key(521), 2048); });
    EXPECT_EQ(a.output, bytes(2048, 0));
    EXPECT_EQ(calls("TEE_GenerateKey") - generated, attempts);
    EXPECT_EQ(calls("TEE_AllocateTransientObject") - allocated, attempts) << "each attempt with an object of its own";
    EXPECT_EQ(calls("TEE_FreeTransientObject") - freed, attempts);
  }
};

TEST_F(EcGenerateP521Test, AfterAsManyAttemptsAsItMayTakeItGivesUpWithOneLine) {
  short_reads(most_attempts);
  expect_given_up(TEEC_ERROR_SHORT_BUFFER, "GetObjectBufferAttribute failed with 0xffff0010\n", most_attempts);
}

TEST_F(EcGenerateP521Test, TheLastAttemptCounts) {
  short_reads(most_attempts - 1);
  // The last key fits, whatever the platform says of its values, …
  for (std::uint32_t n = 1; n <= 3; ++n) {
    tee.world().faults().override_output(read_call, n, [](std::uint32_t* length, TEE_Result& result) {
      *length = 65;
      result = TEE_SUCCESS;
    });
  }
  // … and is then written without a complaint.
  for (std::uint32_t n = 4; n <= 6; ++n) {
    tee.world().faults().override_output(read_call, n, [](std::uint32_t* length, TEE_Result& result) {
      *length = 65;
      result = TEE_SUCCESS;
    });
  }
  const std::uint32_t generated = calls("TEE_GenerateKey");
  (void)succeeds([&] { return client().generate(ec_key(521)); });
  EXPECT_EQ(calls("TEE_GenerateKey") - generated, most_attempts);
}

TEST_F(EcGenerateP521Test, AnAttemptMayFailByAnyOfTheThreeValues) {
  const auto fits = [](std::uint32_t* length, TEE_Result& result) {
    *length = 65;
    result = TEE_SUCCESS;
  };
  for (std::uint32_t at = 1; at <= 3; ++at) {
    for (std::uint32_t n = 1; n < at; ++n) tee.world().faults().override_output(read_call, n, fits);
    tee.world().faults().fail_call(read_call, at, TEE_ERROR_SHORT_BUFFER);
    const std::uint32_t generated = calls("TEE_GenerateKey");
    (void)succeeds([&] { return client().generate(ec_key(521)); });
    EXPECT_GE(calls("TEE_GenerateKey") - generated, 2U) << "value " << at;
  }
}

TEST_F(EcGenerateP521Test, OtherFailuresEndItAtOnce) {
  tee.world().faults().fail_call(read_call, 1, TEE_ERROR_OUT_OF_MEMORY);
  expect_given_up(TEEC_ERROR_OUT_OF_MEMORY, "GetObjectBufferAttribute failed with 0xffff000c\n", 1);
  tee.world().faults().fail_call("TEE_GenerateKey", 1, TEE_ERROR_SHORT_BUFFER);
  expect_given_up(TEEC_ERROR_SHORT_BUFFER, "GenerateKey failed with 0xffff0010\n", 1);
  short_reads(3);
  tee.world().faults().fail_call(read_call, 4, TEE_ERROR_GENERIC);
  expect_given_up(TEEC_ERROR_GENERIC, "GetObjectBufferAttribute failed with 0xffff0000\n", 4);
}

TEST_F(EcGenerateP521Test, OnceMeasuredAKeyIsNotMadeAgain) {
  for (std::uint32_t n = 1; n <= 3; ++n) {
    tee.world().faults().override_output(read_call, n, [](std::uint32_t* length, TEE_Result& result) {
      *length = 65;
      result = TEE_SUCCESS;
    });
  }
  tee.world().faults().fail_call(read_call, 4, TEE_ERROR_SHORT_BUFFER);
  expect_given_up(TEEC_ERROR_SHORT_BUFFER, "GetObjectBufferAttribute failed with 0xffff0010\n", 1);
}

TEST_F(EcGenerateP521Test, WhateverFailsInAnyAttemptFailsTheCommandAndLeavesNothingBehind) {
  hosted_tee::fault_plan& faults = tee.world().faults();
  // Two keys are thrown away, and the third one fits, whatever the platform says of its values.
  const auto third_fits = [&] {
    faults.clear();
    short_reads(2);
    for (std::uint32_t n = 1; n <= 6; ++n) {
      faults.override_output(read_call, n, [](std::uint32_t* length, TEE_Result& result) {
        *length = 65;
        result = TEE_SUCCESS;
      });
    }
  };
  const auto generate = [&] { return client().generate(ec_key(521), 2048); };
  third_fits();
  const hosted_tee::accounting before = tee.accounting();
  (void)succeeds(generate);
  EXPECT_EQ(calls("TEE_GenerateKey"), 3U);
  const std::uint32_t allocations = faults.allocations(), fallible = faults.fallible_calls();

  const auto expect_clean_failure = [&] {
    const answer a = generate();
    EXPECT_FALSE(a.ok());
    EXPECT_NE(a.error, KM_ERROR_OK);
    EXPECT_EQ(a.size, 0U);
    EXPECT_EQ(a.output, bytes(2048, 0));
    expect_same(before);
  };
  for (std::uint32_t n = 1; n <= allocations; ++n) {
    SCOPED_TRACE(fmt::format("allocation {} of {}", n, allocations));
    third_fits();
    faults.fail_allocation(n);
    expect_clean_failure();
  }
  for (std::uint32_t n = 1; n <= fallible; ++n) {
    SCOPED_TRACE(fmt::format("platform call {} of {}", n, fallible));
    third_fits();
    faults.fail_any_call(n, TEE_ERROR_OUT_OF_MEMORY);
    expect_clean_failure();
  }
}

TEST_F(EcGenerateP521Test, GeneratedKeysWorkAndHaveShortValues) {
  for (int round = 0; round < 10; ++round) {
    const bytes blob = succeeds([&] { return client().generate(ec_key(521)); }).body();
    const ec_fields exported = ec_fields::parse(client().export_key(blob).body(), false);
    EXPECT_LE(exported.x.size(), 65U);
    EXPECT_LE(exported.y.size(), 65U);
    const bytes message = pattern(100, static_cast<std::uint32_t>(round));
    const bytes made = client().sign(blob, ec_digest(KM_DIGEST_SHA_2_512), message).data;
    EXPECT_TRUE(ec_test_key::from_fields(exported).verifies(KM_DIGEST_SHA_2_512, message, made));
  }
}

}  // namespace
}  // namespace testing_support
