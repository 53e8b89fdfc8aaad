// One TA instance as the platform's own code sees it: its heap, its handles, and the device it runs on.
#ifndef TEE_RUNTIME_INSTANCE_H_
#define TEE_RUNTIME_INSTANCE_H_

#include <memory>
#include <unordered_map>

#include "tee/runtime/faults.h"
#include "tee/runtime/handle_table.h"
#include "tee/runtime/instance_heap.h"
#include "tee_internal_api_extensions.h"
#include "tee_ta_image.h"

namespace hosted_tee {

/// What a TEE_ObjectHandle stands for: a transient object (tee/crypto) or an open persistent object (tee/storage).
class object {
 public:
  object() = default;
  object(const object&) = delete;
  object& operator=(const object&) = delete;
  virtual ~object() = default;
  [[nodiscard]] virtual bool is_persistent() const = 0;
  [[nodiscard]] virtual TEE_ObjectInfo info() const = 0;
};

/// What a TEE_OperationHandle stands for; tee/crypto defines it.
class operation;
struct operation_deleter {
  void operator()(operation* op) const;
};

class device_services;  // storage, clocks, identity: tee/runtime/device.h

/// Everything that dies with the instance. The tables own their content.
struct instance {
  instance(const TEE_UUID& ta, std::uint32_t heap_limit, device_services& services, fault_plan& plan);
  ~instance();
  instance(const instance&) = delete;
  instance& operator=(const instance&) = delete;

  TEE_UUID uuid;
  device_services& device;
  fault_plan& faults;
  instance_heap heap;
  handle_table<object, TEE_ObjectHandle> objects;
  // shared_ptr semantics are not needed: an operation belongs to its instance alone.
  std::unordered_map<std::uintptr_t, std::unique_ptr<operation, operation_deleter>> operations;
  std::uintptr_t next_operation = 0x1000;

  // What the image and the running call say; a bare instance of a unit test leaves them as they are.
  const char* trace_prefix = "";
  const tee_ta_property* properties = nullptr;  ///< ends with a null name; may be null
  const void* data = nullptr;                   ///< TEE_SetInstanceData
  TEE_Identity client{};                        ///< whose session is being served
  std::uint32_t param_types = 0;                ///< of the running call, with its parameters; null: no parameters
  const TEE_Param* params = nullptr;

  /// The sessions that this instance opened to other TAs: handle -> session of the secure world.
  handle_table<std::uint32_t, TEE_TASessionHandle> sessions;
};

/// current_instance is the instance whose code runs now (the innermost of nested calls). Calling a platform function
/// with none is a bug of the host program and aborts.
[[nodiscard]] instance& current_instance();

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_INSTANCE_H_
