// AES as libcrypto runs it: a key, an IV, and data in pieces. Padding is always off.
#ifndef TEE_CRYPTO_AES_STREAM_H_
#define TEE_CRYPTO_AES_STREAM_H_

#include "tee/crypto/algorithms.h"
#include "tee/crypto/call.h"
#include "tee/crypto/secret_bytes.h"

namespace hosted_tee {

/// The functions that return bool answer whether libcrypto did what was asked.
class aes_stream {
 public:
  [[nodiscard]] bool start(block_mode mode, bytes_view key, bytes_view iv, bool encrypt);
  /// update writes to `destination` exactly what libcrypto has ready: all whole blocks, or every byte in a stream mode.
  [[nodiscard]] bool update(bytes_view source, std::uint8_t* destination);
  [[nodiscard]] bool add_associated_data(bytes_view data);
  /// close ends the message, after which GCM's tag can be had; no bytes come out any more.
  [[nodiscard]] bool close();
  [[nodiscard]] bool get_tag(std::uint8_t* tag, std::size_t size);
  [[nodiscard]] bool expect_tag(bytes_view tag);
  [[nodiscard]] bool copy_from(const aes_stream& other);
  void drop() { context_.reset(); }

 private:
  [[nodiscard]] bool feed(bytes_view source, std::uint8_t* destination);

  evp_cipher_context context_;
};

}  // namespace hosted_tee

#endif  // TEE_CRYPTO_AES_STREAM_H_
