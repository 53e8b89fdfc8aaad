#include "tee/crypto/cipher_operation.h"

namespace hosted_tee {

void cipher_operation::take_key(const key_material& material) {
  key_ = material.find(TEE_ATTR_SECRET_VALUE)->bytes;
}

void cipher_operation::drop_key() {
  key_ = {};
  stream_.drop();
}

void cipher_operation::start_message(bytes_view iv) {
  expect_key();
  panic_unless(iv.size() == (kind().chaining == block_mode::ecb ? 0 : block_bytes), "an IV of a wrong length");
  start([&] {
    residue_ = 0;
    refuse_unless(stream_.start(kind().chaining, key_, iv, mode() == TEE_MODE_ENCRYPT), TEE_ERROR_GENERIC);
  });
}

void cipher_operation::update(bytes_view source, const output& destination) {
  expect_running();
  const std::uint64_t available = std::uint64_t{residue_} + source.size();
  const std::uint64_t ready = is_stream() ? source.size() : available / block_bytes * block_bytes;
  std::uint8_t* const place = destination.room(ready);
  // libcrypto writes nothing when no block is complete, but takes a null destination for another request.
  std::uint8_t nowhere = 0;
  expect_step(stream_.update(source, place == nullptr ? &nowhere : place));
  residue_ = is_stream() ? 0 : static_cast<std::size_t>(available % block_bytes);
  destination.written(ready);
}

void cipher_operation::finish_into(bytes_view source, const output& destination) {
  expect_running();
  refuse_unless(is_stream() || (residue_ + source.size()) % block_bytes == 0, TEE_ERROR_BAD_PARAMETERS);
  update(source, destination);
  expect_step(stream_.close());
  finish();
}

void cipher_operation::copy_content(const operation& other) {
  const auto& source = dynamic_cast<const cipher_operation&>(other);
  key_ = source.key_;
  residue_ = source.residue_;
  expect_step(stream_.copy_from(source.stream_));
  copy_stage(source);
}

}  // namespace hosted_tee
