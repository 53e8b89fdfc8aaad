// What the TA says it can do: counts and lists, for every algorithm and purpose.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// A pair of commands: one answers how many values there are, the other which.
struct list_commands {
  std::uint32_t count, list;
};
constexpr list_commands block_modes = {KM_COMMAND_GET_SUPPORT_BLK_MODE_CNT, KM_COMMAND_GET_SUPPORT_BLK_MODE};
constexpr list_commands paddings = {KM_COMMAND_GET_SUPPORT_PADDING_MODE_CNT, KM_COMMAND_GET_SUPPORT_PADDING_MODE};
constexpr list_commands digests = {KM_COMMAND_GET_SUPPORT_DIGEST_CNT, KM_COMMAND_GET_SUPPORT_DIGEST};
constexpr list_commands import_formats = {KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT_CNT,
                                          KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT};
constexpr list_commands export_formats = {KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT_CNT,
                                          KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT};
constexpr list_commands by_purpose[] = {block_modes, paddings, digests};
constexpr list_commands by_algorithm[] = {import_formats, export_formats};

struct offer {
  list_commands commands;
  std::uint32_t algorithm, purpose;
  std::vector<std::uint32_t> values;
};

const std::vector<offer>& offers() {
  static const std::vector<offer> all = {
      {block_modes, KM_ALGORITHM_RSA, KM_PURPOSE_ENCRYPT, {}},
      {paddings, KM_ALGORITHM_RSA, KM_PURPOSE_ENCRYPT, {1, 2, 4}},
      {digests, KM_ALGORITHM_RSA, KM_PURPOSE_ENCRYPT, {0, 2, 3, 4, 5, 6}},
      {block_modes, KM_ALGORITHM_RSA, KM_PURPOSE_DECRYPT, {}},
      {paddings, KM_ALGORITHM_RSA, KM_PURPOSE_DECRYPT, {1, 2, 4}},
      {digests, KM_ALGORITHM_RSA, KM_PURPOSE_DECRYPT, {0, 2, 3, 4, 5, 6}},
      {block_modes, KM_ALGORITHM_RSA, KM_PURPOSE_SIGN, {}},
      {paddings, KM_ALGORITHM_RSA, KM_PURPOSE_SIGN, {1, 3, 5}},
      {digests, KM_ALGORITHM_RSA, KM_PURPOSE_SIGN, {0, 1, 2, 3, 4, 5, 6}},
      {block_modes, KM_ALGORITHM_RSA, KM_PURPOSE_VERIFY, {}},
      {paddings, KM_ALGORITHM_RSA, KM_PURPOSE_VERIFY, {1, 3, 5}},
      {digests, KM_ALGORITHM_RSA, KM_PURPOSE_VERIFY, {0, 1, 2, 3, 4, 5, 6}},
      {block_modes, KM_ALGORITHM_AES, KM_PURPOSE_ENCRYPT, {1, 2, 3, 32}},
      {paddings, KM_ALGORITHM_AES, KM_PURPOSE_ENCRYPT, {1, 64}},
      {digests, KM_ALGORITHM_AES, KM_PURPOSE_ENCRYPT, {}},
      {block_modes, KM_ALGORITHM_AES, KM_PURPOSE_DECRYPT, {1, 2, 3, 32}},
      {paddings, KM_ALGORITHM_AES, KM_PURPOSE_DECRYPT, {1, 64}},
      {digests, KM_ALGORITHM_AES, KM_PURPOSE_DECRYPT, {}},
      {block_modes, KM_ALGORITHM_EC, KM_PURPOSE_SIGN, {}},
      {paddings, KM_ALGORITHM_EC, KM_PURPOSE_SIGN, {}},
      {digests, KM_ALGORITHM_EC, KM_PURPOSE_SIGN, {0, 2, 3, 4, 5, 6}},
      {block_modes, KM_ALGORITHM_EC, KM_PURPOSE_VERIFY, {}},
      {paddings, KM_ALGORITHM_EC, KM_PURPOSE_VERIFY, {}},
      {digests, KM_ALGORITHM_EC, KM_PURPOSE_VERIFY, {0, 2, 3, 4, 5, 6}},
      {block_modes, KM_ALGORITHM_HMAC, KM_PURPOSE_SIGN, {}},
      {paddings, KM_ALGORITHM_HMAC, KM_PURPOSE_SIGN, {}},
      {digests, KM_ALGORITHM_HMAC, KM_PURPOSE_SIGN, {1, 2, 3, 4, 5, 6}},
      {block_modes, KM_ALGORITHM_HMAC, KM_PURPOSE_VERIFY, {}},
      {paddings, KM_ALGORITHM_HMAC, KM_PURPOSE_VERIFY, {}},
      {digests, KM_ALGORITHM_HMAC, KM_PURPOSE_VERIFY, {1, 2, 3, 4, 5, 6}},
      {import_formats, KM_ALGORITHM_RSA, 0, {1}},
      {export_formats, KM_ALGORITHM_RSA, 0, {0}},
      {import_formats, KM_ALGORITHM_AES, 0, {3}},
      {export_formats, KM_ALGORITHM_AES, 0, {}},
      {import_formats, KM_ALGORITHM_EC, 0, {1}},
      {export_formats, KM_ALGORITHM_EC, 0, {0}},
      {import_formats, KM_ALGORITHM_HMAC, 0, {3}},
      {export_formats, KM_ALGORITHM_HMAC, 0, {}},
  };
  return all;
}

