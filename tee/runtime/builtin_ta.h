// TAs that are linked into the program rather than loaded from an image: for fuzzing, for debuggers, and for ports that
// have no loader. Their static state outlives an instance, so such a TA must set all of it in TA_CreateEntryPoint.
#ifndef TEE_RUNTIME_BUILTIN_TA_H_
#define TEE_RUNTIME_BUILTIN_TA_H_

#include "tee_ta_image.h"

namespace hosted_tee {

/// The parts of an image that a loader would have found.
struct builtin_ta {
  const tee_ta_head* head;
  const tee_ta_property* properties;
  const char* trace_prefix;
  TEE_Result (*create)();
  void (*destroy)();
  TEE_Result (*open_session)(uint32_t, TEE_Param[4], void**);
  void (*close_session)(void*);
  TEE_Result (*invoke)(void*, uint32_t, uint32_t, TEE_Param[4]);
};

/// register_builtin_ta makes `ta` answer for its UUID in every secure world of this process, before any image of that
/// UUID. The records it points at must outlive the process's worlds.
void register_builtin_ta(const builtin_ta& ta);

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_BUILTIN_TA_H_
