// What keys of the soter framework do instead of a plain export and a plain signature: signed statements.
//
//   u32 length of the text, the text (a JSON object), the RSA signature over exactly these bytes of text.
//
// The text of an export statement goes without its NUL; that of a sign statement includes it, in the length, in the
// output and under the signature. Relying parties tell the two apart by it, so they must never become alike.
#ifndef KEYMASTER_SOTER_SOTER_ENHANCE_H_
#define KEYMASTER_SOTER_SOTER_ENHANCE_H_

#include <cstdint>
#include <span>

#include "params/key_param.h"
#include "platform/bytes.h"
#include "tee_internal_api.h"

namespace keymaster {

/// The uid in the sign statement of a key that has none.
inline constexpr uint32_t soter_no_uid = 0xFFFFFFFF;

/// What a sign statement needs of the signing operation, all of it borrowed.
struct soter_signer {
  const keymaster_key_param_set_t& authorization_set;  // of the key: its uid
  TEE_OperationHandle operation;                       // signs digests with the key
  TEE_OperationHandle digest_operation;  // nothing was fed to it yet; null: the key signs without a digest
  std::span<uint8_t> buffer;             // as long as the modulus; takes the digest
  const TEE_Attribute* salt;             // the salt length of PSS; null with PKCS#1 v1.5
};

/// soter_enhance_export_key writes the export statement of a key to `output`; `*output_length` is the capacity on
/// entry, the size on return. The counter, where the key has it told, moves whatever happens afterwards.
/// TEE_ERROR_OUT_OF_MEMORY; TEE_ERROR_BAD_FORMAT (the key data is no RSA key's); TEE_ERROR_BAD_STATE (a member can't be
/// set or written, or the signing key can't be had); TEE_ERROR_ITEM_NOT_FOUND (no blob of the signing key);
/// TEE_ERROR_BAD_PARAMETERS (no signing key is named at all); TEE_ERROR_SHORT_BUFFER; otherwise the result of
/// increase_and_get_counter, export_rsa_public_key, soter_ensure_ready or digest_and_sign. On failure `*output_length`
/// is as it was, and nothing is written.
[[nodiscard]] TEE_Result soter_enhance_export_key(const keymaster_key_param_set_t& params,
                                                  std::span<const uint8_t> key_data, uint8_t* output,
                                                  uint32_t* output_length);

/// soter_enhance_sign_finish makes a sign statement about the message `raw` and signs it. A zero byte stands behind
/// `raw`. TEE_ERROR_NOT_SUPPORTED, before anything else happens, for a key that signs without a digest;
/// TEE_ERROR_OUT_OF_MEMORY; otherwise the result of produce_soter_sign_json or of the platform. `output` is empty then.
[[nodiscard]] TEE_Result soter_enhance_sign_finish(const soter_signer& op, const keymaster_key_param_set_t& in_params,
                                                   std::span<const uint8_t> raw, secret_bytes& output);

/// soter_do_sign_finish signs `statement`, whose NUL counts, with the operation's own key and padding. Results as
/// above.
[[nodiscard]] TEE_Result soter_do_sign_finish(const soter_signer& op, const keymaster_key_param_set_t& in_params,
                                              std::span<const uint8_t> statement, secret_bytes& signature);

/// produce_soter_sign_json makes the text of a sign statement, which json_free_serialized_string frees. A zero byte
/// stands behind `raw`. Null, with `*result` telling why: TEE_ERROR_OUT_OF_MEMORY, TEE_ERROR_BAD_FORMAT (the message is
/// not UTF-8, or holds a NUL), TEE_ERROR_BAD_STATE (a member can't be set or written), or the result of
/// soter_ensure_ready or increase_and_get_counter. The counter moves once the message has been accepted.
[[nodiscard]] char* produce_soter_sign_json(std::span<const uint8_t> raw, uint32_t uid, TEE_Result* result);

}  // namespace keymaster

#endif  // KEYMASTER_SOTER_SOTER_ENHANCE_H_
