// The platform's functions on operations and on other TAs.
#include <fmt/format.h>

#include <cstring>

#include "quil/quil_protocol.h"
#include "tests/second_platform/platform.h"

using namespace second_platform;
using namespace testing_support;

namespace second_platform {
std::string shown_parameters(const TEE_Attribute* attributes, std::uint32_t count);
}  // namespace second_platform

namespace {

constexpr std::uint32_t block_size = 16;

std::size_t digest_size(std::uint32_t algorithm) {
  constexpr std::size_t sizes[] = {0, 16, 20, 28, 32, 48, 64, 0};
  return sizes[algorithm & 7];
}

bool is_ecdsa(std::uint32_t algorithm) {
  return (algorithm & 0xFF) == (TEE_ALG_ECDSA_P256 & 0xFF);
}

std::size_t field_size(const operation& op) {
  return (op.bits + 7) / 8;
}

bytes tag_of(const operation& op) {
  return fixed_output(op.tag_bits / 8);
}

operation known(TEE_OperationHandle handle) {
  const operation* const found = platform.find(handle);
  return found == nullptr ? operation{} : *found;
}

std::string note_input(TEE_OperationHandle handle, const bytes& input) {
  return fmt::format("{}, {}", platform.label(handle), shown(input));
}

}  // namespace

TEE_Result TEE_AllocateOperation(TEE_OperationHandle* handle, uint32_t algorithm, uint32_t mode, uint32_t maxKeySize) {
  const twist departure = platform.enter(__func__, fmt::format("{:08x}, {}, {}", algorithm, mode, maxKeySize));
  if (!departure.undone) *handle = platform.add(operation{algorithm, mode, maxKeySize, 0, 0});
  return departure.result.value_or(TEE_SUCCESS);
}

void TEE_FreeOperation(TEE_OperationHandle handle) {
  platform.enter(__func__, handle == TEE_HANDLE_NULL ? "null" : platform.label(handle));
  if (handle != TEE_HANDLE_NULL) platform.drop(handle);
}

TEE_Result TEE_SetOperationKey(TEE_OperationHandle handle, TEE_ObjectHandle key) {
  const twist departure = platform.enter(__func__, fmt::format("{}, {}", platform.label(handle), platform.label(key)));
  return departure.result.value_or(TEE_SUCCESS);
}

void TEE_DigestUpdate(TEE_OperationHandle handle, const void* chunk, uint32_t chunkSize) {
  platform.enter(__func__, note_input(handle, platform.read(chunk, chunkSize)));
}

TEE_Result TEE_DigestDoFinal(TEE_OperationHandle handle, const void* chunk, uint32_t chunkLen, void* hash,
                             uint32_t* hashLen) {
  const twist departure =
      platform.enter(__func__, fmt::format("{}, {}", note_input(handle, platform.read(chunk, chunkLen)), *hashLen));
  return platform.deliver(departure, fixed_output(digest_size(known(handle).algorithm)), hash, hashLen);
}

void TEE_CipherInit(TEE_OperationHandle handle, const void* IV, uint32_t IVLen) {
  platform.enter(__func__, note_input(handle, platform.read(IV, IVLen)));
}

TEE_Result TEE_CipherUpdate(TEE_OperationHandle handle, const void* srcData, uint32_t srcLen, void* destData,
                            uint32_t* destLen) {
  bytes data = platform.read(srcData, srcLen);
  const twist departure = platform.enter(__func__, fmt::format("{}, {}", note_input(handle, data), *destLen));
  operation* const op = platform.find(handle);
  if (op != nullptr && op->algorithm != TEE_ALG_AES_CTR) {
    const std::uint32_t all = op->held + srcLen;
    data.resize(all / block_size * block_size, 0x11);
    op->held = all % block_size;
  }
  return platform.deliver(departure, data, destData, destLen);
}

TEE_Result TEE_CipherDoFinal(TEE_OperationHandle handle, const void* srcData, uint32_t srcLen, void* destData,
                             uint32_t* destLen) {
  const twist departure =
      platform.enter(__func__, fmt::format("{}, {}", note_input(handle, platform.read(srcData, srcLen)), *destLen));
  return platform.deliver(departure, {}, destData, destLen);
}

void TEE_MACInit(TEE_OperationHandle handle, const void* IV, uint32_t IVLen) {
  platform.enter(__func__, note_input(handle, platform.read(IV, IVLen)));
}

