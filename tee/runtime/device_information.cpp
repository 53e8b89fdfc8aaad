// The TA "device information". It stands on the Internal Core API like any other TA, except that it may read the
// properties of TAs other than itself (get_ta_property).
#include "tee/runtime/device_information.h"

#include <algorithm>
#include <array>
#include <cstring>
#include <string_view>

#include "tee/client/device_information.h"
#include "tee/runtime/property.h"
#include "tee/runtime/uuid.h"

namespace hosted_tee {
namespace {

// Plain memory: a platform call that panics unwinds nothing here.
using name_buffer = std::array<char, device_information_name_limit + 1>;

// The memory is the client's and may change, so the name is read once, and judged in the TA's copy.
bool read_name(const TEE_Param& slot, name_buffer& name) {
  const auto& from = slot.memref;
  if (from.buffer == nullptr || from.size == 0 || from.size >= name.size()) return false;
  name = {};
  TEE_MemMove(name.data(), from.buffer, from.size);
  return std::string_view(name.data()).size() == from.size;
}

bool read_uuid(const TEE_Param& slot, TEE_UUID& uuid) {
  uuid_bytes bytes{};
  if (slot.memref.buffer == nullptr || slot.memref.size != bytes.size()) return false;
  TEE_MemMove(bytes.data(), slot.memref.buffer, slot.memref.size);
  uuid = from_bytes(bytes);
  return true;
}

// Hands the slot to `get` as the place for a property's value.
template <class Get>
TEE_Result answer_property(TEE_Param& slot, Get&& get) {
  auto& value = slot.memref;
  if (value.buffer == nullptr) value.size = 0;
  const TEE_Result result = get(static_cast<char*>(value.buffer), &value.size);
  if (result != TEE_SUCCESS && result != TEE_ERROR_SHORT_BUFFER) value.size = 0;
  return result;
}

TEE_Result get_tee_property(TEE_Param params[4]) {
  return answer_property(params[1], [&](char* value, std::uint32_t* length) -> TEE_Result {
    name_buffer name;
    if (!read_name(params[0], name)) return TEE_ERROR_BAD_PARAMETERS;
    return TEE_GetPropertyAsString(TEE_PROPSET_TEE_IMPLEMENTATION, name.data(), value, length);
  });
}

TEE_Result get_property_of_ta(TEE_Param params[4]) {
  return answer_property(params[2], [&](char* value, std::uint32_t* length) -> TEE_Result {
    TEE_UUID ta{};
    name_buffer name;
    if (!read_uuid(params[0], ta) || !read_name(params[1], name)) return TEE_ERROR_BAD_PARAMETERS;
    return get_ta_property(ta, name.data(), value, length);
  });
}

TEE_Result get_state(TEE_Param params[4]) {
  std::uint32_t rpmb = 0;
  params[0].value = {TEE_RPMB_MakeFileSystem(&rpmb) == TEE_SUCCESS ? 1U : 0U, 0};
  TEE_Time now{};
  TEE_GetSystemTime(&now);
  params[1].value = {now.seconds, now.millis};
  TEE_GetREETime(&now);
  params[2].value = {now.seconds, now.millis};
  return TEE_SUCCESS;
}

struct command_row {
  std::uint32_t number;
  std::uint32_t types;
  TEE_Result (*handler)(TEE_Param params[4]);
};

constexpr std::array<command_row, 3> commands{{
    {DEVICE_INFORMATION_GET_TEE_PROPERTY,
     TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT, TEE_PARAM_TYPE_NONE,
                     TEE_PARAM_TYPE_NONE),
     get_tee_property},
    {DEVICE_INFORMATION_GET_TA_PROPERTY,
     TEE_PARAM_TYPES(TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_INPUT, TEE_PARAM_TYPE_MEMREF_OUTPUT,
                     TEE_PARAM_TYPE_NONE),
     get_property_of_ta},
    {DEVICE_INFORMATION_GET_STATE,
     TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_OUTPUT, TEE_PARAM_TYPE_VALUE_OUTPUT, TEE_PARAM_TYPE_VALUE_OUTPUT,
                     TEE_PARAM_TYPE_NONE),
     get_state},
}};

TEE_Result create() {
  return TEE_SUCCESS;
}
void destroy() {}
TEE_Result open_session(uint32_t types, TEE_Param* /*params*/, void** /*context*/) {
  return types == 0 ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS;
}
void close_session(void* /*context*/) {}
TEE_Result invoke(void* /*context*/, uint32_t number, uint32_t types, TEE_Param params[4]) {
  const auto row = std::find_if(commands.begin(), commands.end(), [&](const auto& c) { return c.number == number; });
  if (row == commands.end()) return TEE_ERROR_NOT_SUPPORTED;
  return types == row->types ? row->handler(params) : TEE_ERROR_BAD_PARAMETERS;
}

constexpr std::uint32_t stack_size = 4096;
constexpr std::uint32_t heap_size = 4096;  // it allocates nothing

constexpr tee_ta_head head{DEVICE_INFORMATION_TA_UUID,
                           stack_size,
                           TEE_TA_FLAG_USER_MODE | TEE_TA_FLAG_SINGLE_INSTANCE | TEE_TA_FLAG_MULTI_SESSION,
                           tee_entry_open_session,
                           tee_entry_close_session,
                           tee_entry_invoke_command};

constexpr std::array<tee_ta_property, 8> properties{{
    {"gpd.ta.singleInstance", TEE_TA_PROPERTY_BOOL, 1, nullptr},
    {"gpd.ta.multiSession", TEE_TA_PROPERTY_BOOL, 1, nullptr},
    {"gpd.ta.instanceKeepAlive", TEE_TA_PROPERTY_BOOL, 0, nullptr},
    {"gpd.ta.dataSize", TEE_TA_PROPERTY_U32, heap_size, nullptr},
    {"gpd.ta.stackSize", TEE_TA_PROPERTY_U32, stack_size, nullptr},
    {"gpd.ta.version", TEE_TA_PROPERTY_STRING, 0, HOSTED_TEE_VERSION},
    {"gpd.ta.description", TEE_TA_PROPERTY_STRING, 0, "Reads properties for the normal world"},
    {nullptr, 0, 0, nullptr},
}};

}  // namespace

const builtin_ta& device_information_ta() {
  static constexpr builtin_ta parts{&head,   properties.data(), "DEVICE_INFORMATION", create,
                                    destroy, open_session,      close_session,        invoke};
  return parts;
}

}  // namespace hosted_tee
