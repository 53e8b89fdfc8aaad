#include "tests/support/encryption.h"

#include <fmt/format.h>
#include <openssl/evp.h>

#include <algorithm>
#include <memory>
#include <stdexcept>

using namespace keymaster;

namespace testing_support {
namespace {

using cipher_context = std::unique_ptr<EVP_CIPHER_CTX, decltype(&EVP_CIPHER_CTX_free)>;
using cipher_type = std::unique_ptr<EVP_CIPHER, decltype(&EVP_CIPHER_free)>;

void must(bool done, const char* what) {
  if (!done) throw std::runtime_error(fmt::format("libcrypto refuses: {}", what));
}

const char* mode_name(std::uint32_t block_mode) {
  switch (block_mode) {
    case KM_MODE_ECB:
      return "ECB";
    case KM_MODE_CBC:
      return "CBC";
    case KM_MODE_CTR:
      return "CTR";
    case KM_MODE_GCM:
      return "GCM";
    default:
      throw std::invalid_argument("no block mode of AES");
  }
}

}  // namespace

param_list aes_key(std::uint32_t bits) {
  param_list list;
  list.add(KM_TAG_ALGORITHM, KM_ALGORITHM_AES)
      .add(KM_TAG_KEY_SIZE, bits)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_DECRYPT)
      .add(KM_TAG_NO_AUTH_REQUIRED)
      .add(KM_TAG_CALLER_NONCE)
      .add(KM_TAG_MIN_MAC_LENGTH, 96);
  for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM}) {
    list.add(KM_TAG_BLOCK_MODE, mode);
  }
  return list.add(KM_TAG_PADDING, KM_PAD_NONE).add(KM_TAG_PADDING, KM_PAD_PKCS7);
}

param_list rsa_cipher_key(std::uint32_t bits) {
  param_list list;
  list.add(KM_TAG_ALGORITHM, KM_ALGORITHM_RSA)
      .add(KM_TAG_KEY_SIZE, bits)
      .add(KM_TAG_RSA_PUBLIC_EXPONENT, 65537)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_DECRYPT)
      .add(KM_TAG_NO_AUTH_REQUIRED)
      .add(KM_TAG_DIGEST, KM_DIGEST_NONE);
  for (const std::uint32_t padding : {KM_PAD_NONE, KM_PAD_RSA_OAEP, KM_PAD_RSA_PKCS1_1_5_ENCRYPT}) {
    list.add(KM_TAG_PADDING, padding);
  }
  return list;
}

param_list cipher(std::uint32_t block_mode, std::uint32_t padding, const bytes& nonce) {
  param_list list = param_list{}.add(KM_TAG_BLOCK_MODE, block_mode).add(KM_TAG_PADDING, padding);
  return nonce.empty() ? list : list.add_blob(KM_TAG_NONCE, nonce);
}

param_list gcm(std::uint32_t tag_bits, const bytes& nonce) {
  return cipher(KM_MODE_GCM, KM_PAD_NONE, nonce).add(KM_TAG_MAC_LENGTH, tag_bits);
}

std::vector<bytes> cut(const bytes& data, std::mt19937& random) {
  const auto below = [&random](std::size_t limit) {
    return std::uniform_int_distribution<std::size_t>(0, limit - 1)(random);
  };
  // Some messages come in small pieces, some in large ones, some mixed.
  const std::size_t most = std::size_t{1} << below(9);
  std::vector<bytes> pieces;
  for (auto at = data.begin(); at != data.end();) {
    const auto left = static_cast<std::size_t>(data.end() - at);
    const std::size_t size = below(20) == 0 ? 0 : std::min(left, 1 + below(most));
    pieces.emplace_back(at, at + static_cast<std::ptrdiff_t>(size));
    at += static_cast<std::ptrdiff_t>(size);
  }
  return pieces;
}

std::vector<bytes> cut_every(const bytes& data, std::size_t size) {
  std::vector<bytes> pieces;
  for (std::size_t at = 0; at < data.size(); at += size) {
    const std::size_t end = std::min(data.size(), at + size);
    pieces.emplace_back(data.begin() + static_cast<std::ptrdiff_t>(at),
                        data.begin() + static_cast<std::ptrdiff_t>(end));
  }
  return pieces;
}

cipher_answer run_cipher(ta_client& client, std::uint32_t purpose, const bytes& blob, const param_list& params,
                         const std::vector<bytes>& pieces, const bytes& aad) {
  cipher_answer whole;
  const auto keep = [&whole](const answer& step) {
    static_cast<answer&>(whole) = step;
    return step.ok();
  };
  const answer begun = client.begin(purpose, blob, params);
  if (!keep(begun)) return whole;
  whole.begun = param_list::parse(begun.body()).value();
  if (!aad.empty() && !keep(client.update(begun.b, {}, param_list{}.add_blob(KM_TAG_ASSOCIATED_DATA, aad)))) {
    return whole;
  }
  for (const bytes& piece : pieces) {
    const answer fed = client.update(begun.b, piece, {}, piece.size() + 32);
    if (!keep(fed)) return whole;
    whole.text = join({whole.text, fed.body()});
  }
  static_cast<finish_answer&>(whole) = client.finish(begun.b);
  whole.text = join({whole.text, whole.data});
  return whole;
}

bytes aes_encrypt(const aes_job& job, const bytes& text) {
  const std::string name = fmt::format("AES-{}-{}", job.key.size() * 8, mode_name(job.block_mode));
  const cipher_type type(EVP_CIPHER_fetch(nullptr, name.c_str(), nullptr), EVP_CIPHER_free);
  must(type != nullptr, name.c_str());
  const cipher_context context(EVP_CIPHER_CTX_new(), EVP_CIPHER_CTX_free);
  const bool is_gcm = job.block_mode == KM_MODE_GCM;
  must(EVP_EncryptInit_ex2(context.get(), type.get(), job.key.data(), job.nonce.empty() ? nullptr : job.nonce.data(),
                           nullptr) == 1,
       "the key");
  must(EVP_CIPHER_CTX_set_padding(context.get(), job.padding == KM_PAD_PKCS7 ? 1 : 0) == 1, "the padding");
  int written = 0, last = 0;
  if (is_gcm && !job.aad.empty()) {
    must(EVP_EncryptUpdate(context.get(), nullptr, &written, job.aad.data(), static_cast<int>(job.aad.size())) == 1,
         "the associated data");
  }
  bytes out(text.size() + 32);
  written = 0;
  must(text.empty() ||
           EVP_EncryptUpdate(context.get(), out.data(), &written, text.data(), static_cast<int>(text.size())) == 1,
       "the text");
  must(EVP_EncryptFinal_ex(context.get(), out.data() + written, &last) == 1, "the end of the text");
  out.resize(static_cast<std::size_t>(written + last));
  if (!is_gcm || job.tag_size == 0) return out;
  bytes tag(job.tag_size);
  must(EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_AEAD_GET_TAG, static_cast<int>(tag.size()), tag.data()) == 1,
       "the tag");
  return join({out, tag});
}

}  // namespace testing_support
