// A request that changes while its command runs, at a moment of the test's choosing: what was decided on is what was
// copied, and the shared memory is not read again.
#include <algorithm>

#include "tests/commands/command_fixture.h"
#include "tests/commands/raw_session.h"

using namespace keymaster;

namespace testing_support {
namespace {

class ChangingRequestTest : public CommandTest {
 protected:
  /// during runs `change` inside the command that comes next, right after the n-th call (1 = the next) of a platform
  /// function.
  template <class Change>
  void during(const char* call, std::uint32_t n, Change change) {
    tee.world().faults().override_output(call, n, [change](std::uint32_t*, TEE_Result&) { change(); });
  }

  raw_answer call(std::uint32_t command, std::uint32_t a, bytes& request) {
    const raw_answer got = session.call(command, a, memref(request), memref(response));
    EXPECT_EQ(tee.world().faults().triggered(), expects_change);
    tee.world().faults().clear();
    return got;
  }
  static void expect_ok(const raw_answer& got) {
    EXPECT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.error, KM_ERROR_OK);
  }

  raw_session session{tee.world()};
  bytes response = bytes(4096);
  bool expects_change = true;
};

constexpr std::size_t blob_at = 4;          // in a request, behind its length
constexpr std::size_t ciphertext_at = 200;  // in a blob
constexpr std::size_t nonce_at = 5;         // in a blob
constexpr std::size_t blob_front = 77;      // protection, nonce and IV of a blob

TEST_F(ChangingRequestTest, ABlobIsOpenedAsItWasWhenItCameIn) {
  const bytes blob = import_fixed(512);
  for (const char* const moment : {"TEE_MACComputeFinal", "TEE_AEInit"}) {
    SCOPED_TRACE(moment);
    bytes begin = join({prefixed(blob), prefixed(signature(KM_DIGEST_NONE, KM_PAD_NONE).marshal())});
    during(moment, 1, [&] { begin.at(blob_at + ciphertext_at) ^= 1; });
    const raw_answer begun = call(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, begin);
    expect_ok(begun);
    EXPECT_TRUE(client().abort(begun.b).ok());
    for (const std::uint32_t command : {KM_COMMAND_GET_KEY_CHARACTER, KM_COMMAND_EXPORT_KEY}) {
      bytes request = key_body(blob, {}, {});
      during(moment, 1, [&] { request.at(blob_at + ciphertext_at) ^= 1; });
      expect_ok(call(command, 0, request));
    }
  }
}

TEST_F(ChangingRequestTest, ALimitedKeyIsCountedByTheBlobThatWasOpened) {
  const bytes once = import_fixed(512, rsa_key(512).add(KM_TAG_MAX_USES_PER_BOOT, 1));
  bytes request = join({prefixed(once), prefixed(signature(KM_DIGEST_NONE, KM_PAD_NONE).marshal())});
  during("TEE_AEDecryptFinal", 1, [&] { request.at(blob_at + nonce_at) ^= 1; });
  const raw_answer begun = call(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, request);
  expect_ok(begun);
  EXPECT_TRUE(client().abort(begun.b).ok());

  request.at(blob_at + nonce_at) ^= 1;
  tee.clear_trace();
  expects_change = false;
  EXPECT_EQ(call(KM_COMMAND_BEGIN, KM_PURPOSE_SIGN, request).error, KM_ERROR_KEY_MAX_OPS_EXCEEDED);
  EXPECT_EQ(lines(), (trace_lines{"Key max ops exceeded", "Authorization failed"}));
}

TEST_F(ChangingRequestTest, AnApplicationIsJudgedByTheIdThatCameIn) {
  const bytes id = pattern(20);
  const bytes blob = import_fixed(512, rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, id));
  bytes right = key_body(blob, id, {}), wrong = key_body(blob, flip(id, 3), {});
  const std::size_t changed = blob_at + blob.size() + 4 + 3;
  for (const std::uint32_t command : {KM_COMMAND_GET_KEY_CHARACTER, KM_COMMAND_EXPORT_KEY}) {
    during("TEE_AEDecryptFinal", 1, [&] { right.at(changed) ^= 1; });
    expect_ok(call(command, 0, right));
    right.at(changed) ^= 1;
    during("TEE_AEDecryptFinal", 1, [&] { wrong.at(changed) ^= 1; });
    EXPECT_EQ(call(command, 0, wrong).error, KM_ERROR_INVALID_KEY_BLOB);
    wrong.at(changed) ^= 1;
  }
}

TEST_F(ChangingRequestTest, ASignatureIsVerifiedAsItWasWhenItCameIn) {
  const bytes blob = import_fixed(1024), message = from_text("message");
  const param_list scheme = signature(KM_DIGEST_SHA_2_256, KM_PAD_RSA_PKCS1_1_5_SIGN);
  const bytes right = client().sign(blob, scheme, message).data;
  struct row {
    bytes sent;
    std::int32_t error;
  };
  for (const row& each : {row{right, KM_ERROR_OK}, {flip(right, 40), KM_ERROR_VERIFICATION_FAILED}}) {
    const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, blob, scheme);
    ASSERT_TRUE(client().update(handle, message).ok());
    bytes request = join({prefixed(each.sent), prefixed(u32(0))});
    during("TEE_DigestDoFinal", 1, [&] { request.at(4 + 40) ^= 1; });
    const raw_answer got = call(KM_COMMAND_FINISH, handle, request);
    EXPECT_EQ(got.result, TEE_SUCCESS);
    EXPECT_EQ(got.error, each.error);
  }
}

TEST_F(ChangingRequestTest, KeyMaterialIsStoredAsItWasWhenItCameIn) {
  const rsa_test_key& key = rsa_test_key::of_bits(512);
  const bytes params = rsa_key(512).marshal();
  bytes request = join({prefixed(params), key.material()});
  during("TEE_AEInit", 1, [&] { std::fill(request.begin() + 4, request.end(), std::uint8_t{0xFF}); });
  expect_ok(call(KM_COMMAND_IMPORT_KEY, 0, request));
  const bytes blob(response.begin() + 4, response.begin() + 4 + u32_at(response, 0));
  EXPECT_EQ(client().export_key(blob).body(), key.spki());
}

// What is sealed with must come from the TA: a client that could choose nonce and IV would get two keys sealed alike.
TEST_F(ChangingRequestTest, ABlobIsSealedOutOfTheClientsReach) {
  const bytes params = rsa_key(512).marshal(), old = import_fixed(512);
  for (const char* const moment :
       {"TEE_AllocateOperation", "TEE_MACComputeFinal", "TEE_AEInit", "TEE_AEUpdate", "TEE_AEEncryptFinal"}) {
    SCOPED_TRACE(moment);
    bytes request = join({prefixed(params), rsa_test_key::of_bits(512).material()});
    during(moment, 1, [&] { std::copy(old.begin(), old.end(), response.begin() + 4); });
    expect_ok(call(KM_COMMAND_IMPORT_KEY, 0, request));
    const bytes blob(response.begin() + 4, response.begin() + 4 + u32_at(response, 0));
    EXPECT_NE(bytes(blob.begin(), blob.begin() + blob_front), bytes(old.begin(), old.begin() + blob_front));
    EXPECT_EQ(client().export_key(blob).body(), rsa_test_key::of_bits(512).spki());
  }
}

}  // namespace
}  // namespace testing_support
