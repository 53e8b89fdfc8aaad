// Owners of platform handles: move-only, empty or holding exactly one, freed when they go.
#ifndef KEYMASTER_PLATFORM_HANDLES_H_
#define KEYMASTER_PLATFORM_HANDLES_H_

#include <utility>

#include "tee_internal_api.h"

namespace keymaster {

/// basic_handle owns a handle of type `Handle` that `Free` gives back.
template <class Handle, void (*Free)(Handle)>
class basic_handle {
 public:
  basic_handle() = default;
  explicit basic_handle(Handle handle) : handle_(handle) {}
  basic_handle(basic_handle&& other) noexcept : handle_(other.release()) {}
  basic_handle& operator=(basic_handle&& other) noexcept {
    if (this != &other) reset(other.release());
    return *this;
  }
  basic_handle(const basic_handle&) = delete;
  basic_handle& operator=(const basic_handle&) = delete;
  ~basic_handle() { reset(); }

  void reset(Handle handle = TEE_HANDLE_NULL) {
    const Handle old = std::exchange(handle_, handle);
    if (old != TEE_HANDLE_NULL) Free(old);
  }
  [[nodiscard]] Handle release() { return std::exchange(handle_, Handle{TEE_HANDLE_NULL}); }
  [[nodiscard]] Handle get() const { return handle_; }
  [[nodiscard]] explicit operator bool() const { return handle_ != TEE_HANDLE_NULL; }

 protected:
  Handle handle_ = TEE_HANDLE_NULL;
};

/// object_handle owns a transient object.
class object_handle : public basic_handle<TEE_ObjectHandle, TEE_FreeTransientObject> {
 public:
  using basic_handle::basic_handle;

  /// allocate makes an uninitialised object. On failure the owner is empty and the platform's result comes back.
  [[nodiscard]] TEE_Result allocate(TEE_ObjectType type, uint32_t max_key_size) {
    reset();
    const TEE_Result result = TEE_AllocateTransientObject(type, max_key_size, &handle_);
    if (result != TEE_SUCCESS) handle_ = TEE_HANDLE_NULL;
    return result;
  }
};

/// persistent_object owns an open persistent object; closing it leaves the object in storage.
class persistent_object : public basic_handle<TEE_ObjectHandle, TEE_CloseObject> {
 public:
  using basic_handle::basic_handle;

  [[nodiscard]] TEE_Result open(uint32_t storage, const void* id, uint32_t id_length, uint32_t flags) {
    reset();
    const TEE_Result result = TEE_OpenPersistentObject(storage, id, id_length, flags, &handle_);
    if (result != TEE_SUCCESS) handle_ = TEE_HANDLE_NULL;
    return result;
  }
  [[nodiscard]] TEE_Result create(uint32_t storage, const void* id, uint32_t id_length, uint32_t flags,
                                  const void* data, uint32_t data_length) {
    reset();
    const TEE_Result result =
        TEE_CreatePersistentObject(storage, id, id_length, flags, TEE_HANDLE_NULL, data, data_length, &handle_);
    if (result != TEE_SUCCESS) handle_ = TEE_HANDLE_NULL;
    return result;
  }

  /// read reads up to `size` bytes from where the object stands; `*count` tells how many came. Without an object it is
  /// TEE_ERROR_BAD_PARAMETERS: the platform would end the instance for a null handle.
  [[nodiscard]] TEE_Result read(void* bytes, uint32_t size, uint32_t* count) const {
    *count = 0;
    if (handle_ == TEE_HANDLE_NULL) return TEE_ERROR_BAD_PARAMETERS;
    return TEE_ReadObjectData(handle_, bytes, size, count);
  }
};

/// operation_handle owns a cryptographic operation.
class operation_handle : public basic_handle<TEE_OperationHandle, TEE_FreeOperation> {
 public:
  using basic_handle::basic_handle;

  /// allocate makes an operation without a key. On failure the owner is empty and the platform's result comes back.
  [[nodiscard]] TEE_Result allocate(uint32_t algorithm, uint32_t mode, uint32_t max_key_size) {
    reset();
    const TEE_Result result = TEE_AllocateOperation(&handle_, algorithm, mode, max_key_size);
    if (result != TEE_SUCCESS) handle_ = TEE_HANDLE_NULL;
    return result;
  }
};

/// ta_session owns a session to another TA.
class ta_session : public basic_handle<TEE_TASessionHandle, TEE_CloseTASession> {
 public:
  using basic_handle::basic_handle;

  /// open opens a session without parameters. On failure the owner is empty and the platform's result comes back.
  [[nodiscard]] TEE_Result open(const TEE_UUID& destination) {
    reset();
    TEE_Param unused[4] = {};
    const TEE_Result result =
        TEE_OpenTASession(&destination, TEE_TIMEOUT_INFINITE, TEE_PARAM_TYPES(0, 0, 0, 0), unused, &handle_, nullptr);
    if (result != TEE_SUCCESS) handle_ = TEE_HANDLE_NULL;
    return result;
  }

  [[nodiscard]] TEE_Result invoke(uint32_t command, uint32_t param_types, TEE_Param params[4]) const {
    return TEE_InvokeTACommand(handle_, TEE_TIMEOUT_INFINITE, command, param_types, params, nullptr);
  }
};

}  // namespace keymaster

#endif  // KEYMASTER_PLATFORM_HANDLES_H_
