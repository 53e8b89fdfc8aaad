// How operation records are made and freed, the same for every algorithm.
#ifndef KEYMASTER_PARAMS_OPERATION_RECORD_H_
#define KEYMASTER_PARAMS_OPERATION_RECORD_H_

#include "params/operation.h"
#include "platform/handles.h"
#include "platform/trace.h"

namespace keymaster {

/// The entries of a record.
struct operation_entries {
  uint32_t purpose;
  operation_free free;
  operation_update update;
  operation_finish finish;
};

/// make_record makes a record with its entries filled and has `prepare(record)` set it up, which answers the platform's
/// result and leaves its own error in `*error`. Null, with nothing left behind, when that fails; want of memory for the
/// record itself is `no_memory`.
template <class Record, class Prepare>
[[nodiscard]] keymaster_operation_t* make_record(const operation_entries& entries, TEE_Result* result,
                                                 keymaster_error_t* error, Prepare&& prepare,
                                                 keymaster_error_t no_memory = KM_ERROR_OK) {
  Record* const op = new_record<Record>();
  if (op == nullptr) {
    TRACE_ERROR("Out of memory");
    *error = no_memory;
    return nullptr;
  }
  op->purpose = entries.purpose;
  op->free = entries.free;
  op->update = entries.update;
  op->finish = entries.finish;
  *result = prepare(*op);
  if (*result == TEE_SUCCESS && *error == KM_ERROR_OK) return op;
  delete_record(op);
  return nullptr;
}

/// resolve_into makes the record's key by `resolve(TEE_ObjectHandle*)`.
template <class Resolve>
[[nodiscard]] TEE_Result resolve_into(object_handle& key, const keymaster_error_t* error, Resolve&& resolve) {
  TEE_ObjectHandle made = TEE_HANDLE_NULL;
  const TEE_Result result = resolve(&made);
  key.reset(made);
  if (result != TEE_SUCCESS || *error != KM_ERROR_OK) TRACE_ERROR("Resolve key data failed");
  return result;
}

/// missing_handles counts which of key and operation a record lacks; freeing it traces a line for each.
template <class Record>
[[nodiscard]] uint32_t missing_handles(const Record& op) {
  return (op.key ? 0U : 1U) + (op.operation ? 0U : 1U);
}

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_OPERATION_RECORD_H_
