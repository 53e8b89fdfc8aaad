// Message digests.
#ifndef TEE_CRYPTO_DIGEST_OPERATION_H_
#define TEE_CRYPTO_DIGEST_OPERATION_H_

#include "tee/crypto/operation.h"

namespace hosted_tee {

/// Ready from the start, and again after each result.
class digest_operation : public multi_stage_operation {
 public:
  digest_operation(const algorithm& kind, std::uint32_t mode, std::uint32_t max_bits);

  void update(bytes_view chunk);
  void finish_into(bytes_view chunk, const output& hash);
  void reset() override;

 private:
  void take_key(const key_material& /*material*/) override {}
  void drop_key() override {}
  void copy_content(const operation& other) override;

  evp_digest_context context_;
};

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_DIGEST_OPERATION_H_
