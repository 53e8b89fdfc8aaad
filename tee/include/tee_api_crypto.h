// GlobalPlatform TEE Internal Core API 1.1.2: cryptographic operations (chapter 6).
#ifndef TEE_API_CRYPTO_H_
#define TEE_API_CRYPTO_H_

#include "tee_api_types.h"

#ifdef __cplusplus
extern "C" {
#endif

// Any operation (6.2). The caller frees with TEE_FreeOperation; the null handle is allowed there.
TEE_Result TEE_AllocateOperation(TEE_OperationHandle* operation, uint32_t algorithm, uint32_t mode,
                                 uint32_t maxKeySize);
void TEE_FreeOperation(TEE_OperationHandle operation);
void TEE_GetOperationInfo(TEE_OperationHandle operation, TEE_OperationInfo* operationInfo);
void TEE_ResetOperation(TEE_OperationHandle operation);
TEE_Result TEE_SetOperationKey(TEE_OperationHandle operation, TEE_ObjectHandle key);
void TEE_CopyOperation(TEE_OperationHandle dstOperation, TEE_OperationHandle srcOperation);

// Message digests (6.3).
void TEE_DigestUpdate(TEE_OperationHandle operation, const void* chunk, uint32_t chunkSize);
TEE_Result TEE_DigestDoFinal(TEE_OperationHandle operation, const void* chunk, uint32_t chunkLen, void* hash,
                             uint32_t* hashLen);

// Symmetric ciphers (6.4).
void TEE_CipherInit(TEE_OperationHandle operation, const void* IV, uint32_t IVLen);
TEE_Result TEE_CipherUpdate(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                            uint32_t* destLen);
TEE_Result TEE_CipherDoFinal(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                             uint32_t* destLen);

// Message authentication codes (6.5).
void TEE_MACInit(TEE_OperationHandle operation, const void* IV, uint32_t IVLen);
void TEE_MACUpdate(TEE_OperationHandle operation, const void* chunk, uint32_t chunkSize);
TEE_Result TEE_MACComputeFinal(TEE_OperationHandle operation, const void* message, uint32_t messageLen, void* mac,
                               uint32_t* macLen);
TEE_Result TEE_MACCompareFinal(TEE_OperationHandle operation, const void* message, uint32_t messageLen, const void* mac,
                               uint32_t macLen);

// Authenticated encryption (6.6). tagLen of TEE_AEInit is in bits; everything else in bytes.
TEE_Result TEE_AEInit(TEE_OperationHandle operation, const void* nonce, uint32_t nonceLen, uint32_t tagLen,
                      uint32_t AADLen, uint32_t payloadLen);
void TEE_AEUpdateAAD(TEE_OperationHandle operation, const void* AADdata, uint32_t AADdataLen);
TEE_Result TEE_AEUpdate(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                        uint32_t* destLen);
TEE_Result TEE_AEEncryptFinal(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                              uint32_t* destLen, void* tag, uint32_t* tagLen);
TEE_Result TEE_AEDecryptFinal(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                              uint32_t* destLen, void* tag, uint32_t tagLen);

// Asymmetric functions (6.7).
TEE_Result TEE_AsymmetricEncrypt(TEE_OperationHandle operation, const TEE_Attribute* params, uint32_t paramCount,
                                 const void* srcData, uint32_t srcLen, void* destData, uint32_t* destLen);
TEE_Result TEE_AsymmetricDecrypt(TEE_OperationHandle operation, const TEE_Attribute* params, uint32_t paramCount,
                                 const void* srcData, uint32_t srcLen, void* destData, uint32_t* destLen);
TEE_Result TEE_AsymmetricSignDigest(TEE_OperationHandle operation, const TEE_Attribute* params, uint32_t paramCount,
                                    const void* digest, uint32_t digestLen, void* signature, uint32_t* signatureLen);
TEE_Result TEE_AsymmetricVerifyDigest(TEE_OperationHandle operation, const TEE_Attribute* params, uint32_t paramCount,
                                      const void* digest, uint32_t digestLen, const void* signature,
                                      uint32_t signatureLen);

// Random data (6.9).
void TEE_GenerateRandom(void* randomBuffer, uint32_t randomBufferLen);

#ifdef __cplusplus
}
#endif

#endif  // TEE_API_CRYPTO_H_
