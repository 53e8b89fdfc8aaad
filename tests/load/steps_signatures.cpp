// Signatures and MACs in both directions, with libcrypto as the other side.
#include "src/params/keymaster_defs.h"
#include "tests/load/steps.h"
#include "tests/support/ec_test_key.h"
#include "tests/support/encryption.h"
#include "tests/support/hmac_test_key.h"
#include "tests/support/libcrypto_digest.h"
#include "tests/support/rsa_test_key.h"

using namespace keymaster;
using namespace testing_support;

namespace load {
namespace {

/// Has the TA verify a signature that holds, or one that was changed since.
bool verify_or_refuse(desk& d, const bytes& blob, const param_list& ask, const bytes& message, const bytes& good,
                      std::size_t changed_at) {
  const bool is_good = d.one_in(2);
  const finish_answer checked = d.client.verify(blob, ask, message, is_good ? good : flip(good, changed_at));
  if (is_full(checked)) return false;
  if (is_good) {
    expect_ok(checked, "a signature that holds");
    expect(checked.data.empty(), "verification has no output");
  } else {
    expect_none(checked, TEEC_SUCCESS, KM_ERROR_VERIFICATION_FAILED, "a changed signature");
  }
  return true;
}

struct rsa_scheme {
  std::uint32_t digest, padding;
  static rsa_scheme draw(desk& d) {
    if (d.one_in(2)) return {d.pick(every_sha), KM_PAD_RSA_PSS};
    return {d.pick(every_digest), KM_PAD_RSA_PKCS1_1_5_SIGN};
  }
};

/// Without a digest the message is as long as half a signature; the TA would not take more.
struct ec_job {
  std::uint32_t digest;
  bytes message;
  static ec_job draw(desk& d, const ec_test_key& key) {
    if (d.one_in(6)) return {KM_DIGEST_NONE, pattern(key.fields().half(), d.below(1000))};
    return {d.pick(every_sha), d.message()};
  }
};

std::uint32_t draw_mac_bits(desk& d, const hmac_secret& key) {
  return 64 + 8 * d.below((key.longest_mac - 64) / 8 + 1);
}

}  // namespace

bool sign_rsa(desk& d) {
  const rsa_pair& key = d.pick(d.keys.rsa);
  const rsa_scheme scheme = rsa_scheme::draw(d);
  const bytes message = d.message();
  const cipher_answer made =
      run_cipher(d.client, KM_PURPOSE_SIGN, key.signing, signature(scheme.digest, scheme.padding), d.pieces(message));
  if (is_full(made)) return false;
  expect_ok(made, "an RSA signature");
  expect(rsa_test_key::of_bits(key.bits).verifies(scheme.digest, scheme.padding, message, made.text),
         "libcrypto verifies the RSA signature");
  return true;
}

bool verify_rsa(desk& d) {
  const rsa_pair& key = d.pick(d.keys.rsa);
  const rsa_scheme scheme = rsa_scheme::draw(d);
  const bytes message = d.message();
  // The salt that every key here has room for.
  const bytes made = rsa_test_key::of_bits(key.bits).sign(scheme.digest, scheme.padding, message, 20);
  return verify_or_refuse(d, key.signing, signature(scheme.digest, scheme.padding), message, made, made.size() - 1);
}

bool sign_ec(desk& d) {
  const ec_pair& pair = d.pick(d.keys.ec);
  const ec_test_key& key = ec_test_key::of_bits(pair.bits);
  const ec_job job = ec_job::draw(d, key);
  const cipher_answer made =
      run_cipher(d.client, KM_PURPOSE_SIGN, pair.blob, ec_digest(job.digest), d.pieces(job.message));
  if (is_full(made)) return false;
  expect_ok(made, "an EC signature");
  expect(key.verifies(job.digest, job.message, made.text), "libcrypto verifies the EC signature");
  return true;
}

bool verify_ec(desk& d) {
  const ec_pair& pair = d.pick(d.keys.ec);
  const ec_test_key& key = ec_test_key::of_bits(pair.bits);
  const ec_job job = ec_job::draw(d, key);
  const bytes made = key.sign(job.digest, job.message);
  return verify_or_refuse(d, pair.blob, ec_digest(job.digest), job.message, made, made.size() - 1);
}

bool sign_hmac(desk& d) {
  const hmac_secret& key = d.pick(d.keys.hmac);
  const std::uint32_t bits = draw_mac_bits(d, key);
  const bytes message = d.message();
  const cipher_answer made = run_cipher(d.client, KM_PURPOSE_SIGN, key.blob, hmac_length(bits), d.pieces(message));
  if (is_full(made)) return false;
  expect_ok(made, "a MAC");
  bytes expected = hmac_of(key.digest, key.key, message);
  expected.resize(bits / 8);
  expect(made.text == expected, "the MAC is libcrypto's");
  return true;
}

bool verify_hmac(desk& d) {
  const hmac_secret& key = d.pick(d.keys.hmac);
  const std::uint32_t bits = draw_mac_bits(d, key);
  const bytes message = d.message();
  return verify_or_refuse(d, key.blob, hmac_length(bits), message, hmac_of(key.digest, key.key, message),
                          d.below(bits / 8));
}

}  // namespace load
