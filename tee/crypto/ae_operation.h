// AES-GCM.
#ifndef TEE_CRYPTO_AE_OPERATION_H_
#define TEE_CRYPTO_AE_OPERATION_H_

#include "tee/crypto/aes_stream.h"
#include "tee/crypto/operation.h"

namespace hosted_tee {

class ae_operation : public multi_stage_operation {
 public:
  using multi_stage_operation::multi_stage_operation;

  /// start_message takes a nonce of 12 bytes and a tag length of 0 to 128 bits in whole bytes, or with `strict_tags` of
  /// 96 to 128 bits. Anything else is refused with TEE_ERROR_NOT_SUPPORTED.
  void start_message(bytes_view nonce, std::uint32_t tag_bits, bool strict_tags);
  void add_associated_data(bytes_view data);  ///< before the first data
  /// update puts out as many bytes as it takes. A short buffer takes no data.
  void update(bytes_view source, const output& destination);

  void encrypt_final(bytes_view source, const output& destination, const output& tag);
  /// decrypt_final refuses with TEE_ERROR_MAC_INVALID whatever keeps it from confirming the tag: a wrong one, one of
  /// another length than agreed, an operation that a failed step has spoiled. Callers look for that code alone. A short
  /// buffer is told only with a tag of the agreed length, and takes no data.
  void decrypt_final(bytes_view source, const output& destination, bytes_view tag);

 private:
  void take_key(const key_material& material) override;
  void drop_key() override;
  void copy_content(const operation& other) override;
  [[nodiscard]] std::uint32_t result_bytes() const override { return tag_bytes_; }
  [[nodiscard]] bool is_authentic(bytes_view tag);  ///< for a tag of the agreed length

  secret_bytes key_;
  aes_stream stream_;
  std::uint32_t tag_bytes_ = 0;
  bool has_data_ = false;
};

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_AE_OPERATION_H_