bytes list_of(const std::vector<std::uint32_t>& values) {
  bytes list;
  for (const std::uint32_t value : values) list = join({list, u32(value)});
  return list;
}

class CapabilityTest : public CommandTest {
 protected:
  answer count(const list_commands& commands, std::uint32_t algorithm, std::uint32_t purpose) {
    return client().call(commands.count, algorithm, purpose, std::nullopt, std::nullopt);
  }
  answer list(const list_commands& commands, std::uint32_t algorithm, std::uint32_t purpose, std::size_t capacity) {
    return client().call(commands.list, algorithm, purpose, std::nullopt, capacity);
  }

  /// expect_unsupported asks for a count and for lists of several sizes, and expects `error` each time: the error comes
  /// before the size is looked at, and slot 2 stays as it was given.
  void expect_unsupported(const list_commands& commands, std::uint32_t algorithm, std::uint32_t purpose,
                          std::int32_t error) {
    tee.clear_trace();
    const answer counted = count(commands, algorithm, purpose);
    EXPECT_EQ(counted.result, TEEC_SUCCESS);
    EXPECT_EQ(counted.error, error);
    EXPECT_EQ(counted.b, 0U);
    for (const std::size_t capacity : {0U, 4U, 5U, 64U}) {
      const answer listed = list(commands, algorithm, purpose, capacity);
      EXPECT_EQ(listed.result, TEEC_SUCCESS);
      EXPECT_EQ(listed.error, error);
      EXPECT_EQ(listed.size, capacity);
      EXPECT_EQ(listed.output, bytes(capacity, canary));
    }
    EXPECT_THAT(lines(), testing::IsEmpty());
  }
};

TEST_F(CapabilityTest, ThereAreFourAlgorithms) {
  const answer a = client().call(KM_COMMAND_GET_SUPPORT_ALGO_CNT, 0, 0, std::nullopt, std::nullopt);
  EXPECT_EQ(a.result, TEEC_SUCCESS);
  EXPECT_EQ(a.error, 4);  // slot 0 a is the count here, and no error
  EXPECT_EQ(a.b, 0U);
}

TEST_F(CapabilityTest, TheAlgorithmsComeInTheOrderOfTheRegistry) {
  const answer a = succeeds([&] { return client().call(KM_COMMAND_GET_SUPPORT_ALGO, 0, 0, std::nullopt, 16); });
  EXPECT_EQ(a.body(), list_of({1, 32, 3, 128}));
}

