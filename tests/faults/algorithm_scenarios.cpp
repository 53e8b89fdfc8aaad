// Scenarios of the algorithms beside RSA signatures: keys, and each step of each kind of operation.
#include <gtest/gtest.h>

#include "tests/faults/stage.h"

using namespace keymaster;

namespace testing_support {
namespace {

/// A kind of operation: how its key is made, and what begin is asked for. What decrypts names its nonce, so that the
/// ciphertext can be made with the same.
struct kind {
  std::string name;
  param_list key;
  bytes material;  // empty: the key is generated
  std::uint32_t purpose;
  param_list params;
  bool finishes_despite_platform = false;
};

param_list free_key(std::uint32_t algorithm, std::uint32_t bits) {
  return param_list{}.add(KM_TAG_ALGORITHM, algorithm).add(KM_TAG_KEY_SIZE, bits).add(KM_TAG_NO_AUTH_REQUIRED, 1);
}

param_list aes_key(std::uint32_t block_mode, std::uint32_t padding) {
  return free_key(KM_ALGORITHM_AES, 128)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_DECRYPT)
      .add(KM_TAG_BLOCK_MODE, block_mode)
      .add(KM_TAG_PADDING, padding)
      .add(KM_TAG_CALLER_NONCE, 1)
      .add(KM_TAG_MIN_MAC_LENGTH, 96);
}

param_list aes_operation(std::uint32_t block_mode, std::uint32_t padding, std::size_t nonce) {
  param_list params;
  params.add(KM_TAG_BLOCK_MODE, block_mode).add(KM_TAG_PADDING, padding).add(KM_TAG_MAC_LENGTH, 96);
  if (nonce != 0) params.add_blob(KM_TAG_NONCE, pattern(nonce));
  return params;
}

kind aes(std::string name, std::uint32_t purpose, std::uint32_t block_mode, std::uint32_t padding, std::size_t nonce) {
  // Only a tag that the platform calls wrong keeps a decryption from ending well.
  const bool lenient = block_mode == KM_MODE_GCM && purpose == KM_PURPOSE_DECRYPT;
  return {
      std::move(name), aes_key(block_mode, padding), pattern(16), purpose, aes_operation(block_mode, padding, nonce),
      lenient};
}

param_list ec_key() {
  return free_key(KM_ALGORITHM_EC, 256)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add(KM_TAG_DIGEST, KM_DIGEST_NONE)
      .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256);
}

param_list hmac_key() {
  return free_key(KM_ALGORITHM_HMAC, 256)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_SIGN)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_VERIFY)
      .add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256)
      .add(KM_TAG_MIN_MAC_LENGTH, 64);
}

param_list hmac_operation() {
  return param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256).add(KM_TAG_MAC_LENGTH, 128);
}

param_list rsa_cipher_key() {
  return rsa_key(1024)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_ENCRYPT)
      .add(KM_TAG_PURPOSE, KM_PURPOSE_DECRYPT)
      .add(KM_TAG_PADDING, KM_PAD_RSA_OAEP)
      .add(KM_TAG_PADDING, KM_PAD_RSA_PKCS1_1_5_ENCRYPT);
}

kind rsa(std::string name, std::uint32_t purpose, std::uint32_t digest, std::uint32_t padding) {
  return {std::move(name), rsa_cipher_key(), rsa_test_key::of_bits(1024).material(), purpose,
          signature(digest, padding)};
}

