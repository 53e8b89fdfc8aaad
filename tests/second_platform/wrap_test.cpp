// Lengths and counts whose sums and products pass 2^32: on the processor that the TA ships on they would wrap where
// somebody computed in its own width. Everything here must come out alike on any processor.
#include <fmt/format.h>

#include "algorithms/aes/aes_key.h"
#include "algorithms/hmac/hmac_key.h"
#include "algorithms/rsa/rsa_sign.h"
#include "params/marshal.h"
#include "platform/cursor.h"
#include "soter/public_key_pem.h"
#include "soter/tlv_box.h"
#include "tests/second_platform/ta_fixture.h"

using namespace keymaster;
using namespace testing_support;

namespace second_platform {
namespace {

constexpr outcome too_short = {TEE_ERROR_GENERIC, KM_ERROR_UNKNOWN_ERROR};

/// Lengths that wrap to something small when a header of 4, 8 or 24 bytes is added to them, or when they are doubled.
constexpr std::uint32_t near_the_end[] = {0x7FFFFFFF, 0x80000000, 0x80000001, 0xFFFFFFE8, 0xFFFFFFF0,
                                          0xFFFFFFF8, 0xFFFFFFFB, 0xFFFFFFFC, 0xFFFFFFFD, 0xFFFFFFFF};

class WrapTest : public SecondPlatformTest {
 protected:
  /// A blob of this platform, whose cipher hands the plaintext through.
  static bytes blob_around(const bytes& plaintext) {
    return join({{1}, bytes(64), bytes(12), fixed_output(16), plaintext});
  }

