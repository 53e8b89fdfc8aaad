// RSA keys: from components, generated, exported.
#include <openssl/bn.h>
#include <openssl/core_names.h>

#include "tests/tee/crypto_rsa_fixture.h"

namespace hosted_tee::testing {
namespace {

class RsaKeyTest : public rsa_fixture {};

TEST_F(RsaKeyTest, PopulatedKeyGivesItsComponentsBackWithoutLeadingZeros) {
  const key_owner& key = reference(1024);
  const object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, 1032);
  const bytes zero = {0};
  attribute_list padded;
  padded.add(TEE_ATTR_RSA_MODULUS, joined(zero, number_of(key, OSSL_PKEY_PARAM_RSA_N)))
      .add(TEE_ATTR_RSA_PUBLIC_EXPONENT, joined(repeated(0, 5), number_of(key, OSSL_PKEY_PARAM_RSA_E)))
      .add(TEE_ATTR_RSA_PRIVATE_EXPONENT, joined(zero, number_of(key, OSSL_PKEY_PARAM_RSA_D)));
  ASSERT_EQ(populate_into(object, padded), TEE_SUCCESS);
  EXPECT_EQ(info_of(object).keySize, 1024U);
  EXPECT_EQ(info_of(object).maxKeySize, 1032U);
  EXPECT_EQ(buffer_attribute(object, TEE_ATTR_RSA_MODULUS), number_of(key, OSSL_PKEY_PARAM_RSA_N));
  EXPECT_EQ(buffer_attribute(object, TEE_ATTR_RSA_PUBLIC_EXPONENT), from_hex("010001"));
  EXPECT_EQ(buffer_attribute(object, TEE_ATTR_RSA_PRIVATE_EXPONENT), number_of(key, OSSL_PKEY_PARAM_RSA_D));
}

TEST_F(RsaKeyTest, ComponentsThatCannotBeAKeyAreRefused) {
  const key_owner& key = reference(1024);
  const bytes modulus = number_of(key, OSSL_PKEY_PARAM_RSA_N);
  bytes even_modulus = modulus;
  even_modulus.back() ^= 1;
  struct fault {
    std::uint32_t attribute;
    bytes value;
  };
  std::vector<fault> faults = {
      {TEE_ATTR_RSA_MODULUS, even_modulus},         {TEE_ATTR_RSA_MODULUS, {1}},
      {TEE_ATTR_RSA_MODULUS, joined({1}, modulus)},  // longer than the object
      {TEE_ATTR_RSA_PUBLIC_EXPONENT, {1}},          {TEE_ATTR_RSA_PUBLIC_EXPONENT, {2}},
      {TEE_ATTR_RSA_PUBLIC_EXPONENT, {1, 0, 0}},    {TEE_ATTR_RSA_PRIME1, repeated(0xFF, 100000)},
  };
  const std::uint32_t components[] = {
      TEE_ATTR_RSA_MODULUS, TEE_ATTR_RSA_PUBLIC_EXPONENT, TEE_ATTR_RSA_PRIVATE_EXPONENT, TEE_ATTR_RSA_PRIME1,
      TEE_ATTR_RSA_PRIME2,  TEE_ATTR_RSA_EXPONENT1,       TEE_ATTR_RSA_EXPONENT2,        TEE_ATTR_RSA_COEFFICIENT};
  for (const std::uint32_t each : components) {
    faults.push_back({each, {}});
    faults.push_back({each, {0, 0}});
  }
  for (const fault& each : faults) {
    const attribute_list good = rsa_attributes(key);
    std::vector<TEE_Attribute> attributes(good.data(), good.data() + good.count());
    bytes value = each.value;
    for (TEE_Attribute& attribute : attributes) {
      if (attribute.attributeID == each.attribute) attribute.content.ref = {value.data(), size_of(value)};
    }
    const object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, 1024);
    EXPECT_EQ(TEE_PopulateTransientObject(object.get(), attributes.data(), 8), TEE_ERROR_BAD_PARAMETERS)
        << std::hex << each.attribute << " of " << each.value.size() << " bytes";
    EXPECT_EQ(info_of(object).keySize, 0U);
    EXPECT_EQ(populate_into(object, good), TEE_SUCCESS);
  }
}

