// Digests, MACs and ciphers against published values: FIPS 180-4, RFC 1321, RFC 2202, RFC 4231, SP 800-38A.
#include <openssl/hmac.h>

#include <algorithm>

#include "tests/tee/crypto_fixture.h"

namespace hosted_tee::testing {
namespace {

struct known_digest {
  std::uint32_t algorithm;
  const char* of_abc;
  const char* of_nothing;
};
const known_digest known_digests[] = {
    {TEE_ALG_MD5, "900150983cd24fb0d6963f7d28e17f72", "d41d8cd98f00b204e9800998ecf8427e"},
    {TEE_ALG_SHA1, "a9993e364706816aba3e25717850c26c9cd0d89d", "da39a3ee5e6b4b0d3255bfef95601890afd80709"},
    {TEE_ALG_SHA224, "23097d223405d8228642a477bda255b32aadbce4bda0b3f7e36c9da7",
     "d14a028c2a3a2bc9476102bb288234c415a2b01f828ea62ac5b3e42f"},
    {TEE_ALG_SHA256, "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad",
     "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855"},
    {TEE_ALG_SHA384, "cb00753f45a35e8bb5a03d699ac65007272c32ab0eded1631a8b605a43ff5bed8086072ba1e7cc2358baeca134c825a7",
     "38b060a751ac96384cd9327eb1b1e36a21fdb71114be07434c0cc7bf63f6e1da274edebfe76f65fbd51ad2f14898b95b"},
    {TEE_ALG_SHA512,
     "ddaf35a193617abacc417349ae20413112e6fa4e89a97ea20a9eeee64b55d39a2192992a274fc1a836ba3c23a3feebbd454d4423643ce80e2"
     "a"
     "9ac94fa54ca49f",
     "cf83e1357eefb8bdf1542850d66d8007d620e4050b5715dc83f4a921d36ce9ce47d0d13c5d85f2b0ff8318d2877eec2f63b931bd47417a81a"
     "5"
     "38327af927da3e"},
};

class DigestTest : public crypto_fixture {
 protected:
  static answer finish(const operation_owner& digest, const bytes& chunk, std::size_t capacity = 64) {
    return taking(capacity, [&](void* hash, std::uint32_t* length) {
      return TEE_DigestDoFinal(digest.get(), chunk.data(), size_of(chunk), hash, length);
    });
  }
};

TEST_F(DigestTest, EveryDigestGivesItsPublishedValuesInOnePieceAndInSeveral) {
  for (const known_digest& known : known_digests) {
    const operation_owner digest = keyless(known.algorithm, TEE_MODE_DIGEST, 0);
    EXPECT_EQ(info_of(digest).digestLength, from_hex(known.of_abc).size());
    EXPECT_EQ(finish(digest, from_text("abc")).data, from_hex(known.of_abc));
    EXPECT_EQ(finish(digest, {}).data, from_hex(known.of_nothing)) << "after a result the next message begins";
    TEE_DigestUpdate(digest.get(), "a", 1);
    TEE_DigestUpdate(digest.get(), nullptr, 0);
    TEE_DigestUpdate(digest.get(), "b", 1);
    EXPECT_EQ(finish(digest, from_text("c")).data, from_hex(known.of_abc));
  }
}

TEST_F(DigestTest, ShortBufferTakesNothingAndTellsTheSize) {
  const operation_owner digest = keyless(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0);
  TEE_DigestUpdate(digest.get(), "ab", 2);
  const answer refusal = finish(digest, from_text("c"), 31);
  EXPECT_EQ(refusal.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(refusal.length, 32U);
  EXPECT_EQ(finish(digest, from_text("c"), 32).data, from_hex(known_digests[3].of_abc));
}

TEST_F(DigestTest, FailedUpdatePoisonsUntilReset) {
  const operation_owner digest = keyless(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0);
  TEE_DigestUpdate(digest.get(), nullptr, 5);
  const answer refusal = finish(digest, from_text("abc"));
  EXPECT_EQ(refusal.result, TEE_ERROR_GENERIC);
  EXPECT_EQ(refusal.length, 0U);
  TEE_DigestUpdate(digest.get(), "abc", 3);
  EXPECT_EQ(finish(digest, {}).result, TEE_ERROR_GENERIC) << "a later good step doesn't heal it";
  TEE_ResetOperation(digest.get());
  EXPECT_EQ(finish(digest, from_text("abc")).data, from_hex(known_digests[3].of_abc));
}

TEST_F(DigestTest, OrderedFailureOfAStepPoisonsToo) {
  const operation_owner digest = keyless(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0);
  const operation_owner copy = keyless(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0);
  for (const char* step : {"TEE_DigestUpdate", "TEE_ResetOperation", "TEE_CopyOperation"}) {
    faults().fail_call(step, 1, TEE_ERROR_BUSY);
    TEE_DigestUpdate(digest.get(), "abc", 3);
    TEE_CopyOperation(copy.get(), digest.get());
    TEE_ResetOperation(digest.get());
    EXPECT_TRUE(faults().triggered()) << step;
    const bool reset_failed = step == std::string("TEE_ResetOperation");
    EXPECT_EQ(finish(copy, {}).result, reset_failed ? TEE_SUCCESS : TEE_ERROR_GENERIC) << step;
    EXPECT_EQ(finish(digest, {}).result, reset_failed ? TEE_ERROR_GENERIC : TEE_SUCCESS) << step;
    faults().clear();
    TEE_ResetOperation(digest.get());
    TEE_ResetOperation(copy.get());
    EXPECT_EQ(finish(digest, from_text("abc")).data, from_hex(known_digests[3].of_abc));
  }
}

TEST_F(DigestTest, CopyGoesOnFromWhereTheSourceStood) {
  const operation_owner digest = keyless(TEE_ALG_SHA1, TEE_MODE_DIGEST, 0);
  const operation_owner copy = keyless(TEE_ALG_SHA1, TEE_MODE_DIGEST, 0);
  TEE_DigestUpdate(digest.get(), "ab", 2);
  TEE_CopyOperation(copy.get(), digest.get());
  EXPECT_EQ(finish(copy, from_text("c")).data, from_hex(known_digests[1].of_abc));
  EXPECT_EQ(finish(digest, from_text("c")).data, from_hex(known_digests[1].of_abc));
}

class MacTest : public crypto_fixture {
 protected:
  static answer finish(const operation_owner& mac, const bytes& chunk, std::size_t capacity = 64) {
    return taking(capacity, [&](void* place, std::uint32_t* length) {
      return TEE_MACComputeFinal(mac.get(), chunk.data(), size_of(chunk), place, length);
    });
  }
};

struct known_mac {
  std::uint32_t algorithm;
  std::uint32_t key_type;
  bytes key;
  bytes message;
  bytes mac;
};

std::vector<known_mac> known_macs() {
  const bytes rfc4231_key = from_hex("0102030405060708090a0b0c0d0e0f10111213141516171819");
  std::vector<known_mac> known = {
      {TEE_ALG_HMAC_MD5, TEE_TYPE_HMAC_MD5, repeated(0x0b, 16), from_text("Hi There"),
       from_hex("9294727a3638bb1c13f48ef8158bfc9d")},
      {TEE_ALG_HMAC_SHA1, TEE_TYPE_HMAC_SHA1, repeated(0x0b, 20), from_text("Hi There"),
       from_hex("b617318655057264e28bc0b6fb378c8ef146be00")},
      {TEE_ALG_HMAC_SHA224, TEE_TYPE_HMAC_SHA224, rfc4231_key, repeated(0xcd, 50),
       from_hex("6c11506874013cac6a2abc1bb382627cec6a90d86efc012de7afec5a")},
      {TEE_ALG_HMAC_SHA256, TEE_TYPE_HMAC_SHA256, rfc4231_key, repeated(0xcd, 50),
       from_hex("82558a389a443c0ea4cc819899f2083a85f0faa3e578f8077a2e3ff46729665b")},
  };
  // The published keys are too short or too long for these two, so libcrypto's one-shot function makes the values.
  for (const auto& [algorithm, type, md] : {std::tuple{TEE_ALG_HMAC_SHA384, TEE_TYPE_HMAC_SHA384, EVP_sha384()},
                                            std::tuple{TEE_ALG_HMAC_SHA512, TEE_TYPE_HMAC_SHA512, EVP_sha512()}}) {
    const bytes key = repeated(0x3c, 128);
    const bytes message = from_text("what do ya want for nothing?");
    bytes mac(EVP_MAX_MD_SIZE);
    unsigned size = 0;
    HMAC(md, key.data(), static_cast<int>(key.size()), message.data(), message.size(), mac.data(), &size);
    mac.resize(size);
    known.push_back({algorithm, type, key, message, mac});
  }
  return known;
}

TEST_F(MacTest, EveryHmacGivesItsPublishedValueInOnePieceAndInSeveral) {
  for (const known_mac& known : known_macs()) {
    const object_owner key = secret_key(known.key_type, known.key);
    const operation_owner mac = operation_for(known.algorithm, TEE_MODE_MAC, key);
    TEE_MACInit(mac.get(), nullptr, 0);
    EXPECT_EQ(finish(mac, known.message).data, known.mac);
    TEE_MACInit(mac.get(), nullptr, 0);
    TEE_MACUpdate(mac.get(), nullptr, 0);
    for (const std::uint8_t& byte : known.message) TEE_MACUpdate(mac.get(), &byte, 1);
    EXPECT_EQ(finish(mac, {}).data, known.mac);
  }
}

TEST_F(MacTest, ShortestKeysWork) {
  const bytes key = repeated(0x77, 8);
  const operation_owner mac = operation_for(TEE_ALG_HMAC_MD5, TEE_MODE_MAC, secret_key(TEE_TYPE_HMAC_MD5, key));
  TEE_MACInit(mac.get(), nullptr, 0);
  bytes expected(EVP_MAX_MD_SIZE);
  unsigned size = 0;
  HMAC(EVP_md5(), key.data(), 8, expected.data(), 0, expected.data(), &size);
  expected.resize(size);
  EXPECT_EQ(finish(mac, {}).data, expected);
}

TEST_F(MacTest, CompareTakesTheWholeMacAndNothingElse) {
  const known_mac known = known_macs()[3];
  const operation_owner mac = operation_for(known.algorithm, TEE_MODE_MAC, secret_key(known.key_type, known.key));
  const auto compare = [&](const bytes& candidate) {
    TEE_MACInit(mac.get(), nullptr, 0);
    return TEE_MACCompareFinal(mac.get(), known.message.data(), size_of(known.message), candidate.data(),
                               size_of(candidate));
  };
  EXPECT_EQ(compare(known.mac), TEE_SUCCESS);
  for (std::size_t i = 0; i < known.mac.size(); ++i) {
    bytes wrong = known.mac;
    wrong[i] ^= 0x01;
    EXPECT_EQ(compare(wrong), TEE_ERROR_MAC_INVALID) << "byte " << i;
  }
  EXPECT_EQ(compare(bytes(known.mac.begin(), known.mac.end() - 1)), TEE_ERROR_MAC_INVALID);
  EXPECT_EQ(compare(joined(known.mac, {0})), TEE_ERROR_MAC_INVALID);
  EXPECT_EQ(compare({}), TEE_ERROR_MAC_INVALID);
}

TEST_F(MacTest, ShortBufferTakesNothingAndAFailedUpdatePoisonsUntilInit) {
  const known_mac known = known_macs()[3];
  const operation_owner mac = operation_for(known.algorithm, TEE_MODE_MAC, secret_key(known.key_type, known.key));
  TEE_MACInit(mac.get(), nullptr, 0);
  const answer refusal = finish(mac, known.message, 31);
  EXPECT_EQ(refusal.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(refusal.length, 32U);
  EXPECT_EQ(finish(mac, known.message, 32).data, known.mac);

  TEE_MACInit(mac.get(), nullptr, 0);
  TEE_MACUpdate(mac.get(), nullptr, 1);
  EXPECT_EQ(finish(mac, known.message).result, TEE_ERROR_GENERIC);
  TEE_MACInit(mac.get(), nullptr, 0);
  EXPECT_EQ(finish(mac, known.message).data, known.mac);
}

TEST_F(MacTest, OrderedFailureOfAStepPoisonsUntilInit) {
  const known_mac known = known_macs()[3];
  const operation_owner mac = operation_for(known.algorithm, TEE_MODE_MAC, secret_key(known.key_type, known.key));
  for (const char* step : {"TEE_MACInit", "TEE_MACUpdate"}) {
    faults().fail_call(step, 1, TEE_ERROR_BUSY);
    TEE_MACInit(mac.get(), nullptr, 0);
    TEE_MACUpdate(mac.get(), nullptr, 0);
    const answer refusal = finish(mac, known.message);
    EXPECT_EQ(refusal.result, TEE_ERROR_GENERIC) << step;
    EXPECT_EQ(refusal.length, 0U) << step;
    TEE_MACInit(mac.get(), nullptr, 0);
    EXPECT_EQ(finish(mac, known.message).data, known.mac) << step;
  }
}

TEST_F(MacTest, CopyGoesOnFromWhereTheSourceStood) {
  const known_mac known = known_macs()[2];
  const operation_owner mac = operation_for(known.algorithm, TEE_MODE_MAC, secret_key(known.key_type, known.key));
  const operation_owner copy = keyless(known.algorithm, TEE_MODE_MAC, 200);
  TEE_MACInit(mac.get(), nullptr, 0);
  TEE_MACUpdate(mac.get(), known.message.data(), 20);
  TEE_CopyOperation(copy.get(), mac.get());
  EXPECT_EQ(finish(copy, bytes(known.message.begin() + 20, known.message.end())).data, known.mac);
  TEE_MACInit(copy.get(), nullptr, 0);
  EXPECT_EQ(finish(copy, known.message).data, known.mac) << "the key came along";
}

TEST_F(MacTest, UseBeforeInitOrWithoutKeyPanics) {
  const known_mac known = known_macs()[3];
  const operation_owner mac = operation_for(known.algorithm, TEE_MODE_MAC, secret_key(known.key_type, known.key));
  EXPECT_TRUE(panics([&] { TEE_MACUpdate(mac.get(), "x", 1); }));
  const operation_owner bare = keyless(known.algorithm, TEE_MODE_MAC, 256);
  EXPECT_TRUE(panics([&] { TEE_MACInit(bare.get(), nullptr, 0); }));
  EXPECT_TRUE(panics([&] { TEE_DigestUpdate(mac.get(), "x", 1); })) << "an operation of another class";
}

class CipherTest : public crypto_fixture {
 protected:
  static answer update(const operation_owner& cipher, const bytes& source, std::size_t capacity) {
    return taking(capacity, [&](void* place, std::uint32_t* length) {
      return TEE_CipherUpdate(cipher.get(), source.data(), size_of(source), place, length);
    });
  }
  static answer finish(const operation_owner& cipher, const bytes& source, std::size_t capacity) {
    return taking(capacity, [&](void* place, std::uint32_t* length) {
      return TEE_CipherDoFinal(cipher.get(), source.data(), size_of(source), place, length);
    });
  }
  static void init(const operation_owner& cipher, const bytes& iv) {
    TEE_CipherInit(cipher.get(), iv.empty() ? nullptr : iv.data(), size_of(iv));
  }
};

const char* const plain_blocks =
    "6bc1bee22e409f96e93d7e117393172aae2d8a571e03ac9c9eb76fac45af8e51"
    "30c81c46a35ce411e5fbc1191a0a52eff69f2445df4f9b17ad2b417be66c3710";
const char* const key_128 = "2b7e151628aed2a6abf7158809cf4f3c";
const char* const key_192 = "8e73b0f7da0e6452c810f32b809079e562f8ead2522c6b7b";
const char* const key_256 = "603deb1015ca71be2b73aef0857d77811f352c073b6108d72d9810a30914dff4";

struct known_cipher {
  std::uint32_t algorithm;
  const char* key;
  const char* iv;
  const char* cipher;
};
const known_cipher known_ciphers[] = {
    {TEE_ALG_AES_ECB_NOPAD, key_128, "",
     "3ad77bb40d7a3660a89ecaf32466ef97f5d3d58503b9699de785895a96fdbaaf"
     "43b1cd7f598ece23881b00e3ed0306887b0c785e27e8ad3f8223207104725dd4"},
    {TEE_ALG_AES_ECB_NOPAD, key_192, "",
     "bd334f1d6e45f25ff712a214571fa5cc974104846d0ad3ad7734ecb3ecee4eef"
     "ef7afd2270e2e60adce0ba2face6444e9a4b41ba738d6c72fb16691603c18e0e"},
    {TEE_ALG_AES_ECB_NOPAD, key_256, "",
     "f3eed1bdb5d2a03c064b5a7e3db181f8591ccb10d410ed26dc5ba74a31362870"
     "b6ed21b99ca6f4f9f153e7b1beafed1d23304b7a39f9f3ff067d8d8f9e24ecc7"},
    {TEE_ALG_AES_CBC_NOPAD, key_128, "000102030405060708090a0b0c0d0e0f",
     "7649abac8119b246cee98e9b12e9197d5086cb9b507219ee95db113a917678b2"
     "73bed6b8e3c1743b7116e69e222295163ff1caa1681fac09120eca307586e1a7"},
    {TEE_ALG_AES_CTR, key_128, "f0f1f2f3f4f5f6f7f8f9fafbfcfdfeff",
     "874d6191b620e3261bef6864990db6ce9806f66b7970fdff8617187bb9fffdff"
     "5ae4df3edbd5d35e5b4f09020db03eab1e031dda2fbe03d1792170a0f3009cee"},
};

TEST_F(CipherTest, EveryModeGivesItsPublishedValuesBothWays) {
  for (const known_cipher& known : known_ciphers) {
    const object_owner key = secret_key(TEE_TYPE_AES, from_hex(known.key));
    const operation_owner encrypt = operation_for(known.algorithm, TEE_MODE_ENCRYPT, key);
    init(encrypt, from_hex(known.iv));
    EXPECT_EQ(finish(encrypt, from_hex(plain_blocks), 64).data, from_hex(known.cipher));
    const operation_owner decrypt = operation_for(known.algorithm, TEE_MODE_DECRYPT, key);
    init(decrypt, from_hex(known.iv));
    EXPECT_EQ(finish(decrypt, from_hex(known.cipher), 64).data, from_hex(plain_blocks));
  }
}

TEST_F(CipherTest, EveryWholeBlockComesOutAtOnceInBothDirections) {
  for (const known_cipher& known : known_ciphers) {
    const bool stream = known.algorithm == TEE_ALG_AES_CTR;
    const object_owner key = secret_key(TEE_TYPE_AES, from_hex(known.key));
    for (const std::uint32_t mode : {TEE_MODE_ENCRYPT, TEE_MODE_DECRYPT}) {
      const bytes source = from_hex(mode == TEE_MODE_ENCRYPT ? plain_blocks : known.cipher);
      const bytes expected = from_hex(mode == TEE_MODE_ENCRYPT ? known.cipher : plain_blocks);
      const operation_owner cipher = operation_for(known.algorithm, mode, key);
      init(cipher, from_hex(known.iv));
      bytes out;
      std::size_t taken = 0;
      for (const std::size_t piece : {16U, 8U, 8U, 1U, 15U, 0U, 16U}) {
        const bytes part(source.begin() + static_cast<std::ptrdiff_t>(taken),
                         source.begin() + static_cast<std::ptrdiff_t>(taken + piece));
        taken += piece;
        const std::size_t due = (stream ? taken : taken / 16 * 16) - out.size();
        const answer got = update(cipher, part, due);
        ASSERT_EQ(got.result, TEE_SUCCESS) << "room for exactly what is due must do";
        EXPECT_EQ(got.data.size(), due);
        out = joined(out, got.data);
      }
      const answer end = finish(cipher, {}, 0);
      EXPECT_EQ(end.result, TEE_SUCCESS);
      EXPECT_EQ(end.length, 0U);
      EXPECT_EQ(out, expected);
    }
  }
}

TEST_F(CipherTest, ShortBufferTellsTheSizeAndChangesNothing) {
  const known_cipher& known = known_ciphers[3];
  const operation_owner cipher =
      operation_for(known.algorithm, TEE_MODE_ENCRYPT, secret_key(TEE_TYPE_AES, from_hex(known.key)));
  init(cipher, from_hex(known.iv));
  const bytes plain = from_hex(plain_blocks);
  const bytes first(plain.begin(), plain.begin() + 40);
  const bytes rest(plain.begin() + 40, plain.end());
  const answer refusal = update(cipher, first, 31);
  EXPECT_EQ(refusal.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(refusal.length, 32U);
  const answer query = [&] {
    answer got;
    got.length = 100;
    got.result = TEE_CipherUpdate(cipher.get(), first.data(), size_of(first), nullptr, &got.length);
    return got;
  }();
  EXPECT_EQ(query.result, TEE_ERROR_SHORT_BUFFER) << "no buffer is no room";
  EXPECT_EQ(query.length, 32U);
  const answer head = update(cipher, first, 32);
  const answer refused_end = finish(cipher, rest, 31);
  EXPECT_EQ(refused_end.result, TEE_ERROR_SHORT_BUFFER);
  const answer tail = finish(cipher, rest, 32);
  EXPECT_EQ(joined(head.data, tail.data), from_hex(known.cipher));
}

TEST_F(CipherTest, DataThatEndInsideABlockAreRefusedAtTheEnd) {
  for (const known_cipher& known : known_ciphers) {
    const operation_owner cipher =
        operation_for(known.algorithm, TEE_MODE_DECRYPT, secret_key(TEE_TYPE_AES, from_hex(known.key)));
    init(cipher, from_hex(known.iv));
    const bytes source = from_hex(known.cipher);
    ASSERT_EQ(update(cipher, bytes(source.begin(), source.begin() + 20), 32).result, TEE_SUCCESS);
    const bool stream = known.algorithm == TEE_ALG_AES_CTR;
    EXPECT_EQ(finish(cipher, {}, 16).result, stream ? TEE_SUCCESS : TEE_ERROR_BAD_PARAMETERS);
    if (stream) continue;
    const answer completed = finish(cipher, bytes(source.begin() + 20, source.begin() + 32), 16);
    const bytes plain = from_hex(plain_blocks);
    EXPECT_EQ(completed.data, bytes(plain.begin() + 16, plain.begin() + 32)) << "the refusal took nothing";
  }
}

TEST_F(CipherTest, NewInitBeginsANewMessage) {
  const known_cipher& known = known_ciphers[3];
  const operation_owner cipher =
      operation_for(known.algorithm, TEE_MODE_ENCRYPT, secret_key(TEE_TYPE_AES, from_hex(known.key)));
  init(cipher, repeated(9, 16));
  ASSERT_EQ(update(cipher, repeated(1, 21), 16).result, TEE_SUCCESS);
  init(cipher, from_hex(known.iv));
  EXPECT_EQ(finish(cipher, from_hex(plain_blocks), 64).data, from_hex(known.cipher));
}

TEST_F(CipherTest, FailedInitPoisonsUntilTheNext) {
  const known_cipher& known = known_ciphers[4];
  const operation_owner cipher =
      operation_for(known.algorithm, TEE_MODE_ENCRYPT, secret_key(TEE_TYPE_AES, from_hex(known.key)));
  TEE_CipherInit(cipher.get(), nullptr, 16);
  EXPECT_EQ(update(cipher, repeated(1, 16), 16).result, TEE_ERROR_GENERIC);
  EXPECT_EQ(finish(cipher, {}, 0).result, TEE_ERROR_GENERIC);
  init(cipher, from_hex(known.iv));
  EXPECT_EQ(finish(cipher, from_hex(plain_blocks), 64).data, from_hex(known.cipher));
}

TEST_F(CipherTest, OrderedFailureOfTheInitPoisonsUntilTheNext) {
  const known_cipher& known = known_ciphers[4];
  const operation_owner cipher =
      operation_for(known.algorithm, TEE_MODE_ENCRYPT, secret_key(TEE_TYPE_AES, from_hex(known.key)));
  faults().fail_call("TEE_CipherInit", 1, TEE_ERROR_BUSY);
  init(cipher, from_hex(known.iv));
  EXPECT_EQ(finish(cipher, from_hex(plain_blocks), 64).result, TEE_ERROR_GENERIC);
  init(cipher, from_hex(known.iv));
  EXPECT_EQ(finish(cipher, from_hex(plain_blocks), 64).data, from_hex(known.cipher));
}

TEST_F(CipherTest, CopyCarriesKeyChainAndHeldBytes) {
  const known_cipher& known = known_ciphers[3];
  const operation_owner cipher =
      operation_for(known.algorithm, TEE_MODE_ENCRYPT, secret_key(TEE_TYPE_AES, from_hex(known.key)));
  const operation_owner copy = keyless(known.algorithm, TEE_MODE_ENCRYPT, 256);
  init(cipher, from_hex(known.iv));
  const bytes plain = from_hex(plain_blocks);
  const bytes head = update(cipher, bytes(plain.begin(), plain.begin() + 21), 16).data;
  TEE_CopyOperation(copy.get(), cipher.get());
  const bytes rest(plain.begin() + 21, plain.end());
  EXPECT_EQ(joined(head, finish(copy, rest, 48).data), from_hex(known.cipher));
  EXPECT_EQ(joined(head, finish(cipher, rest, 48).data), from_hex(known.cipher));
}

TEST_F(CipherTest, WrongIvOrMissingInitPanics) {
  const object_owner key = secret_key(TEE_TYPE_AES, from_hex(key_128));
  const operation_owner cipher = operation_for(TEE_ALG_AES_CBC_NOPAD, TEE_MODE_ENCRYPT, key);
  std::uint32_t length = 0;
  EXPECT_TRUE(panics([&] { (void)TEE_CipherUpdate(cipher.get(), nullptr, 0, nullptr, &length); }));
  const bytes iv = repeated(0, 15);
  EXPECT_TRUE(panics([&] { TEE_CipherInit(cipher.get(), iv.data(), 15); }));
  const operation_owner ecb = operation_for(TEE_ALG_AES_ECB_NOPAD, TEE_MODE_ENCRYPT, key);
  EXPECT_TRUE(panics([&] { TEE_CipherInit(ecb.get(), iv.data(), 15); }));
}

}  // namespace
}  // namespace hosted_tee::testing
