#include "tee/storage/sealing.h"

#include <openssl/crypto.h>
#include <openssl/rand.h>

#include <limits>

#include "tee/crypto/algorithms.h"
#include "tee/runtime/platform_call.h"

namespace hosted_tee {
namespace {

constexpr std::size_t nonce_size = 12;
constexpr std::size_t tag_size = 16;
static_assert(nonce_size + tag_size == sealer::overhead);

void require(int libcrypto_result) {
  if (libcrypto_result != 1) throw call_failure(TEE_ERROR_GENERIC);
}

int length_of(std::size_t size) {
  if (size > std::size_t{std::numeric_limits<int>::max()}) throw call_failure(TEE_ERROR_STORAGE_NO_SPACE);
  return static_cast<int>(size);
}

evp_cipher_context start(const storage_key& key, std::span<const std::uint8_t> nonce, std::string_view label,
                         bool encrypt) {
  auto context = owned<evp_cipher_context>(EVP_CIPHER_CTX_new());
  const std::span<const std::uint8_t> key_bytes = key.bytes();
  require(EVP_CipherInit_ex2(context.get(), fetched_aes(block_mode::gcm, key_bytes.size()), key_bytes.data(),
                             nonce.data(), encrypt ? 1 : 0, nullptr));
  int length = 0;
  const auto* aad = reinterpret_cast<const std::uint8_t*>(label.data());
  require(EVP_CipherUpdate(context.get(), nullptr, &length, aad, length_of(label.size())));
  return context;
}

// An update without input would be read as the end of the message.
void run(EVP_CIPHER_CTX* context, std::span<const std::uint8_t> in, std::uint8_t* out) {
  int length = 0;
  if (!in.empty()) require(EVP_CipherUpdate(context, out, &length, in.data(), length_of(in.size())));
}

}  // namespace

std::vector<std::uint8_t> sealer::seal(std::string_view label, std::span<const std::uint8_t> data) const {
  const error_queue_scope errors;
  std::vector<std::uint8_t> sealed(data.size() + overhead);
  require(RAND_bytes(sealed.data(), nonce_size));
  const auto context = start(key_, {sealed.data(), nonce_size}, label, true);
  run(context.get(), data, sealed.data() + nonce_size);
  std::uint8_t* tag = sealed.data() + nonce_size + data.size();
  int length = 0;
  require(EVP_CipherFinal_ex(context.get(), tag, &length));
  require(EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_AEAD_GET_TAG, tag_size, tag));
  return sealed;
}

std::optional<secret_bytes> sealer::open(std::string_view label, std::span<const std::uint8_t> sealed) const {
  if (sealed.size() < overhead) return std::nullopt;
  const error_queue_scope errors;
  const auto context = start(key_, sealed.first(nonce_size), label, false);
  secret_bytes data(sealed.size() - overhead);
  run(context.get(), sealed.subspan(nonce_size, data.size()), data.data());
  std::array<std::uint8_t, tag_size> tag{};
  std::copy(sealed.end() - tag_size, sealed.end(), tag.begin());
  require(EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_AEAD_SET_TAG, tag_size, tag.data()));
  int length = 0;
  if (EVP_CipherFinal_ex(context.get(), tag.data(), &length) != 1) return std::nullopt;
  return data;
}

}  // namespace hosted_tee
