// Freed memory keeps nothing of AES keys and RSA private keys that encrypt, nor of what was encrypted with them.
#include <fmt/format.h>

#include <functional>

#include "tests/commands/command_fixture.h"
#include "tests/commands/hostile/freed_memory.h"
#include "tests/commands/sealed_blob.h"
#include "tests/support/encryption.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr rsa_component private_components[] = {rsa_d, rsa_p, rsa_q, rsa_dp, rsa_dq, rsa_qinv};

class CipherSecretsTest : public CommandTest {
 protected:
  const bytes aes = pattern(32, 501);
  const bytes text = pattern(48, 502);  // three blocks, each with bytes of its own
  const bytes rsa_text = pattern(40, 503);
  const rsa_test_key& pair = rsa_test_key::of_bits(1024);
  const bytes aes_blob = client().must_import(aes_key(256), aes);
  const bytes rsa_blob = import_fixed(1024, rsa_cipher_key(1024));
  freed_memory freed{tee.world()};

  void expect_no_secrets() {
    EXPECT_FALSE(freed.holds(aes)) << "the AES key";
    EXPECT_FALSE(freed.holds(text)) << "the text under AES";
    EXPECT_FALSE(freed.holds(rsa_text)) << "the text under RSA";
    for (const rsa_component which : private_components) EXPECT_FALSE(freed.holds(pair.component(which))) << which;
    freed.clear();
  }

  [[nodiscard]] static bytes nonce_of(std::uint32_t mode) {
    return mode == KM_MODE_ECB ? bytes{} : pattern(mode == KM_MODE_GCM ? 12 : 16, 504);
  }
  [[nodiscard]] static param_list asking(std::uint32_t mode, std::uint32_t padding = KM_PAD_NONE) {
    param_list list = cipher(mode, padding, nonce_of(mode));
    return mode == KM_MODE_GCM ? list.add(KM_TAG_MAC_LENGTH, 128) : list;
  }
  [[nodiscard]] bytes sealed(std::uint32_t mode, std::uint32_t padding, const bytes& plain) const {
    return aes_encrypt({mode, padding, aes, nonce_of(mode)}, plain);
  }
  cipher_answer encrypt(std::uint32_t mode, std::uint32_t padding, const bytes& plain) {
    return run_cipher(client(), KM_PURPOSE_ENCRYPT, aes_blob, asking(mode, padding), cut_every(plain, 20));
  }
  cipher_answer decrypt(std::uint32_t mode, std::uint32_t padding, const bytes& ciphertext) {
    return run_cipher(client(), KM_PURPOSE_DECRYPT, aes_blob, asking(mode, padding), cut_every(ciphertext, 20));
  }
  std::uint32_t begin_decrypting_padded() {
    return client().must_begin(KM_PURPOSE_DECRYPT, aes_blob, asking(KM_MODE_CBC, KM_PAD_PKCS7));
  }
  cipher_answer rsa(std::uint32_t purpose, std::uint32_t digest, std::uint32_t padding, const bytes& input) {
    return run_cipher(client(), purpose, rsa_blob, signature(digest, padding), {input});
  }
};

struct rsa_scheme {
  std::uint32_t digest, padding;
};
constexpr rsa_scheme rsa_schemes[] = {{KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP},
                                      {KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT},
                                      {KM_DIGEST_NONE, KM_PAD_NONE}};
constexpr std::uint32_t every_mode[] = {KM_MODE_ECB, KM_MODE_CBC, KM_MODE_CTR, KM_MODE_GCM};

TEST_F(CipherSecretsTest, MakingAnAesKeyLeavesNone) {
  for (const std::uint32_t bits : {128U, 192U, 256U}) {
    const bytes plaintext = open_blob(stored_ksk(), client().must_generate(aes_key(bits))).value();
    const std::span<const std::uint8_t> key_data = std::span(plaintext).subspan(4, u32_at(plaintext, 0));
    EXPECT_FALSE(freed.holds({key_data.end() - bits / 8, key_data.end()}));
  }
  EXPECT_TRUE(client().import_key(aes_key(256), aes).ok());
  EXPECT_FALSE(client().import_key(aes_key(128), aes).ok());
  EXPECT_FALSE(client().import_key(aes_key(256), aes, 20).ok());
  EXPECT_FALSE(client().import_key(aes_key(256).add(KM_TAG_ORIGIN), aes).ok());
  EXPECT_FALSE(client().export_key(aes_blob).ok());
  expect_no_secrets();
}

