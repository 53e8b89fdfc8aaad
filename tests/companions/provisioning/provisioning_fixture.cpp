#include "tests/companions/provisioning/provisioning_fixture.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {

ProvisioningTest::ProvisioningTest()
    : CompanionTest(
          quil_ta, "QUIL",
          {"quil.key", "quil.data", "quil.prop.1834.0000", "quil.prop.1734.173a", "quil.prop.1934.1936", "quil.lock"}) {
  as_keymaster_.emplace(tee.world(), quil_ta, as_keymaster);
}

void ProvisioningTest::restart() {
  as_keymaster_.reset();
  CompanionTest::restart();
  as_keymaster_.emplace(tee.world(), quil_ta, as_keymaster);
}

TEE_Result ProvisioningTest::put(std::uint32_t command, const bytes& data) {
  bytes sent = data;
  TEE_Param params[4] = {memory_slot(sent)};
  return invoke(command, 0x0005, params);
}

TEE_Result ProvisioningTest::put_property(const bytes& request, const bytes& value) {
  bytes name = request, content = value;
  TEE_Param params[4] = {memory_slot(name), memory_slot(content)};
  return invoke(COMMAND_PUT_PROPERTY, 0x0055, params);
}

quil_answer ProvisioningTest::generate(std::uint32_t bits, std::size_t capacity) {
  quil_answer answer{.buffer = bytes(capacity, canary)};
  TEE_Param params[4] = {value_slot(bits), memory_slot(answer.buffer)};
  answer.result = invoke(COMMAND_GENERATE_ATTK, 0x0061, params);
  answer.size = params[1].memref.size;
  return answer;
}

TEE_Result ProvisioningTest::lock() {
  TEE_Param params[4] = {};
  return invoke(COMMAND_LOCK, 0, params);
}

quil_answer ProvisioningTest::fetch(std::uint32_t command, std::size_t capacity) {
  quil_answer answer{.buffer = bytes(capacity, canary)};
  TEE_Param params[4] = {memory_slot(answer.buffer)};
  answer.result = invoke_as_keymaster(command, 0x0026, params);
  answer.size = params[0].memref.size;
  answer.length = params[1].value.a;
  return answer;
}

quil_answer ProvisioningTest::get_property(const bytes& request, std::size_t capacity) {
  bytes name = request;
  quil_answer answer{.buffer = bytes(capacity, canary)};
  TEE_Param params[4] = {memory_slot(name), memory_slot(answer.buffer)};
  answer.result = invoke_as_keymaster(QUIL_COMMAND_GET_PROPERTY, 0x0065, params);
  answer.size = params[1].memref.size;
  return answer;
}

std::optional<std::uint32_t> ProvisioningTest::status() {
  TEE_Param params[4] = {};
  const TEE_Result result = invoke(COMMAND_STATUS, 0x0002, params);
  EXPECT_EQ(result, TEE_SUCCESS);
  if (result != TEE_SUCCESS) return std::nullopt;
  return params[0].value.a;
}

}  // namespace testing_support
