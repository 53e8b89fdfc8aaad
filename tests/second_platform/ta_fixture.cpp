#include "tests/second_platform/ta_fixture.h"

#include <fmt/format.h>

#include <algorithm>
#include <memory>
#include <ostream>
#include <stdexcept>

#include "quil/quil_protocol.h"

using namespace keymaster;
using namespace testing_support;

namespace second_platform {
namespace {

bytes tlv(std::uint16_t tag, const bytes& value) {
  const auto low = [](std::size_t number) { return static_cast<std::uint8_t>(number & 0xFF); };
  const auto high = [](std::size_t number) { return static_cast<std::uint8_t>(number >> 8); };
  return join({{low(tag), high(tag), low(value.size()), high(value.size())}, value});
}

constexpr std::uint32_t types(std::uint32_t slot0, std::uint32_t slot1, std::uint32_t slot2) {
  return TEE_PARAM_TYPES(slot0, slot1, slot2, TEE_PARAM_TYPE_NONE);
}

bool answers_status(std::uint32_t command) {
  return command == KM_COMMAND_SOTER_EXPORT_ATTK_PUBLIC_KEY || command == KM_COMMAND_SOTER_GET_DEVICE_ID;
}

std::uint32_t parameter_types(std::uint32_t command, bool with_request, bool with_response) {
  const std::uint32_t slot1 = with_request ? TEE_PARAM_TYPE_MEMREF_INPUT : TEE_PARAM_TYPE_NONE;
  const std::uint32_t slot2 = with_response ? TEE_PARAM_TYPE_MEMREF_OUTPUT : TEE_PARAM_TYPE_NONE;
  if (command == KM_COMMAND_SOTER_SET_FID) return types(TEE_PARAM_TYPE_NONE, slot1, slot2);
  return types(answers_status(command) ? TEE_PARAM_TYPE_VALUE_OUTPUT : TEE_PARAM_TYPE_VALUE_INOUT, slot1, slot2);
}

/// Memory of exactly `size` bytes, so that a sanitizer sees the first byte beyond.
std::unique_ptr<std::uint8_t[]> exact(std::size_t size) {
  return std::make_unique<std::uint8_t[]>(size);
}

}  // namespace

std::ostream& operator<<(std::ostream& out, const outcome& shown) {
  return out << fmt::format("{{{:#010x}, {}}}", shown.result, shown.error);
}

command_answer ta::call(std::uint32_t command, std::uint32_t a, const std::optional<bytes>& request,
                        std::optional<std::uint32_t> capacity) {
  const auto sent = exact(request ? request->size() : 0);
  const auto response = exact(capacity.value_or(0));
  TEE_Param params[4] = {};
  params[0].value = {a, 0};
  if (request) {
    std::copy(request->begin(), request->end(), sent.get());
    params[1].memref = {sent.get(), static_cast<std::uint32_t>(request->size())};
  }
  if (capacity) params[2].memref = {response.get(), *capacity};
  command_answer answered;
  answered.result = TA_InvokeCommandEntryPoint(
      nullptr, command, parameter_types(command, request.has_value(), capacity.has_value()), params);
  answered.error = static_cast<std::int32_t>(params[0].value.a);
  answered.b = params[0].value.b;
  answered.reported = params[2].memref.size;
  if (capacity) answered.body.assign(response.get(), response.get() + std::min(answered.reported, *capacity));
  return answered;
}

command_answer ta::generate(const param_list& params, std::uint32_t capacity) {
  return call(KM_COMMAND_GENERATE_KEY, 0, params.marshal(), capacity);
}

command_answer ta::import_key(const param_list& params, const bytes& material, std::uint32_t capacity) {
  return call(KM_COMMAND_IMPORT_KEY, 0, join({prefixed(params.marshal()), material}), capacity);
}

command_answer ta::characteristics(const bytes& blob) {
  return call(KM_COMMAND_GET_KEY_CHARACTER, 0, join({prefixed(blob), prefixed({}), prefixed({})}), room);
}

command_answer ta::export_key(const bytes& blob) {
  return call(KM_COMMAND_EXPORT_KEY, 0, join({prefixed(blob), prefixed({}), prefixed({})}), room);
}

command_answer ta::begin(std::uint32_t purpose, const bytes& blob, const param_list& params) {
  return call(KM_COMMAND_BEGIN, purpose, join({prefixed(blob), prefixed(params.marshal())}), room);
}

command_answer ta::update(std::uint32_t handle, const bytes& input, const param_list& params, std::uint32_t capacity) {
  return call(KM_COMMAND_UPDATE, handle, join({prefixed(input), prefixed(params.marshal())}), capacity);
}

command_answer ta::finish(std::uint32_t handle, const bytes& input, const param_list& params, std::uint32_t capacity) {
  return call(KM_COMMAND_FINISH, handle, join({prefixed(input), prefixed(params.marshal())}), capacity);
}

command_answer ta::abort(std::uint32_t handle) {
  return call(KM_COMMAND_ABORT, handle, std::nullopt, std::nullopt);
}

command_answer ta::soter(std::uint32_t command) {
  return call(command, 0, std::nullopt, answers_status(command) ? std::optional{room} : std::nullopt);
}

bytes ta::must_generate(const param_list& params, std::uint32_t capacity) {
  const command_answer made = generate(params, capacity);
  if (made != outcome{}) throw std::runtime_error(fmt::format("generate: {:x} {}", made.result, made.error));
  return made.body;
}

std::uint32_t ta::must_begin(std::uint32_t purpose, const bytes& blob, const param_list& params) {
  const command_answer begun = begin(purpose, blob, params);
  if (begun != outcome{}) throw std::runtime_error(fmt::format("begin: {:x} {}", begun.result, begun.error));
  return begun.b;
}

void power_on() {
  platform.power_on();
  platform.key_box = join({tlv(QUIL_TAG_RSA_N, pattern(256)), tlv(QUIL_TAG_RSA_E, {1, 0, 1}),
                           tlv(QUIL_TAG_RSA_D, pattern(256, 2)), tlv(QUIL_TAG_RSA_P, pattern(128, 3)),
                           tlv(QUIL_TAG_RSA_Q, pattern(128, 4)), tlv(QUIL_TAG_RSA_DP, pattern(128, 5)),
                           tlv(QUIL_TAG_RSA_DQ, pattern(128, 6)), tlv(QUIL_TAG_RSA_QINV, pattern(128, 7))});
  platform.property_box = join({tlv(QUIL_TAG_FP_SENSOR_NAME, from_text("finger")),
                                tlv(QUIL_TAG_FP_SENSOR_VERSION, from_text("3.1")), tlv(QUIL_TAG_FP_UUID, pattern(16))});
  platform.cpu_id = from_text("cpu-17");
  platform.device_id = from_text("device-4");
}

SecondPlatformTest::SecondPlatformTest() = default;
SecondPlatformTest::~SecondPlatformTest() = default;

void SecondPlatformTest::SetUp() {
  power_on();
  ASSERT_EQ(TA_CreateEntryPoint(), TEE_SUCCESS);
  platform.clear();
}

void SecondPlatformTest::TearDown() {
  platform.no_more_departures();
  TA_DestroyEntryPoint();
  // The two key storage keys stay for the platform to take back, as does everything that a test left in the pool.
  EXPECT_EQ(platform.held(), (holdings{0, 2, 0, 0}));
  EXPECT_THAT(platform.violations(), ::testing::IsEmpty());
  platform.power_on();
}

param_list any_use(std::uint32_t algorithm, std::uint32_t bits) {
  param_list params;
  params.add(KM_TAG_ALGORITHM, algorithm).add(KM_TAG_KEY_SIZE, bits).add(KM_TAG_NO_AUTH_REQUIRED);
  for (std::uint32_t purpose = KM_PURPOSE_ENCRYPT; purpose <= KM_PURPOSE_VERIFY; ++purpose) {
    params.add(KM_TAG_PURPOSE, purpose);
  }
  return params;
}

param_list rsa_key(std::uint32_t bits) {
  param_list params = any_use(KM_ALGORITHM_RSA, bits);
  for (std::uint32_t padding = KM_PAD_NONE; padding <= KM_PAD_RSA_PKCS1_1_5_SIGN; ++padding) {
    params.add(KM_TAG_PADDING, padding);
  }
  params.add(KM_TAG_DIGEST, KM_DIGEST_NONE).add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
  return params.add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537);
}

