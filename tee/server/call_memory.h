// The parameters of a command as the TA in this process gets them.
#ifndef TEE_SERVER_CALL_MEMORY_H_
#define TEE_SERVER_CALL_MEMORY_H_

#include <cstdint>
#include <span>

#include "tee/remote/messages.h"
#include "tee/server/shared_memory.h"
#include "tee_internal_api.h"

namespace hosted_tee {

/// Carried input is read where the frame lies. What is carried out is written to `scratch`, which holds a frame and is
/// zeroed as far as it is used, so that nobody gets what another command left there.
class call_memory {
 public:
  explicit call_memory(std::span<std::uint8_t> scratch) : scratch_(scratch) {}

  /// take gives a result and an origin of its own when the references can't be followed: TEEC_ERROR_BAD_PARAMETERS for
  /// shared memory that is not there or not for this, TEEC_ERROR_EXCESS_DATA when the answer would not fit into a
  /// frame. TEEC_SUCCESS: `params` can be handed to the TA.
  [[nodiscard]] TEEC_Result take(const remote::request_slots& request, const block_collection& blocks);

  [[nodiscard]] std::uint32_t types() const { return request_->types; }
  [[nodiscard]] TEE_Param* params() { return params_; }

  /// answer is what comes out; of memory the bytes too when the TA was reached.
  [[nodiscard]] remote::answer_slots answer(bool reached_ta) const;

 private:
  [[nodiscard]] bool follow(const remote::request_slot& slot, std::uint32_t type, const block_collection& blocks,
                            TEE_Param& param);
  void carry(const remote::request_slot& slot, std::uint32_t type, TEE_Param& param);

  std::span<std::uint8_t> scratch_;
  std::size_t used_ = 0;
  const remote::request_slots* request_ = nullptr;
  TEE_Param params_[4] = {};
};

}  // namespace hosted_tee

#endif  // TEE_SERVER_CALL_MEMORY_H_
