// Who owns an operation while a command handles it: its authorization set and its record go together.
#ifndef KEYMASTER_TA_OPERATION_OWNER_H_
#define KEYMASTER_TA_OPERATION_OWNER_H_

#include <utility>

#include "params/operation.h"

namespace keymaster {

/// operation_owner owns one operation or none.
class operation_owner {
 public:
  operation_owner() = default;
  explicit operation_owner(keymaster_operation_t* operation) : operation_(operation) {}
  operation_owner(const operation_owner&) = delete;
  operation_owner& operator=(const operation_owner&) = delete;
  ~operation_owner() { reset(); }

  /// reset frees the authorization set and then the algorithm's record.
  void reset(keymaster_operation_t* operation = nullptr) {
    keymaster_operation_t* const old = std::exchange(operation_, operation);
    if (old == nullptr) return;
    keymaster_free_param_set(&old->authorization_set);
    old->free(old);
  }
  [[nodiscard]] keymaster_operation_t* release() { return std::exchange(operation_, nullptr); }
  [[nodiscard]] keymaster_operation_t* get() const { return operation_; }
  [[nodiscard]] keymaster_operation_t* operator->() const { return operation_; }
  [[nodiscard]] explicit operator bool() const { return operation_ != nullptr; }

 private:
  keymaster_operation_t* operation_ = nullptr;
};

}  // namespace keymaster

#endif  // KEYMASTER_TA_OPERATION_OWNER_H_
