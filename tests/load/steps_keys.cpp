// Keys made, imported, described, exported and deleted.
#include <openssl/x509.h>

#include "src/params/keymaster_defs.h"
#include "tests/load/steps.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/encryption.h"
#include "tests/support/hmac_test_key.h"
#include "tests/support/rsa_test_key.h"

using namespace keymaster;
using namespace testing_support;

namespace load {
namespace {

constexpr std::size_t ample = 65536;  // a response's room, more than a frame has

/// Whose key it is: what the client must say to use it.
struct owner {
  bytes id, data;

  /// Mostly nobody; the data is at times more than a frame carries.
  static owner draw(desk& d) {
    if (!d.one_in(3)) return {};
    return {pattern(1 + d.below(40), d.below(1000)), pattern(d.one_in(4) ? 17'000 : d.below(100), d.below(1000))};
  }
  [[nodiscard]] param_list tags() const {
    param_list list;
    if (!id.empty()) list.add_blob(KM_TAG_APPLICATION_ID, id);
    if (!data.empty()) list.add_blob(KM_TAG_APPLICATION_DATA, data);
    return list;
  }
};

/// Expects the characteristics of `blob`, for its owner and for nobody else.
void expect_described(desk& d, const bytes& blob, const owner& whose, const param_list& visible) {
  const answer size = d.client.characteristics_size(blob, whose.id, whose.data);
  expect_ok(size, "the size of the characteristics");
  const answer described = d.client.characteristics(blob, whose.id, whose.data, size.b);
  expect_ok(described, "the characteristics");
  expect(described.body() == visible.marshal(), "the characteristics are what was asked for");
  const bytes wrong = join({whose.id, {1}});
  expect_none(d.client.characteristics(blob, wrong, whose.data), TEEC_SUCCESS, KM_ERROR_INVALID_KEY_BLOB,
              "somebody else's application id");
}

bytes generated(desk& d, const param_list& asked, const owner& whose) {
  const answer made = d.client.generate(param_list(asked).add(whose.tags()), ample);
  expect_ok(made, "generate_key");
  bytes blob = made.body();
  expect_described(d, blob, whose, param_list(asked).add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED));
  return blob;
}

bytes imported(desk& d, const param_list& asked, const bytes& material, const owner& whose) {
  const answer made = d.client.import_key(param_list(asked).add(whose.tags()), material, ample);
  expect_ok(made, "import_key");
  const bytes body = made.body();
  bytes blob(body.begin() + 4, body.begin() + 4 + u32_at(body, 0));
  const param_list visible = param_list(asked).add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED);
  expect(body == join({prefixed(blob), prefixed(visible.marshal())}), "import_key answers blob and characteristics");
  expect_described(d, blob, whose, visible);
  const param_list misfit = param_list(asked).remove(KM_TAG_KEY_SIZE).add(KM_TAG_KEY_SIZE, 8);
  expect_none(d.client.import_key(misfit, material), TEEC_SUCCESS, KM_ERROR_IMPORT_PARAMETER_MISMATCH,
              "a size that is not the key's");
  return blob;
}

bytes exported(desk& d, const bytes& blob, const owner& whose) {
  const answer out = d.client.export_key(blob, whose.id, whose.data);
  expect_ok(out, "export_key");
  return out.body();
}

/// PKCS#1 v1.5 with SHA-256, by the key in `spki` as libcrypto reads it.
bool verifies_sha256(const bytes& spki, const bytes& message, const bytes& signature) {
  const unsigned char* at = spki.data();
  const std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)> key(
      d2i_PUBKEY(nullptr, &at, static_cast<long>(spki.size())), EVP_PKEY_free);
  const std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
  return key != nullptr && EVP_DigestVerifyInit(context.get(), nullptr, EVP_sha256(), nullptr, key.get()) == 1 &&
         EVP_DigestVerify(context.get(), signature.data(), signature.size(), message.data(), message.size()) == 1;
}

}  // namespace

bool generate_aes(desk& d) {
  const owner whose = owner::draw(d);
  const bytes blob = generated(d, aes_key(128 + 64 * d.below(3)), whose), text = d.message();
  expect_none(d.client.export_key(blob, whose.id, whose.data), TEEC_SUCCESS, KM_ERROR_UNSUPPORTED_KEY_FORMAT,
              "an AES key has no public half");
  const param_list ask = gcm(128).add(whose.tags());
  const cipher_answer sealed = run_cipher(d.client, KM_PURPOSE_ENCRYPT, blob, ask, d.pieces(text));
  if (is_full(sealed)) return false;
  expect_ok(sealed, "encryption with a new key");
  const param_list back = gcm(128, sealed.begun.blob(KM_TAG_NONCE)).add(whose.tags());
  const cipher_answer opened = run_cipher(d.client, KM_PURPOSE_DECRYPT, blob, back, d.pieces(sealed.text));
  if (is_full(opened)) return false;
  expect_ok(opened, "decryption with a new key");
  expect(opened.text == text, "a new key decrypts what it encrypted");
  return true;
}

