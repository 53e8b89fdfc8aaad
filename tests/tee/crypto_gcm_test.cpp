// AES-GCM against the values of its authors' submission to NIST, and the rules about tags.
#include <algorithm>

#include "tests/tee/crypto_fixture.h"

namespace hosted_tee::testing {
namespace {

const char* const key_hex = "feffe9928665731c6d6a8f9467308308";
const char* const nonce_hex = "cafebabefacedbaddecaf888";
const char* const aad_hex = "feedfacedeadbeeffeedfacedeadbeefabaddad2";
const char* const plain_hex =
    "d9313225f88406e5a55909c5aff5269a86a7a9531534f7da2e4c303d8a318a72"
    "1c3c0c95956809532fcf0e2449a6b525b16aedf5aa0de657ba637b39";
const char* const cipher_hex =
    "42831ec2217774244b7221b784d0d49ce3aa212f2c02a4e035c17e2329aca12e"
    "21d514b25466931c7d8f6a5aac84aa051ba30b396a0aac973d58e091";
const char* const tag_hex = "5bc94fbc3221a5db94fae95ae7121a47";

class GcmTest : public crypto_fixture {
 protected:
  GcmTest()
      : key_(secret_key(TEE_TYPE_AES, from_hex(key_hex))),
        encrypt_(operation_for(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, key_)),
        decrypt_(operation_for(TEE_ALG_AES_GCM, TEE_MODE_DECRYPT, key_)) {}

  static TEE_Result init(const operation_owner& gcm, std::uint32_t tag_bits, const bytes& nonce = from_hex(nonce_hex)) {
    return TEE_AEInit(gcm.get(), nonce.data(), size_of(nonce), tag_bits, 0, 0);
  }
  static void add_aad(const operation_owner& gcm, const bytes& aad) {
    TEE_AEUpdateAAD(gcm.get(), aad.data(), size_of(aad));
  }
  static answer update(const operation_owner& gcm, const bytes& source, std::size_t capacity) {
    return taking(capacity, [&](void* place, std::uint32_t* length) {
      return TEE_AEUpdate(gcm.get(), source.data(), size_of(source), place, length);
    });
  }
  static answer final_tag(const operation_owner& gcm, std::size_t capacity = 16) {
    std::uint32_t none = 0;
    answer got = taking(capacity, [&](void* tag, std::uint32_t* length) {
      return TEE_AEEncryptFinal(gcm.get(), nullptr, 0, nullptr, &none, tag, length);
    });
    EXPECT_EQ(none, 0U);
    return got;
  }
  static TEE_Result check_tag(const operation_owner& gcm, bytes tag) {
    std::uint32_t none = 0;
    const TEE_Result result = TEE_AEDecryptFinal(gcm.get(), nullptr, 0, nullptr, &none, tag.data(), size_of(tag));
    EXPECT_EQ(none, 0U);
    return result;
  }
  /// Decrypts the known message with another tag length and tag.
  TEE_Result decrypt_known(std::uint32_t tag_bits, const bytes& tag) {
    EXPECT_EQ(init(decrypt_, tag_bits), TEE_SUCCESS);
    add_aad(decrypt_, from_hex(aad_hex));
    EXPECT_EQ(update(decrypt_, from_hex(cipher_hex), 60).data, from_hex(plain_hex));
    return check_tag(decrypt_, tag);
  }

