// Parameter sets from any bytes: what unmarshals must marshal to bytes that unmarshal to the same set, and nothing
// stays on the heap.
#include <algorithm>
#include <memory>

#include "fuzz/fuzz_device.h"
#include "params/marshal.h"
#include "ta/ta_limits.h"

using namespace keymaster;

namespace fuzzing {
namespace {

bool same_record(const keymaster_key_param_t& a, const keymaster_key_param_t& b) {
  if (a.tag != b.tag) return false;
  if (!tag_has_blob(a.tag)) return a.long_integer == b.long_integer;
  return std::ranges::equal(blob_bytes(a), blob_bytes(b));
}

bool is_hidden(const keymaster_key_param_t& param) {
  return param.tag == KM_TAG_APPLICATION_ID || param.tag == KM_TAG_APPLICATION_DATA ||
         param.tag == KM_TAG_ROOT_OF_TRUST;
}

/// The bytes of a set, in a block of the TA's heap that the caller frees.
uint8_t* marshalled(const keymaster_key_param_set_t& set, bool include_hidden, uint32_t* length) {
  uint8_t* block = nullptr;
  *length = 0;
  require(marshal(set, include_hidden, &block, length) == TEE_SUCCESS, "what unmarshals marshals");
  require(*length == marshal_size(set, include_hidden), "a set is as long as announced");
  return block;
}

void check_round_trip(const keymaster_key_param_set_t& set) {
  uint32_t length = 0;
  uint8_t* const block = marshalled(set, true, &length);
  parameter_set again;
  require(unmarshal({block, length}, &again) == TEE_SUCCESS, "what marshals unmarshals");
  require(std::ranges::equal(records(set), records(again), same_record), "a set survives the round trip");
  uint32_t second_length = 0;
  uint8_t* const second = marshalled(again, true, &second_length);
  require(std::ranges::equal(std::span(block, length), std::span(second, second_length)), "a set has one byte form");
  TEE_Free(second);
  TEE_Free(block);
}

void check_hidden(const keymaster_key_param_set_t& set) {
  uint32_t length = 0;
  uint8_t* const block = marshalled(set, false, &length);
  parameter_set shown;
  require(unmarshal({block, length}, &shown) == TEE_SUCCESS, "what marshals unmarshals");
  require(std::ranges::none_of(records(shown), is_hidden), "hidden parameters stay inside");
  TEE_Free(block);
}

/// Into a buffer of any size: the sanitizer sees a byte too much.
void check_slot(const keymaster_key_param_set_t& set, std::size_t capacity) {
  const std::unique_ptr<uint8_t[]> slot(new uint8_t[capacity]());
  uint32_t written = 0;
  const TEE_Result result = marshal_to_slot(set, {slot.get(), capacity}, &written);
  require((result == TEE_SUCCESS) == (marshal_size(set, false) <= capacity), "a set fits, or is refused");
  require(result == TEE_SUCCESS || written == 0, "a refused set writes nothing");
}

}  // namespace
}  // namespace fuzzing

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace fuzzing;
  in_fresh_instance([&](hosted_tee::instance& instance) {
    input_reader in({data, size});
    const std::size_t capacity = in.number(2) % 1024;
    const bytes rest = in.take(size);
    const std::unique_ptr<uint8_t[]> body(new uint8_t[rest.size()]);
    std::copy(rest.begin(), rest.end(), body.get());
    parameter_set set;
    if (unmarshal({body.get(), rest.size()}, &set) == TEE_SUCCESS) {
      // A heap that the set fills to more than half has no room for its copies, which is a fair answer.
      if (instance.heap.bytes() < ta_heap_size / 8) {
        check_round_trip(set);
        check_hidden(set);
        check_slot(set, capacity);
      }
    } else {
      require(set.params == nullptr && set.length == 0, "a set that doesn't unmarshal is empty");
    }
  });
  return 0;
}
