// Want of memory in begin, update and finish: which of the two levels of error tells it, and what the trace says.
#include "tests/commands/want_of_memory.h"

using namespace keymaster;

namespace testing_support {
namespace {

struct signature_scheme {
  const char* name;
  std::uint32_t digest, padding;
};
constexpr signature_scheme schemes[] = {{"with a digest", KM_DIGEST_SHA_2_256, KM_PAD_RSA_PSS},
                                        {"raw", KM_DIGEST_NONE, KM_PAD_RSA_PKCS1_1_5_SIGN}};

class OperationMemoryTest : public WantOfMemoryTest {
 protected:
  const bytes blob = import_fixed(1024, rsa_key(1024).add_blob(KM_TAG_APPLICATION_ID, app_id));
  const bytes message = from_text("the message");
  const hosted_tee::accounting idle = tee.accounting();

  param_list scheme_of(const signature_scheme& scheme) const {
    return signature(scheme.digest, scheme.padding).add_blob(KM_TAG_APPLICATION_ID, app_id);
  }

  /// The parameters of update and finish: an array, and a blob of 20 bytes that means nothing to RSA.
  const param_list in_params = param_list{}.add_blob(KM_TAG_NONCE, app_id);
  const allocations step_parameters = {
      {"array of the parameters", refused(KM_ERROR_INVALID_ARGUMENT, {no_memory, "Unmarshal failed"})},
      {"blob in the parameters", refused(KM_ERROR_INVALID_ARGUMENT, {no_memory_for_the_id, "Unmarshal failed"})}};
  static constexpr const char* no_memory_for_no_parameters = "Out of memory, need 4B";

  /// expect_steps_lost runs `step` on a fresh operation for each row; the operation is gone each time. `b` is what slot
  /// 0 then says.
  template <class Begin, class Step>
  void expect_steps_lost(const allocations& rows, std::uint32_t b, Begin&& begin, Step&& step) {
    for (std::uint32_t n = 1; n <= rows.size(); ++n) {
      SCOPED_TRACE(rows[n - 1].purpose);
      const std::uint32_t handle = begin();
      faults().clear();
      faults().fail_allocation(n);
      const answer got = expect_lost(rows[n - 1].expected, handle, idle, [&] { return step(handle); });
      EXPECT_TRUE(faults().triggered());
      EXPECT_EQ(got.b, b);
    }
    const std::uint32_t handle = begin();
    faults().clear();
    (void)succeeds([&] { return step(handle); });
    EXPECT_EQ(faults().allocations(), rows.size());
    (void)client().abort(handle);
  }
};

TEST_F(OperationMemoryTest, BeginTellsWhereTheMemoryWasShort) {
  const failure unopened = refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {no_memory, "Open key failed"});
  const failure uncreated = refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {no_memory, "Create operation failed"});
  const allocations rows = {
      {"array of the parameters", broken(TEEC_ERROR_BAD_PARAMETERS, {no_memory, "Unmarshal failed"})},
      {"application id", broken(TEEC_ERROR_BAD_PARAMETERS, {no_memory_for_the_id, "Unmarshal failed"})},
      {"copy of the blob", refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {no_memory})},
      {"plaintext", unopened},
      {"key data", unopened},
      {"array of the characteristics",
       refused(KM_ERROR_INVALID_ARGUMENT, {no_memory, "Unmarshal failed", "Open key failed"})},
      {"application id in the characteristics",
       refused(KM_ERROR_INVALID_ARGUMENT, {no_memory_for_the_id, "Unmarshal failed", "Open key failed"})},
      {"operation record", uncreated},
      {"message buffer", uncreated},
      {"response", broken(TEEC_ERROR_OUT_OF_MEMORY, {no_memory_for_no_parameters, "Marshal failed"})}};
  for (const signature_scheme& scheme : schemes) {
    for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
      SCOPED_TRACE(scheme.name);
      expect_rows(rows, canary, [&] {
        const answer begun = client().begin(purpose, blob, scheme_of(scheme), 64);
        if (begun.ok()) (void)client().abort(begun.b);
        return begun;
      });
    }
  }
}

TEST_F(OperationMemoryTest, AnOperationThatCouldNotBeAnsweredLeavesItsSlotOfThePool) {
  constexpr std::uint32_t response = 10;
  for (int i = 0; i < 17; ++i) {
    faults().fail_allocation(response);
    EXPECT_EQ(client().begin(KM_PURPOSE_SIGN, blob, scheme_of(schemes[0])).result, TEEC_ERROR_OUT_OF_MEMORY);
  }
  expect_same(idle);
  for (int i = 0; i < 16; ++i) EXPECT_TRUE(client().begin(KM_PURPOSE_SIGN, blob, scheme_of(schemes[0])).ok()) << i;
}

TEST_F(OperationMemoryTest, UpdateNeedsMemoryForItsParametersOnly) {
  for (const signature_scheme& scheme : schemes) {
    for (const std::uint32_t purpose : {KM_PURPOSE_SIGN, KM_PURPOSE_VERIFY}) {
      SCOPED_TRACE(scheme.name);
      expect_steps_lost(
          step_parameters, static_cast<std::uint32_t>(message.size()),
          [&] { return client().must_begin(purpose, blob, scheme_of(scheme)); },
          [&](std::uint32_t handle) { return client().update(handle, message, in_params, 64); });
    }
  }
}

TEST_F(OperationMemoryTest, ASignatureThatHasNoRoomIsTheFinishsFailureAndAResponseThePlatforms) {
  allocations rows = step_parameters;
  rows.push_back({"signature", refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {no_memory, "Finish failed"})});
  rows.push_back({"response", broken(TEEC_ERROR_OUT_OF_MEMORY, {no_memory_for_no_parameters, "Marshal failed"})});
  for (const signature_scheme& scheme : schemes) {
    SCOPED_TRACE(scheme.name);
    const auto begin = [&] {
      const std::uint32_t handle = client().must_begin(KM_PURPOSE_SIGN, blob, scheme_of(scheme));
      EXPECT_TRUE(client().update(handle, message).ok());
      return handle;
    };
    expect_steps_lost(rows, 0, begin,
                      [&](std::uint32_t handle) -> answer { return client().finish(handle, {}, in_params); });
  }
}

TEST_F(OperationMemoryTest, VerifyingNeedsAWorkBufferAndACopyOfTheSignature) {
  allocations rows = step_parameters;
  const failure unfinished = refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {no_memory, "Finish failed"});
  rows.push_back({"work buffer", unfinished});
  rows.push_back({"copy of the signature", unfinished});
  rows.push_back({"response", broken(TEEC_ERROR_OUT_OF_MEMORY, {no_memory_for_no_parameters, "Marshal failed"})});
  for (const signature_scheme& scheme : schemes) {
    SCOPED_TRACE(scheme.name);
    const bytes made = client().sign(blob, scheme_of(scheme), message).data;
    const auto begin = [&] {
      const std::uint32_t handle = client().must_begin(KM_PURPOSE_VERIFY, blob, scheme_of(scheme));
      EXPECT_TRUE(client().update(handle, message).ok());
      return handle;
    };
    expect_steps_lost(rows, 0, begin,
                      [&](std::uint32_t handle) -> answer { return client().finish(handle, made, in_params); });
  }
}

}  // namespace
}  // namespace testing_support
