// The device's attestation key pair (ATTK), as the provisioning TA hands it out.
#ifndef KEYMASTER_SOTER_ATTESTATION_KEY_H_
#define KEYMASTER_SOTER_ATTESTATION_KEY_H_

#include "soter/soter_data.h"
#include "soter/tlv_box.h"
#include "tee_internal_api.h"

namespace keymaster {

/// The components of the key: big-endian magnitudes. A key may have n, e and d alone; the others are empty then.
struct attk_key_pair_t {
  vlb_t n, d, e, p, q, dp, dq, qinv;
};

/// init_soter_key loads the key pair from the provisioning TA into `key`, which is empty. TEE_ERROR_OUT_OF_MEMORY (also
/// for a box that does not parse), TEE_ERROR_BAD_PARAMETERS (n, e, d or one behind p is missing),
/// TEE_ERROR_SHORT_BUFFER (a length beyond the buffer), or the provisioning TA's result; `key` stays empty then.
[[nodiscard]] TEE_Result init_soter_key(attk_key_pair_t* key);

/// parse_buf_fill_key takes the components out of a serialized box; see init_soter_key.
[[nodiscard]] TEE_Result parse_buf_fill_key(attk_key_pair_t* key, const uint8_t* buffer, uint32_t length);

/// init_vlb_with_tag copies the value of `tag` into an empty component. TEE_ERROR_BAD_PARAMETERS: there is none;
/// TEE_ERROR_OUT_OF_MEMORY; TEE_ERROR_SHORT_BUFFER: it was not copied whole. The component stays empty then.
[[nodiscard]] TEE_Result init_vlb_with_tag(vlb_t* component, const tlv_box* box, uint16_t tag);

/// free_soter_key wipes and frees the components; an empty key is allowed.
void free_soter_key(attk_key_pair_t* key);

/// convert_key_to_object makes a key-pair object of 3 components, or of 8 where there is a p. The object is the
/// caller's; null, with a trace line, when there is none. `*key_size` is 2048, whatever the key.
[[nodiscard]] TEE_ObjectHandle convert_key_to_object(const attk_key_pair_t* key, uint32_t* key_size);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_ATTESTATION_KEY_H_