TEST_F(RsaKeyTest, ThreeOrEightAttributesMakeAPair) {
  const object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, 1024);
  const attribute_list all = rsa_attributes(reference(1024));
  for (const std::uint32_t count : {0U, 1U, 2U, 4U, 5U, 6U, 7U}) {
    EXPECT_TRUE(panics([&] { (void)TEE_PopulateTransientObject(object.get(), all.data(), count); })) << count;
  }
  EXPECT_EQ(TEE_PopulateTransientObject(object.get(), all.data(), 3), TEE_SUCCESS);
}

TEST_F(RsaKeyTest, GeneratedKeyHasItsSizeAndExponentAndIsConsistent) {
  for (const std::uint32_t bits : {512U, 520U, 1024U, 2048U, 2056U}) {
    for (const bytes& exponent : {from_hex("0000000000010001"), bytes{3}}) {
      const object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, bits);
      const attribute_list params = attribute_list().add(TEE_ATTR_RSA_PUBLIC_EXPONENT, exponent);
      ASSERT_EQ(TEE_GenerateKey(object.get(), bits, params.data(), 1), TEE_SUCCESS);
      EXPECT_EQ(info_of(object).keySize, bits);
      const bytes modulus = buffer_attribute(object, TEE_ATTR_RSA_MODULUS);
      EXPECT_EQ(modulus.size(), bits / 8);
      EXPECT_EQ(modulus[0] & 0x80, 0x80);
      EXPECT_EQ(buffer_attribute(object, TEE_ATTR_RSA_PUBLIC_EXPONENT),
                exponent.size() == 8 ? from_hex("010001") : exponent);
      const auto bn = [&](std::uint32_t id) {
        const bytes value = buffer_attribute(object, id);
        return BN_bin2bn(value.data(), static_cast<int>(value.size()), nullptr);
      };
      BIGNUM* p = bn(TEE_ATTR_RSA_PRIME1);
      BIGNUM* q = bn(TEE_ATTR_RSA_PRIME2);
      BN_CTX* scratch = BN_CTX_new();
      BIGNUM* product = BN_new();
      BN_mul(product, p, q, scratch);
      bytes factors(modulus.size());
      EXPECT_EQ(BN_bn2binpad(product, factors.data(), static_cast<int>(factors.size())), static_cast<int>(bits / 8));
      EXPECT_EQ(factors, modulus);
      for (BIGNUM* each : {p, q, product}) BN_free(each);
      BN_CTX_free(scratch);
    }
  }
}

TEST_F(RsaKeyTest, ExponentThatCannotBeIsRefusedAndNotReplaced) {
  for (const char* exponent : {"", "00", "0000000000000000", "01", "02", "04", "010000", "fffffffffffffffe"}) {
    const object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, 512);
    const attribute_list params = attribute_list().add(TEE_ATTR_RSA_PUBLIC_EXPONENT, from_hex(exponent));
    EXPECT_EQ(TEE_GenerateKey(object.get(), 512, params.data(), 1), TEE_ERROR_BAD_PARAMETERS) << exponent;
    EXPECT_EQ(info_of(object).keySize, 0U);
  }
  const object_owner object = allocate(TEE_TYPE_RSA_KEYPAIR, 512);
  ASSERT_EQ(TEE_GenerateKey(object.get(), 512, nullptr, 0), TEE_SUCCESS);
  EXPECT_EQ(buffer_attribute(object, TEE_ATTR_RSA_PUBLIC_EXPONENT), from_hex("010001"));
}

TEST_F(RsaKeyTest, GeneratedKeyComesBackFromItsComponents) {
  const object_owner made = allocate(TEE_TYPE_RSA_KEYPAIR, 1024);
  ASSERT_EQ(TEE_GenerateKey(made.get(), 1024, nullptr, 0), TEE_SUCCESS);
  const object_owner copy = allocate(TEE_TYPE_RSA_KEYPAIR, 1024);
  ASSERT_EQ(TEE_CopyObjectAttributes1(copy.get(), made.get()), TEE_SUCCESS);
  const bytes digest = digest_of("SHA256", from_text("message"));
  const std::uint32_t algorithm = TEE_ALG_RSASSA_PKCS1_V1_5_SHA256;
  const bytes signature = sign(operation_for(algorithm, TEE_MODE_SIGN, copy), digest, 128).data;
  EXPECT_EQ(verify(operation_for(algorithm, TEE_MODE_VERIFY, made), digest, signature), TEE_SUCCESS);
}

