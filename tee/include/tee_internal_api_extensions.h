// What the TAs of this system ask of their trusted OS beyond the GlobalPlatform TEE Internal Core API.
// A port to a device supplies these functions; see docs/porting.md.
#ifndef TEE_INTERNAL_API_EXTENSIONS_H_
#define TEE_INTERNAL_API_EXTENSIONS_H_

#include "tee_internal_api.h"

#ifdef __cplusplus
extern "C" {
#endif

/// Storage identifier of the RPMB-backed secure storage (replay-protected), for the persistent object calls.
#define TEE_STORAGE_RPMB 0x80000001u

/// Operation mode of TEE_ALG_RSA_NOPAD under which TEE_AsymmetricExport works.
#define TEE_MODE_EXPORT 8u

/// Format of TEE_AsymmetricExport: a DER SubjectPublicKeyInfo (RFC 5280, section 4.1.2.7; RSA as in RFC 3279).
#define TEE_EXPORT_FORMAT_SPKI_DER 5u

/// TEE_RPMB_MakeFileSystem probes the RPMB storage and prepares it for use; it is harmless on one that is ready.
/// `*state` is zero on entry, and its content afterwards is the platform's own. TEE_SUCCESS: the storage can be used;
/// any other result: it cannot, for the whole life of the calling instance.
TEE_Result TEE_RPMB_MakeFileSystem(uint32_t* state);

/// TEE_AsymmetricExport writes the public key of `operation` (mode TEE_MODE_EXPORT, key set) to `buffer` in `format`.
/// `*length` is the capacity on entry, the bytes written on return; TEE_ERROR_SHORT_BUFFER leaves the needed size
/// there. TEE_ERROR_NOT_SUPPORTED for another format or key type.
TEE_Result TEE_AsymmetricExport(TEE_OperationHandle operation, uint32_t format, void* buffer, uint32_t* length);

/// GetBootSeed copies the secret of this boot to `seed`: 32 bytes, drawn anew at every start of the secure world and
/// shared with the authenticators alone. TEE_ERROR_BAD_PARAMETERS for another `length`.
TEE_Result GetBootSeed(void* seed, uint32_t length);

// Levels of the trace facility.
#define TEE_TRACE_ERROR 1
#define TEE_TRACE_INFO 2
#define TEE_TRACE_DEBUG 3

#if defined(__GNUC__)
#define TEE_TRACE_FORMAT __attribute__((format(printf, 4, 5)))
#else
#define TEE_TRACE_FORMAT
#endif

/// tee_trace prints one line: the TA's prefix, the level, `function` and `line` of the caller, and the text that
/// `format` (as printf's) makes of the arguments. Some formats end in a newline and some don't; the platform ends the
/// line in either case.
void TEE_TRACE_FORMAT tee_trace(const char* function, int line, int level, const char* format, ...);

/// The name under which the platform prints a TA's trace; each TA defines it.
extern const char TA_EXPORT tee_trace_prefix[];

#ifdef __cplusplus
}
#endif

#endif  // TEE_INTERNAL_API_EXTENSIONS_H_
