// AES between the TA and the `openssl` command, both ways.
#include <fmt/format.h>

#include "tests/openssl/openssl_fixture.h"
#include "tests/support/encryption.h"

using namespace keymaster;

namespace testing_support {
namespace {

struct openssl_cipher {
  std::uint32_t block_mode, padding;
  const char* name;
  bool has_iv, whole_blocks;
};
constexpr openssl_cipher ciphers[] = {{KM_MODE_ECB, KM_PAD_NONE, "ecb", false, true},
                                      {KM_MODE_ECB, KM_PAD_PKCS7, "ecb", false, false},
                                      {KM_MODE_CBC, KM_PAD_NONE, "cbc", true, true},
                                      {KM_MODE_CBC, KM_PAD_PKCS7, "cbc", true, false},
                                      {KM_MODE_CTR, KM_PAD_NONE, "ctr", true, false}};

class OpensslAesTest : public OpensslTest {
 protected:
  /// in_openssl encrypts, or decrypts with -d.
  bytes in_openssl(const openssl_cipher& with, const bytes& key, const bytes& iv, const char* direction,
                   const bytes& input) {
    write_file(file("input"), input);
    std::vector<std::string> arguments = {"enc",    fmt::format("-aes-{}-{}", key.size() * 8, with.name),
                                          "-K",     to_hex(key),
                                          "-in",    "input",
                                          "-out",   "output",
                                          direction};
    if (with.has_iv) arguments.insert(arguments.end(), {"-iv", to_hex(iv)});
    if (with.padding == KM_PAD_NONE) arguments.emplace_back("-nopad");
    EXPECT_EQ(run(arguments).status, 0);
    return read_file(file("output"));
  }

  /// each_job plays `check` for every cipher, key size and a few messages.
  template <class Check>
  void each_job(Check&& check) {
    for (const std::size_t key_size : {16U, 24U, 32U}) {
      const bytes key = pattern(key_size, 900), iv = pattern(16, 901);
      const bytes blob = client().must_import(aes_key(static_cast<std::uint32_t>(key_size * 8)), key);
      for (const openssl_cipher& with : ciphers) {
        for (int round = 0; round < 3; ++round) {
          bytes text = round == 0 ? pattern(16) : random_message(3000);
          if (with.whole_blocks) text.resize(text.size() / 16 * 16);
          SCOPED_TRACE(
              fmt::format("AES-{}-{}, padding {}, {} bytes", key_size * 8, with.name, with.padding, text.size()));
          check(with, key, iv, blob, cipher(with.block_mode, with.padding, with.has_iv ? iv : bytes{}), text);
        }
      }
    }
  }
};

TEST_F(OpensslAesTest, WhatTheTaEncryptsOpensslDecrypts) {
  each_job([&](const openssl_cipher& with, const bytes& key, const bytes& iv, const bytes& blob,
               const param_list& params, const bytes& text) {
    const cipher_answer made = run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, params, cut_every(text, 1000));
    ASSERT_TRUE(made.ok()) << made.result << ", error " << made.error;
    EXPECT_EQ(in_openssl(with, key, iv, "-d", made.text), text);
  });
}

TEST_F(OpensslAesTest, WhatOpensslEncryptsTheTaDecrypts) {
  each_job([&](const openssl_cipher& with, const bytes& key, const bytes& iv, const bytes& blob,
               const param_list& params, const bytes& text) {
    const bytes sealed = in_openssl(with, key, iv, "-e", text);
    const cipher_answer back = run_cipher(client(), KM_PURPOSE_DECRYPT, blob, params, cut_every(sealed, 1000));
    ASSERT_TRUE(back.ok()) << back.result << ", error " << back.error;
    EXPECT_EQ(back.text, text);
  });
}

TEST_F(OpensslAesTest, ANonceThatTheTaDrewDecryptsInOpenssl) {
  const bytes key = pattern(32, 900), text = random_message(500);
  const bytes blob = client().must_import(aes_key(256), key);
  for (const openssl_cipher& with : ciphers) {
    if (!with.has_iv || with.whole_blocks) continue;
    const cipher_answer made =
        run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, cipher(with.block_mode, with.padding), {text});
    EXPECT_EQ(in_openssl(with, key, made.begun.blob(KM_TAG_NONCE), "-d", made.text), text);
  }
}

}  // namespace
}  // namespace testing_support
