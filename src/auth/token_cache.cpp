#include "auth/token_cache.h"

#include <cstring>

#include "platform/bytes.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

struct cache_entry {
  uint8_t token[auth_token_size];
  uint8_t spare;
};
static_assert(sizeof(cache_entry) == auth_token_size + 1);

constexpr uint32_t cache_size = 16;
constexpr uint8_t empty_version = 1;  // no valid token has it, so that an empty entry never matches

constinit cache_entry* cache = nullptr;

std::span<cache_entry> entries() {
  return {cache, cache == nullptr ? 0 : cache_size};
}

bool is_empty(const cache_entry& entry) {
  return entry.token[0] != auth_token_version;
}

bool same_issuer(const auth_token_fields& a, const auth_token_fields& b) {
  return a.user_id == b.user_id && a.authenticator_id == b.authenticator_id &&
         a.authenticator_type == b.authenticator_type;
}

/// The entry of the same issuer, or else the one to give up: the first empty one, or the oldest.
cache_entry* choose_entry(const auth_token_fields& fresh) {
  cache_entry* victim = nullptr;
  for (cache_entry& entry : entries()) {
    if (is_empty(entry)) {
      if (victim == nullptr || !is_empty(*victim)) victim = &entry;
      continue;
    }
    const auth_token_fields held = parse_auth_token(entry.token);
    if (same_issuer(held, fresh)) return &entry;
    if (victim == nullptr || (!is_empty(*victim) && held.timestamp < parse_auth_token(victim->token).timestamp)) {
      victim = &entry;
    }
  }
  return victim;
}

}  // namespace

TEE_Result token_cache_init() {
  cache = allocate_records<cache_entry>(cache_size);
  if (cache == nullptr) {
    TRACE_ERROR("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  for (cache_entry& entry : entries()) entry.token[0] = empty_version;
  return TEE_SUCCESS;
}

void token_cache_release() {
  for (cache_entry& entry : entries()) wipe(&entry, sizeof entry);
  TEE_Free(cache);
  cache = nullptr;
}

void token_cache_store(std::span<const uint8_t, auth_token_size> token) {
  const auth_token_fields fresh = parse_auth_token(token);
  cache_entry* const entry = choose_entry(fresh);
  if (entry == nullptr) return;
  if (!is_empty(*entry)) {
    const auth_token_fields held = parse_auth_token(entry->token);
    if (same_issuer(held, fresh) && fresh.timestamp < held.timestamp) return;
  }
  std::memcpy(entry->token, token.data(), token.size());
}

bool token_cache_has_recent(uint64_t secure_id, uint32_t auth_type, uint32_t timeout_seconds) {
  TEE_Time now;
  TEE_GetSystemTime(&now);
  const uint64_t now_ms = uint64_t{now.seconds} * 1000 + now.millis;
  const uint64_t timeout_ms = uint64_t{timeout_seconds} * 1000;
  for (const cache_entry& entry : entries()) {
    if (is_empty(entry)) continue;
    const auth_token_fields held = parse_auth_token(entry.token);
    if (held.user_id != secure_id && held.authenticator_id != secure_id) continue;
    if ((held.authenticator_type & auth_type) == 0) continue;
    if (now_ms - held.timestamp < timeout_ms) return true;  // wraps to "long ago" for a stamp in the future
  }
  return false;
}

}  // namespace keymaster
