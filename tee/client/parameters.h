// The parameters of a TEEC_Operation as the TA gets them, and back.
#ifndef TEE_CLIENT_PARAMETERS_H_
#define TEE_CLIENT_PARAMETERS_H_

#include <array>
#include <cstddef>
#include <cstdint>

#include "tee_client_api.h"
#include "tee_internal_api.h"

namespace hosted_tee {

class shared_block;
class tee_link;

/// The slots as a TA in this process sees them: their memory is the client's own.
class client_params {
 public:
  /// Null stands for an operation without parameters; `link` is the context's. Throws client_failure:
  /// TEEC_ERROR_BAD_PARAMETERS (a type that does not exist, a null buffer with a size, shared memory that is not
  /// registered, is another context's, does not allow the direction or is too small for the part),
  /// TEEC_ERROR_EXCESS_DATA (more than 32 bits of size).
  client_params(TEEC_Operation* operation, const tee_link& link);

  [[nodiscard]] std::uint32_t types() const { return types_; }
  [[nodiscard]] TEE_Param* slots() { return slots_; }

  /// block is what makes the memory of a registered reference shared; null for every other slot.
  [[nodiscard]] const shared_block* block(std::size_t slot) const { return blocks_[slot]; }

  /// hand_back puts values and sizes where the client looks for them. A size may be larger than the buffer was: that is
  /// how a TA tells what it needs.
  void hand_back() const;

 private:
  TEEC_Operation* operation_;
  std::uint32_t types_ = 0;
  TEE_Param slots_[4] = {};
  std::array<const shared_block*, 4> blocks_{};
};

}  // namespace hosted_tee

#endif  // TEE_CLIENT_PARAMETERS_H_
