// A live instance of a TA: its state and the code that works on it.
#ifndef TEE_RUNTIME_TA_INSTANCE_H_
#define TEE_RUNTIME_TA_INSTANCE_H_

#include <memory>

#include "tee/runtime/instance.h"
#include "tee/runtime/ta_image.h"

namespace hosted_tee {

/// The flags of the header record say how many instances and sessions there can be, the properties how large the heap
/// is and whether the instance outlives its last session.
class ta_instance : public instance {
 public:
  static constexpr std::uint32_t default_heap = 64 * 1024;  // of a TA without gpd.ta.dataSize

  ta_instance(std::unique_ptr<ta_image> image, std::uint32_t heap_limit, device_services& services, fault_plan& plan);

  [[nodiscard]] const builtin_ta& code() const { return image_->parts(); }
  [[nodiscard]] bool is_single() const { return has_flag(TEE_TA_FLAG_SINGLE_INSTANCE); }
  [[nodiscard]] bool takes_another_session() const { return open_sessions == 0 || has_flag(TEE_TA_FLAG_MULTI_SESSION); }
  [[nodiscard]] bool is_kept_alive() const { return kept_alive_; }

  bool created = false;  ///< TA_CreateEntryPoint has run, TA_DestroyEntryPoint has not
  bool busy = false;     ///< its code is on the stack
  std::uint32_t open_sessions = 0;

 private:
  [[nodiscard]] bool has_flag(std::uint32_t flag) const { return (code().head->flags & flag) != 0; }

  std::unique_ptr<ta_image> image_;
  bool kept_alive_;
};

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_TA_INSTANCE_H_
