#include "tee/companions/authenticator/back_off.h"

#include <algorithm>
#include <limits>

#include "platform/byte_order.h"
#include "platform/cursor.h"
#include "platform/trace.h"
#include "tee/companions/authenticator/authenticator_protocol.h"
#include "tee/companions/common/auth_token_mint.h"
#include "tee/companions/common/fixed_object.h"
#include "tee/companions/common/object_name.h"
#include "tee/companions/common/stored_object.h"

namespace keymaster::authenticator {
namespace {

constexpr uint32_t record_size = sizeof(uint32_t) + sizeof(uint64_t);

companion::object_name name_of(uint32_t uid) {
  return companion::object_name("pwauth.fail.").add_decimal(uid);
}

/// A user of whom nothing is stored has no failures.
TEE_Result read_record(uint32_t uid, failure_record& record) {
  uint8_t bytes[record_size] = {};
  const TEE_Result result = companion::read_fixed(name_of(uid).view(), bytes);
  if (result != TEE_SUCCESS && result != TEE_ERROR_ITEM_NOT_FOUND) return result;
  record = {.count = load_u32(bytes), .last_ms = load_u64(bytes + sizeof(uint32_t))};
  return TEE_SUCCESS;
}

TEE_Result write_record(uint32_t uid, const failure_record& record) {
  uint8_t bytes[record_size];
  byte_writer out{bytes};
  if (!out.write_u32(record.count) || !out.write_bytes(&record.last_ms, sizeof record.last_ms)) {
    return TEE_ERROR_BAD_STATE;
  }
  return companion::write_stored(name_of(uid).view(), bytes);
}

}  // namespace

uint64_t wait_after(uint32_t count) {
  if (count < free_failures) return 0;
  constexpr uint32_t ample = 16;  // doublings: beyond any wait, and far from shifting bits out
  static_assert(first_wait_ms << ample > longest_wait_ms);
  return std::min(first_wait_ms << std::min(count - free_failures, ample), longest_wait_ms);
}

TEE_Result attempt::begin(uint32_t uid, uint32_t* wait_ms) {
  uid_ = uid;
  if (TEE_Result r = read_record(uid, before_); r != TEE_SUCCESS) return r;
  const uint64_t now = companion::system_time_ms();
  if (before_.last_ms > now) {
    // The clock began anew with a boot. How long ago the failure was is not known, so the waiting begins anew too, and
    // it must be on record from when.
    before_.last_ms = now;
    if (TEE_Result r = write_record(uid, before_); r != TEE_SUCCESS) return r;
  }
  const uint64_t passed = now - before_.last_ms, wait = wait_after(before_.count);
  if (passed < wait) {
    *wait_ms = static_cast<uint32_t>(wait - passed);
    TRACE_ERROR("%u failures, wait for %u ms\n", before_.count, *wait_ms);
    return TEE_ERROR_BUSY;
  }
  const uint32_t most = std::numeric_limits<uint32_t>::max();
  return write_record(uid, {.count = before_.count == most ? most : before_.count + 1, .last_ms = now});
}

TEE_Result attempt::proved_right() const {
  return write_record(uid_, {});
}

void attempt::gave_no_answer() const {
  (void)write_record(uid_, before_);
}

}  // namespace keymaster::authenticator