TEST_F(CipherSecretsTest, WholeAesOperationsLeaveNone) {
  for (const std::uint32_t mode : every_mode) {
    SCOPED_TRACE(mode);
    EXPECT_TRUE(encrypt(mode, KM_PAD_NONE, text).ok());
    EXPECT_EQ(decrypt(mode, KM_PAD_NONE, sealed(mode, KM_PAD_NONE, text)).text, text);
    expect_no_secrets();
  }
  for (const std::uint32_t mode : {KM_MODE_ECB, KM_MODE_CBC}) {
    for (const std::size_t size : {32U, 40U, 47U, 48U}) {
      const bytes plain(text.begin(), text.begin() + static_cast<std::ptrdiff_t>(size));
      EXPECT_TRUE(encrypt(mode, KM_PAD_PKCS7, plain).ok());
      EXPECT_EQ(decrypt(mode, KM_PAD_PKCS7, sealed(mode, KM_PAD_PKCS7, plain)).text, plain);
      // What is left of the last block is shorter than what is looked for elsewhere.
      EXPECT_FALSE(size > 40 && freed.holds({plain.begin() + 32, plain.end()}));
      expect_no_secrets();
    }
  }
}

TEST_F(CipherSecretsTest, AWholeBlockOfTextAtTheEndIsWipedWhereverItStood) {
  // A last byte of 0 leaves the whole block as text, which finish puts together on the heap.
  bytes block = pattern(16, 505);
  block.back() = 0;
  const bytes ciphertext = sealed(KM_MODE_CBC, KM_PAD_NONE, join({text, block}));
  EXPECT_EQ(decrypt(KM_MODE_CBC, KM_PAD_PKCS7, ciphertext).data, block);
  EXPECT_FALSE(freed.holds(block));
  const std::uint32_t handle = begin_decrypting_padded();
  EXPECT_TRUE(client().update(handle, ciphertext).ok());
  EXPECT_FALSE(client().finish(handle, {}, {}, 10).ok());
  EXPECT_FALSE(freed.holds(block));
  expect_no_secrets();
}

TEST_F(CipherSecretsTest, AesOperationsThatFailOrAreAbortedLeaveNone) {
  for (const std::uint32_t mode : every_mode) {
    for (const std::uint32_t purpose : {KM_PURPOSE_ENCRYPT, KM_PURPOSE_DECRYPT}) {
      EXPECT_TRUE(client().abort(client().must_begin(purpose, aes_blob, asking(mode))).ok());
    }
  }
  EXPECT_FALSE(client().begin(KM_PURPOSE_DECRYPT, aes_blob, cipher(KM_MODE_CBC, KM_PAD_NONE, pattern(5))).ok());
  expect_no_secrets();

  const bytes ciphertext = sealed(KM_MODE_CBC, KM_PAD_NONE, text);
  const bytes two_blocks(ciphertext.begin(), ciphertext.begin() + 32);
  std::uint32_t handle = begin_decrypting_padded();
  EXPECT_TRUE(client().update(handle, two_blocks).ok());
  EXPECT_TRUE(client().abort(handle).ok());
  expect_no_secrets();
  EXPECT_EQ(decrypt(KM_MODE_CBC, KM_PAD_PKCS7, ciphertext).error, KM_ERROR_INVALID_ARGUMENT) << "wrong padding";
  expect_no_secrets();
  EXPECT_EQ(decrypt(KM_MODE_CBC, KM_PAD_PKCS7, join({two_blocks, {1, 2, 3}})).error, KM_ERROR_INVALID_INPUT_LENGTH);
  expect_no_secrets();
  handle = begin_decrypting_padded();
  EXPECT_TRUE(client().update(handle, two_blocks).ok());
  EXPECT_FALSE(client().update(handle, ciphertext, {}, 20).ok());
  expect_no_secrets();
}

TEST_F(CipherSecretsTest, TagsAreLeftNowhere) {
  const bytes stream = sealed(KM_MODE_GCM, KM_PAD_NONE, text), tag(stream.end() - 16, stream.end());
  EXPECT_EQ(encrypt(KM_MODE_GCM, KM_PAD_NONE, text).data, tag);
  EXPECT_FALSE(freed.holds(tag)) << "that of a finish that made it";
  EXPECT_TRUE(decrypt(KM_MODE_GCM, KM_PAD_NONE, stream).ok());
  EXPECT_FALSE(freed.holds(tag)) << "that which was held back";
  const bytes forged = flip(stream, stream.size() - 1);
  EXPECT_EQ(decrypt(KM_MODE_GCM, KM_PAD_NONE, forged).error, KM_ERROR_VERIFICATION_FAILED);
  EXPECT_FALSE(freed.holds(tag));
  EXPECT_FALSE(freed.holds({forged.end() - 16, forged.end()}));
  expect_no_secrets();
}

