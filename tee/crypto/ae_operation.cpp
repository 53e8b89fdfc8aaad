#include "tee/crypto/ae_operation.h"

namespace hosted_tee {

namespace {

constexpr std::size_t nonce_bytes = 12;
constexpr std::uint32_t most_tag_bits = 128;
constexpr std::uint32_t least_strict_tag_bits = 96;  // SP 800-38D, section 5.2.1.2, without its shorter exceptions

}  // namespace

void ae_operation::take_key(const key_material& material) {
  key_ = material.find(TEE_ATTR_SECRET_VALUE)->bytes;
}

void ae_operation::drop_key() {
  key_ = {};
  stream_.drop();
}

void ae_operation::start_message(bytes_view nonce, std::uint32_t tag_bits, bool strict_tags) {
  expect_key();
  reset();
  refuse_unless(nonce.size() == nonce_bytes, TEE_ERROR_NOT_SUPPORTED);
  refuse_unless(tag_bits <= most_tag_bits && tag_bits % 8 == 0, TEE_ERROR_NOT_SUPPORTED);
  refuse_unless(!strict_tags || tag_bits >= least_strict_tag_bits, TEE_ERROR_NOT_SUPPORTED);
  start([&] {
    tag_bytes_ = tag_bits / 8;
    has_data_ = false;
    refuse_unless(stream_.start(block_mode::gcm, key_, nonce, mode() == TEE_MODE_ENCRYPT), TEE_ERROR_GENERIC);
  });
}

void ae_operation::add_associated_data(bytes_view data) {
  expect_running();
  panic_unless(!has_data_, "associated data after data");
  expect_step(stream_.add_associated_data(data));
}

void ae_operation::update(bytes_view source, const output& destination) {
  expect_running();
  std::uint8_t* const place = destination.room(source.size());
  has_data_ = has_data_ || !source.empty();
  expect_step(stream_.update(source, place));
  destination.written(source.size());
}

void ae_operation::encrypt_final(bytes_view source, const output& destination, const output& tag) {
  expect_mode(TEE_MODE_ENCRYPT);
  expect_running();
  std::uint8_t* const place = tag.room(tag_bytes_);  // both rooms before the data: a short buffer takes none
  (void)destination.room(source.size());
  update(source, destination);
  expect_step(stream_.close());
  // libcrypto has no tag of no bytes to give.
  expect_step(tag_bytes_ == 0 || stream_.get_tag(place, tag_bytes_));
  tag.written(tag_bytes_);
  finish();
}

void ae_operation::decrypt_final(bytes_view source, const output& destination, bytes_view tag) {
  expect_mode(TEE_MODE_DECRYPT);
  refuse_unless(!is_poisoned(), TEE_ERROR_MAC_INVALID);
  expect_running();
  // libcrypto would be content with any part of the tag, so its length is settled first.
  const bool has_length = tag.size() == tag_bytes_;
  std::uint8_t* const place = has_length ? destination.room(source.size()) : nullptr;
  bool authentic = false;
  guard([&] {
    if (!has_length) return;
    update(source, destination);
    authentic = is_authentic(tag);
  });
  if (!authentic && place != nullptr) OPENSSL_cleanse(place, source.size());
  finish();
  refuse_unless(authentic, TEE_ERROR_MAC_INVALID);
}

bool ae_operation::is_authentic(bytes_view tag) {
  return tag.empty() || (stream_.expect_tag(tag) && stream_.close());
}

void ae_operation::copy_content(const operation& other) {
  const auto& source = dynamic_cast<const ae_operation&>(other);
  key_ = source.key_;
  tag_bytes_ = source.tag_bytes_;
  has_data_ = source.has_data_;
  expect_step(stream_.copy_from(source.stream_));
  copy_stage(source);
}

}  // namespace hosted_tee
