// Records of RSA operations that were never completed: what freeing them says, and that nothing stays.
#include "algorithms/rsa/rsa_sign.h"
#include "algorithms/rsa/rsa_verify.h"
#include "tests/support/ta_scope.h"

using namespace keymaster;
using namespace testing_support;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

namespace {

enum member : unsigned { key = 1, operation = 2, buffer = 4, whole = 7 };

/// One kind of record: its maker, its free entry, and what that says.
struct kind {
  rsa_operation_t* (*make)();
  operation_free free;
  const char* null_line;
  const char* invalid_line;
};

template <class Record>
rsa_operation_t* make() {
  return new_record<Record>();
}

class RsaFreeTest : public TaUnitTest {
 protected:
  const kind kinds[2] = {{make<rsa_sign_operation_t>, rsa_sign_free, "Try to free NULL rsa_sign_operation_t",
                          "Try to free invalid rsa_sign_operation_t"},
                         {make<rsa_verify_operation_t>, rsa_verify_free, "Try to free NULL rsa_verify_operation_t",
                          "Try to free invalid rsa_verify_operation_t"}};

  /// give lets a record have these members.
  static void give(rsa_operation_t& op, unsigned members) {
    if ((members & key) != 0) {
      ASSERT_EQ(op.key.allocate(TEE_TYPE_RSA_KEYPAIR, 512), TEE_SUCCESS);
    }
    if ((members & operation) != 0) {
      ASSERT_EQ(op.operation.allocate(TEE_ALG_RSA_NOPAD, TEE_MODE_DECRYPT, 512), TEE_SUCCESS);
    }
    if ((members & buffer) != 0) {
      ASSERT_TRUE(op.buffer.allocate(64));
    }
  }

  /// expect_freed frees a record and expects `lines` lines of its kind, and everything given back.
  void expect_freed(const kind& of, rsa_operation_t* op, std::size_t lines) {
    ta.clear_trace();
    of.free(op);
    EXPECT_EQ(ta.errors(), std::vector<std::string>(lines, of.invalid_line));
    expect_same(ta.holdings(), {});
  }
};

TEST_F(RsaFreeTest, NoRecordAtAllIsTraced) {
  for (const kind& of : kinds) {
    ta.clear_trace();
    of.free(nullptr);
    EXPECT_THAT(ta.errors(), ElementsAre(of.null_line));
  }
}

TEST_F(RsaFreeTest, EachMissingMemberIsTracedOnce) {
  for (const kind& of : kinds) {
    expect_freed(of, of.make(), 3);
    for (const unsigned missing : {key, operation, buffer}) {
      SCOPED_TRACE(missing);
      rsa_operation_t* const without = of.make();
      give(*without, whole & ~missing);
      expect_freed(of, without, 1);
      rsa_operation_t* const alone = of.make();
      give(*alone, missing);
      expect_freed(of, alone, 2);
    }
  }
}

TEST_F(RsaFreeTest, AWholeRecordIsFreedWithoutAWordWhateverElseItHolds) {
  for (const kind& of : kinds) {
    rsa_operation_t* const plain = of.make();
    give(*plain, whole);
    expect_freed(of, plain, 0);

    rsa_operation_t* const with_digest = of.make();
    give(*with_digest, whole);
    ASSERT_EQ(with_digest->digest_operation.allocate(TEE_ALG_SHA256, TEE_MODE_DIGEST, 0), TEE_SUCCESS);
    expect_freed(of, with_digest, 0);
  }
}

TEST_F(RsaFreeTest, TheSoterMessageGoesWithTheRecordAndIsWiped) {
  auto* const op = new_record<rsa_sign_operation_t>();
  give(*op, whole);
  const bytes message = pattern(100);
  ASSERT_TRUE(op->soter_buffer.copy_of(message));
  bool left = false;
  ta.on_free(
      [&](std::span<const std::uint8_t> block) { left = left || contains(block, std::span(message).first(16)); });
  expect_freed(kinds[0], op, 0);
  EXPECT_FALSE(left);
}

}  // namespace
