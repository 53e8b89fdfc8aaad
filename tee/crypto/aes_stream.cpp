#include "tee/crypto/aes_stream.h"

#include <algorithm>
#include <array>

namespace hosted_tee {

bool aes_stream::start(block_mode mode, bytes_view key, bytes_view iv, bool encrypt) {
  if (context_ == nullptr) context_ = owned<evp_cipher_context>(EVP_CIPHER_CTX_new());
  return EVP_CipherInit_ex2(context_.get(), fetched_aes(mode, key.size()), key.data(), iv.empty() ? nullptr : iv.data(),
                            encrypt ? 1 : 0, nullptr) == 1 &&
         EVP_CIPHER_CTX_set_padding(context_.get(), 0) == 1;
}

bool aes_stream::update(bytes_view source, std::uint8_t* destination) {
  return feed(source, destination);
}

bool aes_stream::add_associated_data(bytes_view data) {
  return feed(data, nullptr);
}

bool aes_stream::feed(bytes_view source, std::uint8_t* destination) {
  // libcrypto counts in int; the pieces are whole blocks.
  constexpr std::size_t piece = 1U << 30U;
  while (!source.empty()) {
    const std::size_t size = std::min(piece, source.size());
    int written = 0;
    if (EVP_CipherUpdate(context_.get(), destination, &written, source.data(), static_cast<int>(size)) != 1) {
      return false;
    }
    if (destination != nullptr) destination += written;
    source = source.subspan(size);
  }
  return true;
}

bool aes_stream::close() {
  std::array<std::uint8_t, EVP_MAX_BLOCK_LENGTH> nothing{};
  int written = 0;
  return EVP_CipherFinal_ex(context_.get(), nothing.data(), &written) == 1 && written == 0;
}

bool aes_stream::get_tag(std::uint8_t* tag, std::size_t size) {
  return EVP_CIPHER_CTX_ctrl(context_.get(), EVP_CTRL_AEAD_GET_TAG, static_cast<int>(size), tag) == 1;
}

bool aes_stream::expect_tag(bytes_view tag) {
  std::array<std::uint8_t, 16> copy{};  // the control has no const form
  if (tag.size() > copy.size()) return false;
  std::copy(tag.begin(), tag.end(), copy.begin());
  return EVP_CIPHER_CTX_ctrl(context_.get(), EVP_CTRL_AEAD_SET_TAG, static_cast<int>(tag.size()), copy.data()) == 1;
}

bool aes_stream::copy_from(const aes_stream& other) {
  if (other.context_ == nullptr) {
    context_.reset();
    return true;
  }
  context_ = owned<evp_cipher_context>(EVP_CIPHER_CTX_new());
  return EVP_CIPHER_CTX_copy(context_.get(), other.context_.get()) == 1;
}

}  // namespace hosted_tee