std::vector<kind> kinds() {
  const param_list ec_digest = param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_SHA_2_256),
                   ec_bare = param_list{}.add(KM_TAG_DIGEST, KM_DIGEST_NONE);
  return {
      aes("aes_ecb_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_ECB, KM_PAD_PKCS7, 0),
      aes("aes_ecb_decrypt", KM_PURPOSE_DECRYPT, KM_MODE_ECB, KM_PAD_PKCS7, 0),
      aes("aes_cbc_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_CBC, KM_PAD_PKCS7, 16),
      aes("aes_cbc_decrypt", KM_PURPOSE_DECRYPT, KM_MODE_CBC, KM_PAD_PKCS7, 16),
      aes("aes_cbc_unpadded_decrypt", KM_PURPOSE_DECRYPT, KM_MODE_CBC, KM_PAD_NONE, 16),
      aes("aes_ctr_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_CTR, KM_PAD_NONE, 0),
      aes("aes_gcm_encrypt", KM_PURPOSE_ENCRYPT, KM_MODE_GCM, KM_PAD_NONE, 0),
      aes("aes_gcm_decrypt", KM_PURPOSE_DECRYPT, KM_MODE_GCM, KM_PAD_NONE, 12),
      {"ec_sign", ec_key(), {}, KM_PURPOSE_SIGN, ec_digest},
      {"ec_sign_without_digest", ec_key(), {}, KM_PURPOSE_SIGN, ec_bare},
      {"ec_verify", ec_key(), {}, KM_PURPOSE_VERIFY, ec_digest},
      {"hmac_sign", hmac_key(), pattern(32), KM_PURPOSE_SIGN, hmac_operation()},
      {"hmac_verify", hmac_key(), pattern(32), KM_PURPOSE_VERIFY, hmac_operation()},
      rsa("rsa_oaep_encrypt", KM_PURPOSE_ENCRYPT, KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP),
      rsa("rsa_oaep_decrypt", KM_PURPOSE_DECRYPT, KM_DIGEST_SHA_2_256, KM_PAD_RSA_OAEP),
      rsa("rsa_pkcs1_encrypt", KM_PURPOSE_ENCRYPT, KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT),
      rsa("rsa_pkcs1_decrypt", KM_PURPOSE_DECRYPT, KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_ENCRYPT),
      rsa("rsa_raw_decrypt", KM_PURPOSE_DECRYPT, KM_DIGEST_NONE, KM_PAD_NONE),
  };
}

std::uint32_t counterpart(std::uint32_t purpose) {
  return purpose == KM_PURPOSE_DECRYPT ? KM_PURPOSE_ENCRYPT : KM_PURPOSE_SIGN;
}

/// Makes the key, and what the operation is fed: a text, a ciphertext of it, or a text with its signature.
void arrange(stage& on, const kind& what) {
  on.blob =
      what.material.empty() ? on.client().must_generate(what.key) : on.client().must_import(what.key, what.material);
  on.params = what.params;
  on.message = pattern(32);
  if (what.purpose != KM_PURPOSE_DECRYPT && what.purpose != KM_PURPOSE_VERIFY) return;
  const std::uint32_t handle = on.client().must_begin(counterpart(what.purpose), on.blob, on.params);
  const answer fed = on.client().update(handle, on.message);
  const finish_answer done = on.client().finish(handle);
  ASSERT_TRUE(fed.ok() && done.ok());
  if (what.purpose == KM_PURPOSE_VERIFY) {
    on.signature = done.data;
  } else {
    on.message = join({fed.body(), done.data});
  }
}

void end_it(stage& on, const answer& begun) {
  EXPECT_TRUE(on.client().abort(begun.b).ok());
}

scenario begin_of(const kind& what) {
  scenario play{"begin_" + what.name,
                [what](stage& on) { arrange(on, what); },
                {},
                [what](stage& on) { return on.client().begin(what.purpose, on.blob, on.params); },
                end_it};
  play.begins = true;
  return play;
}

scenario update_of(const kind& what) {
  scenario play{"update_" + what.name, [what](stage& on) { arrange(on, what); },
                [what](stage& on) { on.begin(what.purpose); },
                [](stage& on) { return on.client().update(on.handle, on.message); },
                [](stage& on, const answer& updated) {
                  EXPECT_EQ(updated.b, on.message.size());
                  EXPECT_TRUE(on.client().abort(on.handle).ok());
                }};
  return play;
}

scenario finish_of(const kind& what) {
  scenario play{"finish_" + what.name, [what](stage& on) { arrange(on, what); },
                [what](stage& on) {
                  on.begin(what.purpose);
                  EXPECT_TRUE(on.client().update(on.handle, on.message).ok());
                },
                [](stage& on) { return on.client().finish(on.handle, on.signature); }};
  play.may_outlive_platform = what.finishes_despite_platform;
  return play;
}

scenario generate_of(const std::string& name, const param_list& key) {
  scenario play{"generate_" + name,
                [](stage&) {},
                {},
                [key](stage& on) { return on.client().generate(key, 2048); },
                [](stage& on, const answer& made) { EXPECT_TRUE(on.client().characteristics_size(made.body()).ok()); }};
  play.zeroes_response = true;
  return play;
}

scenario import_of(const std::string& name, const param_list& key, const bytes& material) {
  scenario play{"import_" + name,
                [](stage&) {},
                {},
                [key, material](stage& on) { return on.client().import_key(key, material, 2048); }};
  play.zeroes_response = true;
  return play;
}

}  // namespace

std::vector<scenario> algorithm_scenarios() {
  std::vector<scenario> all = {
      generate_of("aes", aes_key(KM_MODE_GCM, KM_PAD_NONE)),
      generate_of("ec", ec_key()),
      generate_of("hmac", hmac_key()),
      import_of("aes", aes_key(KM_MODE_CBC, KM_PAD_PKCS7), pattern(16)),
      import_of("hmac", hmac_key(), pattern(32)),
      import_of("hmac_with_size_unsaid", hmac_key().remove(KM_TAG_KEY_SIZE), pattern(32)),
  };
  for (const kind& each : kinds()) {
    all.push_back(begin_of(each));
    all.push_back(update_of(each));
    all.push_back(finish_of(each));
  }
  all.push_back({"export_ec",
                 [](stage& on) { on.blob = on.client().must_generate(ec_key()); },
                 {},
                 [](stage& on) { return on.client().export_key(on.blob); }});
  return all;
}

}  // namespace testing_support
