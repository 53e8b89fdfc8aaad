// The commands of the provisioning TA.
#include "platform/cursor.h"
#include "platform/trace.h"
#include "tee/companions/common/command_table.h"
#include "tee/companions/common/stored_object.h"
#include "tee/companions/provisioning/key_box.h"
#include "tee/companions/provisioning/provisioning_protocol.h"
#include "tee/companions/provisioning/vault.h"

namespace keymaster::provisioning {
namespace {

using companion::answer_bytes;
using companion::caller_rule;
using companion::memref_bytes;

/// Copies what the client sent, and stores the copy; the client's memory can change meanwhile.
TEE_Result copy_in(const TEE_Param& slot, secret_bytes& copy) {
  if (copy.copy_of(memref_bytes(slot))) return TEE_SUCCESS;
  TRACE_ERROR("Out of memory\n");
  return TEE_ERROR_OUT_OF_MEMORY;
}

TEE_Result put_key(TEE_Param params[4]) {
  // A box that the Keymaster TA could not fetch is none.
  if (memref_bytes(params[0]).size() > QUIL_KEY_CAPACITY) {
    TRACE_ERROR("The box of the key is too long\n");
    return TEE_ERROR_BAD_FORMAT;
  }
  secret_bytes box;
  if (TEE_Result r = copy_in(params[0], box); r != TEE_SUCCESS) return r;
  if (!is_key_box(box.span())) {
    TRACE_ERROR("Not the box of a key\n");
    return TEE_ERROR_BAD_FORMAT;
  }
  return companion::write_stored(key_name, box.span());
}

TEE_Result put_data(TEE_Param params[4]) {
  if (memref_bytes(params[0]).size() > QUIL_KEY_CAPACITY) {
    TRACE_ERROR("The data is too long\n");
    return TEE_ERROR_BAD_PARAMETERS;
  }
  secret_bytes data;
  if (TEE_Result r = copy_in(params[0], data); r != TEE_SUCCESS) return r;
  return companion::write_stored(data_name, data.span());
}

/// Everything that can fail comes before the key is stored, and the storing is one step: whatever fails, there is the
/// old key or the new one.
TEE_Result generate_attk(TEE_Param params[4]) {
  if (params[0].value.a != attk_bits) {
    TRACE_ERROR("No attestation key has %u bits\n", params[0].value.a);
    return TEE_ERROR_NOT_SUPPORTED;
  }
  if (TEE_Result r = companion::check_room(params[1], public_key_size); r != TEE_SUCCESS) return r;
  object_handle key;
  if (TEE_Result r = make_attestation_key(key); r != TEE_SUCCESS) return r;
  heap_bytes der;
  if (TEE_Result r = export_public_key(key, der); r != TEE_SUCCESS) return r;
  tlv_box_owner box;
  if (TEE_Result r = make_key_box(key, box); r != TEE_SUCCESS) return r;
  const std::span<const uint8_t> serialized{tlv_box_get_buffer(box.get()), tlv_box_get_size(box.get())};
  if (TEE_Result r = companion::write_stored(key_name, serialized); r != TEE_SUCCESS) return r;
  return answer_bytes(params[1], der.span());
}

/// Takes the four bytes of a property request.
TEE_Result read_request(const TEE_Param& slot, quil_property_request* request) {
  byte_reader in{memref_bytes(slot)};
  if (in.copy_to(request, sizeof *request) && in.remaining() == 0) return TEE_SUCCESS;
  TRACE_ERROR("A property request has 4 bytes, not %u\n", slot.memref.size);
  return TEE_ERROR_BAD_PARAMETERS;
}

TEE_Result put_property(TEE_Param params[4]) {
  quil_property_request property = {};
  if (TEE_Result r = read_request(params[0], &property); r != TEE_SUCCESS) return r;
  const std::size_t size = memref_bytes(params[1]).size();
  if (size == 0 || size > property_limit) {
    TRACE_ERROR("A property has 1 to %u bytes\n", property_limit);
    return TEE_ERROR_BAD_PARAMETERS;
  }
  secret_bytes value;
  if (TEE_Result r = copy_in(params[1], value); r != TEE_SUCCESS) return r;
  return companion::write_stored(property_name(property).view(), value.span());
}

TEE_Result get_property(TEE_Param params[4]) {
  quil_property_request property = {};
  if (TEE_Result r = read_request(params[0], &property); r != TEE_SUCCESS) return r;
  secret_bytes value;
  const TEE_Result result = companion::read_stored(property_name(property).view(), property_limit, value);
  return result == TEE_SUCCESS ? answer_bytes(params[1], value.span()) : result;
}

/// Answers the key or the data; slot 1 tells the length once more.
TEE_Result fetch(std::string_view name, TEE_Param params[4]) {
  secret_bytes content;
  if (TEE_Result r = companion::read_stored(name, QUIL_KEY_CAPACITY, content); r != TEE_SUCCESS) return r;
  params[1].value.a = content.size();
  return answer_bytes(params[0], content.span());
}

TEE_Result get_key(TEE_Param params[4]) {
  return fetch(key_name, params);
}

TEE_Result get_data(TEE_Param params[4]) {
  return fetch(data_name, params);
}

TEE_Result lock_device(TEE_Param /*params*/[4]) {
  return lock();
}

TEE_Result tell_status(TEE_Param params[4]) {
  return find_status(&params[0].value.a);
}

/// The commands that change what a lock protects.
template <TEE_Result (*Handler)(TEE_Param[4])>
TEE_Result until_locked(TEE_Param params[4]) {
  bool locked = true;
  if (TEE_Result r = is_locked(&locked); r != TEE_SUCCESS) return r;
  if (!locked) return Handler(params);
  TRACE_ERROR("The device is locked\n");
  return TEE_ERROR_ACCESS_DENIED;
}

constexpr uint32_t no_slots = TEE_PARAM_TYPES(0, 0, 0, 0);
constexpr uint32_t bytes_in = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0, 0);
constexpr uint32_t two_bytes_in = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_INPUT, 0, 0);
constexpr uint32_t bytes_in_and_out = TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT, 0, 0);
constexpr uint32_t value_in_bytes_out = TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT, 0, 0);
constexpr uint32_t bytes_and_value_out =
    TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_OUTPUT, TEE_PARAM_TYPE_VALUE_OUTPUT, 0, 0);