  object_owner key_;
  operation_owner encrypt_;
  operation_owner decrypt_;
};

TEST_F(GcmTest, PublishedValuesInPiecesOfAnySize) {
  ASSERT_EQ(init(encrypt_, 128), TEE_SUCCESS);
  const bytes aad = from_hex(aad_hex);
  TEE_AEUpdateAAD(encrypt_.get(), aad.data(), 7);
  TEE_AEUpdateAAD(encrypt_.get(), nullptr, 0);
  TEE_AEUpdateAAD(encrypt_.get(), aad.data() + 7, size_of(aad) - 7);
  bytes source = from_hex(plain_hex);
  bytes out;
  for (const std::size_t piece : {1U, 5U, 16U, 0U, 10U, 8U, 20U}) {
    const auto cut = source.begin() + static_cast<std::ptrdiff_t>(piece);
    const answer got = update(encrypt_, bytes(source.begin(), cut), piece);
    ASSERT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.data.size(), piece) << "as many bytes come out as go in";
    out = joined(out, got.data);
    source.erase(source.begin(), cut);
  }
  EXPECT_EQ(out, from_hex(cipher_hex));
  EXPECT_EQ(final_tag(encrypt_).data, from_hex(tag_hex));
  EXPECT_EQ(decrypt_known(128, from_hex(tag_hex)), TEE_SUCCESS);
}

TEST_F(GcmTest, DataOfTheFinalCallsAreProcessedToo) {
  const bytes plain = from_hex(plain_hex);
  ASSERT_EQ(init(encrypt_, 128), TEE_SUCCESS);
  add_aad(encrypt_, from_hex(aad_hex));
  bytes tag(16);
  std::uint32_t tag_length = 16;
  const answer sealed = taking(60, [&](void* place, std::uint32_t* length) {
    return TEE_AEEncryptFinal(encrypt_.get(), plain.data(), 60, place, length, tag.data(), &tag_length);
  });
  EXPECT_EQ(sealed.data, from_hex(cipher_hex));
  EXPECT_EQ(tag, from_hex(tag_hex));

  for (const bool forged : {false, true}) {
    ASSERT_EQ(init(decrypt_, 128), TEE_SUCCESS);
    add_aad(decrypt_, from_hex(aad_hex));
    if (forged) tag[3] ^= 0x80;
    bytes opened(60, 0xEE);
    std::uint32_t length = 60;
    const TEE_Result result =
        TEE_AEDecryptFinal(decrypt_.get(), sealed.data.data(), 60, opened.data(), &length, tag.data(), 16);
    EXPECT_EQ(result, forged ? TEE_ERROR_MAC_INVALID : TEE_SUCCESS);
    EXPECT_EQ(length, forged ? 0U : 60U);
    EXPECT_EQ(opened, forged ? bytes(60, 0) : plain) << "unconfirmed plaintext doesn't stay behind";
  }
}

TEST_F(GcmTest, EmptyMessages) {
  const operation_owner gcm =
      operation_for(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, secret_key(TEE_TYPE_AES, repeated(0, 16)));
  ASSERT_EQ(init(gcm, 128, repeated(0, 12)), TEE_SUCCESS);
  EXPECT_EQ(final_tag(gcm).data, from_hex("58e2fccefa7e3061367f1d57a4e7455a"));
}

TEST_F(GcmTest, GenericSecretAndAesObjectsAreBothAes256Keys) {
  for (const std::uint32_t type : {TEE_TYPE_AES, TEE_TYPE_GENERIC_SECRET}) {
    const object_owner key = secret_key(type, repeated(0, 32));
    const operation_owner gcm = operation_for(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, key);
    ASSERT_EQ(init(gcm, 128, repeated(0, 12)), TEE_SUCCESS);
    EXPECT_EQ(final_tag(gcm).data, from_hex("530f8afbc74536b9a963b4f1c4cb738b"));
  }
}

TEST_F(GcmTest, TagsOfEveryLengthInWholeBytesFromNone) {
  for (std::uint32_t bits = 0; bits <= 128; bits += 8) {
    ASSERT_EQ(init(encrypt_, bits), TEE_SUCCESS);
    EXPECT_EQ(info_of(encrypt_).digestLength, bits / 8);
    add_aad(encrypt_, from_hex(aad_hex));
    ASSERT_EQ(update(encrypt_, from_hex(plain_hex), 60).result, TEE_SUCCESS);
    const bytes whole = from_hex(tag_hex);
    const bytes part(whole.begin(), whole.begin() + bits / 8);
    const answer tag = final_tag(encrypt_, bits / 8);
    EXPECT_EQ(tag.result, TEE_SUCCESS);
    EXPECT_EQ(tag.data, part);
    EXPECT_EQ(decrypt_known(bits, part), TEE_SUCCESS);
  }
  for (const std::uint32_t bits : {1U, 100U, 127U, 129U, 136U, 0xFFFFFFF8U}) {
    EXPECT_EQ(init(encrypt_, bits), TEE_ERROR_NOT_SUPPORTED) << bits;
  }
}

TEST_F(GcmTest, StrictPlatformTakesTheStandardsTagsAlone) {
  faults().strict_gcm_tags(true);
  for (std::uint32_t bits = 0; bits <= 128; bits += 8) {
    EXPECT_EQ(init(encrypt_, bits), bits >= 96 ? TEE_SUCCESS : TEE_ERROR_NOT_SUPPORTED) << bits;
  }
}

TEST_F(GcmTest, NonceHasTwelveBytes) {
  for (const std::size_t size : {0U, 1U, 11U, 13U, 16U}) {
    EXPECT_EQ(init(encrypt_, 128, repeated(1, size)), TEE_ERROR_NOT_SUPPORTED) << size;
  }
}

TEST_F(GcmTest, OnlyTheWholeTagIsValid) {
  const bytes tag = from_hex(tag_hex);
  for (std::size_t i = 0; i < tag.size(); ++i) {
    bytes wrong = tag;
    wrong[i] ^= 0x01;
    EXPECT_EQ(decrypt_known(128, wrong), TEE_ERROR_MAC_INVALID) << "byte " << i;
    EXPECT_EQ(decrypt_known(128, bytes(tag.begin(), tag.begin() + static_cast<std::ptrdiff_t>(i))),
              TEE_ERROR_MAC_INVALID)
        << "a true prefix of " << i << " bytes";
  }
  EXPECT_EQ(decrypt_known(96, tag), TEE_ERROR_MAC_INVALID) << "longer than agreed";
  EXPECT_EQ(decrypt_known(0, {tag[0]}), TEE_ERROR_MAC_INVALID);
  ASSERT_EQ(init(decrypt_, 128), TEE_SUCCESS);
  std::uint32_t none = 0;
  EXPECT_EQ(TEE_AEDecryptFinal(decrypt_.get(), nullptr, 0, nullptr, &none, nullptr, 16), TEE_ERROR_MAC_INVALID);
}

TEST_F(GcmTest, NothingButInvalidComesFromASpoiledDecryption) {
  ASSERT_EQ(init(decrypt_, 128), TEE_SUCCESS);
  TEE_AEUpdateAAD(decrypt_.get(), nullptr, 20);
  EXPECT_EQ(update(decrypt_, from_hex(cipher_hex), 60).result, TEE_ERROR_GENERIC);
  EXPECT_EQ(check_tag(decrypt_, from_hex(tag_hex)), TEE_ERROR_MAC_INVALID);
  EXPECT_EQ(check_tag(decrypt_, from_hex(tag_hex)), TEE_ERROR_MAC_INVALID) << "it stays so";
  EXPECT_EQ(decrypt_known(128, from_hex(tag_hex)), TEE_SUCCESS) << "until a new message begins";

  ASSERT_EQ(init(encrypt_, 128), TEE_SUCCESS);
  TEE_AEUpdateAAD(encrypt_.get(), nullptr, 20);
  EXPECT_EQ(final_tag(encrypt_).result, TEE_ERROR_GENERIC);
}

TEST_F(GcmTest, OrderedFailureOfAssociatedDataSpoilsTheMessage) {
  faults().fail_call("TEE_AEUpdateAAD", 1, TEE_ERROR_BUSY);
  ASSERT_EQ(init(decrypt_, 128), TEE_SUCCESS);
  add_aad(decrypt_, from_hex(aad_hex));
  EXPECT_TRUE(faults().triggered());
  EXPECT_EQ(update(decrypt_, from_hex(cipher_hex), 60).result, TEE_ERROR_GENERIC);
  EXPECT_EQ(check_tag(decrypt_, from_hex(tag_hex)), TEE_ERROR_MAC_INVALID);
}

TEST_F(GcmTest, FailedEncryptionTellsNeitherLength) {
  const bytes plain = from_hex(plain_hex);
  const auto finish = [&](const void* source, std::uint32_t& length, std::uint32_t& tag_length) {
    bytes sealed(60), tag(16);
    length = 60;
    tag_length = 16;
    return TEE_AEEncryptFinal(encrypt_.get(), source, 60, sealed.data(), &length, tag.data(), &tag_length);
  };
  std::uint32_t length = 0, tag_length = 0;
  ASSERT_EQ(init(encrypt_, 128), TEE_SUCCESS);
  EXPECT_EQ(finish(nullptr, length, tag_length), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(length, 0U);
  EXPECT_EQ(tag_length, 0U);
  faults().fail_call("TEE_AEEncryptFinal", 1, TEE_ERROR_BUSY);
  EXPECT_EQ(finish(plain.data(), length, tag_length), TEE_ERROR_BUSY);
  EXPECT_EQ(length, 0U);
  EXPECT_EQ(tag_length, 0U);
}

TEST_F(GcmTest, TagOfAnotherLengthIsInvalidWhateverElseIsWrong) {
  ASSERT_EQ(init(decrypt_, 128), TEE_SUCCESS);
  bytes source = from_hex(cipher_hex), tag = from_hex(tag_hex), place(59);
  std::uint32_t length = 59;
  EXPECT_EQ(TEE_AEDecryptFinal(decrypt_.get(), source.data(), 60, place.data(), &length, tag.data(), 15),
            TEE_ERROR_MAC_INVALID);
  EXPECT_EQ(length, 0U);
  ASSERT_EQ(init(decrypt_, 128), TEE_SUCCESS);
  length = 59;
  EXPECT_EQ(TEE_AEDecryptFinal(decrypt_.get(), source.data(), 60, place.data(), &length, tag.data(), 16),
            TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(length, 60U);
}

TEST_F(GcmTest, ShortBufferTellsTheSizeAndChangesNothing) {
  ASSERT_EQ(init(encrypt_, 128), TEE_SUCCESS);
  add_aad(encrypt_, from_hex(aad_hex));
  const answer refusal = update(encrypt_, from_hex(plain_hex), 59);
  EXPECT_EQ(refusal.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(refusal.length, 60U);
  EXPECT_EQ(update(encrypt_, from_hex(plain_hex), 60).data, from_hex(cipher_hex));
  const answer short_tag = final_tag(encrypt_, 15);
  EXPECT_EQ(short_tag.result, TEE_ERROR_SHORT_BUFFER);
  EXPECT_EQ(short_tag.length, 16U);
  EXPECT_EQ(final_tag(encrypt_).data, from_hex(tag_hex));
}

TEST_F(GcmTest, CopyGoesOnFromWhereTheSourceStood) {
  const operation_owner copy = keyless(TEE_ALG_AES_GCM, TEE_MODE_ENCRYPT, 256);
  ASSERT_EQ(init(encrypt_, 128), TEE_SUCCESS);
  add_aad(encrypt_, from_hex(aad_hex));
  const bytes plain = from_hex(plain_hex);
  const bytes head = update(encrypt_, bytes(plain.begin(), plain.begin() + 21), 21).data;
  TEE_CopyOperation(copy.get(), encrypt_.get());
  for (const auto* each : std::initializer_list<const operation_owner*>{&copy, &encrypt_}) {
    EXPECT_EQ(joined(head, update(*each, bytes(plain.begin() + 21, plain.end()), 39).data), from_hex(cipher_hex));
    EXPECT_EQ(final_tag(*each).data, from_hex(tag_hex));
  }
}

TEST_F(GcmTest, OrderedFailureOfTheFinalCallIsGivenAsItIs) {
  faults().fail_call("TEE_AEDecryptFinal", 1, TEE_ERROR_OUT_OF_MEMORY);
  EXPECT_EQ(decrypt_known(128, from_hex(tag_hex)), TEE_ERROR_OUT_OF_MEMORY);
}

TEST_F(GcmTest, MisusePanics) {
  std::uint32_t none = 0;
  bytes tag = from_hex(tag_hex);
  EXPECT_TRUE(panics([&] { TEE_AEUpdateAAD(encrypt_.get(), tag.data(), 1); })) << "not initialised";
  ASSERT_EQ(init(encrypt_, 128), TEE_SUCCESS);
  EXPECT_TRUE(panics([&] { (void)TEE_AEDecryptFinal(encrypt_.get(), nullptr, 0, nullptr, &none, tag.data(), 16); }))
      << "the other mode";
  ASSERT_EQ(update(encrypt_, tag, 16).result, TEE_SUCCESS);
  EXPECT_TRUE(panics([&] { TEE_AEUpdateAAD(encrypt_.get(), tag.data(), 1); })) << "associated data after data";
}

}  // namespace
}  // namespace hosted_tee::testing
