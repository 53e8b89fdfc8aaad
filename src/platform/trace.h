// Trace lines carry the function and source line of the caller; the platform adds the TA's prefix and the level.
// A format is one literal: messages are part of the interface, some end in a newline and some don't.
#ifndef KEYMASTER_PLATFORM_TRACE_H_
#define KEYMASTER_PLATFORM_TRACE_H_

#include "tee_internal_api_extensions.h"

#define TRACE_ERROR(...) tee_trace(__func__, __LINE__, TEE_TRACE_ERROR, __VA_ARGS__)
#define TRACE_INFO(...) tee_trace(__func__, __LINE__, TEE_TRACE_INFO, __VA_ARGS__)
#define TRACE_DEBUG(...) tee_trace(__func__, __LINE__, TEE_TRACE_DEBUG, __VA_ARGS__)

#endif  // KEYMASTER_PLATFORM_TRACE_H_