void TEE_MACUpdate(TEE_OperationHandle handle, const void* chunk, uint32_t chunkSize) {
  platform.enter(__func__, note_input(handle, platform.read(chunk, chunkSize)));
}

TEE_Result TEE_MACComputeFinal(TEE_OperationHandle handle, const void* message, uint32_t messageLen, void* mac,
                               uint32_t* macLen) {
  const twist departure =
      platform.enter(__func__, fmt::format("{}, {}", note_input(handle, platform.read(message, messageLen)), *macLen));
  return platform.deliver(departure, fixed_output(digest_size(known(handle).algorithm)), mac, macLen);
}

TEE_Result TEE_AEInit(TEE_OperationHandle handle, const void* nonce, uint32_t nonceLen, uint32_t tagLen,
                      uint32_t AADLen, uint32_t payloadLen) {
  const twist departure = platform.enter(
      __func__,
      fmt::format("{}, {}, {}, {}", note_input(handle, platform.read(nonce, nonceLen)), tagLen, AADLen, payloadLen));
  if (operation* const op = platform.find(handle)) op->tag_bits = tagLen;
  return departure.result.value_or(TEE_SUCCESS);
}

void TEE_AEUpdateAAD(TEE_OperationHandle handle, const void* AADdata, uint32_t AADdataLen) {
  platform.enter(__func__, note_input(handle, platform.read(AADdata, AADdataLen)));
}

TEE_Result TEE_AEUpdate(TEE_OperationHandle handle, const void* srcData, uint32_t srcLen, void* destData,
                        uint32_t* destLen) {
  const bytes data = platform.read(srcData, srcLen);
  const twist departure = platform.enter(__func__, fmt::format("{}, {}", note_input(handle, data), *destLen));
  return platform.deliver(departure, data, destData, destLen);
}

TEE_Result TEE_AEEncryptFinal(TEE_OperationHandle handle, const void* srcData, uint32_t srcLen, void* destData,
                              uint32_t* destLen, void* tag, uint32_t* tagLen) {
  const bytes data = platform.read(srcData, srcLen);
  const twist departure =
      platform.enter(__func__, fmt::format("{}, {}, {}", note_input(handle, data), *destLen, *tagLen));
  if (const TEE_Result r = platform.deliver(departure, data, destData, destLen); r != TEE_SUCCESS) return r;
  twist of_tag = departure;
  of_tag.second_length = !departure.second_length;
  return platform.deliver(of_tag, tag_of(known(handle)), tag, tagLen);
}

TEE_Result TEE_AEDecryptFinal(TEE_OperationHandle handle, const void* srcData, uint32_t srcLen, void* destData,
                              uint32_t* destLen, void* tag, uint32_t tagLen) {
  const bytes data = platform.read(srcData, srcLen);
  const bytes given = platform.read(tag, tagLen);
  const twist departure =
      platform.enter(__func__, fmt::format("{}, {}, {}", note_input(handle, data), *destLen, shown(given)));
  if (!departure.result && given != tag_of(known(handle))) return TEE_ERROR_MAC_INVALID;
  return platform.deliver(departure, data, destData, destLen);
}

namespace {

/// The bare operation: a number below the modulus, which comes without its leading zero byte.
TEE_Result run_rsa(const char* name, TEE_OperationHandle handle, const TEE_Attribute* params, std::uint32_t paramCount,
                   const bytes& input, void* destData, uint32_t* destLen) {
  const twist departure =
      platform.enter(name, fmt::format("{}, {}, {}, {}", platform.label(handle), shown_parameters(params, paramCount),
                                       shown(input), *destLen));
  bytes output = platform.public_operation.value_or(fixed_output(field_size(known(handle)) - 1));
  return platform.deliver(departure, output, destData, destLen);
}

}  // namespace

TEE_Result TEE_AsymmetricEncrypt(TEE_OperationHandle handle, const TEE_Attribute* params, uint32_t paramCount,
                                 const void* srcData, uint32_t srcLen, void* destData, uint32_t* destLen) {
  return run_rsa(__func__, handle, params, paramCount, platform.read(srcData, srcLen), destData, destLen);
}

TEE_Result TEE_AsymmetricDecrypt(TEE_OperationHandle handle, const TEE_Attribute* params, uint32_t paramCount,
                                 const void* srcData, uint32_t srcLen, void* destData, uint32_t* destLen) {
  return run_rsa(__func__, handle, params, paramCount, platform.read(srcData, srcLen), destData, destLen);
}

