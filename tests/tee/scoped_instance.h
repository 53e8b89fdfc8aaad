// A TA instance that is current while it lives, for tests that call the platform's functions without a TA.
#ifndef TESTS_TEE_SCOPED_INSTANCE_H_
#define TESTS_TEE_SCOPED_INSTANCE_H_

#include <cstdint>

#include "tee/runtime/device.h"
#include "tee/runtime/instance.h"
#include "tee/runtime/instance_scope.h"

namespace hosted_tee {

class scoped_instance {
 public:
  explicit scoped_instance(std::uint32_t heap_limit = 512 * 1024)
      : instance_(TEE_UUID{}, heap_limit, device_, device_.faults), scope_(instance_) {}

  [[nodiscard]] instance& self() { return instance_; }
  [[nodiscard]] device_services& device() { return device_; }
  [[nodiscard]] fault_plan& faults() { return device_.faults; }

 private:
  device_services device_;
  instance instance_;
  instance_scope scope_;
};

}  // namespace hosted_tee

#endif  // TESTS_TEE_SCOPED_INSTANCE_H_
