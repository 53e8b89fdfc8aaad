"""The names that the TA's files may refer to, and those that they must."""
import re

# The platform's calls that the commands need: each must really be referenced, or code that should be there was dropped.
USED = {
    # heap, properties, clocks, random
    "TEE_Malloc", "TEE_Realloc", "TEE_Free", "TEE_GetPropertyAsUUID", "TEE_GetSystemTime", "TEE_GetREETime",
    "TEE_GenerateRandom",
    # keys
    "TEE_AllocateTransientObject", "TEE_FreeTransientObject", "TEE_PopulateTransientObject", "TEE_InitRefAttribute",
    "TEE_InitValueAttribute", "TEE_GenerateKey", "TEE_GetObjectBufferAttribute",
    # storage of the key storage key
    "TEE_OpenPersistentObject", "TEE_CreatePersistentObject", "TEE_ReadObjectData", "TEE_CloseObject",
    "TEE_CloseAndDeletePersistentObject1", "TEE_RPMB_MakeFileSystem",
    # operations: sealing, auth tokens, digests, RSA
    "TEE_AllocateOperation", "TEE_FreeOperation", "TEE_SetOperationKey", "TEE_AEInit", "TEE_AEUpdate",
    "TEE_AEEncryptFinal", "TEE_AEDecryptFinal", "TEE_MACInit", "TEE_MACComputeFinal", "TEE_DigestUpdate",
    "TEE_DigestDoFinal", "TEE_AsymmetricEncrypt", "TEE_AsymmetricDecrypt", "TEE_AsymmetricSignDigest",
    "TEE_AsymmetricVerifyDigest", "TEE_AsymmetricExport",
    # ciphers and MACs in steps
    "TEE_CipherInit", "TEE_CipherUpdate", "TEE_CipherDoFinal", "TEE_AEUpdateAAD", "TEE_MACUpdate",
    # soter: properties, the counter, the provisioning TA
    "TEE_GetPropertyAsString", "TEE_GetPropertyAsIdentity", "TEE_WriteObjectData", "TEE_SeekObjectData",
    "TEE_OpenTASession", "TEE_InvokeTACommand", "TEE_CloseTASession",
    # the boot's secret, trace
    "GetBootSeed", "tee_trace",
}
# Calls that the TA may come to need, and any platform that runs it offers.
PERMITTED = {"TEE_MemMove", "TEE_MemFill"}
ENTRY_LAYER = ["tee_entry_open_session", "tee_entry_close_session", "tee_entry_invoke_command"]
# What a compiler calls on its own: the five that every freestanding environment has, and the arithmetic helpers of the
# ARM architecture's run-time ABI. What unwinds, registers destructors, finds thread-local storage or errno, or reports
# a division by zero is none of them.
COMPILER = re.compile(r"mem(?:cpy|move|set|cmp)|strlen|__aeabi_(?!unwind|atexit|read_tp|errno|[il]div0)\w+")
# Named one by one, although the allow-list leaves no room for them, so that a failure says what came in: libc, the C++
# run time, threads; calls that end the instance; and calls that some trusted OS does not have.
FORBIDDEN = re.compile(
    r"(?:m|c|re)alloc|free|\w*printf|puts|abort|exit|__stack_chk_\w+|_Z(?:n|d)[aw]?\w*|__cxa_\w+|__gxx_personality\w*|"
    r"_Unwind_\w+|__tls_get_addr|pthread_\w+|TEE_Panic|TEE_MemCompare|TEE_GetObjectInfo1?|TEE_CopyOperation|"
    r"TEE_CopyObjectAttributes1?|TEE_ResetOperation|TEE_ResetTransientObject|TEE_MACCompareFinal|"
    r"TEE_DigestExtract|TEE_GetObjectValueAttribute|TEE_TruncateObjectData")
# What must not be defined in them either: run-time type information and the guards of static variables.
UNWANTED = re.compile(r"_ZT[IS]\w+|_ZGV\w+")


def stray(undefined, more=frozenset()):
    """The names that no platform need have. `more` are calls that this image may make besides."""
    return {name for name in undefined - USED - PERMITTED - set(ENTRY_LAYER) - more if not COMPILER.fullmatch(name)}


def missing(undefined):
    """The calls that the code must make and does not refer to."""
    return (USED | set(ENTRY_LAYER)) - undefined


def forbidden(undefined, defined):
    """What must not be there, neither imported nor linked in."""
    return {name for name in undefined | defined if FORBIDDEN.fullmatch(name)} | {
        name for name in defined if UNWANTED.fullmatch(name)}
