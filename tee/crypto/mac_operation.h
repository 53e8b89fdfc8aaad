// Message authentication codes.
#ifndef TEE_CRYPTO_MAC_OPERATION_H_
#define TEE_CRYPTO_MAC_OPERATION_H_

#include "tee/crypto/operation.h"

namespace hosted_tee {

/// HMAC with the algorithm's digest, over data between start_message and one of the final calls.
class mac_operation : public multi_stage_operation {
 public:
  using multi_stage_operation::multi_stage_operation;

  void start_message();
  void update(bytes_view chunk);
  void compute_into(bytes_view chunk, const output& mac);
  /// compare refuses with TEE_ERROR_MAC_INVALID unless `mac` is the whole MAC; takes as long wherever they differ.
  void compare(bytes_view chunk, bytes_view mac);

 private:
  void take_key(const key_material& material) override;
  void drop_key() override;
  void copy_content(const operation& other) override;
  void compute(bytes_view chunk, std::uint8_t* place);

  secret_bytes key_;
  evp_mac_context context_;
};

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_MAC_OPERATION_H_
