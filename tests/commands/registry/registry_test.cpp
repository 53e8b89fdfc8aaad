// The commands with an algorithm of the test's own in the registry's place: one that lacks what an algorithm may lack.
#include <gmock/gmock.h>

#include <cstring>

#include "keystore/key_blob.h"
#include "params/keymaster_protocol.h"
#include "ta/algorithm_registry.h"
#include "ta/dispatch.h"
#include "tests/commands/raw_session.h"
#include "tests/support/ta_client.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// What the registry knows: one algorithm, or none.
struct played_registry {
  bool has_algorithm = true;
  keymaster_algorithm_descriptor descriptor = {};
  bool has_purpose_ops = true;
  keymaster_purpose_ops ops = {};
};
played_registry registry;

const keymaster_purpose_ops* get_purpose_ops(uint32_t) {
  return registry.has_purpose_ops ? &registry.ops : nullptr;
}

uint32_t three() {
  return 3;
}
uint32_t none() {
  return 0;
}
void copy_values(uint8_t* values) {
  constexpr uint32_t all[] = {7, 8, 0x80000009};
  std::memcpy(values, all, sizeof all);
}

}  // namespace
}  // namespace testing_support

// The program's own look-ups go before those of the TA's library.
namespace keymaster {

std::span<const keymaster_algorithm_descriptor* const> algorithms() {
  return {};
}
const keymaster_algorithm_descriptor* find_algorithm(uint32_t algorithm) {
  const testing_support::played_registry& known = testing_support::registry;
  return known.has_algorithm && known.descriptor.algorithm == algorithm ? &known.descriptor : nullptr;
}
const keymaster_purpose_ops* find_purpose_ops(uint32_t algorithm, uint32_t purpose) {
  const keymaster_algorithm_descriptor* const found = find_algorithm(algorithm);
  return found == nullptr || found->get_purpose_ops == nullptr ? nullptr : found->get_purpose_ops(purpose);
}

}  // namespace keymaster

namespace testing_support {
namespace {

using trace_lines = std::vector<std::string>;

class RegistryTest : public TaUnitTest {
 protected:
  void SetUp() override {
    registry = played_registry();
    registry.descriptor.algorithm = KM_ALGORITHM_EC;
    registry.descriptor.name = "TEST";
    registry.descriptor.get_purpose_ops = get_purpose_ops;
    ASSERT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
    ta.clear_trace();
    started = ta.holdings();
  }
  void TearDown() override {  // the platform reclaims the rest of what an instance holds
    expect_same(ta.holdings(), started);
    TA_DestroyEntryPoint();
  }

  raw_answer invoke(std::uint32_t command, std::uint32_t types, TEE_Param (&params)[4]) {
    ta.clear_trace();
    const TEE_Result result = TA_InvokeCommandEntryPoint(nullptr, command, types, params);
    return {result, static_cast<std::int32_t>(params[0].value.a), params[0].value.b, params[2].memref.size};
  }
  raw_answer call(std::uint32_t command, std::uint32_t a, bytes request) {
    TEE_Param params[4] = {values(a, 0), memref(request), memref(response), {}};
    return invoke(command, with_both, params);
  }

  /// expect_refused expects that error, those lines, and no response.
  void expect_refused(const raw_answer& got, keymaster_error_t error, const trace_lines& lines) {
    EXPECT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.error, error);
    EXPECT_EQ(got.b, 0U);
    EXPECT_EQ(got.size, 0U);
    EXPECT_EQ(ta.errors(), lines);
    expect_same(ta.holdings(), started);
  }

  /// A sealed key of `algorithm`, with some bytes for key data.
  static bytes key_of(std::uint32_t algorithm) {
    const parameter_set characteristics = in_ta(param_list{}.add(KM_TAG_ALGORITHM, algorithm));
    bytes blob(512);
    std::uint32_t length = 0;
    if (save_key(pattern(36), characteristics, blob, &length) != TEE_SUCCESS) throw std::runtime_error("no blob");
    blob.resize(length);
    return blob;
  }
  raw_answer begin(std::uint32_t algorithm, std::uint32_t purpose) {
    return call(KM_COMMAND_BEGIN, purpose, join({prefixed(key_of(algorithm)), prefixed(u32(0))}));
  }