TEE_Result TEE_AsymmetricSignDigest(TEE_OperationHandle handle, const TEE_Attribute* params, uint32_t paramCount,
                                    const void* digest, uint32_t digestLen, void* signature, uint32_t* signatureLen) {
  const twist departure = platform.enter(
      __func__, fmt::format("{}, {}, {}, {}", platform.label(handle), shown_parameters(params, paramCount),
                            shown(platform.read(digest, digestLen)), *signatureLen));
  const operation op = known(handle);
  return platform.deliver(departure, fixed_output(field_size(op) * (is_ecdsa(op.algorithm) ? 2 : 1)), signature,
                          signatureLen);
}

TEE_Result TEE_AsymmetricVerifyDigest(TEE_OperationHandle handle, const TEE_Attribute* params, uint32_t paramCount,
                                      const void* digest, uint32_t digestLen, const void* signature,
                                      uint32_t signatureLen) {
  const bytes given = platform.read(signature, signatureLen);
  const twist departure = platform.enter(
      __func__, fmt::format("{}, {}, {}, {}", platform.label(handle), shown_parameters(params, paramCount),
                            shown(platform.read(digest, digestLen)), shown(given)));
  const operation op = known(handle);
  const bytes right = fixed_output(field_size(op) * (is_ecdsa(op.algorithm) ? 2 : 1));
  return departure.result.value_or(given == right ? TEE_SUCCESS : TEE_ERROR_SIGNATURE_INVALID);
}

TEE_Result TEE_AsymmetricExport(TEE_OperationHandle handle, uint32_t format, void* buffer, uint32_t* length) {
  const twist departure = platform.enter(__func__, fmt::format("{}, {}, {}", platform.label(handle), format, *length));
  return platform.deliver(departure, fixed_output(38 + field_size(known(handle))), buffer, length);
}

void TEE_GenerateRandom(void* randomBuffer, uint32_t randomBufferLen) {
  const twist departure = platform.enter(__func__, std::to_string(randomBufferLen));
  std::uint32_t capacity = randomBufferLen;
  (void)platform.deliver(departure, platform.random(randomBufferLen), randomBuffer, &capacity);
}

TEE_Result TEE_OpenTASession(const TEE_UUID* destination, uint32_t cancellationRequestTimeout, uint32_t paramTypes,
                             TEE_Param[4], TEE_TASessionHandle* session, uint32_t* returnOrigin) {
  const twist departure =
      platform.enter(__func__, fmt::format("{:08x}, {:#x}, {:#x}, {}", destination->timeLow, cancellationRequestTimeout,
                                           paramTypes, returnOrigin == nullptr ? "no origin" : "origin"));
  if (!departure.undone) *session = platform.open_session();
  return departure.result.value_or(TEE_SUCCESS);
}

void TEE_CloseTASession(TEE_TASessionHandle session) {
  platform.enter(__func__, "");
  platform.close_session(session);
}

namespace {

const bytes& property(const bytes& request) {
  if (request == bytes{0x34, 0x18, 0x00, 0x00}) return platform.property_box;
  return request == bytes{0x34, 0x17, 0x3A, 0x17} ? platform.cpu_id : platform.device_id;
}

}  // namespace

TEE_Result TEE_InvokeTACommand(TEE_TASessionHandle, uint32_t cancellationRequestTimeout, uint32_t commandID,
                               uint32_t paramTypes, TEE_Param params[4], uint32_t* returnOrigin) {
  const bool by_request = commandID == keymaster::QUIL_COMMAND_GET_PROPERTY;
  const bytes request = by_request ? platform.read(params[0].memref.buffer, params[0].memref.size) : bytes{};
  TEE_Param& output = params[by_request ? 1 : 0];
  const twist departure = platform.enter(
      __func__, fmt::format("{:#x}, {}, {:#x}, {}, {}, {}", cancellationRequestTimeout, commandID, paramTypes,
                            shown(request), output.memref.size, returnOrigin == nullptr ? "no origin" : "origin"));
  std::uint32_t length = output.memref.size;
  const TEE_Result result =
      platform.deliver(departure, by_request ? property(request) : platform.key_box, output.memref.buffer, &length);
  (by_request ? output.memref.size : params[1].value.a) = length;
  return result;
}