param_list aes_key() {
  param_list params = any_use(KM_ALGORITHM_AES, 128);
  for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM}) {
    params.add(KM_TAG_BLOCK_MODE, mode);
  }
  params.add(KM_TAG_PADDING, KM_PAD_NONE).add(KM_TAG_PADDING, KM_PAD_PKCS7).add(KM_TAG_CALLER_NONCE);
  return params.add(KM_TAG_MIN_MAC_LENGTH, 96);
}

param_list ec_key(std::uint32_t bits) {
  return any_use(KM_ALGORITHM_EC, bits).add(KM_TAG_DIGEST, KM_DIGEST_NONE).add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
}

param_list hmac_key() {
  return any_use(KM_ALGORITHM_HMAC, 256).add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add(KM_TAG_MIN_MAC_LENGTH, 128);
}

param_list soter_key() {
  return rsa_key(2048).add(KM_TAG_SOTER_KEY).add(KM_TAG_SOTER_SIGNED_BY_ATTK).add(KM_TAG_SOTER_COUNTED);
}

param_list aes_params(std::uint32_t mode, std::uint32_t padding) {
  param_list params;
  params.add(KM_TAG_BLOCK_MODE, mode).add(KM_TAG_PADDING, padding);
  if (mode == KM_MODE_GCM) params.add(KM_TAG_MAC_LENGTH, 128);
  return params;
}

param_list digest_params(std::uint32_t digest, std::uint32_t padding) {
  return param_list{}.add(KM_TAG_DIGEST, digest).add(KM_TAG_PADDING, padding);
}

param_list mac_params(std::uint32_t bits) {
  return param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add(KM_TAG_MAC_LENGTH, bits);
}

}  // namespace second_platform
