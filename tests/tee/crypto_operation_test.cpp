// Operations of any class: which there are, their keys, their information, random data.
#include <algorithm>
#include <set>

#include "tests/tee/crypto_fixture.h"

namespace hosted_tee::testing {
namespace {

class OperationTest : public crypto_fixture {
 protected:
  static TEE_Result try_allocate(std::uint32_t algorithm, std::uint32_t mode, std::uint32_t bits) {
    TEE_OperationHandle handle = TEE_HANDLE_NULL;
    const TEE_Result result = TEE_AllocateOperation(&handle, algorithm, mode, bits);
    EXPECT_EQ(handle != TEE_HANDLE_NULL, result == TEE_SUCCESS);
    TEE_FreeOperation(handle);
    return result;
  }
};

struct offer {
  std::set<std::uint32_t> algorithms;
  std::set<std::uint32_t> modes;
  std::uint32_t bits;
};
const offer offers[] = {
    {{TEE_ALG_MD5, TEE_ALG_SHA1, TEE_ALG_SHA224, TEE_ALG_SHA256, TEE_ALG_SHA384, TEE_ALG_SHA512}, {5}, 0},
    {{TEE_ALG_HMAC_MD5, TEE_ALG_HMAC_SHA1, TEE_ALG_HMAC_SHA224, TEE_ALG_HMAC_SHA256, TEE_ALG_HMAC_SHA384,
      TEE_ALG_HMAC_SHA512},
     {4},
     256},
    {{TEE_ALG_AES_ECB_NOPAD, TEE_ALG_AES_CBC_NOPAD, TEE_ALG_AES_CTR, TEE_ALG_AES_GCM}, {0, 1}, 192},
    {{TEE_ALG_RSA_NOPAD}, {0, 1, 8}, 2056},
    {{TEE_ALG_RSAES_PKCS1_V1_5, 0x60210230, 0x60310230, 0x60410230, 0x60510230, 0x60610230, 0x60212230, 0x60312230,
      0x60412230, 0x60512230, 0x60612230},
     {0, 1},
     2056},
    {{0x70001830, 0x70002830, 0x70003830, 0x70004830, 0x70005830, 0x70006830, 0x70212930, 0x70313930, 0x70414930,
      0x70515930, 0x70616930},
     {2, 3},
     2048},
    {{TEE_ALG_ECDSA_P192}, {2, 3}, 192},
    {{TEE_ALG_ECDSA_P224}, {2, 3}, 224},
    {{TEE_ALG_ECDSA_P256}, {2, 3}, 256},
    {{TEE_ALG_ECDSA_P384}, {2, 3}, 384},
    {{TEE_ALG_ECDSA_P521}, {2, 3}, 521},
};

TEST_F(OperationTest, EachAlgorithmHasItsModesAndNoOther) {
  for (const offer& each : offers) {
    for (const std::uint32_t algorithm : each.algorithms) {
      for (const std::uint32_t mode : {0U, 1U, 2U, 3U, 4U, 5U, 6U, 7U, 8U, 9U, 31U, 32U, 0xFFFFFFFFU}) {
        EXPECT_EQ(try_allocate(algorithm, mode, each.bits),
                  each.modes.contains(mode) ? TEE_SUCCESS : TEE_ERROR_NOT_SUPPORTED)
            << std::hex << algorithm << " mode " << mode;
      }
    }
  }
  for (const std::uint32_t unknown : {0U, TEE_ALG_AES_CCM, 0x60212231U, 0x60710230U, 0x70006041U, 0xFFFFFFFFU}) {
    for (std::uint32_t mode = 0; mode < 9; ++mode) {
      EXPECT_EQ(try_allocate(unknown, mode, 256), TEE_ERROR_NOT_SUPPORTED);
    }
  }
}

TEST_F(OperationTest, MaximumSizeIsOneThatTheKeysCanHave) {
  for (const std::uint32_t bits : {0U, 504U, 513U, 8200U, 0xFFFFFFF8U}) {
    EXPECT_EQ(try_allocate(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, bits), TEE_ERROR_NOT_SUPPORTED) << bits;
  }
  for (const std::uint32_t bits : {512U, 520U, 1000U, 2056U, 8192U}) {
    EXPECT_EQ(try_allocate(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, bits), TEE_SUCCESS) << bits;
  }
  EXPECT_EQ(try_allocate(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, 64), TEE_ERROR_NOT_SUPPORTED);
  EXPECT_EQ(try_allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 184), TEE_ERROR_NOT_SUPPORTED);
  EXPECT_EQ(try_allocate(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 192), TEE_SUCCESS);
  EXPECT_EQ(try_allocate(TEE_ALG_ECDSA_P256, TEE_MODE_SIGN, 384), TEE_ERROR_NOT_SUPPORTED);
}

TEST_F(OperationTest, OrderedFailureLeavesTheNullHandle) {
  faults().fail_call("TEE_AllocateOperation", 2, TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(try_allocate(TEE_ALG_SHA1, TEE_MODE_DIGEST, 0), TEE_SUCCESS);
  EXPECT_EQ(try_allocate(TEE_ALG_SHA1, TEE_MODE_DIGEST, 0), TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(try_allocate(TEE_ALG_SHA1, TEE_MODE_DIGEST, 0), TEE_SUCCESS);
}

TEST_F(OperationTest, InformationFollowsTheKeyAndTheState) {
  const operation_owner mac = keyless(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 512);
  TEE_OperationInfo info = info_of(mac);
  EXPECT_EQ(info.algorithm, TEE_ALG_HMAC_SHA256);
  EXPECT_EQ(info.operationClass, TEE_OPERATION_MAC);
  EXPECT_EQ(info.mode, TEE_MODE_MAC);
  EXPECT_EQ(info.digestLength, 32U);
  EXPECT_EQ(info.maxKeySize, 512U);
  EXPECT_EQ(info.keySize, 0U);
  EXPECT_EQ(info.requiredKeyUsage, TEE_USAGE_MAC);
  EXPECT_EQ(info.handleState, 0U);
  const object_owner key = secret_key(TEE_TYPE_HMAC_SHA256, repeated(3, 32));
  ASSERT_EQ(TEE_SetOperationKey(mac.get(), key.get()), TEE_SUCCESS);
  EXPECT_EQ(info_of(mac).keySize, 256U);
  EXPECT_EQ(info_of(mac).handleState, TEE_HANDLE_FLAG_KEY_SET);
  TEE_MACInit(mac.get(), nullptr, 0);
  EXPECT_EQ(info_of(mac).handleState, TEE_HANDLE_FLAG_KEY_SET | TEE_HANDLE_FLAG_INITIALIZED);
  TEE_ResetOperation(mac.get());
  EXPECT_EQ(info_of(mac).handleState, TEE_HANDLE_FLAG_KEY_SET);
  ASSERT_EQ(TEE_SetOperationKey(mac.get(), TEE_HANDLE_NULL), TEE_SUCCESS);
  EXPECT_EQ(info_of(mac).keySize, 0U);
  EXPECT_EQ(info_of(mac).handleState, 0U);

  info = info_of(keyless(TEE_ALG_SHA512, TEE_MODE_DIGEST, 0));
  EXPECT_EQ(info.operationClass, TEE_OPERATION_DIGEST);
  EXPECT_EQ(info.digestLength, 64U);
  EXPECT_EQ(info.handleState, TEE_HANDLE_FLAG_KEY_SET | TEE_HANDLE_FLAG_INITIALIZED) << "a digest is always ready";
  EXPECT_EQ(info_of(keyless(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, 512)).requiredKeyUsage,
            TEE_USAGE_DECRYPT | TEE_USAGE_SIGN);
  EXPECT_EQ(info_of(keyless(TEE_ALG_RSA_NOPAD, TEE_MODE_EXPORT, 512)).requiredKeyUsage, 0U);
}

TEST_F(OperationTest, ClassesHaveTheStandardsNumbers) {
  const auto class_of = [](std::uint32_t algorithm, std::uint32_t mode, std::uint32_t bits) {
    return info_of(keyless(algorithm, mode, bits)).operationClass;
  };
  EXPECT_EQ(class_of(TEE_ALG_AES_CTR, TEE_MODE_ENCRYPT, 128), 1U);
  EXPECT_EQ(class_of(TEE_ALG_HMAC_SHA1, TEE_MODE_MAC, 160), 3U);
  EXPECT_EQ(class_of(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, 128), 4U);
  EXPECT_EQ(class_of(TEE_ALG_SHA1, TEE_MODE_DIGEST, 0), 5U);
  EXPECT_EQ(class_of(TEE_ALG_RSA_NOPAD, TEE_MODE_ENCRYPT, 512), 6U);
  EXPECT_EQ(class_of(TEE_ALG_ECDSA_P256, TEE_MODE_SIGN, 256), 7U);
}

TEST_F(OperationTest, KeyAboveTheMaximumIsRefusedAndTheOldOneStays) {
  const object_owner big = secret_key(TEE_TYPE_AES, repeated(1, 32));
  const object_owner small = secret_key(TEE_TYPE_AES, repeated(1, 16));
  const operation_owner cipher = keyless(TEE_ALG_AES_CTR, TEE_MODE_ENCRYPT, 192);
  ASSERT_EQ(TEE_SetOperationKey(cipher.get(), small.get()), TEE_SUCCESS) << "below the maximum";
  EXPECT_EQ(TEE_SetOperationKey(cipher.get(), big.get()), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(info_of(cipher).keySize, 128U);
}

TEST_F(OperationTest, OperationKeepsItsKeyWhenTheObjectIsGone) {
  object_owner key = secret_key(TEE_TYPE_AES, from_hex("2b7e151628aed2a6abf7158809cf4f3c"));
  const operation_owner cipher = operation_for(TEE_ALG_AES_ECB_NOPAD, TEE_MODE_ENCRYPT, key);
  key.reset();
  TEE_CipherInit(cipher.get(), nullptr, 0);
  const bytes plain = from_hex("6bc1bee22e409f96e93d7e117393172a");
  const answer got = taking(16, [&](void* place, std::uint32_t* length) {
    return TEE_CipherDoFinal(cipher.get(), plain.data(), 16, place, length);
  });
  EXPECT_EQ(got.data, from_hex("3ad77bb40d7a3660a89ecaf32466ef97"));
}

TEST_F(OperationTest, MisusePanics) {
  const object_owner aes = secret_key(TEE_TYPE_AES, repeated(1, 32));
  const object_owner empty = allocate(TEE_TYPE_AES, 128);
  const operation_owner mac = keyless(TEE_ALG_HMAC_SHA256, TEE_MODE_MAC, 256);
  const operation_owner digest = keyless(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0);
  const operation_owner other_digest = keyless(TEE_ALG_SHA1, TEE_MODE_DIGEST, 0);
  const operation_owner cipher = operation_for(TEE_ALG_AES_CTR, TEE_MODE_ENCRYPT, aes);
  const bytes iv = repeated(0, 16);
  TEE_CipherInit(cipher.get(), iv.data(), 16);
  auto* const stale = reinterpret_cast<TEE_OperationHandle>(0x123456);
  TEE_OperationInfo info;
  EXPECT_TRUE(panics([&] { (void)TEE_SetOperationKey(mac.get(), aes.get()); })) << "a key of another type";
  EXPECT_TRUE(panics([&] { (void)TEE_SetOperationKey(mac.get(), empty.get()); })) << "no key in the object";
  EXPECT_TRUE(panics([&] { (void)TEE_SetOperationKey(digest.get(), aes.get()); })) << "needs no key";
  EXPECT_TRUE(panics([&] { (void)TEE_SetOperationKey(cipher.get(), aes.get()); })) << "in the middle of data";
  EXPECT_TRUE(panics([&] { TEE_CopyOperation(digest.get(), other_digest.get()); })) << "another algorithm";
  EXPECT_TRUE(panics([&] { TEE_FreeOperation(stale); }));
  EXPECT_TRUE(panics([&] { TEE_GetOperationInfo(stale, &info); }));
  EXPECT_FALSE(panics([&] { TEE_FreeOperation(TEE_HANDLE_NULL); }));
}

TEST_F(OperationTest, RandomDataFillTheBufferAndNoMore) {
  bytes buffer(96, 0xA5);
  TEE_GenerateRandom(buffer.data() + 16, 64);
  EXPECT_EQ(bytes(buffer.begin(), buffer.begin() + 16), repeated(0xA5, 16));
  EXPECT_EQ(bytes(buffer.begin() + 80, buffer.end()), repeated(0xA5, 16));
  EXPECT_GT(std::set<std::uint8_t>(buffer.begin() + 16, buffer.begin() + 80).size(), 20U);
  const bytes first = buffer;
  TEE_GenerateRandom(buffer.data() + 16, 64);
  EXPECT_NE(first, buffer);
  EXPECT_FALSE(panics([] { TEE_GenerateRandom(nullptr, 0); }));
  EXPECT_TRUE(panics([] { TEE_GenerateRandom(nullptr, 1); }));
}

TEST_F(OperationTest, WantOfRandomDataPanicsWithTheOrderedCode) {
  faults().fail_call("TEE_GenerateRandom", 2, TEE_ERROR_BUSY);
  static std::array<std::uint8_t, 4> buffer;
  TEE_GenerateRandom(buffer.data(), 4);
  const auto before = buffer;
  EXPECT_EQ(run_guarded([] { TEE_GenerateRandom(buffer.data(), 4); }), TEE_ERROR_BUSY);
  EXPECT_EQ(buffer, before);
}

TEST_F(OperationTest, EveryCallIsCountedUnderItsOwnName) {
  (void)try_allocate(TEE_ALG_SHA1, TEE_MODE_DIGEST, 0);
  EXPECT_EQ(faults().call_count("TEE_AllocateOperation"), 1U);
  EXPECT_EQ(faults().call_count("TEE_FreeOperation"), 1U);
  bytes buffer(4);
  TEE_GenerateRandom(buffer.data(), 4);
  EXPECT_EQ(faults().call_count("TEE_GenerateRandom"), 1U);
}

}  // namespace
}  // namespace hosted_tee::testing
