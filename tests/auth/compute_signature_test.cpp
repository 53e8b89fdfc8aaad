// What ComputeSignature leaves in its output, and what it says of it.
#include <fmt/format.h>

#include "platform/handles.h"
#include "tests/auth/auth_fixture.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

class ComputeSignatureTest : public TaUnitTest {
 protected:
  void SetUp() override {
    ASSERT_EQ(key.allocate(TEE_TYPE_HMAC_SHA256, 256), TEE_SUCCESS);
    TEE_Attribute attribute;
    TEE_InitRefAttribute(&attribute, TEE_ATTR_SECRET_VALUE, secret.data(), static_cast<std::uint32_t>(secret.size()));
    ASSERT_EQ(TEE_PopulateTransientObject(key.get(), &attribute, 1), TEE_SUCCESS);
  }
  void TearDown() override {
    key.reset();
    TaUnitTest::TearDown();
  }

  bytes sign(std::uint32_t size, const bytes& message) {
    bytes signature(size, 0xEE);
    ta.clear_trace();
    whole =
        ComputeSignature(signature.data(), size, key.get(), message.data(), static_cast<std::uint32_t>(message.size()));
    return signature;
  }

  const bytes secret = pattern(32, 3);
  object_handle key;
  bool whole = false;  // what it said of the last signature
};

TEST_F(ComputeSignatureTest, TheSignatureIsHmacSha256) {
  for (const std::size_t size : {0U, 1U, 37U, 64U, 1000U}) {
    const bytes message = pattern(size);
    EXPECT_EQ(sign(32, message), hmac_sha256(secret, message)) << size;
    EXPECT_TRUE(whole);
    EXPECT_THAT(ta.errors(), IsEmpty());
  }
}

TEST_F(ComputeSignatureTest, AnotherSizeIsToldAndServedAllTheSame) {
  const bytes message = pattern(37), mac = hmac_sha256(secret, message);
  for (const std::uint32_t size : {0U, 1U, 16U, 31U, 33U, 64U, 300U}) {
    bytes expected = mac;
    expected.resize(size);  // shorter: the first bytes; longer: zeros behind the MAC
    EXPECT_EQ(sign(size, message), expected) << size;
    EXPECT_FALSE(whole);
    EXPECT_THAT(ta.errors(), ElementsAre(fmt::format("Wrong signature size, expected 32B, got {}B\n", size)));
  }
}

TEST_F(ComputeSignatureTest, AFailureClearsTheWholeOutputAndGivesTheOperationBack) {
  struct row {
    const char* call;
    const char* line;
  };
  for (const row& r : {row{"TEE_AllocateOperation", "AllocateOperation failed with 0xffff000d\n"},
                       {"TEE_SetOperationKey", "SetOperationKey failed with 0xffff000d\n"},
                       {"TEE_MACComputeFinal", "MACComputeFinal failed with 0xffff000d\n"}}) {
    const auto before = ta.holdings();
    ta.faults().fail_call(r.call, 1, TEE_ERROR_BUSY);
    EXPECT_EQ(sign(32, pattern(37)), bytes(32, 0)) << r.call;
    EXPECT_FALSE(whole);
    EXPECT_THAT(ta.errors(), ElementsAre(r.line));
    ta.faults().fail_call(r.call, 1, TEE_ERROR_BUSY);
    EXPECT_EQ(sign(40, pattern(37)), bytes(40, 0)) << r.call;
    EXPECT_THAT(ta.errors(), ElementsAre("Wrong signature size, expected 32B, got 40B\n", r.line));
    expect_same(ta.holdings(), before);
  }
}

TEST_F(ComputeSignatureTest, AMacOfAnotherLengthIsToldAndCopiedAsFarAsItGoes) {
  const bytes message = pattern(37), mac = hmac_sha256(secret, message);
  ta.faults().override_output("TEE_MACComputeFinal", 1, [](std::uint32_t* length, TEE_Result&) { *length = 20; });
  EXPECT_EQ(sign(32, message), join({bytes(mac.begin(), mac.begin() + 20), bytes(12, 0xEE)}));
  EXPECT_FALSE(whole);
  EXPECT_THAT(ta.errors(), ElementsAre("Wrong MAC length, expected 32B, got 20B\n"));

  ta.faults().override_output("TEE_MACComputeFinal", 1, [](std::uint32_t* length, TEE_Result&) { *length = 64; });
  EXPECT_EQ(sign(32, message), mac);
  EXPECT_FALSE(whole);
  EXPECT_THAT(ta.errors(), ElementsAre("Wrong MAC length, expected 32B, got 64B\n"));
}

TEST_F(ComputeSignatureTest, ALengthBeyondThePlatformsBufferIsNotBelieved) {
  ta.faults().override_output("TEE_MACComputeFinal", 1, [](std::uint32_t* length, TEE_Result&) { *length = 100000; });
  const bytes signature = sign(300, pattern(37));
  EXPECT_EQ(bytes(signature.begin() + 256, signature.end()), bytes(44, 0));
  EXPECT_THAT(ta.errors(), ElementsAre("Wrong signature size, expected 32B, got 300B\n",
                                       "Wrong MAC length, expected 32B, got 100000B\n"));
}

}  // namespace
