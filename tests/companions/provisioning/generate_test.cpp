// The attestation key that is made on the device and whose private half no factory sees.
#include "tests/companions/provisioning/provisioning_fixture.h"
#include "tests/companions/provisioning/reference_box.h"

using namespace keymaster;
using namespace keymaster::provisioning;

namespace testing_support {
namespace {

using ::testing::ElementsAre;

class GenerateTest : public ProvisioningTest {
 protected:
  /// expect_no_key asks for a key that is refused, and expects that neither the old key nor the buffer is touched.
  quil_answer expect_no_key(TEE_Result expected, const std::string& line, std::uint32_t bits, std::size_t capacity) {
    const bytes old_key = attestation_key_box(rsa_test_key::of_bits(1024).components());
    EXPECT_EQ(put_key(old_key), TEE_SUCCESS);
    quil_answer answer;
    expect_refused(expected, {line}, [&] { return (answer = generate(bits, capacity)).result; });
    EXPECT_EQ(answer.buffer, bytes(capacity, canary));
    EXPECT_EQ(stored("quil.key"), old_key);
    return answer;
  }
};

TEST_F(GenerateTest, AKeyPairIsStoredWholeAndItsPublicHalfIsAnswered) {
  const hosted_tee::accounting before = holdings();
  const quil_answer answer = generate(2048, 400);
  ASSERT_EQ(answer.result, TEE_SUCCESS);
  expect_same_holdings(before);
  const bytes box = get_key().data();
  const rsa_components key = components_of(box);
  EXPECT_TRUE(is_key_pair(key));
  EXPECT_EQ(key[rsa_n].size(), 256U);
  EXPECT_GE(key[rsa_n][0], 0x80);
  EXPECT_EQ(key[rsa_e], (bytes{1, 0, 1}));
  EXPECT_EQ(answer.data(), spki_of(key));
  EXPECT_EQ(answer.buffer, join({spki_of(key), bytes(400 - 294, canary)}));
}

TEST_F(GenerateTest, TheBoxHasItsEntriesInTheReverseOrderOfThePuts) {
  ASSERT_EQ(generate().result, TEE_SUCCESS);
  std::vector<std::uint16_t> tags;
  for (const auto& [tag, value] : box_entries(get_key().data())) tags.push_back(tag);
  EXPECT_THAT(tags, ElementsAre(24, 23, 22, 21, 20, 19, 18, 17));
}

TEST_F(GenerateTest, EachKeyIsANewOneAndReplacesTheOneBefore) {
  const quil_answer first = generate();
  const bytes first_box = get_key().data();
  const quil_answer second = generate();
  ASSERT_EQ(second.result, TEE_SUCCESS);
  EXPECT_NE(first.data(), second.data());
  EXPECT_NE(get_key().data(), first_box);
  EXPECT_EQ(spki_of(components_of(get_key().data())), second.data());
}

TEST_F(GenerateTest, AKeyOutlivesAReboot) {
  const quil_answer answer = generate();
  restart();
  EXPECT_EQ(spki_of(components_of(get_key().data())), answer.data());
}

TEST_F(GenerateTest, OtherSizesAreNotSupported) {
  for (const std::uint32_t bits : {0U, 1024U, 2047U, 2049U, 3072U, 4096U, 0x80000800U}) {
    expect_no_key(TEE_ERROR_NOT_SUPPORTED, "No attestation key has " + std::to_string(bits) + " bits\n", bits, 400);
  }
}

TEST_F(GenerateTest, WithoutRoomForThePublicKeyNoKeyIsMade) {
  for (const std::size_t capacity : {std::size_t{0}, std::size_t{1}, std::size_t{293}}) {
    faults().clear();
    const quil_answer answer = expect_no_key(TEE_ERROR_SHORT_BUFFER, "The answer needs 294 bytes\n", 2048, capacity);
    EXPECT_EQ(answer.size, 294U);
    EXPECT_EQ(faults().call_count("TEE_GenerateKey"), 0U);
  }
}

TEST_F(GenerateTest, AComponentOfAnImpossibleLengthMakesNoKey) {
  for (std::uint32_t n = 1; n <= 8; ++n) {
    SCOPED_TRACE(n);
    faults().clear();
    faults().override_output("TEE_GetObjectBufferAttribute", n,
                             [](std::uint32_t* length, TEE_Result&) { *length = 257; });
    expect_no_key(TEE_ERROR_GENERIC, "Make the box of the key failed with 0xffff0000\n", 2048, 400);
    EXPECT_TRUE(faults().triggered());
  }
}

TEST_F(GenerateTest, APublicKeyOfAnImpossibleLengthMakesNoKey) {
  for (const std::uint32_t lie : {0U, 293U, 295U, 0xFFFFFFFFU}) {
    SCOPED_TRACE(lie);
    faults().clear();
    faults().override_output("TEE_AsymmetricExport", 1, [lie](std::uint32_t* length, TEE_Result&) { *length = lie; });
    expect_no_key(TEE_ERROR_GENERIC, "AsymmetricExport failed with 0xffff0000\n", 2048, 400);
    EXPECT_TRUE(faults().triggered());
  }
}

}  // namespace
}  // namespace testing_support
