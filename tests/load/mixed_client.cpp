#include "tests/load/mixed_client.h"

#include <fmt/format.h>

#include <array>
#include <optional>
#include <stdexcept>

#include "tests/load/carried_memory.h"

namespace load {

std::size_t below(std::mt19937& random, std::size_t limit) {
  return std::uniform_int_distribution<std::size_t>(0, limit - 1)(random);
}

mixed_client::~mixed_client() {
  for (const auto& session : added_) TEEC_CloseSession(session.get());
}

void mixed_client::open_session() {
  static constexpr TEEC_UUID ta = KEYMASTER_TA_UUID;
  auto session = std::make_unique<TEEC_Session>();
  const TEEC_Result opened =
      TEEC_OpenSession(&context_, session.get(), &ta, TEEC_LOGIN_PUBLIC, nullptr, nullptr, nullptr);
  if (opened != TEEC_SUCCESS) throw std::runtime_error(fmt::format("TEEC_OpenSession: {:#x}", opened));
  added_.push_back(std::move(session));
}

void mixed_client::close_session() {
  if (added_.empty()) throw std::runtime_error("there is no session to close");
  TEEC_CloseSession(added_.back().get());
  added_.pop_back();
}

answer mixed_client::call_types(std::uint32_t command, std::uint32_t types, std::uint32_t a, std::uint32_t b,
                                const bytes& request, std::size_t capacity) {
  TEEC_Operation operation = {};
  std::array<std::optional<carried_memory>, 4> memory;
  for (std::uint32_t slot = 0; slot < 4; ++slot) {
    std::uint32_t type = TEEC_PARAM_TYPE_GET(types, slot);
    if (type >= TEEC_MEMREF_TEMP_INPUT) {
      const bytes content = type == TEEC_MEMREF_TEMP_INPUT ? request : bytes(capacity, testing_support::canary);
      memory[slot].emplace(context_, static_cast<passage>(below(random_, passages)), content, type);
      memory[slot]->refer(operation.params[slot]);
      type = memory[slot]->type();
    } else if (type != TEEC_NONE) {
      operation.params[slot].value = {a, b};
    }
    operation.paramTypes |= type << (4 * slot);
  }
  const std::size_t which = below(random_, added_.size() + 1);
  answer reply;
  reply.result =
      TEEC_InvokeCommand(which == 0 ? &session_ : added_[which - 1].get(), command, &operation, &reply.origin);
  if (reply.origin != TEEC_ORIGIN_TRUSTED_APP) {
    throw std::runtime_error(fmt::format("command {:#x}: {:#x} from {}", command, reply.result, reply.origin));
  }
  if (TEEC_PARAM_TYPE_GET(types, 0) != TEEC_NONE) {
    reply.error = static_cast<std::int32_t>(operation.params[0].value.a);
    reply.b = operation.params[0].value.b;
  }
  for (std::uint32_t slot = 0; slot < 4; ++slot) {
    if (!memory[slot]) continue;
    if (TEEC_PARAM_TYPE_GET(types, slot) != TEEC_MEMREF_TEMP_INPUT) {
      reply.size = static_cast<std::uint32_t>(memory[slot]->size(operation.params[slot]));
      reply.output = memory[slot]->content();
    } else if (memory[slot]->content() != request) {
      throw std::runtime_error("the request was written to");
    }
  }
  return reply;
}

}  // namespace load
