// ECDSA against the published values of RFC 6979, and against the verification equation of FIPS 186-4, section 6.4.
#include <openssl/bn.h>
#include <openssl/ec.h>
#include <openssl/obj_mac.h>

#include <algorithm>

#include "tests/tee/crypto_fixture.h"

namespace hosted_tee::testing {
namespace {

struct curve {
  std::uint32_t algorithm;
  std::uint32_t id;
  std::uint32_t bits;
  int nid;
  [[nodiscard]] std::size_t half() const { return (bits + 7) / 8; }
};
const curve curves[] = {
    {TEE_ALG_ECDSA_P192, TEE_ECC_CURVE_NIST_P192, 192, NID_X9_62_prime192v1},
    {TEE_ALG_ECDSA_P224, TEE_ECC_CURVE_NIST_P224, 224, NID_secp224r1},
    {TEE_ALG_ECDSA_P256, TEE_ECC_CURVE_NIST_P256, 256, NID_X9_62_prime256v1},
    {TEE_ALG_ECDSA_P384, TEE_ECC_CURVE_NIST_P384, 384, NID_secp384r1},
    {TEE_ALG_ECDSA_P521, TEE_ECC_CURVE_NIST_P521, 521, NID_secp521r1},
};

BIGNUM* number(const bytes& value) {
  return BN_bin2bn(value.data(), static_cast<int>(value.size()), nullptr);
}

/// satisfies_equation computes (z/s)·G + (r/s)·Q and compares its x coordinate with r, z being an integer as it is.
bool satisfies_equation(const curve& on, const bytes& x, const bytes& y, const bytes& z, const bytes& signature) {
  const auto middle = signature.begin() + static_cast<std::ptrdiff_t>(on.half());
  BN_CTX* scratch = BN_CTX_new();
  EC_GROUP* group = EC_GROUP_new_by_curve_name(on.nid);
  EC_POINT* point = EC_POINT_new(group);
  const BIGNUM* order = EC_GROUP_get0_order(group);
  BIGNUM* r = number(bytes(signature.begin(), middle));
  BIGNUM* s = number(bytes(middle, signature.end()));
  BIGNUM* u1 = number(z);
  BIGNUM* qx = number(x);
  BIGNUM* qy = number(y);
  BIGNUM* u2 = BN_new();
  BIGNUM* inverse = BN_mod_inverse(nullptr, s, order, scratch);
  bool holds = inverse != nullptr && EC_POINT_set_affine_coordinates(group, point, qx, qy, scratch) == 1;
  if (holds) {
    BN_mod_mul(u1, u1, inverse, order, scratch);
    BN_mod_mul(u2, r, inverse, order, scratch);
    EC_POINT_mul(group, point, u1, point, u2, scratch);
    EC_POINT_get_affine_coordinates(group, point, qx, nullptr, scratch);
    BN_nnmod(qx, qx, order, scratch);
    holds = BN_cmp(qx, r) == 0;
  }
  for (BIGNUM* each : {r, s, u1, u2, qx, qy, inverse}) BN_free(each);
  EC_POINT_free(point);
  EC_GROUP_free(group);
  BN_CTX_free(scratch);
  return holds;
}

bytes order_of(const curve& on) {
  EC_GROUP* group = EC_GROUP_new_by_curve_name(on.nid);
  bytes order(on.half());
  BN_bn2binpad(EC_GROUP_get0_order(group), order.data(), static_cast<int>(order.size()));
  EC_GROUP_free(group);
  return order;
}

bytes padded(const bytes& value, std::size_t width) {
  return joined(bytes(width - value.size()), value);
}

class EcdsaTest : public crypto_fixture {
 protected:
  static object_owner generated(const curve& on) {
    object_owner object = allocate(TEE_TYPE_ECDSA_KEYPAIR, on.bits);
    const attribute_list params = attribute_list().add_value(TEE_ATTR_ECC_CURVE, on.id);
    EXPECT_EQ(TEE_GenerateKey(object.get(), on.bits, params.data(), 1), TEE_SUCCESS);
    return object;
  }
  static attribute_list pair(std::uint32_t curve_id, const bytes& x, const bytes& y, const bytes& d) {
    attribute_list list;
    list.add(TEE_ATTR_ECC_PUBLIC_VALUE_X, x).add(TEE_ATTR_ECC_PUBLIC_VALUE_Y, y).add(TEE_ATTR_ECC_PRIVATE_VALUE, d);
    list.add_value(TEE_ATTR_ECC_CURVE, curve_id);
    return list;
  }
  static bytes x_of(const object_owner& object) { return buffer_attribute(object, TEE_ATTR_ECC_PUBLIC_VALUE_X); }
  static bytes y_of(const object_owner& object) { return buffer_attribute(object, TEE_ATTR_ECC_PUBLIC_VALUE_Y); }
  static answer sign(const operation_owner& op, const bytes& digest, std::size_t capacity) {
    return taking(capacity, [&](void* place, std::uint32_t* length) {
      return TEE_AsymmetricSignDigest(op.get(), nullptr, 0, digest.data(), size_of(digest), place, length);
    });
  }
  static TEE_Result verify(const operation_owner& op, const bytes& digest, const bytes& signature) {
    return TEE_AsymmetricVerifyDigest(op.get(), nullptr, 0, digest.data(), size_of(digest), signature.data(),
                                      size_of(signature));
  }
};

struct known_signature {
  const curve& on;
  const char* d;
  const char* x;
  const char* y;
  const char* digest;
  const char* r;
  const char* s;
};
// RFC 6979, A.2.5 and A.2.7: the message "sample".
const known_signature known_signatures[] = {
    {curves[2], "C9AFA9D845BA75166B5C215767B1D6934E50C3DB36E89B127B8A622B120F6721",
     "60FED4BA255A9D31C961EB74C6356D68C049B8923B61FA6CE669622E60F29FB6",
     "7903FE1008B8BC99A41AE9E95628BC64F2F1B20C2D7E9F5177A3C294D4462299", "SHA256",
     "EFD48B2AACB6A8FD1140DD9CD45E81D69D2C877B56AAF991C34D0EA84EAF3716",
     "F7CB1C942D657C41D436C7A1B6E29F65F3E900DBB9AFF4064DC4AB2F843ACDA8"},
    {curves[4],
     "00FAD06DAA62BA3B25D2FB40133DA757205DE67F5BB0018FEE8C86E1B68C7E75CAA896EB32F1F47C70855836A6D16FCC1466F6D8FBEC67DB"
     "89EC0C08B0E996B83538",
     "01894550D0785932E00EAA23B694F213F8C3121F86DC97A04E5A7167DB4E5BCD371123D46E45DB6B5D5370A7F20FB633155D38FFA16D2BD7"
     "61DCAC474B9A2F5023A4",
     "00493101C962CD4D2FDDF782285E64584139C2F91B47F87FF82354D6630F746A28A0DB25741B5B34A828008B22ACC23F924FAAFBD4D33F81"
     "EA66956DFEAA2BFDFCF5",
     "SHA512",
     "00C328FAFCBD79DD77850370C46325D987CB525569FB63C5D3BC53950E6D4C5F174E25A1EE9017B5D450606ADD152B534931D7D4E8455CC9"
     "1F9B15BF05EC36E377FA",
     "00617CCE7CF5064806C467F678D3B4080D6F1CC50AF26CA209417308281B68AF282623EAA63E5B5C0723D8B8C37FF0777B1A20F8CCB1DCCC"
     "43997F1EE0E44DA4A67A"},
};

TEST_F(EcdsaTest, PublishedSignaturesVerify) {
  for (const known_signature& known : known_signatures) {
    const object_owner object = allocate(TEE_TYPE_ECDSA_KEYPAIR, known.on.bits);
    ASSERT_EQ(populate_into(object, pair(known.on.id, from_hex(known.x), from_hex(known.y), from_hex(known.d))),
              TEE_SUCCESS);
    EXPECT_EQ(info_of(object).keySize, known.on.bits);
    const operation_owner op = operation_for(known.on.algorithm, TEE_MODE_VERIFY, object);
    const bytes digest = digest_of(known.digest, from_text("sample"));
    const bytes signature = joined(from_hex(known.r), from_hex(known.s));
    EXPECT_EQ(verify(op, digest, signature), TEE_SUCCESS);
    for (std::size_t i = 0; i < signature.size(); i += 7) {
      bytes wrong = signature;
      wrong[i] ^= 0x10;
      EXPECT_EQ(verify(op, digest, wrong), TEE_ERROR_SIGNATURE_INVALID) << "byte " << i;
    }
    EXPECT_EQ(verify(op, digest_of(known.digest, from_text("test")), signature), TEE_ERROR_SIGNATURE_INVALID);
  }
}

TEST_F(EcdsaTest, SignaturesOfDigestsOfAnyLengthSatisfyTheEquation) {
  for (const curve& on : curves) {
    const object_owner object = generated(on);
    const operation_owner signing = operation_for(on.algorithm, TEE_MODE_SIGN, object);
    const operation_owner verifying = operation_for(on.algorithm, TEE_MODE_VERIFY, object);
    for (std::size_t size = 0; size <= on.half(); ++size) {
      bytes digest = repeated(0xD7, size);
      if (on.bits == 521 && size == 66) digest[0] = 0x01;  // the integer itself: 521 bits
      const answer made = sign(signing, digest, 2 * on.half());
      ASSERT_EQ(made.result, TEE_SUCCESS) << on.bits << " with " << size;
      EXPECT_EQ(made.data.size(), 2 * on.half());
      EXPECT_TRUE(satisfies_equation(on, x_of(object), y_of(object), digest, made.data)) << on.bits << " with " << size;
      EXPECT_EQ(verify(verifying, digest, made.data), TEE_SUCCESS);
    }
    EXPECT_EQ(sign(signing, repeated(0, on.half() + 1), 200).result, TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(verify(verifying, repeated(0, on.half() + 1), bytes(2 * on.half())), TEE_ERROR_BAD_PARAMETERS);
  }
}

TEST_F(EcdsaTest, DigestOf66BytesOnP521IsAnIntegerBelow2To521) {
  const object_owner object = generated(curves[4]);
  const operation_owner signing = operation_for(TEE_ALG_ECDSA_P521, TEE_MODE_SIGN, object);
  const operation_owner verifying = operation_for(TEE_ALG_ECDSA_P521, TEE_MODE_VERIFY, object);
  for (unsigned top = 1; top < 256; ++top) {
    bytes digest = repeated(0xC3, 66);
    digest[0] = static_cast<std::uint8_t>(top);
    const answer made = sign(signing, digest, 132);
    EXPECT_EQ(made.result, top == 1 ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS) << top;
    if (top != 1) {
      EXPECT_EQ(verify(verifying, digest, repeated(1, 132)), TEE_ERROR_BAD_PARAMETERS);
    }
  }
}

TEST_F(EcdsaTest, HalvesOfTheSignatureAreAlwaysWhole) {
  const object_owner object = generated(curves[0]);
  const operation_owner signing = operation_for(TEE_ALG_ECDSA_P192, TEE_MODE_SIGN, object);
  bool padded_half = false;
  for (int i = 0; i < 2000 && !padded_half; ++i) {
    const bytes signature = sign(signing, repeated(0x31, 20), 48).data;
    ASSERT_EQ(signature.size(), 48U);
    padded_half = signature[0] == 0 || signature[24] == 0;
    if (padded_half) {
      EXPECT_TRUE(satisfies_equation(curves[0], x_of(object), y_of(object), repeated(0x31, 20), signature));
    }
  }
  EXPECT_TRUE(padded_half) << "one signature of 128 has a short half";
}

TEST_F(EcdsaTest, NumbersOutsideTheOrderAreNoSignature) {
  for (const curve& on : curves) {
    const object_owner object = generated(on);
    const bytes digest = repeated(0x42, 20);
    const bytes good = sign(operation_for(on.algorithm, TEE_MODE_SIGN, object), digest, 2 * on.half()).data;
    const auto middle = good.begin() + static_cast<std::ptrdiff_t>(on.half());
    const bytes r(good.begin(), middle);
    const bytes s(middle, good.end());
    const operation_owner op = operation_for(on.algorithm, TEE_MODE_VERIFY, object);
    for (const bytes& bad : {bytes(on.half()), order_of(on), repeated(0xFF, on.half())}) {
      EXPECT_EQ(verify(op, digest, joined(bad, s)), TEE_ERROR_SIGNATURE_INVALID);
      EXPECT_EQ(verify(op, digest, joined(r, bad)), TEE_ERROR_SIGNATURE_INVALID);
      EXPECT_EQ(verify(op, digest, joined(bad, bad)), TEE_ERROR_SIGNATURE_INVALID);
    }
    for (const bytes& length : {bytes{}, bytes(good.begin(), good.end() - 1), joined(good, {0}), joined({0}, good)}) {
      EXPECT_EQ(verify(op, digest, length), TEE_ERROR_SIGNATURE_INVALID) << length.size() << " bytes";
    }
    EXPECT_EQ(verify(op, digest, good), TEE_SUCCESS);
  }
}

TEST_F(EcdsaTest, GeneratedKeysHaveMinimalValuesAndAPointOnTheCurve) {
  for (const curve& on : curves) {
    bool shorter = false;
    for (int i = 0; i < 40; ++i) {
      const object_owner object = generated(on);
      for (const std::uint32_t id :
           {TEE_ATTR_ECC_PUBLIC_VALUE_X, TEE_ATTR_ECC_PUBLIC_VALUE_Y, TEE_ATTR_ECC_PRIVATE_VALUE}) {
        const bytes value = buffer_attribute(object, id);
        ASSERT_FALSE(value.empty());
        EXPECT_NE(value[0], 0) << "no leading zero bytes";
        EXPECT_LE(value.size(), on.half());
        shorter = shorter || value.size() < on.half();
      }
      const object_owner again = allocate(TEE_TYPE_ECDSA_KEYPAIR, on.bits);
      EXPECT_EQ(populate_into(again, pair(on.id, x_of(object), y_of(object),
                                          buffer_attribute(object, TEE_ATTR_ECC_PRIVATE_VALUE))),
                TEE_SUCCESS)
          << "short values come back";
      std::uint32_t a = 0;
      std::uint32_t b = 7;
      EXPECT_EQ(TEE_GetObjectValueAttribute(object.get(), TEE_ATTR_ECC_CURVE, &a, &b), TEE_SUCCESS);
      EXPECT_EQ(a, on.id);
      EXPECT_EQ(b, 0U);
    }
    // Every second value of P-521 fits into 65 bytes.
    EXPECT_TRUE(shorter || on.bits != 521);
  }
}

TEST_F(EcdsaTest, ShortBufferTellsTheSizeOfAValue) {
  const object_owner object = generated(curves[2]);
  const bytes x = x_of(object);
  const answer refusal = taking(x.size() - 1, [&](void* buffer, std::uint32_t* size) {
    return TEE_GetObjectBufferAttribute(object.get(), TEE_ATTR_ECC_PUBLIC_VALUE_X, buffer, size);
  });
  EXPECT_EQ(refusal.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(refusal.length, x.size());
  const answer short_signature = sign(operation_for(TEE_ALG_ECDSA_P256, TEE_MODE_SIGN, object), repeated(1, 32), 63);
  EXPECT_EQ(short_signature.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(short_signature.length, 64U);
}

TEST_F(EcdsaTest, ValuesThatCannotBeAKeyAreRefused) {
  for (const curve& on : curves) {
    const object_owner good = generated(on);
    const bytes x = x_of(good);
    const bytes y = y_of(good);
    const bytes d = buffer_attribute(good, TEE_ATTR_ECC_PRIVATE_VALUE);
    const auto result_of = [&](const bytes& px, const bytes& py, const bytes& pd) {
      const object_owner object = allocate(TEE_TYPE_ECDSA_KEYPAIR, on.bits);
      const TEE_Result result = populate_into(object, pair(on.id, px, py, pd));
      EXPECT_EQ(info_of(object).keySize, result == TEE_SUCCESS ? on.bits : 0U);
      return result;
    };
    bytes off_curve = padded(x, on.half());
    off_curve.back() ^= 1;
    bytes below_order = order_of(on);
    below_order.back() -= 1;
    EXPECT_EQ(result_of(x, y, d), TEE_SUCCESS);
    EXPECT_EQ(result_of(joined(bytes(9), x), joined(bytes(3), y), joined(bytes(70), d)), TEE_SUCCESS)
        << "leading zeros don't matter";
    EXPECT_EQ(result_of(x, y, {1}), TEE_SUCCESS);
    EXPECT_EQ(result_of(x, y, below_order), TEE_SUCCESS);
    EXPECT_EQ(result_of(x, y, {}), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(result_of(x, y, bytes(on.half())), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(result_of(x, y, order_of(on)), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(result_of(x, y, repeated(0xFF, on.half())), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(result_of(x, y, repeated(0xFF, 5000)), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(result_of(off_curve, y, d), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(result_of({}, {}, d), TEE_ERROR_BAD_PARAMETERS);
    EXPECT_EQ(result_of(repeated(0xFF, on.half()), y, d), TEE_ERROR_BAD_PARAMETERS) << "not below the prime";
    EXPECT_EQ(result_of(joined({1}, padded(x, on.half())), y, d), TEE_ERROR_BAD_PARAMETERS);
  }
}

TEST_F(EcdsaTest, CurveMustSuitObjectAndOperation) {
  const object_owner small = allocate(TEE_TYPE_ECDSA_KEYPAIR, 224);
  const attribute_list p256 = attribute_list().add_value(TEE_ATTR_ECC_CURVE, TEE_ECC_CURVE_NIST_P256);
  const attribute_list unknown = attribute_list().add_value(TEE_ATTR_ECC_CURVE, 6);
  EXPECT_EQ(TEE_GenerateKey(small.get(), 224, p256.data(), 1), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(TEE_GenerateKey(small.get(), 224, unknown.data(), 1), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_TRUE(panics([&] { (void)TEE_GenerateKey(small.get(), 224, nullptr, 0); }));
  const object_owner key = generated(curves[2]);
  EXPECT_EQ(populate_into(small, pair(TEE_ECC_CURVE_NIST_P256, x_of(key), y_of(key),
                                      buffer_attribute(key, TEE_ATTR_ECC_PRIVATE_VALUE))),
            TEE_ERROR_BAD_PARAMETERS);
  const operation_owner other = keyless(TEE_ALG_ECDSA_P384, TEE_MODE_SIGN, 384);
  EXPECT_EQ(TEE_SetOperationKey(other.get(), key.get()), TEE_ERROR_BAD_PARAMETERS);
}

TEST_F(EcdsaTest, CopiedOperationSignsWithTheSameKey) {
  const object_owner object = generated(curves[2]);
  const operation_owner copy = keyless(TEE_ALG_ECDSA_P256, TEE_MODE_SIGN, 256);
  TEE_CopyOperation(copy.get(), operation_for(TEE_ALG_ECDSA_P256, TEE_MODE_SIGN, object).get());
  const bytes digest = repeated(0x10, 32);
  EXPECT_TRUE(satisfies_equation(curves[2], x_of(object), y_of(object), digest, sign(copy, digest, 64).data));
}

}  // namespace
}  // namespace hosted_tee::testing
