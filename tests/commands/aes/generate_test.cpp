// Generating AES keys: what is made, and what is refused in which order.
#include <fmt/format.h>

#include "tests/commands/aes/aes_fixture.h"
#include "tests/commands/sealed_blob.h"

using namespace keymaster;

namespace testing_support {
namespace {

class AesGenerateTest : public CommandTest {
 protected:
  /// A request with these block modes and shortest tags and nothing else that matters.
  static param_list with(const std::vector<std::uint32_t>& modes, const std::vector<std::uint32_t>& tags) {
    param_list params = aes_key(128).remove(KM_TAG_BLOCK_MODE).remove(KM_TAG_MIN_MAC_LENGTH);
    for (const std::uint32_t mode : modes) params.add(KM_TAG_BLOCK_MODE, mode);
    for (const std::uint32_t tag : tags) params.add(KM_TAG_MIN_MAC_LENGTH, tag);
    return params;
  }

  void expect_refused(const failure& expected, const param_list& params) {
    const answer a = expect_failure(expected, [&] { return client().generate(params, 2048); });
    EXPECT_EQ(a.output, bytes(2048, 0));
  }
  void expect_made(const param_list& params) {
    (void)succeeds([&] { return client().generate(params); });
  }
};

TEST_F(AesGenerateTest, AKeyIsItsSizeAndThatManyBitsAndTheRequestIsItsCharacteristics) {
  for (const std::uint32_t bits : {128U, 192U, 256U}) {
    SCOPED_TRACE(bits);
    const param_list asked = aes_key(bits).add_blob(KM_TAG_APPLICATION_ID, from_text("app"));
    param_list stored = asked;
    stored.add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED);
    const hosted_tee::accounting before = tee.accounting();
    const answer a = succeeds([&] { return client().generate(asked); });
    expect_same(before);
    EXPECT_EQ(a.size, blob_overhead + 4 + bits / 8 + stored.marshal().size());
    const bytes plaintext = open_blob(stored_ksk(), a.body()).value();
    const bytes key = first(from(plaintext, 8), bits / 8);
    EXPECT_EQ(plaintext, blob_plaintext(join({u32(bits), key}), stored.marshal()));
    EXPECT_NE(key, bytes(bits / 8));
  }
}

TEST_F(AesGenerateTest, AKeyEncryptsAsLibcryptoDoesWithTheBytesOfItsBlob) {
  for (const std::uint32_t bits : {128U, 192U, 256U}) {
    const bytes blob = client().must_generate(aes_key(bits));
    const bytes key = first(from(open_blob(stored_ksk(), blob).value(), 8), bits / 8);
    const bytes text = pattern(48, bits);
    EXPECT_EQ(run_cipher(client(), KM_PURPOSE_ENCRYPT, blob, cipher(KM_MODE_ECB), {text}).text,
              aes_encrypt({KM_MODE_ECB, KM_PAD_NONE, key, {}}, text));
  }
}

TEST_F(AesGenerateTest, NoTwoKeysAreAlike) {
  const bytes first_key = open_blob(stored_ksk(), client().must_generate(aes_key(256))).value();
  EXPECT_NE(open_blob(stored_ksk(), client().must_generate(aes_key(256))).value(), first_key);
}

TEST_F(AesGenerateTest, AnOriginIsRefusedBeforeAnythingElse) {
  for (const std::uint32_t origin : {KM_ORIGIN_GENERATED, KM_ORIGIN_IMPORTED}) {
    const failure expected = refused(KM_ERROR_INVALID_ARGUMENT, {"Shouldn't specify KM_TAG_ORIGIN"});
    expect_refused(expected, aes_key(128).add(KM_TAG_ORIGIN, origin));
    expect_refused(expected, with({}, {}).remove(KM_TAG_KEY_SIZE).add(KM_TAG_ORIGIN, origin));
    expect_refused(expected, aes_key(5).add(KM_TAG_ORIGIN, origin).add(KM_TAG_ORIGIN, origin));
  }
}

TEST_F(AesGenerateTest, TheSizeMustOccurOnce) {
  const failure expected = refused(KM_ERROR_INVALID_ARGUMENT, {"No or too many KM_TAG_KEY_SIZE or specified"});
  expect_refused(expected, aes_key(128).remove(KM_TAG_KEY_SIZE));
  expect_refused(expected, aes_key(128).add(KM_TAG_KEY_SIZE, 128));
  expect_refused(expected, with({}, {}).remove(KM_TAG_KEY_SIZE));
}

TEST_F(AesGenerateTest, ThereAreThreeSizesAndTheyAreLookedAtBeforeTheTags) {
  for (const std::uint32_t bits : {0U, 1U, 16U, 64U, 127U, 129U, 136U, 191U, 193U, 255U, 257U, 384U, 512U, 0x20000080U,
                                   0x80000080U, 0xFFFFFFFFU}) {
    const failure expected =
        refused(KM_ERROR_UNSUPPORTED_KEY_SIZE, {fmt::format("Invalid AES key size {}", static_cast<int>(bits))});
    expect_refused(expected, aes_key(bits));
    expect_refused(expected, aes_key(bits).remove(KM_TAG_MIN_MAC_LENGTH));
  }
}

TEST_F(AesGenerateTest, AKeyForGcmOrForNoModeAtAllStatesItsShortestTagOnce) {
  const failure missing = refused(KM_ERROR_MISSING_MIN_MAC_LENGTH, {"No or too many KM_TAG_MIN_MAC_LENGTH"});
  for (const std::vector<std::uint32_t>& modes :
       {std::vector<std::uint32_t>{}, {32}, {1, 32}, {32, 1}, {1, 2, 3, 32}, {32, 32}}) {
    SCOPED_TRACE(testing::PrintToString(modes));
    expect_refused(missing, with(modes, {}));
    expect_refused(missing, with(modes, {96, 96}));
    expect_refused(missing, with(modes, {96, 128}));
    expect_made(with(modes, {96}));
  }
}

TEST_F(AesGenerateTest, TheShortestTagIs96To128BitsInWholeBytes) {
  for (const std::vector<std::uint32_t>& modes : {std::vector<std::uint32_t>{}, {32}, {2, 32}}) {
    SCOPED_TRACE(testing::PrintToString(modes));
    for (const std::uint32_t bits : {96U, 104U, 112U, 120U, 128U}) expect_made(with(modes, {bits}));
    for (const std::uint32_t bits : {0U, 8U, 88U, 95U, 97U, 100U, 127U, 129U, 136U, 0x80000060U, 0xFFFFFFFFU}) {
      expect_refused(refused(KM_ERROR_UNSUPPORTED_MIN_MAC_LENGTH,
                             {fmt::format("Invalid KM_TAG_MIN_MAC_LENGTH {}", static_cast<int>(bits))}),
                     with(modes, {bits}));
    }
  }
}

TEST_F(AesGenerateTest, WithoutGcmAmongItsModesAKeyMayStateAnyTagOrNone) {
  for (const std::vector<std::uint32_t>& modes :
       {std::vector<std::uint32_t>{1}, {2}, {3}, {1, 2, 3}, {0}, {31}, {33}, {0xFFFFFFFF}}) {
    SCOPED_TRACE(testing::PrintToString(modes));
    expect_made(with(modes, {}));
    expect_made(with(modes, {5}));
    expect_made(with(modes, {1, 2}));
  }
}

TEST_F(AesGenerateTest, EachPlatformFailureHasItsLineAndItsResult) {
  struct platform_failure {
    const char* call;
    const char* line;
  };
  for (const platform_failure& row :
       {platform_failure{"TEE_AllocateTransientObject", "AllocateTransientObject failed with 0xffff0001\n"},
        {"TEE_GenerateKey", "GenerateKey failed with 0xffff0001\n"},
        {"TEE_GetObjectBufferAttribute", "GetObjectBufferAttribute failed with 0xffff0001\n"}}) {
    tee.world().faults().fail_call(row.call, 1, TEE_ERROR_ACCESS_DENIED);
    expect_refused(broken(TEEC_ERROR_ACCESS_DENIED, {row.line}), aes_key(128));
  }
}

TEST_F(AesGenerateTest, AKeyOfAnotherSizeThanAskedForIsNotHandedOut) {
  for (const std::uint32_t claimed : {0U, 31U, 33U, 0xFFFFFFFFU}) {
    tee.world().faults().override_output("TEE_GetObjectBufferAttribute", 1,
                                         [claimed](std::uint32_t* length, TEE_Result&) { *length = claimed; });
    expect_refused(refused(KM_ERROR_UNKNOWN_ERROR,
                           {fmt::format("Buffer size modified, before 32B, after {}B", static_cast<int>(claimed))}),
                   aes_key(256));
  }
}

}  // namespace
}  // namespace testing_support
