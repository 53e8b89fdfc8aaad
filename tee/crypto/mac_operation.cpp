#include "tee/crypto/mac_operation.h"

#include <openssl/core_names.h>
#include <openssl/params.h>

#include <array>

namespace hosted_tee {

void mac_operation::take_key(const key_material& material) {
  key_ = material.find(TEE_ATTR_SECRET_VALUE)->bytes;
}

void mac_operation::drop_key() {
  key_ = {};
  context_.reset();
}

void mac_operation::start_message() {
  expect_key();
  start([&] {
    if (context_ == nullptr) context_ = owned<evp_mac_context>(EVP_MAC_CTX_new(fetched_hmac()));
    // The parameter has no const form, and libcrypto only reads it.
    const std::array<OSSL_PARAM, 2> params = {
        OSSL_PARAM_construct_utf8_string(OSSL_MAC_PARAM_DIGEST, const_cast<char*>(digest_name(kind().digest)), 0),
        OSSL_PARAM_construct_end()};
    refuse_unless(EVP_MAC_init(context_.get(), key_.data(), key_.size(), params.data()) == 1, TEE_ERROR_GENERIC);
  });
}

void mac_operation::update(bytes_view chunk) {
  expect_running();
  expect_step(chunk.empty() || EVP_MAC_update(context_.get(), chunk.data(), chunk.size()) == 1);
}

void mac_operation::compute_into(bytes_view chunk, const output& mac) {
  expect_running();
  const std::uint32_t bytes = digest_bytes(kind().digest);
  compute(chunk, mac.room(bytes));  // room first: a short buffer takes no data
  mac.written(bytes);
}

void mac_operation::compare(bytes_view chunk, bytes_view mac) {
  expect_running();
  secret_bytes computed(digest_bytes(kind().digest));
  compute(chunk, computed.data());
  refuse_unless(mac.size() == computed.size() && CRYPTO_memcmp(mac.data(), computed.data(), mac.size()) == 0,
                TEE_ERROR_MAC_INVALID);
}

void mac_operation::compute(bytes_view chunk, std::uint8_t* place) {
  update(chunk);
  std::size_t written = 0;
  const std::size_t bytes = digest_bytes(kind().digest);
  expect_step(EVP_MAC_final(context_.get(), place, &written, bytes) == 1 && written == bytes);
  finish();
}

void mac_operation::copy_content(const operation& other) {
  const auto& source = dynamic_cast<const mac_operation&>(other);
  key_ = source.key_;
  context_.reset(source.context_ == nullptr ? nullptr : EVP_MAC_CTX_dup(source.context_.get()));
  expect_step((context_ == nullptr) == (source.context_ == nullptr));
  copy_stage(source);
}

}  // namespace hosted_tee
