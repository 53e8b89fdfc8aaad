// GlobalPlatform TEE Internal Core API, version 1.1.2 (GPD_SPE_010).
//
// The subset that this system's trusted applications and their platform use, with the standard's own names, numbers
// and prototypes. Sizes and lengths are uint32_t, as in version 1.1.2. Everything has C linkage, so that an image
// links against any platform that offers the same calls.
//
// Conventions, stated once:
//  - A handle is an opaque pointer; TEE_HANDLE_NULL is "none".
//  - An `[inout] uint32_t* length` holds the capacity of the buffer on entry and the bytes written on return; with
//    TEE_ERROR_SHORT_BUFFER it holds the size that is needed.
//  - A programmer error, as the standard defines it for a call, panics the calling instance and does not return.
#ifndef TEE_INTERNAL_API_H_
#define TEE_INTERNAL_API_H_

#include "tee_api_constants.h"
#include "tee_api_crypto.h"
#include "tee_api_storage.h"
#include "tee_api_ta.h"
#include "tee_api_types.h"

#endif  // TEE_INTERNAL_API_H_
