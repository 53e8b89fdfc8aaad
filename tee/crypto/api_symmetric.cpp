// Digests, ciphers, MACs and authenticated encryption (sections 6.3 to 6.6 of the API).
#include "tee/crypto/ae_operation.h"
#include "tee/crypto/cipher_operation.h"
#include "tee/crypto/digest_operation.h"
#include "tee/crypto/mac_operation.h"

using namespace hosted_tee;  // NOLINT(google-build-using-namespace): the file holds nothing but the API's C functions

extern "C" {

void TEE_DigestUpdate(TEE_OperationHandle operation, const void* chunk, uint32_t chunkSize) {
  operation_step<digest_operation>(__func__, operation, [&](auto& digest) { digest.update(input(chunk, chunkSize)); });
}

TEE_Result TEE_DigestDoFinal(TEE_OperationHandle operation, const void* chunk, uint32_t chunkLen, void* hash,
                             uint32_t* hashLen) {
  return operation_call<digest_operation>(__func__, operation, hashLen, [&](auto& digest) {
    digest.finish_into(input(chunk, chunkLen), output(hash, hashLen));
  });
}

void TEE_CipherInit(TEE_OperationHandle operation, const void* IV, uint32_t IVLen) {
  operation_step<cipher_operation>(__func__, operation, [&](auto& cipher) { cipher.start_message(input(IV, IVLen)); });
}

TEE_Result TEE_CipherUpdate(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                            uint32_t* destLen) {
  return operation_call<cipher_operation>(__func__, operation, destLen, [&](auto& cipher) {
    cipher.update(input(srcData, srcLen), output(destData, destLen));
  });
}

TEE_Result TEE_CipherDoFinal(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                             uint32_t* destLen) {
  return operation_call<cipher_operation>(__func__, operation, destLen, [&](auto& cipher) {
    cipher.finish_into(input(srcData, srcLen), output(destData, destLen));
  });
}

void TEE_MACInit(TEE_OperationHandle operation, const void* /*IV*/, uint32_t /*IVLen*/) {
  // None of the MACs has an IV; the standard has one ignored.
  operation_step<mac_operation>(__func__, operation, [&](auto& mac) { mac.start_message(); });
}

void TEE_MACUpdate(TEE_OperationHandle operation, const void* chunk, uint32_t chunkSize) {
  operation_step<mac_operation>(__func__, operation, [&](auto& mac) { mac.update(input(chunk, chunkSize)); });
}

TEE_Result TEE_MACComputeFinal(TEE_OperationHandle operation, const void* message, uint32_t messageLen, void* mac,
                               uint32_t* macLen) {
  return operation_call<mac_operation>(__func__, operation, macLen, [&](auto& found) {
    found.compute_into(input(message, messageLen), output(mac, macLen));
  });
}

TEE_Result TEE_MACCompareFinal(TEE_OperationHandle operation, const void* message, uint32_t messageLen, const void* mac,
                               uint32_t macLen) {
  return operation_call<mac_operation>(__func__, operation, nullptr, [&](auto& found) {
    found.compare(input(message, messageLen), input(mac, macLen));
  });
}

TEE_Result TEE_AEInit(TEE_OperationHandle operation, const void* nonce, uint32_t nonceLen, uint32_t tagLen,
                      uint32_t /*AADLen*/, uint32_t /*payloadLen*/) {
  // GCM needs to know neither length beforehand.
  return crypto_call(__func__, nullptr, [&](instance& self) {
    find_operation<ae_operation>(self, operation)
        .start_message(input(nonce, nonceLen), tagLen, self.faults.strict_gcm_tags());
  });
}

void TEE_AEUpdateAAD(TEE_OperationHandle operation, const void* AADdata, uint32_t AADdataLen) {
  operation_step<ae_operation>(__func__, operation,
                               [&](auto& ae) { ae.add_associated_data(input(AADdata, AADdataLen)); });
}

TEE_Result TEE_AEUpdate(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                        uint32_t* destLen) {
  return operation_call<ae_operation>(__func__, operation, destLen,
                                      [&](auto& ae) { ae.update(input(srcData, srcLen), output(destData, destLen)); });
}

TEE_Result TEE_AEEncryptFinal(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                              uint32_t* destLen, void* tag, uint32_t* tagLen) {
  const TEE_Result result = operation_call<ae_operation>(__func__, operation, destLen, [&](auto& ae) {
    ae.encrypt_final(input(srcData, srcLen), output(destData, destLen), output(tag, tagLen));
  });
  // The one call with two lengths.
  if (result != TEE_SUCCESS && result != TEE_ERROR_SHORT_BUFFER && tagLen != nullptr) *tagLen = 0;
  return result;
}

TEE_Result TEE_AEDecryptFinal(TEE_OperationHandle operation, const void* srcData, uint32_t srcLen, void* destData,
                              uint32_t* destLen, void* tag, uint32_t tagLen) {
  return operation_call<ae_operation>(__func__, operation, destLen, [&](auto& ae) {
    try {
      ae.decrypt_final(input(srcData, srcLen), output(destData, destLen), input(tag, tagLen));
    } catch (const call_failure& refusal) {
      // Also a missing tag or message is one that doesn't authenticate.
      refuse(refusal.code() == TEE_ERROR_SHORT_BUFFER ? TEE_ERROR_SHORT_BUFFER : TEE_ERROR_MAC_INVALID);
    } catch (const std::exception&) {
      refuse(TEE_ERROR_MAC_INVALID);
    }
  });
}

}  // extern "C"
