#include "ta/dispatch.h"

#include <algorithm>
#include <array>

#include "params/keymaster_protocol.h"
#include "platform/trace.h"
#include "soter/soter_handlers.h"
#include "ta/capability_commands.h"
#include "ta/command_slots.h"
#include "ta/key_commands.h"
#include "ta/operation_commands.h"

namespace keymaster {
namespace {

/// What slot 0 must hold on entry. Words that carry a result back come cleared, as a contract with the client.
enum class slot0_rule { any, b_zero, both_zero };

using command_handler = TEE_Result (*)(TEE_Param params[4]);

struct command_entry {
  uint32_t id;
  const char* name;
  uint32_t param_types;
  slot0_rule rule;
  command_handler handler;
};

// The layouts in use: slot 0 small values, slot 1 the request, slot 2 the response.
constexpr uint32_t values_only = TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INOUT, 0, 0, 0);
constexpr uint32_t with_request = TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INOUT, TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0);
constexpr uint32_t with_response = TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INOUT, 0, TEE_PARAM_TYPE_MEMREF_OUTPUT, 0);
constexpr uint32_t with_both =
    TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INOUT, TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT, 0);
constexpr uint32_t status_and_response =
    TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_OUTPUT, 0, TEE_PARAM_TYPE_MEMREF_OUTPUT, 0);
constexpr uint32_t request_only = TEE_PARAM_TYPES(0, TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0);
static_assert(values_only == 0x0003 && with_request == 0x0053 && with_response == 0x0603 && with_both == 0x0653 &&
              status_and_response == 0x0602 && request_only == 0x0050);

void answer(TEE_Param params[4], TEE_Result result, keymaster_error_t error) {
  params[0].value.a = static_cast<uint32_t>(settle_error(result, error));
}

/// A failed command reports no response.
void answer_response(TEE_Param params[4], TEE_Result result, keymaster_error_t error, uint32_t length) {
  params[2].memref.size = result == TEE_SUCCESS && error == KM_ERROR_OK ? length : 0;
  answer(params, result, error);
}

/// The shapes of handlers, as entries of the table.
template <TEE_Result (*Count)(uint32_t, uint32_t, uint32_t*, keymaster_error_t*)>
TEE_Result purpose_count(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  uint32_t count = 0;
  const TEE_Result result = Count(params[0].value.a, params[0].value.b, &count, &error);
  params[0].value.b = count;
  answer(params, result, error);
  return result;
}

template <TEE_Result (*List)(uint32_t, uint32_t, std::span<uint8_t>, keymaster_error_t*)>
TEE_Result purpose_list(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = List(params[0].value.a, params[0].value.b, memref_bytes(params[2]), &error);
  answer(params, result, error);
  return result;
}

template <TEE_Result (*Count)(uint32_t, uint32_t*, keymaster_error_t*)>
TEE_Result format_count(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  uint32_t count = 0;
  const TEE_Result result = Count(params[0].value.a, &count, &error);
  params[0].value.b = count;
  answer(params, result, error);
  return result;
}

template <TEE_Result (*List)(uint32_t, std::span<uint8_t>, keymaster_error_t*)>
TEE_Result format_list(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = List(params[0].value.a, memref_bytes(params[2]), &error);
  answer(params, result, error);
  return result;
}

template <TEE_Result (*Command)(std::span<const uint8_t>, std::span<uint8_t>, uint32_t*, keymaster_error_t*)>
TEE_Result request_response(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  uint32_t length = 0;
  const TEE_Result result = Command(memref_bytes(params[1]), memref_bytes(params[2]), &length, &error);
  answer_response(params, result, error, length);
  return result;
}

/// begin and update: slot 0 names a purpose or a handle, and takes a number back.
template <TEE_Result (*Command)(uint32_t, std::span<const uint8_t>, std::span<uint8_t>, uint32_t*, keymaster_error_t*,
                                uint32_t*)>
TEE_Result operation_step(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  uint32_t length = 0, number = 0;
  const TEE_Result result =
      Command(params[0].value.a, memref_bytes(params[1]), memref_bytes(params[2]), &length, &error, &number);
  params[0].value.b = number;
  answer_response(params, result, error, length);
  return result;
}

TEE_Result count_algorithms(TEE_Param params[4]) {
  params[0].value.a = get_support_algo_cnt();
  return TEE_SUCCESS;
}

TEE_Result list_algorithms(TEE_Param params[4]) {
  return get_support_algo(memref_bytes(params[2]));
}

TEE_Result describe_key_size(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  uint32_t size = 0;
  const TEE_Result result = get_key_character_size(memref_bytes(params[1]), &error, &size);
  params[0].value.b = size;
  answer(params, result, error);
  return result;
}

TEE_Result finish_operation(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  uint32_t length = 0;
  const TEE_Result result =
      finish(params[0].value.a, memref_bytes(params[1]), memref_bytes(params[2]), &length, &error);
  answer_response(params, result, error, length);
  return result;
}

TEE_Result delete_one(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = delete_key(memref_bytes(params[1]), &error);
  answer(params, result, error);
  return result;
}

TEE_Result delete_all(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = delete_all_key(&error);
  answer(params, result, error);
  return result;
}

TEE_Result abort_operation(TEE_Param params[4]) {
  keymaster_error_t error = KM_ERROR_OK;
  const TEE_Result result = abort(params[0].value.a, &error);
  answer(params, result, error);
  return result;
}

