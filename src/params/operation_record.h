// How operation records are made and freed, the same for every algorithm.
#ifndef KEYMASTER_PARAMS_OPERATION_RECORD_H_
#define KEYMASTER_PARAMS_OPERATION_RECORD_H_

#include "params/operation.h"

namespace keymaster {

/// The entries of a record.
struct operation_entries {
  uint32_t purpose;
  operation_free free;
  operation_update update;
  operation_finish finish;
};

/// new_operation makes a record with its entries filled; null when the heap is exhausted.
template <class Record>
[[nodiscard]] Record* new_operation(const operation_entries& entries) {
  Record* const op = new_record<Record>();
  if (op == nullptr) return nullptr;
  op->purpose = entries.purpose;
  op->free = entries.free;
  op->update = entries.update;
  op->finish = entries.finish;
  return op;
}

/// finish_operation_record hands out `op` when its set-up succeeded, and deletes it otherwise.
template <class Record>
[[nodiscard]] keymaster_operation_t* finish_operation_record(Record* op, TEE_Result result, keymaster_error_t error) {
  if (result == TEE_SUCCESS && error == KM_ERROR_OK) return op;
  delete_record(op);
  return nullptr;
}

}  // namespace keymaster

#endif  // KEYMASTER_PARAMS_OPERATION_RECORD_H_
