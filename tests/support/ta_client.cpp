#include "tests/support/ta_client.h"

#include <fmt/format.h>

#include <stdexcept>

using namespace keymaster;

namespace testing_support {
namespace {

/// Parses a finish body; a failed command has none.
finish_answer parse_finish(const answer& raw) {
  finish_answer parsed;
  static_cast<answer&>(parsed) = raw;
  if (!raw.ok()) return parsed;
  const bytes body = raw.body();
  const std::uint32_t length = u32_at(body, 0);
  parsed.data.assign(body.begin() + 4, body.begin() + 4 + length);
  const std::uint32_t params_length = u32_at(body, 4 + length);
  parsed.out_params.assign(body.begin() + 8 + length, body.begin() + 8 + length + params_length);
  return parsed;
}

bytes must(const answer& a, const char* what) {
  if (!a.ok()) throw std::runtime_error(fmt::format("{}: result {:#x}, error {}", what, a.result, a.error));
  return a.body();
}

}  // namespace

ta_client::ta_client(const std::string& context_name, const TEEC_UUID& ta) {
  if (const TEEC_Result r = TEEC_InitializeContext(context_name.c_str(), &context_); r != TEEC_SUCCESS) {
    throw std::runtime_error(fmt::format("TEEC_InitializeContext({}): {:#x}", context_name, r));
  }
  std::uint32_t origin = 0;
  const TEEC_Result r = TEEC_OpenSession(&context_, &session_, &ta, TEEC_LOGIN_PUBLIC, nullptr, nullptr, &origin);
  if (r != TEEC_SUCCESS) {
    TEEC_FinalizeContext(&context_);
    throw std::runtime_error(fmt::format("TEEC_OpenSession: {:#x} from {}", r, origin));
  }
}

ta_client::~ta_client() {
  TEEC_CloseSession(&session_);
  TEEC_FinalizeContext(&context_);
}

answer ta_client::call(std::uint32_t command, std::uint32_t a, std::uint32_t b, const std::optional<bytes>& request,
                       std::optional<std::size_t> capacity) {
  const std::uint32_t types = TEEC_PARAM_TYPES(TEEC_VALUE_INOUT, request ? TEEC_MEMREF_TEMP_INPUT : TEEC_NONE,
                                               capacity ? TEEC_MEMREF_TEMP_OUTPUT : TEEC_NONE, TEEC_NONE);
  return call_types(command, types, a, b, request.value_or(bytes{}), capacity.value_or(0));
}

answer ta_client::call_types(std::uint32_t command, std::uint32_t types, std::uint32_t a, std::uint32_t b,
                             const bytes& request, std::size_t capacity) {
  answer reply;
  // One byte more than is offered, so that an empty buffer still has an address and an overrun shows.
  bytes body = request, space(capacity + 1, canary);
  body.push_back(canary);
  TEEC_Operation operation = {};
  operation.paramTypes = types;
  for (std::uint32_t slot = 0; slot < 4; ++slot) {
    switch (TEEC_PARAM_TYPE_GET(types, slot)) {
      case TEEC_VALUE_INPUT:
      case TEEC_VALUE_OUTPUT:
      case TEEC_VALUE_INOUT:
        operation.params[slot].value = {a, b};
        break;
      case TEEC_MEMREF_TEMP_INPUT:
        operation.params[slot].tmpref = {body.data(), request.size()};
        break;
      case TEEC_MEMREF_TEMP_OUTPUT:
      case TEEC_MEMREF_TEMP_INOUT:
        operation.params[slot].tmpref = {space.data(), capacity};
        break;
      default:
        break;
    }
  }
  reply.result = TEEC_InvokeCommand(&session_, command, &operation, &reply.origin);
  reply.error = static_cast<std::int32_t>(operation.params[0].value.a);
  reply.b = operation.params[0].value.b;
  if (TEEC_PARAM_TYPE_GET(types, 2) == TEEC_MEMREF_TEMP_OUTPUT) {
    reply.size = static_cast<std::uint32_t>(operation.params[2].tmpref.size);
  }
  if (space.back() != canary) throw std::runtime_error("the TA wrote past its response buffer");
  space.pop_back();
  reply.output = std::move(space);
  return reply;
}

bytes key_body(const bytes& blob, const bytes& app_id, const bytes& app_data) {
  return join({prefixed(blob), prefixed(app_id), prefixed(app_data)});
}

answer ta_client::generate(const param_list& params, std::size_t capacity) {
  return call(KM_COMMAND_GENERATE_KEY, 0, 0, params.marshal(), capacity);
}

answer ta_client::import_key(const param_list& params, const bytes& material, std::size_t capacity) {
  return call(KM_COMMAND_IMPORT_KEY, 0, 0, join({prefixed(params.marshal()), material}), capacity);
}

answer ta_client::characteristics_size(const bytes& blob, const bytes& app_id, const bytes& app_data) {
  return call(KM_COMMAND_GET_KEY_CHARACTER_SIZE, 0, 0, key_body(blob, app_id, app_data), std::nullopt);
}

answer ta_client::characteristics(const bytes& blob, const bytes& app_id, const bytes& app_data, std::size_t capacity) {
  return call(KM_COMMAND_GET_KEY_CHARACTER, 0, 0, key_body(blob, app_id, app_data), capacity);
}

answer ta_client::export_key(const bytes& blob, const bytes& app_id, const bytes& app_data, std::size_t capacity) {
  return call(KM_COMMAND_EXPORT_KEY, 0, 0, key_body(blob, app_id, app_data), capacity);
}

answer ta_client::delete_key(const bytes& blob) {
  return call(KM_COMMAND_DELETE_KEY, 0, 0, prefixed(blob), std::nullopt);
}

answer ta_client::delete_all() {
  return call(KM_COMMAND_DELETE_ALL_KEY, 0, 0, std::nullopt, std::nullopt);
}

answer ta_client::begin(std::uint32_t purpose, const bytes& blob, const param_list& params, std::size_t capacity) {
  return call(KM_COMMAND_BEGIN, purpose, 0, join({prefixed(blob), prefixed(params.marshal())}), capacity);
}

answer ta_client::update(std::uint32_t handle, const bytes& input, const param_list& params, std::size_t capacity) {
  return call(KM_COMMAND_UPDATE, handle, 0, join({prefixed(input), prefixed(params.marshal())}), capacity);
}

finish_answer ta_client::finish(std::uint32_t handle, const bytes& input, const param_list& params,
                                std::size_t capacity) {
  return parse_finish(
      call(KM_COMMAND_FINISH, handle, 0, join({prefixed(input), prefixed(params.marshal())}), capacity));
}

answer ta_client::abort(std::uint32_t handle) {
  return call(KM_COMMAND_ABORT, handle, 0, std::nullopt, std::nullopt);
}

bytes ta_client::must_generate(const param_list& params) {
  return must(generate(params), "generate_key");
}

bytes ta_client::must_import(const param_list& params, const bytes& material) {
  const bytes body = must(import_key(params, material), "import_key");
  return {body.begin() + 4, body.begin() + 4 + u32_at(body, 0)};
}

std::uint32_t ta_client::must_begin(std::uint32_t purpose, const bytes& blob, const param_list& params) {
  const answer a = begin(purpose, blob, params);
  (void)must(a, "begin");
  return a.b;
}

finish_answer ta_client::sign(const bytes& blob, const param_list& params, const bytes& message) {
  const answer begun = begin(KM_PURPOSE_SIGN, blob, params);
  if (!begun.ok()) return parse_finish(begun);
  if (const answer fed = update(begun.b, message); !fed.ok()) return parse_finish(fed);
  return finish(begun.b);
}

finish_answer ta_client::verify(const bytes& blob, const param_list& params, const bytes& message,
                                const bytes& signature) {
  const answer begun = begin(KM_PURPOSE_VERIFY, blob, params);
  if (!begun.ok()) return parse_finish(begun);
  if (const answer fed = update(begun.b, message); !fed.ok()) return parse_finish(fed);
  return finish(begun.b, signature);
}

}  // namespace testing_support
