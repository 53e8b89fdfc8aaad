#include "soter/statement_members.h"

#include "platform/trace.h"
#include "soter/soter_counter.h"

namespace keymaster {
namespace {

/// The largest number up to which a double holds all whole ones (IEEE 754, binary64).
constexpr uint64_t exact_limit = uint64_t{1} << 53;

/// A counter that a double can't hold would be told as another one. What the writer finds too long is refused later.
int set_counter(json_object* object, uint64_t counter) {
  if (counter > exact_limit) return -1;
  return json_object_set_number(object, "counter", static_cast<double>(counter));
}

}  // namespace

json_object* statement_object(const json_root& root) {
  json_object* const object = json_value_get_object(root.get());
  if (object == nullptr) {
    TRACE_ERROR("json error root_value %p root_object %p\n", static_cast<const void*>(root.get()),
                static_cast<const void*>(object));
  }
  return object;
}

TEE_Result add_counter(json_object* object) {
  uint64_t counter = 0;
  if (TEE_Result r = increase_and_get_counter(&counter); r != TEE_SUCCESS) {
    TRACE_ERROR("increase counter error %x\n", r);
    return r;
  }
  if (const int rc = set_counter(object, counter); rc != 0) {
    TRACE_ERROR("set counter error %d\n", rc);
    return TEE_ERROR_BAD_STATE;
  }
  return TEE_SUCCESS;
}

}  // namespace keymaster