TEE_Result soter_generate(TEE_Param params[4]) {
  return soter_handle_generate_attk_key_pair(params[0].value.a, &params[0]);
}
TEE_Result soter_verify(TEE_Param params[4]) {
  return soter_handle_verify_attk_key_pair(&params[0]);
}
TEE_Result soter_export(TEE_Param params[4]) {
  return soter_handle_export_attk_public_key(&params[2], &params[0]);
}
TEE_Result soter_device_id(TEE_Param params[4]) {
  return soter_handle_get_device_id(&params[2], &params[0]);
}
TEE_Result soter_set_fid(TEE_Param params[4]) {
  const std::span<uint8_t> body = memref_bytes(params[1]);
  return soter_handle_setFid(body.data(), static_cast<uint32_t>(body.size()));
}

constexpr std::array<command_entry, 28> commands = {{
    {1, "get_support_algo_cnt", values_only, slot0_rule::both_zero, count_algorithms},
    {2, "get_support_algo", with_response, slot0_rule::both_zero, list_algorithms},
    {3, "get_support_blk_mode_cnt", values_only, slot0_rule::any, purpose_count<get_support_blk_mode_cnt>},
    {4, "get_support_blk_mode", with_response, slot0_rule::any, purpose_list<get_support_blk_mode>},
    {5, "get_support_padding_mode_cnt", values_only, slot0_rule::any, purpose_count<get_support_padding_mode_cnt>},
    {6, "get_support_padding_mode", with_response, slot0_rule::any, purpose_list<get_support_padding_mode>},
    {7, "get_support_digest_cnt", values_only, slot0_rule::any, purpose_count<get_support_digest_cnt>},
    {8, "get_support_digest", with_response, slot0_rule::any, purpose_list<get_support_digest>},
    {9, "get_support_import_format_cnt", values_only, slot0_rule::b_zero, format_count<get_support_import_format_cnt>},
    {10, "get_support_import_format", with_response, slot0_rule::b_zero, format_list<get_support_import_format>},
    {11, "get_support_export_format_cnt", values_only, slot0_rule::b_zero, format_count<get_support_export_format_cnt>},
    {12, "get_support_export_format", with_response, slot0_rule::b_zero, format_list<get_support_export_format>},
    {13, "generate_key", with_both, slot0_rule::both_zero, request_response<generate_key>},
    {14, "get_key_character_size", with_request, slot0_rule::both_zero, describe_key_size},
    {15, "get_key_character", with_both, slot0_rule::both_zero, request_response<get_key_character>},
    {16, "begin", with_both, slot0_rule::b_zero, operation_step<begin>},
    {17, "update", with_both, slot0_rule::b_zero, operation_step<update>},
    {18, "finish", with_both, slot0_rule::b_zero, finish_operation},
    {19, "import_key", with_both, slot0_rule::both_zero, request_response<import_key>},
    {20, "export_key", with_both, slot0_rule::both_zero, request_response<export_key>},
    {21, "delete_key", with_request, slot0_rule::both_zero, delete_one},
    {22, "delete_all_key", values_only, slot0_rule::both_zero, delete_all},
    {23, "_abort", values_only, slot0_rule::b_zero, abort_operation},
    {0xFF00, "soter_handle_generate_attk_key_pair", values_only, slot0_rule::b_zero, soter_generate},
    {0xFF01, "soter_handle_verify_attk_key_pair", values_only, slot0_rule::both_zero, soter_verify},
    {0xFF02, "soter_handle_export_attk_public_key", status_and_response, slot0_rule::both_zero, soter_export},
    {0xFF03, "soter_handle_get_device_id", status_and_response, slot0_rule::both_zero, soter_device_id},
    {0xFF04, "soter_handle_setFid", request_only, slot0_rule::any, soter_set_fid},
}};
static_assert(std::is_sorted(commands.begin(), commands.end(),
                             [](const command_entry& a, const command_entry& b) { return a.id < b.id; }));
static_assert(commands[KM_COMMAND_BEGIN - 1].id == KM_COMMAND_BEGIN &&
              commands[KM_COMMAND_ABORT - 1].id == KM_COMMAND_ABORT);

bool values_allowed(slot0_rule rule, const TEE_Param& slot0) {
  switch (rule) {
    case slot0_rule::any:
      return true;
    case slot0_rule::b_zero:
      return slot0.value.b == 0;
    case slot0_rule::both_zero:
      return slot0.value.a == 0 && slot0.value.b == 0;
  }
  return false;
}

}  // namespace

TEE_Result dispatch(uint32_t command, uint32_t param_types, TEE_Param params[4]) {
  const auto entry = std::find_if(commands.begin(), commands.end(),
                                  [command](const command_entry& candidate) { return candidate.id == command; });
  if (entry == commands.end()) {
    TRACE_ERROR("Unknown command %x\n", command);
    return TEE_ERROR_BAD_PARAMETERS;
  }
  TRACE_INFO("%s", entry->name);
  if (param_types != entry->param_types) {
    // The command that another TA sends is the one whose line tells the types.
    if (command == KM_COMMAND_SOTER_SET_FID) {
      TRACE_ERROR("Bad argument type 0x%x\n", param_types);
    } else {
      TRACE_ERROR("Bad argument type\n");
    }
    return TEE_ERROR_BAD_PARAMETERS;
  }
  if (!values_allowed(entry->rule, params[0])) {
    TRACE_ERROR("Bad argument\n");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  return entry->handler(params);
}

}  // namespace keymaster
