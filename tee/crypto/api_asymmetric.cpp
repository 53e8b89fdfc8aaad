// RSA and ECDSA (section 6.7 of the API), and the export of public keys.
#include "tee/crypto/rsa_operation.h"

using namespace hosted_tee;  // NOLINT(google-build-using-namespace): the file holds nothing but the API's C functions

extern "C" {

TEE_Result TEE_AsymmetricEncrypt(TEE_OperationHandle operation, const TEE_Attribute* params, uint32_t paramCount,
                                 const void* srcData, uint32_t srcLen, void* destData, uint32_t* destLen) {
  return operation_call<rsa_cipher_operation>(__func__, operation, destLen, [&](auto& rsa) {
    rsa.encrypt(attribute_view(params, paramCount), input(srcData, srcLen), output(destData, destLen));
  });
}

TEE_Result TEE_AsymmetricDecrypt(TEE_OperationHandle operation, const TEE_Attribute* params, uint32_t paramCount,
                                 const void* srcData, uint32_t srcLen, void* destData, uint32_t* destLen) {
  return operation_call<rsa_cipher_operation>(__func__, operation, destLen, [&](auto& rsa) {
    rsa.decrypt(attribute_view(params, paramCount), input(srcData, srcLen), output(destData, destLen));
  });
}

TEE_Result TEE_AsymmetricSignDigest(TEE_OperationHandle operation, const TEE_Attribute* params, uint32_t paramCount,
                                    const void* digest, uint32_t digestLen, void* signature, uint32_t* signatureLen) {
  return operation_call<signature_operation>(__func__, operation, signatureLen, [&](auto& signer) {
    signer.sign(attribute_view(params, paramCount), input(digest, digestLen), output(signature, signatureLen));
  });
}

TEE_Result TEE_AsymmetricVerifyDigest(TEE_OperationHandle operation, const TEE_Attribute* params, uint32_t paramCount,
                                      const void* digest, uint32_t digestLen, const void* signature,
                                      uint32_t signatureLen) {
  return operation_call<signature_operation>(__func__, operation, nullptr, [&](auto& verifier) {
    verifier.verify(attribute_view(params, paramCount), input(digest, digestLen), input(signature, signatureLen));
  });
}

TEE_Result TEE_AsymmetricExport(TEE_OperationHandle operation, uint32_t format, void* buffer, uint32_t* length) {
  return operation_call<rsa_cipher_operation>(__func__, operation, length, [&](auto& rsa) {
    refuse_unless(format == TEE_EXPORT_FORMAT_SPKI_DER, TEE_ERROR_NOT_SUPPORTED);
    rsa.export_spki(output(buffer, length));
  });
}

}  // extern "C"
