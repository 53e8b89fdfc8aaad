// Encryption and decryption, with libcrypto as the other side.
#include "src/params/keymaster_defs.h"
#include "tests/load/steps.h"
#include "tests/support/encryption.h"
#include "tests/support/libcrypto_digest.h"
#include "tests/support/rsa_test_key.h"

using namespace keymaster;
using namespace testing_support;

namespace load {
namespace {

constexpr std::size_t block = 16;

struct aes_work {
  const aes_secret& secret;
  aes_job job;
  bytes text;

  static aes_work draw(desk& d) {
    static constexpr std::uint32_t modes[] = {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM};
    const aes_secret& secret = d.pick(d.keys.aes);
    const std::uint32_t mode = d.pick(modes);
    const bool in_blocks = mode == KM_MODE_ECB || mode == KM_MODE_CBC;
    const std::uint32_t padding = in_blocks && d.one_in(2) ? KM_PAD_PKCS7 : KM_PAD_NONE;
    bytes text = d.message();
    if (in_blocks && padding == KM_PAD_NONE) text.resize(text.size() / block * block);
    const std::size_t nonce = mode == KM_MODE_ECB ? 0 : mode == KM_MODE_GCM ? 12 : block;
    const bytes aad = mode == KM_MODE_GCM ? pattern(d.below(100), d.below(1000)) : bytes{};
    return {secret, {mode, padding, secret.key, pattern(nonce, d.below(1000)), aad, 12 + d.below(5)}, std::move(text)};
  }

  [[nodiscard]] param_list ask(const bytes& nonce) const {
    if (job.block_mode == KM_MODE_GCM) return gcm(static_cast<std::uint32_t>(job.tag_size * 8), nonce);
    return cipher(job.block_mode, job.padding, nonce);
  }
};

struct rsa_work {
  const rsa_pair& pair;
  std::uint32_t digest, padding;
  bytes text;

  static rsa_work draw(desk& d) {
    const rsa_pair& pair = d.pick(d.keys.rsa);
    const std::uint32_t size = pair.bits / 8;
    if (d.one_in(2)) {
      return {pair, KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT, pattern(d.below(size - 11 + 1), d.below(1000))};
    }
    // OAEP with SHA-512 takes more than a key of 1024 bits has.
    const std::uint32_t digest = pair.bits < 2048 ? std::uint32_t{KM_DIGEST_SHA_2_256} : d.pick(every_sha);
    const auto most = static_cast<std::uint32_t>(size - 2 * digest_size(digest) - 2);
    return {pair, digest, KM_PAD_RSA_OAEP, pattern(d.below(most + 1), d.below(1000))};
  }
  [[nodiscard]] const rsa_test_key& key() const { return rsa_test_key::of_bits(pair.bits); }
  [[nodiscard]] param_list ask() const { return signature(digest, padding); }
};

}  // namespace

bool encrypt_aes(desk& d) {
  aes_work work = aes_work::draw(d);
  const bool draws_nonce = d.one_in(3) && !work.job.nonce.empty();
  const cipher_answer made =
      run_cipher(d.client, KM_PURPOSE_ENCRYPT, work.secret.blob, work.ask(draws_nonce ? bytes{} : work.job.nonce),
                 d.pieces(work.text), work.job.aad);
  if (is_full(made)) return false;
  expect_ok(made, "AES encryption");
  if (draws_nonce) work.job.nonce = made.begun.blob(KM_TAG_NONCE);
  expect(made.text == aes_encrypt(work.job, work.text), "the AES ciphertext is libcrypto's");
  return true;
}

bool decrypt_aes(desk& d) {
  const aes_work work = aes_work::draw(d);
  const cipher_answer made = run_cipher(d.client, KM_PURPOSE_DECRYPT, work.secret.blob, work.ask(work.job.nonce),
                                        d.pieces(aes_encrypt(work.job, work.text)), work.job.aad);
  if (is_full(made)) return false;
  expect_ok(made, "AES decryption");
  expect(made.text == work.text, "AES gives back what libcrypto encrypted");
  return true;
}

bool forge_gcm(desk& d) {
  aes_work work = aes_work::draw(d);
  work.job.block_mode = KM_MODE_GCM;
  work.job.padding = KM_PAD_NONE;
  work.job.nonce = pattern(12, d.below(1000));
  const bytes sealed = aes_encrypt(work.job, work.text);
  const bytes forged = flip(sealed, d.below(static_cast<std::uint32_t>(sealed.size())));
  const cipher_answer made = run_cipher(d.client, KM_PURPOSE_DECRYPT, work.secret.blob, work.ask(work.job.nonce),
                                        d.pieces(forged), work.job.aad);
  if (is_full(made)) return false;
  expect_none(made, TEEC_SUCCESS, KM_ERROR_VERIFICATION_FAILED, "a changed GCM ciphertext");
  return true;
}

bool encrypt_rsa(desk& d) {
  const rsa_work work = rsa_work::draw(d);
  const cipher_answer made =
      run_cipher(d.client, KM_PURPOSE_ENCRYPT, work.pair.ciphering, work.ask(), d.pieces(work.text));
  if (is_full(made)) return false;
  expect_ok(made, "RSA encryption");
  expect(work.key().decrypt(work.digest, work.padding, made.text) == work.text, "libcrypto decrypts what the TA gave");
  return true;
}

bool decrypt_rsa(desk& d) {
  const rsa_work work = rsa_work::draw(d);
  const bytes sealed = work.key().encrypt(work.digest, work.padding, work.text);
  const bool is_forged = work.padding == KM_PAD_RSA_OAEP && d.one_in(3);
  const cipher_answer made = run_cipher(d.client, KM_PURPOSE_DECRYPT, work.pair.ciphering, work.ask(),
                                        d.pieces(is_forged ? flip(sealed, sealed.size() - 1) : sealed));
  if (is_full(made)) return false;
  if (is_forged) {
    expect_none(made, TEEC_SUCCESS, KM_ERROR_INVALID_ARGUMENT, "a changed OAEP ciphertext");
  } else {
    expect_ok(made, "RSA decryption");
    expect(made.text == work.text, "RSA gives back what libcrypto encrypted");
  }
  return true;
}

}  // namespace load