  void expect_error(const std::string& line) { EXPECT_EQ(platform.errors().at(0), line); }
};

TEST_F(WrapTest, CountsOfParametersWhoseRecordsPass32BitsFindNoMemory) {
  // Times 24: 2^32 + 8, 2^32 - 16, 6 * 2^32 and so on; the first would ask for 8 bytes and then read 178 million
  // records.
  for (const std::uint32_t count :
       {0x0AAAAAABU, 0x0AAAAAAAU, 0x10000000U, 0x15555556U, 0x80000000U, 0xAAAAAAABU, 0xFFFFFFFFU}) {
    SCOPED_TRACE(fmt::format("{:#x}", count));
    platform.clear();
    const bytes request = join({u32(count), bytes(1000)});
    EXPECT_EQ(keymaster_ta.call(KM_COMMAND_GENERATE_KEY, 0, request, ta::room),
              (outcome{TEE_ERROR_BAD_PARAMETERS, KM_ERROR_UNKNOWN_ERROR}));
    expect_error("unmarshal_records: Out of memory");
  }
}

TEST_F(WrapTest, ABlobLengthNear32BitsFindsNoMemory) {
  for (const std::uint32_t length : near_the_end) {
    platform.clear();
    const bytes record = join({u32(KM_TAG_APPLICATION_ID), u32(0), u64(0), u64(length)});
    const bytes request = join({u32(1), record, bytes(100)});
    EXPECT_EQ(keymaster_ta.call(KM_COMMAND_GENERATE_KEY, 0, request, ta::room),
              (outcome{TEE_ERROR_BAD_PARAMETERS, KM_ERROR_UNKNOWN_ERROR}));
    expect_error(fmt::format("unmarshal_record: Out of memory, require {}B", static_cast<std::int32_t>(length)));
  }
}

TEST_F(WrapTest, AMarshalledSizeBeyond32BitsStopsAtTheirEnd) {
  std::uint8_t byte = 0;
  keymaster_key_param_t params[3] = {};
  for (keymaster_key_param_t& param : params) {
    param.tag = KM_TAG_ASSOCIATED_DATA;
    param.blob.data = &byte;
    param.blob.data_length = 0x80000000;
  }
  const keymaster_key_param_set_t set = {params, 3};
  EXPECT_EQ(marshal_size(set, true), UINT32_MAX);
  std::uint8_t* buffer = nullptr;
  std::uint32_t length = 0;
  EXPECT_EQ(marshal(set, true, &buffer, &length), TEE_ERROR_OUT_OF_MEMORY);
  expect_error("marshal: Out of memory, need -1B");
  EXPECT_EQ(buffer, nullptr);
}

TEST_F(WrapTest, FieldsOfRequestsNear32BitsRunPastTheRequest) {
  const std::uint32_t handle =
      keymaster_ta.must_begin(KM_PURPOSE_SIGN, keymaster_ta.must_generate(hmac_key()), mac_params());
  ASSERT_NE(handle, 0U);
  EXPECT_EQ(keymaster_ta.abort(handle), outcome{});
  for (const std::uint32_t length : near_the_end) {
    SCOPED_TRACE(fmt::format("{:#x}", length));
    const bytes first = join({u32(length), bytes(64)});
    const bytes second = join({u32(4), bytes(4), u32(length), bytes(64)});
    for (const bytes& request : {first, second}) {
      platform.clear();
      EXPECT_EQ(keymaster_ta.call(KM_COMMAND_GET_KEY_CHARACTER, 0, request, ta::room), too_short);
      expect_error("read_field: Too short input");
      EXPECT_EQ(keymaster_ta.call(KM_COMMAND_EXPORT_KEY, 0, request, ta::room), too_short);
      EXPECT_EQ(keymaster_ta.call(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, request, ta::room), too_short);
    }
    EXPECT_EQ(keymaster_ta.call(KM_COMMAND_IMPORT_KEY, 0, first, ta::room), too_short);
    EXPECT_EQ(keymaster_ta.call(KM_COMMAND_DELETE_KEY, 0, first, std::nullopt), too_short);
  }
}

TEST_F(WrapTest, LengthsOfUpdateAndFinishNear32BitsEndTheOperation) {
  const bytes blob = keymaster_ta.must_generate(hmac_key());
  for (const std::uint32_t length : near_the_end) {
    for (const bytes& request : {join({u32(length), bytes(64)}), join({u32(4), bytes(4), u32(length), bytes(64)})}) {
      for (const std::uint32_t command : {KM_COMMAND_UPDATE, KM_COMMAND_FINISH}) {
        const std::uint32_t handle = keymaster_ta.must_begin(KM_PURPOSE_SIGN, blob, mac_params());
        EXPECT_EQ(keymaster_ta.call(command, handle, request, ta::room), too_short);
        EXPECT_EQ(keymaster_ta.abort(handle), (outcome{TEE_SUCCESS, KM_ERROR_INVALID_OPERATION_HANDLE}));
      }
    }
  }
}

TEST_F(WrapTest, LengthsInsideABlobNear32BitsAreFoundOut) {
  for (const std::uint32_t length : near_the_end) {
    SCOPED_TRACE(fmt::format("{:#x}", length));
    EXPECT_EQ(keymaster_ta.characteristics(blob_around(join({u32(length), bytes(40)}))),
              (outcome{TEE_SUCCESS, KM_ERROR_MEMORY_ALLOCATION_FAILED}));
    EXPECT_EQ(keymaster_ta.characteristics(blob_around(join({u32(4), bytes(4), u32(length), bytes(40)}))), too_short);
    EXPECT_EQ(keymaster_ta.characteristics(blob_around(join({u32(0), prefixed(join({u32(length), bytes(40)}))}))),
              (outcome{TEE_SUCCESS, KM_ERROR_INVALID_ARGUMENT}));
  }
}

TEST_F(WrapTest, LengthsInsideKeyMaterialNear32BitsAreFoundOut) {
  for (const std::uint32_t length : near_the_end) {
    SCOPED_TRACE(fmt::format("{:#x}", length));
    EXPECT_EQ(keymaster_ta.import_key(rsa_key(), join({prefixed(pattern(128)), u32(length), bytes(64)})), too_short);
    EXPECT_EQ(keymaster_ta.import_key(ec_key(), join({u32(256), prefixed(pattern(32)), u32(length), bytes(64)})),
              too_short);
  }
}

TEST_F(WrapTest, KeysWhoseBitsPass32BitsAreNotTakenForSmallOnes) {
  // 2^29 + 16 bytes: 2^32 + 128 bits. Nothing of them may be read, so there need not be so many.
  const std::uint8_t byte = 0;
  const std::span<const std::uint8_t> material{&byte, 0x20000010};
  struct import_of {
    decltype(&aes_import_key) run;
    param_list params;
  };
  for (import_of each : {import_of{aes_import_key, aes_key()}, import_of{hmac_import_key, hmac_key()}}) {
    for (const bool stated : {true, false}) {
      if (stated) each.params.remove(KM_TAG_KEY_SIZE).add(KM_TAG_KEY_SIZE, 128);
      if (!stated) each.params.remove(KM_TAG_KEY_SIZE);
      parameter_set params;
      ASSERT_EQ(unmarshal(each.params.marshal(), &params), TEE_SUCCESS);
      secret_bytes key_data;
      keymaster_error_t error = KM_ERROR_OK;
      EXPECT_EQ(each.run(&params, material, key_data, &error), TEE_SUCCESS);
      EXPECT_EQ(error, stated ? KM_ERROR_IMPORT_PARAMETER_MISMATCH : KM_ERROR_UNSUPPORTED_KEY_SIZE);
      EXPECT_FALSE(key_data);
    }
  }
}

struct soter_state {
  std::uint32_t capacity, length, input;
  std::uint32_t told;  // the size that is asked for, as the line has it
};

TEST_F(WrapTest, TheSoterBufferNeverGrowsPast32Bits) {
  const soter_state states[] = {{0xFFFFFFF0, 0xFFFFFFF0, 0x20, 0xFFFFFFFF},
                                {0x80000000, 0x80000000, 1, 0xFFFFFFFF},
                                {0x7FFFFFFF, 0x7FFFFFFF, 1, 0xFFFFFFFE},
                                {4096, 4096, 0xFFFFF000, 0xFFFFFFFF},
                                {4096, 4096, 0xFFFFEFFF, 0xFFFFFFFF}};
  const bytes input(1);
  for (const soter_state& state : states) {
    platform.clear();
    auto* const op = new_record<rsa_sign_operation_t>();
    ASSERT_NE(op, nullptr);
    ASSERT_TRUE(op->soter_buffer.allocate(16));
    op->soter_capacity = state.capacity;
    op->soter_length = state.length;
    std::uint32_t consumed = 0, output_length = 0;
    keymaster_error_t error = KM_ERROR_OK;
    EXPECT_EQ(
        rsa_sign_update(op, {nullptr, 0}, {input.data(), state.input}, &consumed, nullptr, &output_length, &error),
        TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_MEMORY_ALLOCATION_FAILED);
    expect_error(fmt::format("expand_soter_buffer: no memory to expand soter buf {}", state.told));
    EXPECT_EQ(op->soter_length, state.length);
    delete_record(op);
  }
}

TEST_F(WrapTest, AMessageWhoseLengthPasses32BitsDoesNotFitAnRsaBlock) {
  auto* const op = new_record<rsa_sign_operation_t>();
  ASSERT_NE(op, nullptr);
  ASSERT_TRUE(op->buffer.allocate(128));
  op->key_size = 1024;
  op->padding = KM_PAD_NONE;
  op->buffered = 64;
  const bytes input(1);
  for (const std::uint32_t size : {0xFFFFFFC0U, 0xFFFFFFC8U, 0xFFFFFFFFU}) {  // 64 bytes more: 0, 8 and 63
    platform.clear();
    std::uint32_t consumed = size, output_length = 0;
    keymaster_error_t error = KM_ERROR_OK;
    EXPECT_EQ(rsa_sign_update(op, {nullptr, 0}, {input.data(), size}, &consumed, nullptr, &output_length, &error),
              TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_INVALID_INPUT_LENGTH);
    EXPECT_EQ(consumed, 0U);
    EXPECT_EQ(op->buffered, 64U);
  }
  delete_record(op);
}

TEST_F(WrapTest, CursorsDoNotPassTheirEnd) {
  bytes data(32);
  for (const std::uint32_t length : near_the_end) {
    byte_reader in{data};
    byte_writer out{data};
    std::span<const std::uint8_t> read;
    std::span<std::uint8_t> place;
    std::uint32_t word = 0;
    EXPECT_TRUE(in.read_u32(word));
    EXPECT_TRUE(out.write_u32(length));
    EXPECT_FALSE(in.read_bytes(length, read));
    EXPECT_FALSE(in.copy_to(data.data(), length));
    EXPECT_FALSE(out.reserve(length, place));
    EXPECT_FALSE(out.write_bytes(data.data(), length));
    EXPECT_EQ(in.remaining(), 28U);
    EXPECT_EQ(out.written(), 4U);
  }
}

TEST_F(WrapTest, TextsAndBoxesBeyondTheirLimitsAreRefused) {
  const std::uint8_t byte = 0;
  // Four characters for three bytes: 2^32 of them, and 4 fewer.
  for (const std::uint32_t size : {0xC0000000U, 0xBFFFFFFEU, 0xBFFFFFFDU, 0xFFFFFFFFU}) {
    EXPECT_FALSE(base64_encode({&byte, size}));
  }
  tlv_box_owner box{tlv_box_create()};
  ASSERT_TRUE(box);
  for (const std::uint32_t length : {0x10000U, 0x10001U, 0x80000000U, 0xFFFFFFFCU, 0xFFFFFFFFU}) {
    EXPECT_EQ(tlv_box_put_bytes(box.get(), 1, &byte, length), -1);
    EXPECT_EQ(tlv_box_parse(&byte, length | 0x80000000U), nullptr);
  }
  EXPECT_EQ(tlv_box_get_size(box.get()), 0U);
}

TEST_F(WrapTest, LongValuesOfTheBoxHave32BitsOnEveryProcessor) {
  tlv_box_owner box{tlv_box_create()};
  ASSERT_TRUE(box);
  EXPECT_EQ(tlv_box_put_long(box.get(), 7, -2), 0);
  EXPECT_EQ(tlv_box_serialize(box.get()), 0);
  EXPECT_EQ(bytes(tlv_box_get_buffer(box.get()), tlv_box_get_buffer(box.get()) + tlv_box_get_size(box.get())),
            from_hex("07000400feffffff"));
  std::int32_t value = 0;
  EXPECT_EQ(tlv_box_get_long(box.get(), 7, &value), 0);
  EXPECT_EQ(value, -2);
}

}  // namespace
}  // namespace second_platform
