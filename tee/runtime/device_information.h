// The TA "device information", which every device has beside its images. tee/client/device_information.h tells what a
// client can ask it.
#ifndef TEE_RUNTIME_DEVICE_INFORMATION_H_
#define TEE_RUNTIME_DEVICE_INFORMATION_H_

#include "tee/runtime/builtin_ta.h"

namespace hosted_tee {

[[nodiscard]] const builtin_ta& device_information_ta();

}  // namespace hosted_tee

#endif  // TEE_RUNTIME_DEVICE_INFORMATION_H_