  hosted_tee::accounting started;
  bytes response = bytes(512, canary);
};

TEST_F(RegistryTest, AnAlgorithmThatServesNoPurposeIsNotImplemented) {
  registry.descriptor.get_purpose_ops = nullptr;
  // What asks for the private key asks the policy first, which knows of no purposes either.
  for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_VERIFY}) {
    expect_refused(begin(KM_ALGORITHM_EC, purpose), KM_ERROR_UNSUPPORTED_ALGORITHM, {"Algorithm 3 not implemented"});
  }
  expect_refused(begin(KM_ALGORITHM_EC, KM_PURPOSE_SIGN), KM_ERROR_UNSUPPORTED_PURPOSE, {"Authorization failed"});
}

TEST_F(RegistryTest, AnAlgorithmThatIsGoneIsNotImplemented) {
  registry.has_algorithm = false;
  for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_VERIFY}) {
    expect_refused(begin(KM_ALGORITHM_EC, purpose), KM_ERROR_UNSUPPORTED_ALGORITHM, {"Algorithm 3 not implemented"});
    expect_refused(begin(KM_ALGORITHM_RSA, purpose), KM_ERROR_UNSUPPORTED_ALGORITHM, {"Algorithm 1 not implemented"});
  }
  expect_refused(begin(KM_ALGORITHM_EC, KM_PURPOSE_SIGN), KM_ERROR_UNSUPPORTED_ALGORITHM, {"Authorization failed"});
}

TEST_F(RegistryTest, APurposeWithoutARecordOrAConstructorIsNamedInTheRefusal) {
  expect_refused(begin(KM_ALGORITHM_EC, KM_PURPOSE_VERIFY), KM_ERROR_UNSUPPORTED_PURPOSE,
                 {"Algorithm TEST purpose 3 not implemented"});
  registry.has_purpose_ops = false;
  expect_refused(begin(KM_ALGORITHM_EC, KM_PURPOSE_ENCRYPT), KM_ERROR_UNSUPPORTED_PURPOSE,
                 {"Algorithm TEST purpose 0 not implemented"});
}

TEST_F(RegistryTest, AConstructorThatFailsSilentlyFailsWithAnUnknownError) {
  registry.ops.create_operation = [](const operation_request&, TEE_Result*,
                                     keymaster_error_t*) -> keymaster_operation_t* { return nullptr; };
  expect_refused(begin(KM_ALGORITHM_EC, KM_PURPOSE_VERIFY), KM_ERROR_UNKNOWN_ERROR, {"Create operation failed"});
}

TEST_F(RegistryTest, AnAlgorithmWithoutExportExportsNothing) {
  for (const std::uint32_t algorithm : {KM_ALGORITHM_AES, KM_ALGORITHM_HMAC, KM_ALGORITHM_EC, KM_ALGORITHM_RSA}) {
    registry.descriptor.algorithm = algorithm;
    expect_refused(call(KM_COMMAND_EXPORT_KEY, 0, key_body(key_of(algorithm), {}, {})), KM_ERROR_UNSUPPORTED_ALGORITHM,
                   {"Unsupported algorithm"});
    EXPECT_EQ(response, bytes(512, canary));
  }
}

TEST_F(RegistryTest, AnAlgorithmWithoutGenerationOrImportMakesNoKeys) {
  const bytes params = param_list{}.add(KM_TAG_ALGORITHM, KM_ALGORITHM_EC).marshal();
  expect_refused(call(KM_COMMAND_GENERATE_KEY, 0, params), KM_ERROR_UNSUPPORTED_ALGORITHM, {});
  EXPECT_EQ(response, bytes(512, 0));
  response = bytes(512, canary);
  expect_refused(call(KM_COMMAND_IMPORT_KEY, 0, join({prefixed(params), pattern(20)})), KM_ERROR_UNSUPPORTED_ALGORITHM,
                 {"Unsupport import_key for algorithm TEST (3)"});
  EXPECT_EQ(response, bytes(512, 0));
}

/// A pair of commands on one list, the members that they ask, and the words for a list that isn't there.
struct list_row {
  std::uint32_t count_command, list_command;
  uint32_t (**count)();
  list_writer* copy;
  const char* line;
  keymaster_error_t unsupported;
};

