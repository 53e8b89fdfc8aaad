#include "tee/companions/common/auth_token_mint.h"

#include "platform/byte_order.h"
#include "platform/cursor.h"
#include "platform/trace.h"
#include "platform/wipe.h"
#include "tee/companions/common/keyed_mac.h"

namespace keymaster::companion {
namespace {

constexpr uint8_t token_version = 0;
constexpr uint32_t signed_size = auth_token_size - mac_size;
constexpr uint32_t boot_seed_size = 32;
static_assert(signed_size == 37 && boot_seed_size == mac_size);

/// Makes a MAC under the secret of this boot, which stays nowhere else.
TEE_Result prepare_boot_mac(keyed_mac& mac) {
  wiped_array<boot_seed_size> seed;
  if (TEE_Result r = GetBootSeed(seed.bytes, boot_seed_size); r != TEE_SUCCESS) {
    TRACE_ERROR("GetBootSeed failed with 0x%08x\n", r);
    return r;
  }
  return mac.prepare(seed.bytes);
}

bool write_claim(const auth_token_claim& claim, std::span<uint8_t, signed_size> place) {
  const uint32_t type = swap_u32(claim.authenticator_type);
  const uint64_t time = swap_u64(claim.time_ms);
  byte_writer out{place};
  return out.write_bytes(&token_version, sizeof token_version) &&
         out.write_bytes(&claim.challenge, sizeof claim.challenge) &&
         out.write_bytes(&claim.secure_id, sizeof claim.secure_id) &&
         out.write_bytes(&claim.authenticator_id, sizeof claim.authenticator_id) && out.write_u32(type) &&
         out.write_bytes(&time, sizeof time);
}

}  // namespace

uint64_t system_time_ms() {
  TEE_Time now = {0, 0};
  TEE_GetSystemTime(&now);
  return uint64_t{now.seconds} * 1000 + now.millis;
}

TEE_Result mint_auth_token(const auth_token_claim& claim, std::span<uint8_t, auth_token_size> token) {
  wipe(token.data(), token.size());
  keyed_mac mac;
  if (TEE_Result r = prepare_boot_mac(mac); r != TEE_SUCCESS) return r;
  if (!write_claim(claim, token.first<signed_size>())) return TEE_ERROR_BAD_STATE;
  const TEE_Result result = mac.compute(token.first<signed_size>(), {}, token.last<mac_size>());
  if (result != TEE_SUCCESS) wipe(token.data(), token.size());
  return result;
}

}  // namespace keymaster::companion
