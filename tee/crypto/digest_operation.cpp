#include "tee/crypto/digest_operation.h"

namespace hosted_tee {

digest_operation::digest_operation(const algorithm& kind, std::uint32_t mode, std::uint32_t max_bits)
    : multi_stage_operation(kind, mode, max_bits), context_(owned<evp_digest_context>(EVP_MD_CTX_new())) {
  digest_operation::reset();
}

void digest_operation::reset() {
  start([&] {
    refuse_unless(EVP_DigestInit_ex2(context_.get(), fetched_digest(kind().digest), nullptr) == 1, TEE_ERROR_GENERIC);
  });
}

void digest_operation::update(bytes_view chunk) {
  expect_running();
  expect_step(chunk.empty() || EVP_DigestUpdate(context_.get(), chunk.data(), chunk.size()) == 1);
}

void digest_operation::finish_into(bytes_view chunk, const output& hash) {
  expect_running();
  const std::uint32_t bytes = digest_bytes(kind().digest);
  std::uint8_t* const place = hash.room(bytes);  // before the chunk: a short buffer takes no data
  update(chunk);
  expect_step(EVP_DigestFinal_ex(context_.get(), place, nullptr) == 1);
  hash.written(bytes);
  reset();
}

void digest_operation::copy_content(const operation& other) {
  const auto& source = dynamic_cast<const digest_operation&>(other);
  expect_step(EVP_MD_CTX_copy_ex(context_.get(), source.context_.get()) == 1);
  copy_stage(source);
}

}  // namespace hosted_tee
