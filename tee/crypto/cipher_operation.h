// AES in ECB, CBC and CTR mode, without padding.
#ifndef TEE_CRYPTO_CIPHER_OPERATION_H_
#define TEE_CRYPTO_CIPHER_OPERATION_H_

#include "tee/crypto/aes_stream.h"
#include "tee/crypto/operation.h"

namespace hosted_tee {

class cipher_operation : public multi_stage_operation {
 public:
  using multi_stage_operation::multi_stage_operation;

  /// start_message takes an IV of a block for CBC and CTR, and none for ECB; another one is the TA's mistake.
  void start_message(bytes_view iv);
  /// update puts out every block that is complete at once (CTR: every byte). A short buffer takes no data.
  void update(bytes_view source, const output& destination);
  /// finish_into is update and the end of the message. Data that end inside a block of ECB or CBC are refused with
  /// TEE_ERROR_BAD_PARAMETERS and not taken.
  void finish_into(bytes_view source, const output& destination);

 private:
  static constexpr std::size_t block_bytes = 16;

  void take_key(const key_material& material) override;
  void drop_key() override;
  void copy_content(const operation& other) override;
  [[nodiscard]] bool is_stream() const { return kind().chaining == block_mode::ctr; }

  secret_bytes key_;
  aes_stream stream_;
  std::size_t residue_ = 0;  ///< bytes of an incomplete block that libcrypto holds
};

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_CIPHER_OPERATION_H_