constexpr uint32_t value_out = TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_OUTPUT, 0, 0, 0);
static_assert(bytes_in == 0x0005 && two_bytes_in == 0x0055 && bytes_in_and_out == 0x0065 &&
              value_in_bytes_out == 0x0061 && bytes_and_value_out == 0x0026 && value_out == 0x0002);

constexpr companion::command_row rows[] = {
    {COMMAND_PUT_KEY, "put_key", bytes_in, caller_rule::normal_world, until_locked<put_key>},
    {QUIL_COMMAND_GET_KEY, "get_key", bytes_and_value_out, caller_rule::keymaster_ta, get_key},
    {COMMAND_PUT_DATA, "put_data", bytes_in, caller_rule::normal_world, until_locked<put_data>},
    {QUIL_COMMAND_GET_DATA, "get_data", bytes_and_value_out, caller_rule::keymaster_ta, get_data},
    {COMMAND_GENERATE_ATTK, "generate_attk", value_in_bytes_out, caller_rule::normal_world,
     until_locked<generate_attk>},
    {COMMAND_PUT_PROPERTY, "put_property", two_bytes_in, caller_rule::normal_world, until_locked<put_property>},
    {QUIL_COMMAND_GET_PROPERTY, "get_property", bytes_in_and_out, caller_rule::keymaster_ta, get_property},
    {COMMAND_LOCK, "lock", no_slots, caller_rule::normal_world, lock_device},
    {COMMAND_STATUS, "status", value_out, caller_rule::anybody, tell_status},
};

}  // namespace
}  // namespace keymaster::provisioning

constinit const std::span<const keymaster::companion::command_row> keymaster::companion::commands =
    keymaster::provisioning::rows;