TEST_F(CapabilityTest, AlgorithmsNeedExactlySixteenBytes) {
  for (const std::size_t capacity : {0U, 1U, 4U, 12U, 15U, 17U, 20U, 4096U}) {
    SCOPED_TRACE(capacity);
    tee.clear_trace();
    const answer a = client().call(KM_COMMAND_GET_SUPPORT_ALGO, 0, 0, std::nullopt, capacity);
    EXPECT_EQ(a.result, TEEC_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(a.error, 0);  // the command has no error of its own
    EXPECT_EQ(lines(), (trace_lines{"Output buffer doesn't match"}));
    EXPECT_EQ(a.size, capacity);
    EXPECT_EQ(a.output, bytes(capacity, canary));
  }
}

TEST_F(CapabilityTest, EveryListHasItsCountAndItsValues) {
  for (const offer& each : offers()) {
    SCOPED_TRACE(fmt::format("command {} for {} {}", each.commands.list, each.algorithm, each.purpose));
    const answer counted = succeeds([&] { return count(each.commands, each.algorithm, each.purpose); });
    EXPECT_EQ(counted.b, each.values.size());
    const answer listed =
        succeeds([&] { return list(each.commands, each.algorithm, each.purpose, each.values.size() * 4); });
    EXPECT_EQ(listed.size, each.values.size() * 4);
    EXPECT_EQ(listed.output, list_of(each.values));
  }
}

TEST_F(CapabilityTest, AListOfAnotherSizeIsRefusedAndLeftAlone) {
  for (const offer& each : offers()) {
    const std::size_t exact = each.values.size() * 4;
    for (const std::size_t capacity :
         {exact + 1, exact + 4, exact + 4096, exact == 0 ? 2 : exact - 1, exact == 0 ? 3 : exact - 4}) {
      SCOPED_TRACE(fmt::format("command {} with {} bytes", each.commands.list, capacity));
      tee.clear_trace();
      const answer a = list(each.commands, each.algorithm, each.purpose, capacity);
      EXPECT_EQ(a.result, TEEC_ERROR_BAD_PARAMETERS);
      EXPECT_EQ(a.error, KM_ERROR_UNKNOWN_ERROR);
      EXPECT_EQ(lines(), (trace_lines{"Output buffer doesn't match"}));
      EXPECT_EQ(a.size, capacity);
      EXPECT_EQ(a.output, bytes(capacity, canary));
    }
  }
}

TEST_F(CapabilityTest, AnEmptyListTakesAnEmptyBuffer) {
  const answer a = succeeds([&] { return list(block_modes, KM_ALGORITHM_RSA, KM_PURPOSE_SIGN, 0); });
  EXPECT_EQ(a.size, 0U);
}

TEST_F(CapabilityTest, AnUnknownAlgorithmServesNoPurposeAndHasNoFormats) {
  for (const std::uint32_t algorithm : {0U, 2U, 4U, 31U, 33U, 127U, 129U, 0x80000001U, 0xFFFFFFFFU}) {
    SCOPED_TRACE(algorithm);
    for (const list_commands& commands : by_purpose) {
      for (const std::uint32_t purpose : {0U, 2U, 4U, 0xFFFFFFFFU}) {
        expect_unsupported(commands, algorithm, purpose, KM_ERROR_UNSUPPORTED_PURPOSE);
      }
    }
    for (const list_commands& commands : by_algorithm) {
      expect_unsupported(commands, algorithm, 0, KM_ERROR_UNSUPPORTED_ALGORITHM);
    }
  }
}

TEST_F(CapabilityTest, AnUnknownPurposeIsUnsupported) {
  for (const std::uint32_t purpose : {4U, 5U, 0x80000002U, 0xFFFFFFFFU}) {
    for (const list_commands& commands : by_purpose) {
      for (const std::uint32_t algorithm : {KM_ALGORITHM_RSA, KM_ALGORITHM_AES, KM_ALGORITHM_EC, KM_ALGORITHM_HMAC}) {
        expect_unsupported(commands, algorithm, purpose, KM_ERROR_UNSUPPORTED_PURPOSE);
      }
    }
  }
}

TEST_F(CapabilityTest, AnAesKeyHasNothingToDoWithSignatures) {
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    for (const list_commands& commands : by_purpose) {
      expect_unsupported(commands, KM_ALGORITHM_AES, purpose, KM_ERROR_UNSUPPORTED_PURPOSE);
    }
  }
}

TEST_F(CapabilityTest, CountsOverwriteWhateverTheSlotHeld) {
  const answer a = count(digests, 0xDEADBEEF, 0xFEEDFACE);
  EXPECT_EQ(a.result, TEEC_SUCCESS);
  EXPECT_EQ(a.error, KM_ERROR_UNSUPPORTED_PURPOSE);
  EXPECT_EQ(a.b, 0U);
}

TEST_F(CapabilityTest, AskingHoldsNothing) {
  const hosted_tee::accounting before = tee.accounting();
  for (std::uint32_t command = 1; command <= 12; ++command) {
    const bool lists = command % 2 == 0;
    (void)client().call(command, command < 3 ? 0 : 1, command > 2 && command < 9 ? 2 : 0, std::nullopt,
                        lists ? std::optional<std::size_t>(12) : std::nullopt);
  }
  expect_same(before);
}

TEST_F(CapabilityTest, EcAndHmacKeysHaveNothingToDoWithEncryption) {
  struct algorithm_and_purpose {
    std::uint32_t algorithm, purpose;
  };
  for (const algorithm_and_purpose& each : {algorithm_and_purpose{KM_ALGORITHM_EC, KM_PURPOSE_ENCRYPT},
                                            {KM_ALGORITHM_EC, KM_PURPOSE_DECRYPT},
                                            {KM_ALGORITHM_HMAC, KM_PURPOSE_ENCRYPT},
                                            {KM_ALGORITHM_HMAC, KM_PURPOSE_DECRYPT}}) {
    for (const list_commands& commands : by_purpose) {
      expect_unsupported(commands, each.algorithm, each.purpose, KM_ERROR_UNSUPPORTED_PURPOSE);
    }
  }
}

}  // namespace
}  // namespace testing_support
