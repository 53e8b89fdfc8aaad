#include "soter/finger_id.h"

#include <span>

#include "platform/trace.h"
#include "platform/wipe.h"
#include "soter/soter_init.h"

namespace keymaster {
namespace {

constinit uint32_t soter_fid = 0;
constinit uint64_t soter_fid_time = 0;

static_assert(sizeof(TEE_UUID) == 16);

std::span<const uint8_t> uuid_bytes(const TEE_UUID& uuid) {
  return {reinterpret_cast<const uint8_t*>(&uuid), sizeof uuid};
}

}  // namespace

void soter_set_fid(uint32_t fid, uint64_t time) {
  soter_fid = fid;
  soter_fid_time = time;
}

TEE_Result soter_get_fid(uint32_t* fid_out) {
  TEE_Time system = {0, 0};
  TEE_GetSystemTime(&system);
  const uint64_t now = uint64_t{system.seconds} * 1000 + system.millis;
  // A time in the future wraps around and is too old as well.
  const bool valid = now - soter_fid_time <= soter_fid_validity;
  *fid_out = valid ? soter_fid : soter_no_fid;
  return valid ? TEE_SUCCESS : TEE_ERROR_TIMEOUT;
}

TEE_Result get_client_property(TEE_Identity* identity) {
  TRACE_DEBUG("Try to get client property\n");
  if (identity == nullptr) return TEE_ERROR_BAD_PARAMETERS;
  *identity = {};
  return TEE_GetPropertyAsIdentity(TEE_PROPSET_CURRENT_CLIENT, "gpd.client.identity", identity);
}

// The resources are not loaded here: whoever wants notifications to be taken sees to that first.
TEE_Result is_from_fp_ta() {
  TEE_Identity client;
  if (TEE_Result r = get_client_property(&client); r != TEE_SUCCESS) {
    TRACE_ERROR("get client property error, 0x%x\n", r);
    return r;
  }
  const bool from_fp_ta = client.login == TEE_LOGIN_TRUSTED_APP &&
                          constant_time_equal(uuid_bytes(client.uuid), uuid_bytes(soter_prop_set.fp_uuid));
  return from_fp_ta ? TEE_SUCCESS : TEE_ERROR_ACCESS_DENIED;
}

}  // namespace keymaster
