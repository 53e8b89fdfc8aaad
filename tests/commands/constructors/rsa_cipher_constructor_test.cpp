// The constructors and entries of RSA encryption and decryption themselves: what remains of a record after a refused
// update, what they hold when memory runs out, and how a record is freed.
#include <fmt/format.h>

#include "algorithms/rsa/rsa_cipher.h"
#include "tests/support/encryption.h"
#include "tests/support/rsa_test_key.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using testing::ElementsAre;
using testing::IsEmpty;

namespace testing_support {
namespace {

struct direction {
  const char* name;
  keymaster_operation_t* (*create)(const operation_request&, TEE_Result*, keymaster_error_t*);
  operation_free free;
};
constexpr direction directions[] = {{"encrypt", create_rsa_encrypt, rsa_encrypt_free},
                                    {"decrypt", create_rsa_decrypt, rsa_decrypt_free}};

class RsaCipherConstructorTest : public TaUnitTest {
 protected:
  const rsa_test_key& key = rsa_test_key::of_bits(1024);
  const bytes key_data = join({u32(1024), key.material()});

  TEE_Result result = TEE_SUCCESS;
  keymaster_error_t error = KM_ERROR_OK;

  keymaster_operation_t* create(const direction& way, const param_list& list) {
    const parameter_set params = in_ta(list), none;
    parameter_set told;
    result = TEE_SUCCESS;
    error = KM_ERROR_OK;
    ta.clear_trace();
    keymaster_operation_t* const op = way.create({key_data, none, params, told}, &result, &error);
    EXPECT_EQ(told.length, 0U);
    return op;
  }
  /// update answers how much was consumed; the output stays empty whatever happens.
  std::uint32_t update(keymaster_operation_t* op, const bytes& input) {
    auto consumed = static_cast<std::uint32_t>(input.size());
    std::uint32_t length = 100;
    bytes output(length);
    const parameter_set none;
    error = KM_ERROR_OK;
    EXPECT_EQ(op->update(op, none, input, &consumed, output.data(), &length, &error), TEE_SUCCESS);
    EXPECT_EQ(length, 0U);
    EXPECT_EQ(output, bytes(100));
    return consumed;
  }
  bytes finish(keymaster_operation_t* op) {
    const parameter_set none;
    parameter_set told;
    secret_bytes output;
    error = KM_ERROR_OK;
    result = op->finish(op, none, {}, output, told, &error);
    return {output.span().begin(), output.span().end()};
  }
};

TEST_F(RsaCipherConstructorTest, ARefusedUpdateConsumesNothingAndTheEarlierInputStaysGathered) {
  for (const direction& way : directions) {
    keymaster_operation_t* const op = create(way, signature(KM_DIGEST_NONE, KM_PAD_NONE));
    ASSERT_NE(op, nullptr);
    const bytes message = join({{0}, pattern(127)});
    EXPECT_EQ(update(op, {message.begin(), message.begin() + 100}), 100U);
    EXPECT_EQ(update(op, pattern(29)), 0U);
    EXPECT_EQ(error, KM_ERROR_INVALID_INPUT_LENGTH);
    EXPECT_THAT(ta.errors(), ElementsAre(fmt::format("Input too long to {}, key_size 1024, input 129B", way.name)));
    EXPECT_EQ(update(op, {message.begin() + 100, message.end()}), 28U);
    EXPECT_EQ(error, KM_ERROR_OK);
    EXPECT_EQ(finish(op),
              way.create == create_rsa_encrypt ? key.public_operation(message) : key.private_operation(message));
    op->free(op);
  }
}

TEST_F(RsaCipherConstructorTest, EveryAllocationThatFailsIsWantOfMemoryAndLeavesNothingBehind) {
  for (const direction& way : directions) {
    for (std::uint32_t n = 1; n <= 2; ++n) {
      SCOPED_TRACE(fmt::format("{}, allocation {}", way.name, n));
      const parameter_set params = in_ta(signature(KM_DIGEST_NONE, KM_PAD_NONE)), none;
      parameter_set told;
      const hosted_tee::accounting before = ta.holdings();
      result = TEE_SUCCESS;
      error = KM_ERROR_OK;
      ta.clear_trace();
      ta.faults().clear();
      ta.faults().fail_allocation(n);
      EXPECT_EQ(way.create({key_data, none, params, told}, &result, &error), nullptr);
      EXPECT_TRUE(ta.faults().triggered());
      EXPECT_EQ(result, TEE_SUCCESS);
      EXPECT_EQ(error, n == 1 ? KM_ERROR_OK : KM_ERROR_MEMORY_ALLOCATION_FAILED);
      EXPECT_THAT(ta.errors(), ElementsAre("Out of memory"));
      expect_same(ta.holdings(), before);
    }
    ta.faults().clear();
    keymaster_operation_t* const op = create(way, signature(KM_DIGEST_NONE, KM_PAD_NONE));
    ASSERT_NE(op, nullptr);
    EXPECT_EQ(update(op, {1}), 1U);
    ta.faults().fail_allocation(1);
    EXPECT_TRUE(finish(op).empty());
    EXPECT_EQ(result, TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_MEMORY_ALLOCATION_FAILED);
    EXPECT_THAT(ta.errors(), ElementsAre("Out of memory"));
    op->free(op);
  }
}

TEST_F(RsaCipherConstructorTest, ADigestThatOaepHasNotIsFoundAtTheEndToo) {
  // begin refuses such a digest; a record that holds one all the same must not encrypt with it.
  for (const std::uint32_t digest : {0U, 1U, 7U, 0xFFFFFFFFU}) {
    keymaster_operation_t* const op = create(directions[0], signature(KM_DIGEST_SHA1, KM_PAD_RSA_OAEP));
    ASSERT_NE(op, nullptr);
    static_cast<rsa_encrypt_operation_t&>(*op).digest = digest;
    EXPECT_TRUE(finish(op).empty());
    EXPECT_EQ(result, TEE_SUCCESS);
    EXPECT_EQ(error, KM_ERROR_INCOMPATIBLE_DIGEST);
    EXPECT_THAT(ta.errors(), ElementsAre(fmt::format("Unknown digest {}", static_cast<std::int32_t>(digest))));
    op->free(op);
  }
}

TEST_F(RsaCipherConstructorTest, FreeingNothingIsTraced) {
  for (const direction& way : directions) {
    ta.clear_trace();
    way.free(nullptr);
    EXPECT_THAT(ta.errors(), ElementsAre(fmt::format("Try to free NULL rsa_{}_operation_t", way.name)));
  }
}

TEST_F(RsaCipherConstructorTest, FreeingARecordTracesEachOfItsPartsThatIsMissingAndFreesTheRest) {
  const std::string encrypt_line = "Try to free invalid rsa_encrypt_operation_t",
                    decrypt_line = "Try to free invalid rsa_decrypt_operation_t";
  rsa_encrypt_free(new_record<rsa_encrypt_operation_t>());
  EXPECT_THAT(ta.errors(), ElementsAre(encrypt_line, encrypt_line, encrypt_line));
  ta.clear_trace();
  rsa_decrypt_free(new_record<rsa_decrypt_operation_t>());
  EXPECT_THAT(ta.errors(), ElementsAre(decrypt_line, decrypt_line, decrypt_line));
  ta.clear_trace();
  auto* const partial = new_record<rsa_decrypt_operation_t>();
  ASSERT_TRUE(partial->buffer.allocate(128));
  ASSERT_EQ(partial->key.allocate(TEE_TYPE_RSA_KEYPAIR, 1024), TEE_SUCCESS);
  rsa_decrypt_free(partial);
  EXPECT_THAT(ta.errors(), ElementsAre(decrypt_line));
  // The digest operation that these records never have is not missed.
  keymaster_operation_t* const whole = create(directions[0], signature(KM_DIGEST_NONE, KM_PAD_NONE));
  ASSERT_NE(whole, nullptr);
  whole->free(whole);
  EXPECT_THAT(ta.errors(), IsEmpty());
}

}  // namespace
}  // namespace testing_support
