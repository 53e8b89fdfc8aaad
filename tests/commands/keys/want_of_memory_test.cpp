// Want of memory in the commands on keys: which of the two levels of error tells it, and what the trace says.
#include <fmt/format.h>

#include "tests/commands/want_of_memory.h"

using namespace keymaster;

namespace testing_support {
namespace {

class KeyMemoryTest : public WantOfMemoryTest {
 protected:
  static constexpr const char* not_saved = "Can't save key to TEE storage";
  const param_list bound = rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, app_id);
  const failure unknown = refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {no_memory});

  static std::string needs(const param_list& params) {
    return fmt::format("Out of memory, need {}B", params.marshal().size());
  }

  /// The allocations of a request's parameters: the array, and the application id.
  allocations parameters() const {
    return {{"array of the parameters", broken(TEEC_ERROR_BAD_PARAMETERS, {no_memory, "Unmarshal failed"})},
            {"application id", broken(TEEC_ERROR_BAD_PARAMETERS, {no_memory_for_the_id, "Unmarshal failed"})}};
  }

  /// Those of sealing a key with these characteristics.
  static allocations sealing(const param_list& characteristics) {
    return {{"characteristics as bytes",
             broken(TEEC_ERROR_OUT_OF_MEMORY, {needs(characteristics), "Marshal failed", not_saved})},
            {"blob", broken(TEEC_ERROR_OUT_OF_MEMORY, {no_memory, not_saved})}};
  }

  /// Those of opening a bound key for its application.
  allocations opening() const {
    const failure unopened = refused(KM_ERROR_MEMORY_ALLOCATION_FAILED, {no_memory, "Open key failed"});
    return {{"copy of the blob", unknown},
            {"copy of the application id", unknown},
            {"copy of the application data", unknown},
            {"plaintext", unopened},
            {"key data", unopened},
            {"array of the characteristics",
             refused(KM_ERROR_INVALID_ARGUMENT, {no_memory, "Unmarshal failed", "Open key failed"})},
            {"application id in the characteristics",
             refused(KM_ERROR_INVALID_ARGUMENT, {no_memory_for_the_id, "Unmarshal failed", "Open key failed"})}};
  }

  static allocations join_rows(std::initializer_list<allocations> parts) {
    allocations all;
    for (const allocations& part : parts) all.insert(all.end(), part.begin(), part.end());
    return all;
  }
};

TEST_F(KeyMemoryTest, GeneratingTellsTheScratchBufferFromTheKeyData) {
  const param_list stored = param_list(bound).add(KM_TAG_ORIGIN, KM_ORIGIN_GENERATED);
  const allocations making = {{"room for the origin", unknown},
                              {"scratch buffer", unknown},
                              {"key data", broken(TEEC_ERROR_OUT_OF_MEMORY, {no_memory})}};
  expect_rows(join_rows({parameters(), making, sealing(stored)}), 0, [&] { return client().generate(bound, 2048); });
}

TEST_F(KeyMemoryTest, ImportingNeedsMemoryForAllThatItAdds) {
  const param_list sent = param_list(bound).remove(KM_TAG_KEY_SIZE).remove(KM_TAG_RSA_PUBLIC_EXPONENT);
  const param_list stored =
      param_list(bound).add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED);  // in another order, of the same size
  const param_list answered = param_list(stored).remove(KM_TAG_APPLICATION_ID);
  const allocations making = {{"copy of the material", unknown},
                              {"room for the origin", unknown},
                              {"room for the key size", unknown},
                              {"room for the exponent", unknown},
                              {"key data", unknown}};
  const allocations answering = {{"response", broken(TEEC_ERROR_OUT_OF_MEMORY, {needs(answered), "Marshal failed"})}};
  expect_rows(join_rows({parameters(), making, sealing(stored), answering}), 0,
              [&] { return client().import_key(sent, rsa_test_key::of_bits(512).material(), 2048); });
}

TEST_F(KeyMemoryTest, LookingAtAKeyTellsWhichPartOfItsBlobHadNoRoom) {
  const bytes blob = import_fixed(512, bound);
  const param_list shown = rsa_key(512).add(KM_TAG_ORIGIN, KM_ORIGIN_IMPORTED);
  const allocations answering = {{"response", broken(TEEC_ERROR_OUT_OF_MEMORY, {needs(shown), "Marshal failed"})}};
  const allocations rows = join_rows({opening(), answering});
  expect_rows(rows, canary, [&] { return client().characteristics(blob, app_id, {}, 1024); });

  // The same with the size alone, which is the answer's `b`.
  expect_rows(rows, canary, [&] { return client().characteristics_size(blob, app_id); });
}

TEST_F(KeyMemoryTest, ExportingNeedsNoMemoryOfTheTaBesideTheKey) {
  const bytes blob = import_fixed(512, bound);
  expect_rows(opening(), canary, [&] { return client().export_key(blob, app_id, {}, 1024); });
}

TEST_F(KeyMemoryTest, DeletingNeedsNone) {
  const bytes blob = import_fixed(512, bound);
  expect_rows({}, canary, [&] { return client().delete_key(blob); });
  expect_rows({}, canary, [&] { return client().delete_all(); });
}

}  // namespace
}  // namespace testing_support
