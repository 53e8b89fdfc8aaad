#include "tests/client/fake_tee.h"

#include <algorithm>

namespace fake_tee {

state& now() {
  static state one;
  return one;
}

void reset() {
  now() = {};
}

}  // namespace fake_tee

namespace {

keymaster::client::bytes input(const TEEC_Operation& operation, unsigned slot) {
  if (TEEC_PARAM_TYPE_GET(operation.paramTypes, slot) != TEEC_MEMREF_TEMP_INPUT) return {};
  const auto& in = operation.params[slot].tmpref;
  const auto* const data = static_cast<const std::uint8_t*>(in.buffer);
  return {data, data + in.size};
}

}  // namespace

TEEC_Result TEEC_InitializeContext(const char* name, TEEC_Context* /*context*/) {
  auto& tee = fake_tee::now();
  tee.connected_to = name == nullptr ? "(default)" : name;
  tee.open_contexts += tee.connect_result == TEEC_SUCCESS ? 1 : 0;
  return tee.connect_result;
}

void TEEC_FinalizeContext(TEEC_Context* /*context*/) {
  --fake_tee::now().open_contexts;
}

TEEC_Result TEEC_OpenSession(TEEC_Context* /*context*/, TEEC_Session* /*session*/, const TEEC_UUID* destination,
                             uint32_t /*method*/, const void* /*data*/, TEEC_Operation* /*operation*/,
                             uint32_t* origin) {
  auto& tee = fake_tee::now();
  *origin = TEEC_ORIGIN_TEE;
  if (destination->timeLow == tee.absent_ta) return TEEC_ERROR_ITEM_NOT_FOUND;
  tee.open_sessions += tee.open_result == TEEC_SUCCESS ? 1 : 0;
  return tee.open_result;
}

void TEEC_CloseSession(TEEC_Session* /*session*/) {
  --fake_tee::now().open_sessions;
}

TEEC_Result TEEC_InvokeCommand(TEEC_Session* /*session*/, uint32_t command, TEEC_Operation* operation,
                               uint32_t* origin) {
  auto& tee = fake_tee::now();
  auto& value = operation->params[0].value;
  fake_tee::arrival seen{command, operation->paramTypes, 0, 0, input(*operation, 1), 0, input(*operation, 0)};
  const bool has_value = TEEC_PARAM_TYPE_GET(operation->paramTypes, 0) <= TEEC_VALUE_INOUT;
  if (has_value) {
    seen.a = value.a;
    seen.b = value.b;
  }
  fake_tee::answer answer;
  if (!tee.answers.empty()) {
    answer = tee.answers.front();
    tee.answers.pop_front();
  }
  if (TEEC_PARAM_TYPE_GET(operation->paramTypes, 2) == TEEC_MEMREF_TEMP_OUTPUT) {
    auto& out = operation->params[2].tmpref;
    seen.capacity = out.size;
    std::copy_n(answer.body.begin(), std::min(answer.body.size(), out.size), static_cast<std::uint8_t*>(out.buffer));
    out.size = answer.body.size();
  }
  tee.arrivals.push_back(seen);
  if (tee.at_command) {
    tee.at_command();
  }
  if (has_value) {
    value = {answer.a, answer.b};
  }
  *origin = answer.origin;
  return answer.result;
}
