// Keys that an attacker composed: whatever is in them, every call ends, and with one of the codes it may end with.
#include <openssl/core_names.h>

#include <algorithm>
#include <random>

#include "tests/tee/crypto_fixture.h"

namespace hosted_tee::testing {
namespace {

class HostileKeyTest : public crypto_fixture {
 protected:
  /// A value that is likely to be a special case.
  bytes strange(const bytes& original) {
    if (original.empty()) return {1};
    switch (draw(8)) {
      case 0:
        return {};
      case 1:
        return {static_cast<std::uint8_t>(draw(4))};
      case 2:
        return repeated(0xFF, original.size());
      case 3:
        return bytes(original.begin(), original.begin() + static_cast<std::ptrdiff_t>(draw(original.size())));
      case 4:
        return repeated(0, draw(original.size() + 4));
      case 5: {
        bytes flipped = original;
        flipped[draw(flipped.size())] ^= static_cast<std::uint8_t>(1U << draw(8));
        return flipped;
      }
      case 6:
        return joined(bytes{1}, bytes(draw(original.size())));
      default: {
        bytes random(1 + draw(original.size() + 2));
        std::generate(random.begin(), random.end(), [&] { return static_cast<std::uint8_t>(draw(256)); });
        return random;
      }
    }
  }
  std::size_t draw(std::size_t below) { return below == 0 ? 0 : random_() % below; }

  static bool is_among(TEE_Result result, std::initializer_list<TEE_Result> allowed) {
    return std::find(allowed.begin(), allowed.end(), result) != allowed.end();
  }

