#include "auth/use_log.h"

#include <algorithm>
#include <cstring>

#include "platform/bytes.h"
#include "platform/trace.h"

namespace keymaster {
namespace {

constexpr uint32_t log_size = 8;
constexpr uint32_t kept_blob_bytes = 2048;

/// A blob that is longer than what is kept is known by its length and its first bytes: they hold the nonce, the IV and
/// the tag of a blob that has just been opened, so that no two keys share them.
struct log_entry {
  uint8_t blob[kept_blob_bytes];
  uint32_t blob_length;  // 0: the entry is free
  uint32_t count;
  TEE_Time last_use;
  TEE_Time interval_end;
};

constinit log_entry* use_log = nullptr;

std::span<log_entry> entries() {
  return {use_log, use_log == nullptr ? 0 : log_size};
}

uint32_t kept_length(std::span<const uint8_t> blob) {
  return static_cast<uint32_t>(std::min<std::size_t>(blob.size(), kept_blob_bytes));
}

log_entry* find_entry(std::span<const uint8_t> blob) {
  for (log_entry& entry : entries()) {
    if (entry.blob_length != blob.size() || entry.blob_length == 0) continue;
    if (std::memcmp(entry.blob, blob.data(), kept_length(blob)) == 0) return &entry;
  }
  return nullptr;
}

/// An entry is for the taking when it is free, or holds no count and a rate limit that has run out.
log_entry* find_vacant(uint32_t now_seconds) {
  for (log_entry& entry : entries()) {
    if (entry.blob_length == 0) return &entry;
    if (entry.count == 0 && entry.interval_end.seconds < now_seconds) return &entry;
  }
  return nullptr;
}

void occupy(log_entry& entry, std::span<const uint8_t> blob, uint32_t count) {
  std::memcpy(entry.blob, blob.data(), kept_length(blob));
  entry.blob_length = static_cast<uint32_t>(blob.size());
  entry.count = count;
  entry.last_use = {0, 0};
  entry.interval_end = {0, 0};
}

TEE_Time system_time() {
  TEE_Time now;
  TEE_GetSystemTime(&now);
  return now;
}

}  // namespace

TEE_Result use_log_init() {
  use_log = allocate_records<log_entry>(log_size);
  if (use_log == nullptr) {
    TRACE_ERROR("Out of memory");
    return TEE_ERROR_OUT_OF_MEMORY;
  }
  return TEE_SUCCESS;
}

void use_log_release() {
  TEE_Free(use_log);
  use_log = nullptr;
}

int check_use_count_and_add(std::span<const uint8_t> blob, uint32_t max_uses, keymaster_error_t* error) {
  if (log_entry* const entry = find_entry(blob); entry != nullptr) {
    if (entry->count >= max_uses) {
      TRACE_ERROR("Key max ops exceeded");
      *error = KM_ERROR_KEY_MAX_OPS_EXCEEDED;
      return 1;
    }
    ++entry->count;
    return 0;
  }
  log_entry* const entry = find_vacant(system_time().seconds);
  if (entry == nullptr) {
    TRACE_ERROR("Too many use log");
    *error = KM_ERROR_TOO_MANY_OPERATIONS;
    return 1;
  }
  // The first use is granted before the limit is looked at, so that a limit of 0 allows one.
  occupy(*entry, blob, 1);
  return 0;
}

bool use_log_last_use(std::span<const uint8_t> blob, uint32_t* seconds) {
  const log_entry* const entry = find_entry(blob);
  if (entry == nullptr) return false;
  *seconds = entry->last_use.seconds;
  return true;
}

void use_log_record(std::span<const uint8_t> blob, uint32_t interval_seconds) {
  const TEE_Time now = system_time();
  log_entry* entry = find_entry(blob);
  if (entry == nullptr) {
    entry = find_vacant(now.seconds);
    if (entry == nullptr) return;
    occupy(*entry, blob, 0);
  }
  entry->last_use = now;
  const uint64_t end = uint64_t{now.seconds} + interval_seconds;
  entry->interval_end = {static_cast<uint32_t>(std::min<uint64_t>(end, UINT32_MAX)), now.millis};
}

}  // namespace keymaster
