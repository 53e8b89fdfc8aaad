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

bool is_value(const TEEC_Operation& operation, unsigned slot) {
  const std::uint32_t type = TEEC_PARAM_TYPE_GET(operation.paramTypes, slot);
  return type != TEEC_NONE && type <= TEEC_VALUE_INOUT;
}

fake_tee::slot_held held(const TEEC_Operation& operation, unsigned slot) {
  if (is_value(operation, slot)) {
    return {.a = operation.params[slot].value.a, .b = operation.params[slot].value.b};
  }
  const bool is_output = TEEC_PARAM_TYPE_GET(operation.paramTypes, slot) == TEEC_MEMREF_TEMP_OUTPUT;
  return {.data = input(operation, slot), .capacity = is_output ? operation.params[slot].tmpref.size : 0};
}

/// Says that all of `body` was written, whatever room there is.
void put(TEEC_Operation& operation, unsigned slot, const keymaster::client::bytes& body) {
  auto& out = operation.params[slot].tmpref;
  std::copy_n(body.begin(), std::min(body.size(), out.size), static_cast<std::uint8_t*>(out.buffer));
  out.size = body.size();
}

void put(TEEC_Operation& operation, const fake_tee::slot_answer& told) {
  const auto slot = static_cast<unsigned>(told.slot);
  if (is_value(operation, slot)) {
    operation.params[slot].value = {told.a, told.b};
  } else {
    put(operation, slot, told.body);
  }
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
  if (tee.open_result == TEEC_SUCCESS) {
    ++tee.open_sessions;
    tee.opened_tas.push_back(destination->timeLow);
  }
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
  for (unsigned slot = 0; slot < 4; ++slot) {
    seen.slots[slot] = held(*operation, slot);
  }
  const bool has_value = is_value(*operation, 0);
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
    seen.capacity = operation->params[2].tmpref.size;
    put(*operation, 2, answer.body);
  }
  tee.arrivals.push_back(seen);
  if (tee.at_command) {
    tee.at_command();
  }
  if (has_value) {
    value = {answer.a, answer.b};
  }
  for (const fake_tee::slot_answer& told : answer.slots) {
    put(*operation, told);
  }
  *origin = answer.origin;
  return answer.result;
}
