// The device's properties that go into statements, and the identity of its fingerprint TA.
#ifndef KEYMASTER_SOTER_SOTER_PROPERTIES_H_
#define KEYMASTER_SOTER_SOTER_PROPERTIES_H_

#include "soter/soter_data.h"
#include "soter/tlv_box.h"
#include "tee_internal_api.h"

namespace keymaster {

/// The properties. All but the UUID are texts that end at their first NUL, wherever that is.
struct soter_prop_set_t {
  vlb_t fp_sensor_name;
  vlb_t fp_sensor_version;
  TEE_UUID fp_uuid;  // all zero until it is loaded
  vlb_t cpu_id;
  vlb_t tee_name;
  vlb_t tee_version;
};

/// init_soter_prop_set loads the properties from the provisioning TA and the platform into `props`, which is empty.
/// TEE_ERROR_OUT_OF_MEMORY; TEE_ERROR_GENERIC (the property box does not parse, lacks an entry, or its UUID is not 16
/// bytes long); TEE_ERROR_SHORT_BUFFER (a length beyond the buffer); otherwise the result of the provisioning TA or the
/// platform. `props` stays empty on failure.
[[nodiscard]] TEE_Result init_soter_prop_set(soter_prop_set_t* props);

/// retrieve_soter_property fetches and parses the box of property group `tag`, which is the caller's to destroy. Errors
/// as of init_soter_prop_set; `*out_box` is null then.
[[nodiscard]] TEE_Result retrieve_soter_property(tlv_box** out_box, uint16_t tag);

/// init_prop_with_tag replaces `property` by the value of `tag`. TEE_ERROR_GENERIC: there is none;
/// TEE_ERROR_OUT_OF_MEMORY.
[[nodiscard]] TEE_Result init_prop_with_tag(const tlv_box* box, uint16_t tag, vlb_t* property);

/// init_soter_cpuid replaces `cpu_id` by what the provisioning TA answers; errors as of init_soter_prop_set.
[[nodiscard]] TEE_Result init_soter_cpuid(vlb_t* cpu_id);

/// get_tee_property reads the platform's property `name` into `buffer`; `*out_length` is its length with the NUL. The
/// result is the platform's.
[[nodiscard]] TEE_Result get_tee_property(const char* name, char* buffer, uint32_t capacity, uint32_t* out_length);

/// free_soter_prop_set frees the properties and zeros the UUID; an empty set is allowed.
void free_soter_prop_set(soter_prop_set_t* props);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_SOTER_PROPERTIES_H_
