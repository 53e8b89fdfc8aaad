#include "fuzz/fuzz_device.h"

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <stdexcept>
#include <string>

#include "src/params/keymaster_protocol.h"
#include "ta/ta_limits.h"
#include "tee/runtime/builtin_ta.h"
#include "tee/runtime/device.h"
#include "tee/runtime/instance_scope.h"
#include "tee_ta_image.h"

namespace fuzzing {
namespace {

constexpr TEE_UUID ta_uuid = KEYMASTER_TA_UUID;

void remove_state_at_exit(const std::filesystem::path& folder) {
  static std::filesystem::path to_remove;
  to_remove = folder;
  std::atexit([] {
    std::error_code ignored;
    std::filesystem::remove_all(to_remove, ignored);
  });
}

std::uint32_t natural_types(const command& what) {
  return TEE_PARAM_TYPES(TEE_PARAM_TYPE_VALUE_INOUT, what.request ? TEE_PARAM_TYPE_MEMREF_INPUT : TEE_PARAM_TYPE_NONE,
                         what.capacity ? TEE_PARAM_TYPE_MEMREF_OUTPUT : TEE_PARAM_TYPE_NONE, TEE_PARAM_TYPE_NONE);
}

bool is_memref(std::uint32_t type) {
  return type >= TEE_PARAM_TYPE_MEMREF_INPUT;
}

/// Commands 13 to 23 answer a Keymaster error in slot 0. TEE_ERROR_BAD_PARAMETERS may come from before their handlers,
/// when slot 0 is still the client's.
void require_failures_to_show(const command& what, const reply& answer) {
  if (what.id < keymaster::KM_COMMAND_GENERATE_KEY || what.id > keymaster::KM_COMMAND_ABORT) return;
  if (answer.result == TEE_SUCCESS || answer.result == TEE_ERROR_BAD_PARAMETERS) return;
  require(answer.a != 0, "a failed command says so in its Keymaster error");
}

}  // namespace

void require(bool holds, const char* invariant) {
  if (holds) return;
  std::fprintf(stderr, "invariant broken: %s\n", invariant);
  std::abort();
}

void in_fresh_instance(const std::function<void(hosted_tee::instance& instance)>& body) {
  static auto* const device = new hosted_tee::device_services;  // lives as long as the process
  hosted_tee::instance instance(ta_uuid, keymaster::ta_heap_size, *device, device->faults);
  const hosted_tee::instance_scope scope(instance);
  body(instance);
  require(instance.objects.size() == 0, "no key object stays");
  require(instance.heap.blocks() == 0, "nothing stays on the heap");
  device->trace.clear();
}

fuzz_device::fuzz_device() {
  hosted_tee::register_builtin_ta({&ta_head, ta_properties, tee_trace_prefix, TA_CreateEntryPoint, TA_DestroyEntryPoint,
                                   TA_OpenSessionEntryPoint, TA_CloseSessionEntryPoint, TA_InvokeCommandEntryPoint});
  std::string folder = (std::filesystem::temp_directory_path() / "keymaster-fuzz-XXXXXX").string();
  require(mkdtemp(folder.data()) != nullptr, "there is room for a state folder");
  remove_state_at_exit(folder);
  hosted_tee::world_options options;
  options.state = std::filesystem::path(folder) / "state";
  options.boot_seed = boot_seed;
  world_ = hosted_tee::secure_world::open(options);
}

void fuzz_device::open() {
  // Frozen clocks: an input runs the same way whenever it is run.
  world_->clock().set_system({7200, 250});
  world_->clock().set_ree({1'700'000'000, 500});
  world_->faults().clear();
  session_ = open_session({TEE_LOGIN_PUBLIC, {}});
}

std::uint32_t fuzz_device::open_session(const TEE_Identity& client) {
  TEE_Param params[4] = {};
  std::uint32_t session = 0, origin = 0;
  require(world_->open_session(ta_uuid, client, 0, params, session, origin) == TEE_SUCCESS, "a session opens");
  return session;
}

void fuzz_device::close() {
  world_->faults().clear();
  world_->close_session(session_);
  require(!world_->has_instance(ta_uuid), "the instance ends with its last session");
  require(holdings().same_holdings({}), "an instance that ended holds nothing");
  // The lines of the next input would else be taken for a leak of this one, and searched for.
  world_->trace().clear();
}

hosted_tee::accounting fuzz_device::holdings() const {
  return world_->account(ta_uuid);
}

reply fuzz_device::run_as(const TEE_Identity& client, const command& what) {
  const std::uint32_t session = open_session(client);
  const reply answer = run_in(session, what);
  world_->close_session(session);
  return answer;
}

reply fuzz_device::run_in(std::uint32_t session, const command& what) {
  const std::uint32_t types = what.types.value_or(natural_types(what));
  const std::size_t request_size = what.request ? what.request->size() : 0;
  const std::uint32_t capacity = what.capacity.value_or(0);
  const std::unique_ptr<std::uint8_t[]> request(new std::uint8_t[request_size]);
  const std::unique_ptr<std::uint8_t[]> response(new std::uint8_t[capacity]());
  if (what.request) std::copy(what.request->begin(), what.request->end(), request.get());

  TEE_Param params[4] = {};
  for (std::uint32_t slot = 0; slot < 4; ++slot) {
    const std::uint32_t type = TEE_PARAM_TYPE_GET(types, slot);
    if (!is_memref(type)) {
      if (type != TEE_PARAM_TYPE_NONE) params[slot].value = {what.a, what.b};
    } else if (slot == 1) {
      params[slot].memref = {request.get(), static_cast<std::uint32_t>(request_size)};
    } else {
      params[slot].memref = {response.get(), capacity};
    }
  }
  reply answer;
  std::uint32_t origin = 0;
  answer.result = world_->invoke(session, what.id, types, params, origin);
  require(answer.result != TEE_ERROR_TARGET_DEAD, "no request makes the TA panic");
  answer.a = params[0].value.a;
  answer.b = params[0].value.b;
  require_failures_to_show(what, answer);
  if (is_memref(TEE_PARAM_TYPE_GET(types, 2)) && answer.result == TEE_SUCCESS) {
    require(params[2].memref.size <= capacity, "a response lies within its buffer");
    answer.response.assign(response.get(), response.get() + params[2].memref.size);
  }
  return answer;
}

}  // namespace fuzzing
