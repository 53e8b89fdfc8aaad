#include "tests/kills/key_safe.h"

#include <gtest/gtest.h>

#include "client/lib/operation.h"
#include "tests/support/ec_test_key.h"

namespace hosted_tee::testing {
namespace {

using namespace keymaster;
using client::authorizations;
using client::byte_view;
using client::bytes;
using client::operation;
using client::session;

/// What there is to know of a kind: how a key is described, and what is done with it.
struct kind_row {
  keymaster_algorithm_t algorithm;
  std::uint32_t bits;
  authorizations more;
  keymaster_purpose_t purpose;
  authorizations parameters;
};

const kind_row& row_of(key_kind kind) {
  static const std::array<kind_row, 4> rows = {
      kind_row{KM_ALGORITHM_EC, 256, authorizations{}.purpose({KM_PURPOSE_SIGN}).digest({KM_DIGEST_SHA_2_256}),
               KM_PURPOSE_SIGN, authorizations{}.digest({KM_DIGEST_SHA_2_256})},
      kind_row{KM_ALGORITHM_AES, 256,
               authorizations{}.purpose({KM_PURPOSE_ENCRYPT}).block_mode({KM_MODE_ECB}).padding({KM_PAD_NONE}),
               KM_PURPOSE_ENCRYPT, authorizations{}.block_mode({KM_MODE_ECB}).padding({KM_PAD_NONE})},
      kind_row{KM_ALGORITHM_HMAC, 256,
               authorizations{}.purpose({KM_PURPOSE_SIGN}).digest({KM_DIGEST_SHA_2_256}).min_mac_length(256),
               KM_PURPOSE_SIGN, authorizations{}.mac_length(256)},
      kind_row{KM_ALGORITHM_RSA, 1024,
               authorizations{}
                   .rsa_public_exponent(65537)
                   .purpose({KM_PURPOSE_SIGN})
                   .digest({KM_DIGEST_SHA_2_256})
                   .padding({KM_PAD_RSA_PKCS1_1_5_SIGN}),
               KM_PURPOSE_SIGN, authorizations{}.digest({KM_DIGEST_SHA_2_256}).padding({KM_PAD_RSA_PKCS1_1_5_SIGN})},
  };
  return rows.at(static_cast<std::size_t>(kind));
}

authorizations description_of(key_kind kind) {
  const kind_row& row = row_of(kind);
  return authorizations{}.algorithm(row.algorithm).key_size(row.bits).add(row.more).no_auth_required();
}

const bytes& message() {
  static const bytes text(32, 'm');  // whole blocks
  return text;
}

void expect_its_characteristics(session& ta, const kept_key& key) {
  const authorizations expected = description_of(key.kind).add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED);
  EXPECT_EQ(client::get_characteristics(ta, key.blob), expected);
}

bytes output_of(session& ta, const kept_key& key) {
  const kind_row& row = row_of(key.kind);
  operation op = operation::begin(ta, row.purpose, key.blob, row.parameters);
  bytes output = op.update(message());
  const bytes rest = op.finish().output;
  output.insert(output.end(), rest.begin(), rest.end());
  return output;
}

// An EC signature is another one each time: libcrypto judges it.
bytes proof_of_ec(session& ta, const kept_key& key) {
  const bytes signature = output_of(ta, key);
  bytes shown = key.proof.empty() ? client::export_key(ta, key.blob) : key.proof;
  const auto judge =
      testing_support::ec_test_key::from_fields(testing_support::ec_fields::parse(shown, /*with_d=*/false));
  EXPECT_TRUE(judge.verifies(KM_DIGEST_SHA_2_256, message(), signature)) << "an EC key signs wrong";
  return shown;
}

}  // namespace

client::key_blob make_key(session& ta, key_kind kind) {
  return client::generate_key(ta, description_of(kind));
}

key_proof use_key(session& ta, const kept_key& key) {
  expect_its_characteristics(ta, key);
  key_proof proof = key.kind == key_kind::ec ? proof_of_ec(ta, key) : output_of(ta, key);
  EXPECT_FALSE(proof.empty());
  if (!key.proof.empty()) {
    EXPECT_EQ(proof, key.proof) << "a key is not what it was";
  }
  return proof;
}

std::size_t key_safe::put(key_kind kind, client::key_blob blob) {
  constexpr std::uint8_t under_the_rpmb_key = 1;  // the protection type
  EXPECT_EQ(blob.at(0), under_the_rpmb_key) << "the device has lost its RPMB storage";
  const std::scoped_lock lock(mutex_);
  keys_.push_back({kind, std::move(blob), {}});
  return keys_.size() - 1;
}

void key_safe::learn(std::size_t place, key_proof proof) {
  const std::scoped_lock lock(mutex_);
  key_proof& known = keys_.at(place).proof;
  if (!known.empty()) {
    EXPECT_EQ(proof, known) << "two clients see different keys in one blob";
  }
  known = std::move(proof);
}

std::size_t key_safe::size() const {
  const std::scoped_lock lock(mutex_);
  return keys_.size();
}

kept_key key_safe::at(std::size_t place) const {
  const std::scoped_lock lock(mutex_);
  return keys_.at(place);
}

void key_safe::use(session& ta, std::size_t place) {
  learn(place, use_key(ta, at(place)));
}

}  // namespace hosted_tee::testing
