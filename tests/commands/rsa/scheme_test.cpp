// Which combinations of padding and digest begin takes.
#include <fmt/format.h>

#include "tests/commands/command_fixture.h"

using namespace keymaster;

namespace testing_support {
namespace {

constexpr std::uint32_t paddings[] = {KM_PAD_NONE,
                                      KM_PAD_RSA_OAEP,
                                      KM_PAD_RSA_PSS,
                                      KM_PAD_RSA_PKCS1_1_5_ENCRYPT,
                                      KM_PAD_PKCS7,
                                      KM_PAD_RSA_PKCS1_1_5_SIGN,
                                      0,
                                      6,
                                      0xFFFFFFFF};
constexpr std::uint32_t digests[] = {0, 1, 2, 3, 4, 5, 6, 7, 8, 0x80000000, 0xFFFFFFFF};

/// What a combination answers, for a key that lists it and is long enough.
std::int32_t expected_error(std::uint32_t padding, std::uint32_t digest) {
  if (digest > KM_DIGEST_SHA_2_512) return KM_ERROR_UNSUPPORTED_DIGEST;
  switch (padding) {
    case KM_PAD_RSA_PSS:
      return digest <= KM_DIGEST_MD5 ? KM_ERROR_INCOMPATIBLE_DIGEST : KM_ERROR_OK;
    case KM_PAD_RSA_PKCS1_1_5_SIGN:
      return KM_ERROR_OK;
    case KM_PAD_NONE:
      return digest == KM_DIGEST_NONE ? KM_ERROR_OK : KM_ERROR_INCOMPATIBLE_DIGEST;
    default:
      return KM_ERROR_UNSUPPORTED_PADDING_MODE;
  }
}

class SchemeTest : public CommandTest {
 protected:
  /// A key that lists all paddings and digests of the table.
  bytes permissive_key(unsigned bits) {
    param_list params = rsa_key(bits).remove(KM_TAG_PADDING).remove(KM_TAG_DIGEST);
    for (const std::uint32_t padding : paddings) params.add(KM_TAG_PADDING, padding);
    for (const std::uint32_t digest : digests) params.add(KM_TAG_DIGEST, digest);
    return import_fixed(bits, params);
  }

  void expect_refused(std::int32_t error, trace_lines lines, std::uint32_t purpose, const bytes& blob,
                      const param_list& params) {
    expect_failure(refused(error, std::move(lines)), [&] { return client().begin(purpose, blob, params); });
  }
};

TEST_F(SchemeTest, EveryCombinationIsTakenOrRefusedByTheTable) {
  const bytes blob = permissive_key(1024);
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    for (const std::uint32_t padding : paddings) {
      for (const std::uint32_t digest : digests) {
        SCOPED_TRACE(fmt::format("purpose {} padding {} digest {}", purpose, padding, digest));
        const std::int32_t error = expected_error(padding, digest);
        if (error != KM_ERROR_OK) {
          expect_refused(error, {"Create operation failed"}, purpose, blob, signature(digest, padding));
          continue;
        }
        const answer a = succeeds([&] { return client().begin(purpose, blob, signature(digest, padding)); });
        EXPECT_TRUE(client().abort(a.b).ok());
      }
    }
  }
}

TEST_F(SchemeTest, WhatTheKeyDoesntListIsThePolicysToRefuseAndOnlyForSigning) {
  const bytes blob = import_fixed(
      1024, rsa_key(1024).remove(KM_TAG_PADDING).remove(KM_TAG_DIGEST).add(KM_TAG_PADDING, 3).add(KM_TAG_DIGEST, 4));
  expect_refused(KM_ERROR_INCOMPATIBLE_PADDING_MODE, {"No such padding in key_params", "Authorization failed"},
                 KM_PURPOSE_SIGN, blob, signature(4, 5));
  expect_refused(KM_ERROR_INCOMPATIBLE_DIGEST, {"No such digest in key_params", "Authorization failed"},
                 KM_PURPOSE_SIGN, blob, signature(2, 3));
  for (const param_list& params : {signature(4, 5), signature(2, 3)}) {
    EXPECT_TRUE(client().begin(KM_PURPOSE_VERIFY, blob, params).ok());
  }
}

TEST_F(SchemeTest, PaddingAndDigestMustOccurOnceAndThePaddingIsLookedAtFirst) {
  const bytes blob = import_fixed(1024);
  const param_list padding = param_list{}.add(KM_TAG_PADDING, 5), digest = param_list{}.add(KM_TAG_DIGEST, 4);
  const trace_lines no_padding = {"No or too many KM_TAG_PADDING", "Create operation failed"};
  const trace_lines no_digest = {"No or too many KM_TAG_DIGEST", "Create operation failed"};
  for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
    for (const param_list& params : {param_list{}, digest, signature(4, 5).add(KM_TAG_PADDING, 5)}) {
      expect_refused(KM_ERROR_INVALID_ARGUMENT, no_padding, purpose, blob, params);
    }
    for (const param_list& params : {padding, signature(4, 5).add(KM_TAG_DIGEST, 4)}) {
      expect_refused(KM_ERROR_INVALID_ARGUMENT, no_digest, purpose, blob, params);
    }
  }
}

TEST_F(SchemeTest, PssNeedsRoomForDigestFlagAndSalt) {
  struct size_case {
    unsigned bits;
    std::uint32_t digest;
    const char* line;  // empty: it fits
  };
  for (const size_case& each :
       {size_case{512, KM_DIGEST_SHA1, ""},
        {512, KM_DIGEST_SHA_2_256, ""},
        {512, KM_DIGEST_SHA_2_384, "Too short key to fit digest, flag and salt, key_size 512, need 560"},
        {512, KM_DIGEST_SHA_2_512, "Too short key to fit digest, flag and salt, key_size 512, need 688"},
        {680, KM_DIGEST_SHA_2_384, ""},
        {680, KM_DIGEST_SHA_2_512, "Too short key to fit digest, flag and salt, key_size 680, need 688"},
        {688, KM_DIGEST_SHA_2_512, ""},
        {1024, KM_DIGEST_SHA_2_512, ""}}) {
    const bytes blob = import_fixed(each.bits);
    for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
      SCOPED_TRACE(fmt::format("{} bits, digest {}, purpose {}", each.bits, each.digest, purpose));
      const param_list params = signature(each.digest, KM_PAD_RSA_PSS);
      if (*each.line != '\0') {
        expect_refused(KM_ERROR_INCOMPATIBLE_DIGEST, {each.line, "Create operation failed"}, purpose, blob, params);
      } else {
        EXPECT_TRUE(client().begin(purpose, blob, params).ok());
      }
    }
    tee.close_session();  // and with it the operations
    tee.open_session();
  }
}

TEST_F(SchemeTest, Pkcs1HasNoSuchCheckAtBeginAndFailsAtTheEnd) {
  const bytes blob = import_fixed(512);
  const hosted_tee::accounting before = tee.accounting();
  const std::uint32_t handle =
      client().must_begin(KM_PURPOSE_SIGN, blob, signature(KM_DIGEST_SHA_2_512, KM_PAD_RSA_PKCS1_1_5_SIGN));
  (void)expect_lost(
      broken(TEEC_ERROR_BAD_PARAMETERS, {"AsymmetricSignDigest failed with 0xffff0006\n", "Finish failed"}), handle,
      before, [&] { return client().finish(handle); });
}

}  // namespace
}  // namespace testing_support
