// EC signatures as clients exchange them: a DER SEQUENCE of the INTEGERs r and s (RFC 3279, section 2.2.3), against the
// platform's raw r || s. Only what the encoder would write is decoded.
#ifndef KEYMASTER_ALGORITHMS_EC_EC_SIGNATURE_DER_H_
#define KEYMASTER_ALGORITHMS_EC_EC_SIGNATURE_DER_H_

#include <cstdint>
#include <span>

#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

/// der_length_bytes answers how many bytes a length takes in the long form: 1 below 255, 2 up to 65534, 3 up to
/// 16777214, else 4.
[[nodiscard]] uint32_t der_length_bytes(uint32_t length);

/// encode_length writes a DER length at `*position` and advances it. Up to 126 it is one byte; more takes the long
/// form, one byte below 255.
void encode_length(uint8_t** position, uint32_t length);

/// der_decode_length reads a DER length at `*position`, which it advances, before `end`. 0: done; 1: the input ends too
/// soon, or the length has more than 4 bytes.
[[nodiscard]] int der_decode_length(const uint8_t** position, const uint8_t* end, uint32_t* length);

/// der_encode_ec_signature writes r and s, big-endian magnitudes of any width, into a new buffer. False, with a trace
/// line and an empty buffer: no memory, or a sequence of 127 bytes, whose length this encoder cannot write.
[[nodiscard]] bool der_encode_ec_signature(std::span<const uint8_t> r, std::span<const uint8_t> s, heap_bytes& encoded);

/// der_decode_ec_signature writes the r and s of `der` right-aligned into buffers of their full width.
/// TEE_ERROR_GENERIC for anything but the encoder's own form; TEE_ERROR_OUT_OF_MEMORY.
[[nodiscard]] TEE_Result der_decode_ec_signature(std::span<const uint8_t> der, std::span<uint8_t> r,
                                                 std::span<uint8_t> s);

}  // namespace keymaster

#endif  // KEYMASTER_ALGORITHMS_EC_EC_SIGNATURE_DER_H_
