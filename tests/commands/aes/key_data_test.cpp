// Key data that a blob holds, when an operation makes its key from it. The blobs are sealed here, since the TA seals no
// such ones.
#include <fmt/format.h>

#include "tests/commands/aes/aes_fixture.h"
#include "tests/commands/sealed_blob.h"

using namespace keymaster;

namespace testing_support {
namespace {

class AesKeyDataTest : public AesTest {
 protected:
  bytes sealed(const bytes& key_data) {
    const bytes characteristics = aes_key(128).add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED).marshal();
    return seal_blob(stored_ksk(), sealed_by_rpmb_ksk, blob_plaintext(key_data, characteristics));
  }
  void expect_unusable(TEEC_Result result, const char* line, const bytes& key_data) {
    SCOPED_TRACE(to_hex(key_data));
    const bytes blob_of_it = sealed(key_data);
    for (const std::uint32_t purpose : both_cipher_purposes) {
      for (const param_list& params : {asking(KM_MODE_ECB), asking(KM_MODE_GCM), param_list{}}) {
        const answer a = expect_failure(broken(result, {line, "Resolve key data failed", "Create operation failed"}),
                                        [&] { return client().begin(purpose, blob_of_it, params); });
        EXPECT_EQ(a.b, 0U);
      }
    }
  }
};

TEST_F(AesKeyDataTest, DataThatEndTooSoonAreRefused) {
  for (const std::size_t size : {0U, 1U, 3U}) expect_unusable(TEEC_ERROR_GENERIC, "Too short input", bytes(size));
  expect_unusable(TEEC_ERROR_GENERIC, "Too short input", u32(128));
  expect_unusable(TEEC_ERROR_GENERIC, "Too short input", join({u32(128), pattern(15)}));
  expect_unusable(TEEC_ERROR_GENERIC, "Too short input", join({u32(256), pattern(16)}));
  expect_unusable(TEEC_ERROR_GENERIC, "Too short input", join({u32(0x80000080), pattern(16)}));
  expect_unusable(TEEC_ERROR_GENERIC, "Too short input", join({u32(0xFFFFFFFF), pattern(400)}));
}

TEST_F(AesKeyDataTest, ASizeThatIsNoneOfAesIsThePlatformsToRefuse) {
  for (const std::uint32_t bits : {0U, 7U, 8U, 64U, 127U, 129U, 136U, 160U, 255U}) {
    expect_unusable(TEEC_ERROR_NOT_SUPPORTED, "AllocateTransientObject failed with 0xffff000a\n",
                    join({u32(bits), pattern(40)}));
  }
}

TEST_F(AesKeyDataTest, BytesBehindTheKeyAreIgnored) {
  const bytes with_more = sealed(join({u32(128), key, pattern(100)})), text = pattern(32);
  EXPECT_EQ(run_cipher(client(), KM_PURPOSE_ENCRYPT, with_more, asking(KM_MODE_CBC), {text}).text,
            expected(KM_MODE_CBC, KM_PAD_NONE, text));
}

}  // namespace
}  // namespace testing_support