TEST_F(RsaKeyTest, PublicKeyServesThePublicModes) {
  const object_owner pair = imported(1024);
  const object_owner object = allocate(TEE_TYPE_RSA_PUBLIC_KEY, 1024);
  ASSERT_EQ(TEE_CopyObjectAttributes1(object.get(), pair.get()), TEE_SUCCESS);
  const bytes digest = digest_of("SHA256", {});
  const bytes signature = sign(operation_for(0x70004830, TEE_MODE_SIGN, pair), digest, 128).data;
  EXPECT_EQ(verify(operation_for(0x70004830, TEE_MODE_VERIFY, object), digest, signature), TEE_SUCCESS);
  const operation_owner signing = keyless(0x70004830, TEE_MODE_SIGN, 1024);
  EXPECT_TRUE(panics([&] { (void)TEE_SetOperationKey(signing.get(), object.get()); }));
  const operation_owner decrypting = keyless(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, 1024);
  EXPECT_TRUE(panics([&] { (void)TEE_SetOperationKey(decrypting.get(), object.get()); }));
}

TEST_F(RsaKeyTest, ExportIsTheSubjectPublicKeyInfo) {
  const operation_owner exporting = rsa(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, 2048);
  const auto export_to = [&](std::uint32_t format, std::size_t capacity) {
    return taking(capacity, [&](void* place, std::uint32_t* length) {
      return TEE_AsymmetricExport(exporting.get(), format, place, length);
    });
  };
  const answer der = export_to(TEE_EXPORT_FORMAT_SPKI_DER, 512);
  ASSERT_EQ(der.result, TEE_SUCCESS);
  // RFC 3279, section 2.3.1: rsaEncryption with NULL parameters, then the BIT STRING of RSAPublicKey.
  const bytes expected = joined(joined(from_hex("30820122300d06092a864886f70d01010105000382010f003082010a0282010100"),
                                       number_of(reference(2048), OSSL_PKEY_PARAM_RSA_N)),
                                from_hex("0203010001"));
  EXPECT_EQ(der.data, expected);
  const answer refusal = export_to(TEE_EXPORT_FORMAT_SPKI_DER, expected.size() - 1);
  EXPECT_EQ(refusal.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(refusal.length, expected.size());
  EXPECT_EQ(export_to(TEE_EXPORT_FORMAT_SPKI_DER, expected.size()).data, expected);
  EXPECT_EQ(export_to(4, 512).result, TEE_ERROR_NOT_SUPPORTED);
}

TEST_F(RsaKeyTest, MisusePanics) {
  const object_owner object = imported(512);
  const operation_owner bare = keyless(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, 512);
  const operation_owner signing = operation_for(0x70002830, TEE_MODE_SIGN, object);
  const bytes digest = digest_of("SHA1", {});
  bytes place(64);
  std::uint32_t length = 64;
  EXPECT_TRUE(panics([&] {
    (void)TEE_AsymmetricDecrypt(bare.get(), nullptr, 0, digest.data(), 20, place.data(), &length);
  })) << "no key";
  EXPECT_TRUE(panics([&] {
    (void)TEE_AsymmetricEncrypt(bare.get(), nullptr, 0, digest.data(), 20, place.data(), &length);
  })) << "the other mode";
  EXPECT_TRUE(panics(
      [&] { (void)TEE_AsymmetricVerifyDigest(signing.get(), nullptr, 0, digest.data(), 20, place.data(), 64); }));
  EXPECT_TRUE(panics([&] {
    (void)TEE_AsymmetricDecrypt(signing.get(), nullptr, 0, digest.data(), 20, place.data(), &length);
  })) << "another class";
  EXPECT_TRUE(panics(
      [&] { (void)TEE_AsymmetricSignDigest(signing.get(), nullptr, 0, digest.data(), 20, place.data(), nullptr); }));
}

}  // namespace
}  // namespace hosted_tee::testing