 private:
  std::mt19937 random_{20240229};  // NOLINT(cert-msc32-c,cert-msc51-cpp): fixed, so that a failure comes back
};

TEST_F(HostileKeyTest, RsaEndsInACode) {
  const key_owner key = new_rsa_key(512);
  const attribute_list good = rsa_attributes(key);
  const bytes block = repeated(0x3B, 64);
  const bytes digest = digest_of("SHA1", {});
  int populated = 0;
  int worked = 0;
  for (int round = 0; round < 4000; ++round) {
    std::vector<TEE_Attribute> attributes(good.data(), good.data() + (draw(2) == 0 ? 3 : 8));
    std::vector<bytes> values;
    values.reserve(2);
    for (std::size_t faults = 1 + draw(2); faults > 0; --faults) {
      auto& reference = attributes[draw(attributes.size())].content.ref;
      const auto* const start = static_cast<const std::uint8_t*>(reference.buffer);
      bytes& value = values.emplace_back(strange(bytes(start, start + reference.length)));
      reference = {value.data(), size_of(value)};
    }
    const object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, 512);
    const TEE_Result result =
        TEE_PopulateTransientObject(object.get(), attributes.data(), static_cast<std::uint32_t>(attributes.size()));
    ASSERT_TRUE(is_among(result, {TEE_SUCCESS, TEE_ERROR_BAD_PARAMETERS}));
    if (result != TEE_SUCCESS) continue;
    ++populated;
    for (const std::uint32_t mode : {TEE_MODE_DECRYPT, TEE_MODE_ENCRYPT}) {
      const operation_owner bare = operation_for(TEE_ALG_RSA_NOPAD, mode, object);
      const auto call = mode == TEE_MODE_DECRYPT ? TEE_AsymmetricDecrypt : TEE_AsymmetricEncrypt;
      const answer got = taking(64, [&](void* place, std::uint32_t* length) {
        return call(bare.get(), nullptr, 0, block.data(), 64, place, length);
      });
      ASSERT_TRUE(is_among(got.result, {TEE_SUCCESS, TEE_ERROR_BAD_PARAMETERS})) << std::hex << got.result;
      worked += got.result == TEE_SUCCESS ? 1 : 0;
    }
    const operation_owner signing = operation_for(TEE_ALG_RSASSA_PKCS1_V1_5_SHA1, TEE_MODE_SIGN, object);
    const operation_owner verifying = operation_for(TEE_ALG_RSASSA_PKCS1_V1_5_SHA1, TEE_MODE_VERIFY, object);
    const answer made = taking(64, [&](void* place, std::uint32_t* length) {
      return TEE_AsymmetricSignDigest(signing.get(), nullptr, 0, digest.data(), 20, place, length);
    });
    ASSERT_TRUE(is_among(made.result, {TEE_SUCCESS, TEE_ERROR_BAD_PARAMETERS})) << std::hex << made.result;
    const TEE_Result verified =
        TEE_AsymmetricVerifyDigest(verifying.get(), nullptr, 0, digest.data(), 20, block.data(), 64);
    ASSERT_EQ(verified, TEE_ERROR_SIGNATURE_INVALID);
    const operation_owner exporting = operation_for(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, object);
    const answer der = taking(512, [&](void* place, std::uint32_t* length) {
      return TEE_AsymmetricExport(exporting.get(), TEE_EXPORT_FORMAT_SPKI_DER, place, length);
    });
    EXPECT_EQ(der.result, TEE_SUCCESS);
  }
  EXPECT_GT(populated, 500) << "the sweep must reach the operations";
  EXPECT_GT(worked, 500);
}

TEST_F(HostileKeyTest, WrongCrtExponentStillGivesTheRightResult) {
  const key_owner key = new_rsa_key(1024);
  const attribute_list good = rsa_attributes(key);
  std::vector<TEE_Attribute> attributes(good.data(), good.data() + 8);
  bytes wrong = number_of(key, OSSL_PKEY_PARAM_RSA_EXPONENT1);
  wrong.back() ^= 2;
  for (TEE_Attribute& each : attributes) {
    if (each.attributeID == TEE_ATTR_RSA_EXPONENT1) each.content.ref = {wrong.data(), size_of(wrong)};
  }
  const object_owner faulty = allocate(TEE_TYPE_RSA_KEYPAIR, 1024);
  ASSERT_EQ(TEE_PopulateTransientObject(faulty.get(), attributes.data(), 8), TEE_SUCCESS);
  const object_owner sound = allocate(TEE_TYPE_RSA_KEYPAIR, 1024);
  ASSERT_EQ(populate_into(sound, good), TEE_SUCCESS);
  const bytes digest = digest_of("SHA256", {});
  const auto signature = [&](const object_owner& object) {
    const operation_owner op = operation_for(TEE_ALG_RSASSA_PKCS1_V1_5_SHA256, TEE_MODE_SIGN, object);
    return taking(128, [&](void* place, std::uint32_t* length) {
      return TEE_AsymmetricSignDigest(op.get(), nullptr, 0, digest.data(), 32, place, length);
    });
  };
  EXPECT_EQ(signature(faulty).data, signature(sound).data) << "a faulty result would give the key away";
}

TEST_F(HostileKeyTest, EcEndsInACode) {
  const std::uint32_t sizes[] = {192, 224, 256, 384, 521};
  const std::uint32_t algorithms[] = {TEE_ALG_ECDSA_P192, TEE_ALG_ECDSA_P224, TEE_ALG_ECDSA_P256, TEE_ALG_ECDSA_P384,
                                      TEE_ALG_ECDSA_P521};
  const std::uint32_t components[] = {TEE_ATTR_ECC_PUBLIC_VALUE_X, TEE_ATTR_ECC_PUBLIC_VALUE_Y,
                                      TEE_ATTR_ECC_PRIVATE_VALUE};
  const bytes digest = digest_of("SHA1", {});
  int populated = 0;
  for (std::uint32_t i = 0; i < 5; ++i) {
    const object_owner good = allocate(TEE_TYPE_ECDSA_KEYPAIR, sizes[i]);
    const attribute_list curve = attribute_list().add_value(TEE_ATTR_ECC_CURVE, i + 1);
    ASSERT_EQ(TEE_GenerateKey(good.get(), sizes[i], curve.data(), 1), TEE_SUCCESS);
    for (int round = 0; round < 300; ++round) {
      attribute_list attributes;
      const std::size_t faulty = draw(3);
      for (std::size_t c = 0; c < 3; ++c) {
        const bytes value = buffer_attribute(good, components[c]);
        attributes.add(components[c], c == faulty ? strange(value) : value);
      }
      attributes.add_value(TEE_ATTR_ECC_CURVE, draw(10) == 0 ? static_cast<std::uint32_t>(draw(8)) : i + 1);
      const object_owner object = allocate(TEE_TYPE_ECDSA_KEYPAIR, sizes[i]);
      const TEE_Result result = populate_into(object, attributes);
      ASSERT_TRUE(is_among(result, {TEE_SUCCESS, TEE_ERROR_BAD_PARAMETERS}));
      if (result != TEE_SUCCESS) continue;
      ++populated;
      const operation_owner signing = operation_for(algorithms[i], TEE_MODE_SIGN, object);
      const answer made = taking(132, [&](void* place, std::uint32_t* length) {
        return TEE_AsymmetricSignDigest(signing.get(), nullptr, 0, digest.data(), 20, place, length);
      });
      ASSERT_EQ(made.result, TEE_SUCCESS);
    }
  }
  EXPECT_GT(populated, 100) << "the sweep must reach the signature";
}

}  // namespace
}  // namespace hosted_tee::testing
