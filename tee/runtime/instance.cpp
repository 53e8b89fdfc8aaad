#include "tee/runtime/instance.h"

#include <cstdio>
#include <cstdlib>

#include "tee/runtime/instance_scope.h"

namespace hosted_tee {
namespace {

// Each thread has its own: devices of one program are independent, and each is entered by whichever thread calls it.
thread_local instance* innermost = nullptr;

}  // namespace

instance::instance(const TEE_UUID& ta, std::uint32_t heap_limit, device_services& services, fault_plan& plan)
    : uuid(ta), device(services), faults(plan), heap(heap_limit) {}

instance::~instance() = default;

instance& current_instance() {
  if (innermost == nullptr) {
    (void)std::fputs("hosted TEE: a platform function was called outside of any TA\n", stderr);
    std::abort();
  }
  return *innermost;
}

instance_scope::instance_scope(instance& self) : outer_(innermost) {
  innermost = &self;
}

instance_scope::~instance_scope() {
  innermost = outer_;
}

}  // namespace hosted_tee
