// Operations of any class, and random data (sections 6.2 and 6.9 of the API).
#include <openssl/rand.h>

#include <algorithm>

#include "tee/crypto/operation.h"

using namespace hosted_tee;  // NOLINT(google-build-using-namespace): the file holds nothing but the API's C functions

namespace {

/// offers tells whether an operation can be had: the mode suits the algorithm, and the largest key is one that the
/// algorithm's keys can be.
bool offers(const algorithm& kind, std::uint32_t mode, std::uint32_t max_bits) {
  if (mode > TEE_MODE_EXPORT || (kind.modes & (1U << mode)) == 0) return false;
  if (kind.key_type == 0) return true;
  if (kind.exact_bits != 0) return max_bits == kind.exact_bits;
  return find_object_type(kind.key_type)->has_size(max_bits);
}

/// run_step runs a step on an operation of any class: a failure poisons one that takes its data in pieces. The others
/// have no state to poison, and the instance panics.
template <class Step>
void run_step(operation& target, const std::optional<TEE_Result>& fault, Step&& step) {
  const auto run = [&] {
    if (fault) refuse(*fault);
    step(target);
  };
  if (auto* const staged = dynamic_cast<multi_stage_operation*>(&target)) {
    staged->guard(run);
  } else {
    run();
  }
}

}  // namespace

extern "C" {

TEE_Result TEE_AllocateOperation(TEE_OperationHandle* operation, uint32_t algorithm, uint32_t mode,
                                 uint32_t maxKeySize) {
  if (operation != nullptr) *operation = TEE_HANDLE_NULL;
  return crypto_call(__func__, nullptr, [&](instance& self) {
    panic_unless(operation != nullptr, "no place for the handle");
    const auto* const kind = find_algorithm(algorithm);
    refuse_unless(kind != nullptr && offers(*kind, mode, maxKeySize), TEE_ERROR_NOT_SUPPORTED);
    std::unique_ptr<hosted_tee::operation, operation_deleter> made(kind->make(*kind, mode, maxKeySize).release());
    self.next_operation += 16;
    self.operations.emplace(self.next_operation, std::move(made));
    // An opaque number, as the API has it.
    *operation = reinterpret_cast<TEE_OperationHandle>(self.next_operation);
  });
}

void TEE_FreeOperation(TEE_OperationHandle operation) {
  platform_call_void(__func__, [&](instance& self) {
    if (operation == TEE_HANDLE_NULL) return;
    (void)find_any_operation(self, operation);
    self.operations.erase(reinterpret_cast<std::uintptr_t>(operation));
  });
}

void TEE_GetOperationInfo(TEE_OperationHandle operation, TEE_OperationInfo* operationInfo) {
  platform_call_void(__func__, [&](instance& self) {
    panic_unless(operationInfo != nullptr, "no place for the information");
    *operationInfo = find_any_operation(self, operation).info();
  });
}

void TEE_ResetOperation(TEE_OperationHandle operation) {
  platform_step(__func__, [&](const instance& self, const std::optional<TEE_Result>& fault) {
    const error_queue_scope own_errors;
    run_step(find_any_operation(self, operation), fault, [](hosted_tee::operation& found) { found.reset(); });
  });
}

TEE_Result TEE_SetOperationKey(TEE_OperationHandle operation, TEE_ObjectHandle key) {
  return crypto_call(__func__, nullptr, [&](instance& self) {
    find_any_operation(self, operation).set_key(key == TEE_HANDLE_NULL ? nullptr : &find_transient_object(self, key));
  });
}

void TEE_CopyOperation(TEE_OperationHandle dstOperation, TEE_OperationHandle srcOperation) {
  platform_step(__func__, [&](const instance& self, const std::optional<TEE_Result>& fault) {
    const error_queue_scope own_errors;
    const auto& source = find_any_operation(self, srcOperation);
    auto& destination = find_any_operation(self, dstOperation);
    if (&source == &destination) return;
    run_step(destination, fault, [&](hosted_tee::operation& found) { found.copy_from(source); });
  });
}

void TEE_GenerateRandom(void* randomBuffer, uint32_t randomBufferLen) {
  platform_step(__func__, [&](const instance& /*self*/, const std::optional<TEE_Result>& fault) {
    if (fault) panic("no random data to be had", *fault);
    panic_unless(randomBuffer != nullptr || randomBufferLen == 0, "no place for random data");
    constexpr std::uint32_t piece = 1U << 30U;  // libcrypto counts in int
    auto* place = static_cast<std::uint8_t*>(randomBuffer);
    while (randomBufferLen > 0) {
      const std::uint32_t size = std::min(piece, randomBufferLen);
      if (RAND_bytes(place, static_cast<int>(size)) != 1) panic("no random data to be had", TEE_ERROR_GENERIC);
      place += size;
      randomBufferLen -= size;
    }
  });
}

}  // extern "C"
