// Blobs whose seal is good and whose inside is not: what the TA itself never makes. They are sealed with libcrypto
// under the device's own KSK.
#include "tests/keystore/keystore_fixture.h"

using namespace keymaster;
using namespace testing_support;

namespace {

using Lines = std::vector<std::string>;

class CraftedBlobTest : public BlobTest {
 protected:
  opened open_inside(const bytes& plaintext) {
    return open(seal(0, derived_value(), pattern(64, 1), pattern(12, 2), plaintext));
  }

  void expect_too_short(const bytes& plaintext) {
    expect_not_opened(open_inside(plaintext), TEE_ERROR_GENERIC, untouched, {"Too short input"});
  }
};

TEST_F(CraftedBlobTest, EveryTruncationOfTheInsideIsRefused) {
  const bytes marshalled = param_list{}.add(KM_TAG_KEY_SIZE, 256).marshal();
  const bytes whole = join({prefixed(pattern(8)), prefixed(marshalled)});
  for (std::size_t size = 1; size < whole.size(); ++size) {
    SCOPED_TRACE(size);
    expect_too_short({whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(size)});
  }
  EXPECT_EQ(open_inside(whole).error, KM_ERROR_OK);
}

TEST_F(CraftedBlobTest, AKeyLengthBeyondTheInsideIsTooShort) {
  for (const std::uint32_t length : {5U, 100U, 400'000U}) expect_too_short(join({u32(length), pattern(4)}));
}

TEST_F(CraftedBlobTest, AKeyLengthBeyondTheHeapIsWantOfMemory) {
  // Allocated before it is compared with what there is.
  for (const std::uint32_t length : {600U * 1024, 0x7FFFFFFFU, 0x80000000U, 0xFFFFFFFCU, 0xFFFFFFFFU}) {
    expect_not_opened(open_inside(join({u32(length), pattern(4)})), TEE_SUCCESS, KM_ERROR_MEMORY_ALLOCATION_FAILED,
                      {"Out of memory"});
  }
}

TEST_F(CraftedBlobTest, AParameterLengthBeyondTheInsideIsTooShort) {
  for (const std::uint32_t length : {5U, 100U, 600U * 1024, 0x80000000U, 0xFFFFFFFCU, 0xFFFFFFFFU}) {
    expect_too_short(join({prefixed(pattern(8)), u32(length), u32(0)}));
  }
}

TEST_F(CraftedBlobTest, ParametersThatDoNotUnmarshalAreAnInvalidArgument) {
  struct row {
    bytes marshalled;
    Lines lines;
  };
  const bytes blob_record = join({u32(1), u32(KM_TAG_NONCE), u32(0), u64(0)});
  for (const row& r :
       {row{{}, {"Too short input", "Unmarshal failed"}}, row{bytes(3, 0), {"Too short input", "Unmarshal failed"}},
        row{u32(1), {"Too short input", "Unmarshal failed"}},
        row{u32(0x0AAAAAAB), {"Out of memory", "Unmarshal failed"}},
        row{join({blob_record, u64(5), pattern(4)}), {"Too short input", "Unmarshal failed"}},
        row{join({blob_record, u64(0xFFFFFFFF)}), {"Out of memory, require -1B", "Unmarshal failed"}}}) {
    expect_not_opened(open_inside(join({prefixed(pattern(8)), prefixed(r.marshalled)})), TEE_SUCCESS,
                      KM_ERROR_INVALID_ARGUMENT, r.lines);
  }
}

TEST_F(CraftedBlobTest, BytesBehindTheParametersAreIgnored) {
  const param_list list = param_list{}.add(KM_TAG_KEY_SIZE, 256);
  for (const bytes& inside : {join({prefixed(pattern(8)), prefixed(list.marshal()), pattern(77)}),
                              join({prefixed(pattern(8)), prefixed(join({list.marshal(), pattern(5)}))})}) {
    const opened answer = open_inside(inside);
    EXPECT_EQ(answer.result, TEE_SUCCESS);
    EXPECT_EQ(answer.error, KM_ERROR_OK);
    EXPECT_EQ(answer.key_data, pattern(8));
    EXPECT_EQ(answer.characteristics.marshal(), list.marshal());
  }
}

TEST_F(CraftedBlobTest, KeyDataThatWasCopiedIsWipedWhenTheRestIsBad) {
  const bytes secret = pattern(40, 3);
  std::size_t leaks = 0;
  ta().on_free([&](std::span<const std::uint8_t> block) { leaks += contains(block, secret); });
  expect_too_short(join({prefixed(secret), u32(9)}));
  expect_not_opened(open_inside(join({prefixed(secret), prefixed({})})), TEE_SUCCESS, KM_ERROR_INVALID_ARGUMENT,
                    {"Too short input", "Unmarshal failed"});
  ta().on_free({});
  EXPECT_EQ(leaks, 0U);
}

}  // namespace
