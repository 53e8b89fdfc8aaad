#include "auth/auth_token.h"

#include <algorithm>
#include <cstring>

#include "platform/byte_order.h"
#include "platform/handles.h"
#include "platform/trace.h"
#include "platform/wipe.h"

namespace keymaster {
namespace {

constexpr uint32_t mac_size = 32;
constexpr uint32_t mac_bits = mac_size * 8;
constexpr uint32_t mac_offset = auth_token_size - mac_size;
static_assert(mac_offset == 37);
constexpr uint32_t boot_seed_size = 32;

constinit TEE_ObjectHandle token_key = TEE_HANDLE_NULL;

/// HMAC-SHA256 into `mac`, which has room for whatever a platform calls a MAC.
TEE_Result compute_mac(TEE_ObjectHandle key, std::span<const uint8_t> message, std::span<uint8_t> mac,
                       uint32_t* mac_length) {
  operation_handle operation;
  if (TEE_Result r = operation.allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, mac_bits); r != TEE_SUCCESS) {
    TRACE_ERROR("AllocateOperation failed with 0x%08x\n", r);
    return r;
  }
  if (TEE_Result r = TEE_SetOperationKey(operation.get(), key); r != TEE_SUCCESS) {
    TRACE_ERROR("SetOperationKey failed with 0x%08x\n", r);
    return r;
  }
  TEE_MACInit(operation.get(), nullptr, 0);
  *mac_length = static_cast<uint32_t>(mac.size());
  if (TEE_Result r = TEE_MACComputeFinal(operation.get(), message.data(), static_cast<uint32_t>(message.size()),
                                         mac.data(), mac_length);
      r != TEE_SUCCESS) {
    TRACE_ERROR("MACComputeFinal failed with 0x%08x\n", r);
    return r;
  }
  return TEE_SUCCESS;
}

}  // namespace

auth_token_fields parse_auth_token(std::span<const uint8_t, auth_token_size> token) {
  return {
      .challenge = load_u64(&token[1]),
      .user_id = load_u64(&token[9]),
      .authenticator_id = load_u64(&token[17]),
      .authenticator_type = swap_u32(load_u32(&token[25])),
      .timestamp = swap_u64(load_u64(&token[29])),
  };
}

TEE_Result init_auth_token_key() {
  object_handle key;
  if (TEE_Result r = key.allocate(TEE_TYPE_HMAC_SHA256, mac_bits); r != TEE_SUCCESS) {
    TRACE_ERROR("AllocateTransientObject failed with 0x%08x\n", r);
    return r;
  }
  wiped_array<boot_seed_size> seed;
  if (TEE_Result r = GetBootSeed(seed.bytes, boot_seed_size); r != TEE_SUCCESS) {
    TRACE_ERROR("GetBootSeed failed with 0x%08x\n", r);
    return r;
  }
  TEE_Attribute secret;
  TEE_InitRefAttribute(&secret, TEE_ATTR_SECRET_VALUE, seed.bytes, boot_seed_size);
  if (TEE_Result r = TEE_PopulateTransientObject(key.get(), &secret, 1); r != TEE_SUCCESS) {
    TRACE_ERROR("PopulateTransientObject failed with 0x%08x\n", r);
    return r;
  }
  token_key = key.release();
  return TEE_SUCCESS;
}

void release_auth_token_key() {
  object_handle{token_key}.reset();
  token_key = TEE_HANDLE_NULL;
}

bool ComputeSignature(uint8_t* signature, uint32_t signature_length, TEE_ObjectHandle key, const uint8_t* message,
                      uint32_t message_length) {
  if (signature_length != mac_size) {
    std::fill_n(signature, signature_length, uint8_t{0});
    TRACE_ERROR("Wrong signature size, expected %dB, got %dB\n", mac_size, signature_length);
  }
  wiped_array<256> mac;
  uint32_t mac_length = 0;
  if (compute_mac(key, {message, message_length}, mac.bytes, &mac_length) != TEE_SUCCESS) {
    std::fill_n(signature, signature_length, uint8_t{0});
    return false;
  }
  if (mac_length != mac_size) TRACE_ERROR("Wrong MAC length, expected %dB, got %dB\n", mac_size, mac_length);
  const uint32_t copied = std::min({signature_length, mac_length, static_cast<uint32_t>(sizeof mac.bytes)});
  std::copy_n(mac.bytes, copied, signature);
  return mac_length == mac_size && signature_length == mac_size;
}

int check_auth_token_valid(const uint8_t* token, uint32_t token_length) {
  if (token_length != auth_token_size) {
    TRACE_ERROR("Wrong auth token size, expected %dB, got %dB", auth_token_size, token_length);
    return 1;
  }
  if (token[0] != auth_token_version) {
    TRACE_ERROR("Wrong auth token version, expected %d, got %d", auth_token_version, token[0]);
    return 1;
  }
  wiped_array<mac_size> mac;
  const std::span<const uint8_t> bytes{token, token_length};
  if (!ComputeSignature(mac.bytes, mac_size, token_key, bytes.data(), mac_offset)) return 1;
  return constant_time_equal(mac.bytes, bytes.subspan(mac_offset)) ? 0 : 1;
}

}  // namespace keymaster
