#include "auth/application_binding.h"

#include "platform/trace.h"
#include "platform/wipe.h"

namespace keymaster {
namespace {

/// Whether the key's blob under `tag` (empty when there is none) equals `given`.
bool matches(const keymaster_key_param_set_t& characteristics, keymaster_tag_t tag, std::span<const uint8_t> given) {
  const keymaster_key_param_t* const bound = key_param_set_get_unique(characteristics, tag);
  return constant_time_equal(bound == nullptr ? std::span<const uint8_t>{} : blob_bytes(*bound), given);
}

}  // namespace

int check_app_id_and_app_data(const keymaster_key_param_set_t& characteristics, std::span<const uint8_t> app_id,
                              std::span<const uint8_t> app_data) {
  if (!key_param_set_at_most_one(characteristics, KM_TAG_APPLICATION_ID)) {
    TRACE_ERROR("Duplicated KM_TAG_APPLICATION_ID");
    return 1;
  }
  if (!matches(characteristics, KM_TAG_APPLICATION_ID, app_id)) {
    TRACE_ERROR("KM_TAG_APPLICATION_ID mismatch");
    return 1;
  }
  if (!key_param_set_at_most_one(characteristics, KM_TAG_APPLICATION_DATA)) {
    TRACE_ERROR("Duplicated KM_TAG_APPLICATION_DATA");
    return 1;
  }
  if (!matches(characteristics, KM_TAG_APPLICATION_DATA, app_data)) {
    TRACE_ERROR("KM_TAG_APPLICATION_DATA mismatch");
    return 1;
  }
  return 0;
}

}  // namespace keymaster