TEST_F(CipherSecretsTest, RsaEncryptionLeavesNone) {
  for (const auto& [digest, padding] : rsa_schemes) {
    SCOPED_TRACE(fmt::format("padding {}", padding));
    EXPECT_TRUE(rsa(KM_PURPOSE_ENCRYPT, digest, padding, rsa_text).ok());
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_ENCRYPT, rsa_blob, signature(digest, padding));
    EXPECT_TRUE(client().update(handle, rsa_text).ok());
    EXPECT_TRUE(client().abort(handle).ok());
    expect_no_secrets();
  }
  EXPECT_FALSE(rsa(KM_PURPOSE_ENCRYPT, KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP, join({rsa_text, bytes(40)})).ok());
  EXPECT_FALSE(rsa(KM_PURPOSE_ENCRYPT, KM_DIGEST_NONE, KM_PAD_NONE, join({bytes(88, 0xFF), rsa_text})).ok());
  expect_no_secrets();
}

TEST_F(CipherSecretsTest, RsaDecryptionLeavesNone) {
  for (const auto& [digest, padding] : rsa_schemes) {
    SCOPED_TRACE(fmt::format("padding {}", padding));
    const bytes ciphertext = padding == KM_PAD_NONE ? pair.public_operation(join({bytes(88), rsa_text}))
                                                    : pair.encrypt(digest, padding, rsa_text);
    const bytes got = rsa(KM_PURPOSE_DECRYPT, digest, padding, ciphertext).data;
    EXPECT_EQ(bytes(got.end() - 40, got.end()), rsa_text);
    expect_no_secrets();
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_DECRYPT, rsa_blob, signature(digest, padding));
    EXPECT_TRUE(client().update(handle, ciphertext).ok());
    EXPECT_FALSE(client().finish(handle, {}, {}, 30).ok());
    expect_no_secrets();
    (void)rsa(KM_PURPOSE_DECRYPT, digest, padding, flip(ciphertext, 100));
    expect_no_secrets();
  }
}

TEST_F(CipherSecretsTest, WhateverFailsBelowLeavesNone) {
  hosted_tee::fault_plan& faults = tee.world().faults();
  const bytes padded = sealed(KM_MODE_CBC, KM_PAD_PKCS7, text), gcm_stream = sealed(KM_MODE_GCM, KM_PAD_NONE, text);
  const bytes not_padded = sealed(KM_MODE_CBC, KM_PAD_NONE, text);
  const bytes oaep = pair.encrypt(KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP, rsa_text);
  const std::vector<std::function<void()>> commands = {
      [&] { (void)client().import_key(aes_key(256), aes); },
      [&] { (void)encrypt(KM_MODE_CBC, KM_PAD_PKCS7, text); },
      [&] { (void)decrypt(KM_MODE_CBC, KM_PAD_PKCS7, padded); },
      [&] { (void)decrypt(KM_MODE_CBC, KM_PAD_PKCS7, not_padded); },
      [&] { (void)encrypt(KM_MODE_GCM, KM_PAD_NONE, text); },
      [&] { (void)decrypt(KM_MODE_GCM, KM_PAD_NONE, gcm_stream); },
      [&] { (void)rsa(KM_PURPOSE_ENCRYPT, KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP, rsa_text); },
      [&] { (void)rsa(KM_PURPOSE_DECRYPT, KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP, oaep); },
      [&] { (void)rsa(KM_PURPOSE_DECRYPT, KM_DIGEST_NONE, KM_PAD_NONE, oaep); },
  };
  const hosted_tee::accounting before = tee.accounting();
  for (std::size_t command = 0; command < commands.size(); ++command) {
    faults.clear();
    commands[command]();
    const std::uint32_t allocations = faults.allocations(), calls = faults.fallible_calls();
    SCOPED_TRACE(fmt::format("command {}, {} allocations, {} calls", command, allocations, calls));
    freed.clear();
    for (std::uint32_t n = 1; n <= allocations + calls; ++n) {
      faults.clear();
      if (n <= allocations) {
        faults.fail_allocation(n);
      } else {
        faults.fail_any_call(n - allocations, TEE_ERROR_GENERIC);
      }
      commands[command]();
      EXPECT_TRUE(faults.triggered());
      expect_same(before);
    }
    expect_no_secrets();
  }
}

}  // namespace
}  // namespace testing_support