bool generate_hmac(desk& d) {
  const owner whose = owner::draw(d);
  const hmac_limits& limits = d.pick(every_hmac);
  const bytes blob = generated(d, hmac_key(limits.digest, limits.longest_key), whose), text = d.message();
  const param_list ask = hmac_length(limits.longest_mac).add(whose.tags());
  const cipher_answer mac = run_cipher(d.client, KM_PURPOSE_SIGN, blob, ask, d.pieces(text));
  if (is_full(mac)) return false;
  expect_ok(mac, "a MAC with a new key");
  expect(mac.text.size() * 8 == limits.longest_mac, "the MAC is as long as asked for");
  const finish_answer checked = d.client.verify(blob, ask, text, mac.text);
  if (is_full(checked)) return false;
  expect_ok(checked, "a new key verifies its MAC");
  return true;
}

bool generate_ec(desk& d) {
  const owner whose = owner::draw(d);
  const std::uint32_t bits = d.pick(ec_sizes);
  const bytes blob = generated(d, ec_key(bits), whose), text = d.message();
  const ec_test_key key = ec_test_key::from_fields(ec_fields::parse(exported(d, blob, whose), false));
  const param_list ask = ec_digest(KM_DIGEST_SHA_2_256).add(whose.tags());
  const cipher_answer signature = run_cipher(d.client, KM_PURPOSE_SIGN, blob, ask, d.pieces(text));
  if (is_full(signature)) return false;
  expect_ok(signature, "a signature with a new EC key");
  expect(key.verifies(KM_DIGEST_SHA_2_256, text, signature.text), "the exported EC key verifies the signature");
  return true;
}

bool generate_rsa(desk& d) {
  const owner whose = owner::draw(d);
  const bytes blob = generated(d, rsa_key(1024), whose), text = d.message();
  const bytes spki = exported(d, blob, whose);
  const param_list ask = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN).add(whose.tags());
  const cipher_answer signed_text = run_cipher(d.client, KM_PURPOSE_SIGN, blob, ask, d.pieces(text));
  if (is_full(signed_text)) return false;
  expect_ok(signed_text, "a signature with a new RSA key");
  expect(verifies_sha256(spki, text, signed_text.text), "the exported RSA key verifies the signature");
  return true;
}

bool import_rsa(desk& d) {
  const owner whose = owner::draw(d);
  const unsigned bits = d.pick(d.keys.rsa).bits;
  const rsa_test_key& key = rsa_test_key::of_bits(bits);
  const bytes blob = imported(d, d.one_in(2) ? rsa_key(bits) : rsa_cipher_key(bits), key.material(), whose);
  expect(exported(d, blob, whose) == key.spki(), "an imported RSA key is exported as libcrypto has it");
  return true;
}

bool import_ec(desk& d) {
  const owner whose = owner::draw(d);
  const ec_test_key& key = ec_test_key::of_bits(d.pick(ec_sizes));
  const bytes blob = imported(d, ec_key(key.fields().bits), key.material(), whose);
  expect(exported(d, blob, whose) == key.fields().public_material(), "an imported EC key is exported");
  return true;
}

bool import_secret(desk& d) {
  const owner whose = owner::draw(d);
  const hmac_limits& limits = d.pick(every_hmac);
  const bool is_aes = d.one_in(2);
  const std::uint32_t bits = is_aes ? 128 + 64 * d.below(3) : limits.longest_key;
  const param_list asked = is_aes ? aes_key(bits) : hmac_key(limits.digest, bits);
  const bytes blob = imported(d, asked, pattern(bits / 8, d.below(1000)), whose);
  expect_none(d.client.export_key(blob, whose.id, whose.data), TEEC_SUCCESS, KM_ERROR_UNSUPPORTED_KEY_FORMAT,
              "a secret key is not exported");
  return true;
}

// Nothing is erased, since nothing is kept.
bool delete_keys(desk& d) {
  const ec_pair& key = d.pick(d.keys.ec);
  expect_ok(d.client.delete_key(key.blob), "delete_key");
  expect_ok(d.client.delete_key(pattern(2, d.below(1000))), "delete_key of any two bytes");
  expect_ok(d.client.delete_all(), "delete_all_key");
  expect(exported(d, key.blob, {}) == ec_test_key::of_bits(key.bits).fields().public_material(),
         "a copy of a deleted blob still works");
  return true;
}

}  // namespace load