class RegistryListTest : public RegistryTest {
 protected:
  static std::vector<list_row> rows() {
    keymaster_purpose_ops& ops = registry.ops;
    keymaster_algorithm_descriptor& of = registry.descriptor;
    constexpr keymaster_error_t no_purpose = KM_ERROR_UNSUPPORTED_PURPOSE,
                                no_algorithm = KM_ERROR_UNSUPPORTED_ALGORITHM;
    return {{KM_COMMAND_GET_SUPPORT_BLK_MODE_CNT, KM_COMMAND_GET_SUPPORT_BLK_MODE, &ops.get_support_block_mode_cnt,
             &ops.get_support_block_mode, "get_support_block_mode == NULL", no_purpose},
            {KM_COMMAND_GET_SUPPORT_PADDING_MODE_CNT, KM_COMMAND_GET_SUPPORT_PADDING_MODE,
             &ops.get_support_padding_mode_cnt, &ops.get_support_padding_mode, "get_support_padding_mode == NULL",
             no_purpose},
            {KM_COMMAND_GET_SUPPORT_DIGEST_CNT, KM_COMMAND_GET_SUPPORT_DIGEST, &ops.get_support_digest_cnt,
             &ops.get_support_digest, "get_support_digest == NULL", no_purpose},
            {KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT_CNT, KM_COMMAND_GET_SUPPORT_IMPORT_FORMAT,
             &of.get_support_import_format_cnt, &of.get_support_import_format, "get_support_import_format == NULL",
             no_algorithm},
            {KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT_CNT, KM_COMMAND_GET_SUPPORT_EXPORT_FORMAT,
             &of.get_support_export_format_cnt, &of.get_support_export_format, "get_support_export_format == NULL",
             no_algorithm}};
  }

  raw_answer count(const list_row& row) {
    TEE_Param params[4] = {values(KM_ALGORITHM_EC, 0), {}, {}, {}};
    return invoke(row.count_command, values_only, params);
  }
  raw_answer list(const list_row& row, std::size_t capacity) {
    response = bytes(capacity, canary);
    response.reserve(1);  // also an empty buffer has an address
    TEE_Param params[4] = {values(KM_ALGORITHM_EC, 0), {}, memref(response), {}};
    return invoke(row.list_command, with_response, params);
  }

  void expect_no_list(const list_row& row, std::size_t capacity, TEE_Result result, const char* line) {
    const raw_answer got = list(row, capacity);
    EXPECT_EQ(got.result, result);
    EXPECT_EQ(got.error, KM_ERROR_UNKNOWN_ERROR);
    EXPECT_EQ(ta.errors(), trace_lines{line});
    EXPECT_EQ(got.size, capacity);
    EXPECT_EQ(response, bytes(capacity, canary));
  }
};

TEST_F(RegistryListTest, ACountWithoutAListIsAFailureOnceTheSizeIsRight) {
  for (const list_row& row : rows()) {
    SCOPED_TRACE(row.line);
    *row.count = three;
    const raw_answer counted = count(row);
    EXPECT_EQ(counted.result, TEE_SUCCESS);
    EXPECT_EQ(counted.error, KM_ERROR_OK);
    EXPECT_EQ(counted.b, 3U);
    for (const std::size_t capacity : {0U, 11U, 13U, 16U}) {
      expect_no_list(row, capacity, TEE_ERROR_BAD_PARAMETERS, "Output buffer doesn't match");
    }
    expect_no_list(row, 12, TEE_ERROR_GENERIC, row.line);
    *row.count = none;
    expect_no_list(row, 0, TEE_ERROR_GENERIC, row.line);
  }
}

TEST_F(RegistryListTest, AListWithoutACountIsUnsupported) {
  for (const list_row& row : rows()) {
    SCOPED_TRACE(row.line);
    *row.copy = copy_values;
    for (const raw_answer& got : {count(row), list(row, 12), list(row, 0)}) {
      EXPECT_EQ(got.result, TEE_SUCCESS);
      EXPECT_EQ(got.error, row.unsupported);
      EXPECT_EQ(got.b, 0U);
      EXPECT_EQ(ta.errors(), trace_lines{});
    }
  }
}

TEST_F(RegistryListTest, EachCommandAsksForItsOwnList) {
  for (const list_row& row : rows()) {
    SCOPED_TRACE(row.line);
    *row.count = three;
    *row.copy = copy_values;
    const raw_answer got = list(row, 12);
    EXPECT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.error, KM_ERROR_OK);
    EXPECT_EQ(got.size, 12U);
    EXPECT_EQ(response, join({u32(7), u32(8), u32(0x80000009)}));
    *row.count = nullptr;
    *row.copy = nullptr;
  }
}

}  // namespace
}  // namespace testing_support
