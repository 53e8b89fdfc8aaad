// Keys that are bound to an application's id and data.
#include "tests/commands/keys/key_commands.h"

using namespace keymaster;

namespace testing_support {
namespace {

class ApplicationTest : public CommandTest {
 protected:
  /// expect_open and expect_mismatch try all commands with this id and data.
  void expect_open(const bytes& blob, const bytes& given_id, const bytes& given_data) {
    for (const key_command& command : key_commands()) {
      SCOPED_TRACE(command.name);
      (void)succeeds([&] { return command.call(client(), blob, given_id, given_data); });
    }
  }
  void expect_mismatch(const char* line, const bytes& blob, const bytes& given_id, const bytes& given_data) {
    for (const key_command& command : key_commands()) {
      SCOPED_TRACE(command.name);
      expect_failure(refused(KM_ERROR_INVALID_KEY_BLOB, {line, "Wrong AppId or AppData"}),
                     [&] { return command.call(client(), blob, given_id, given_data); });
    }
  }

  const bytes id = from_text("com.example.app"), data = from_text("profile 7");
  static constexpr const char* wrong_id = "KM_TAG_APPLICATION_ID mismatch";
  static constexpr const char* wrong_data = "KM_TAG_APPLICATION_DATA mismatch";
};

TEST_F(ApplicationTest, ABoundKeyOpensForItsOwnApplicationOnly) {
  const bytes blob =
      import_fixed(512, rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, id).add_blob(KM_TAG_APPLICATION_DATA, data));
  expect_open(blob, id, data);
  expect_mismatch(wrong_id, blob, {}, data);
  expect_mismatch(wrong_id, blob, flip(id, 0), data);
  expect_mismatch(wrong_id, blob, flip(id, id.size() - 1), data);
  expect_mismatch(wrong_id, blob, bytes(id.begin(), id.end() - 1), data);
  expect_mismatch(wrong_id, blob, join({id, {0}}), data);
  expect_mismatch(wrong_data, blob, id, {});
  expect_mismatch(wrong_data, blob, id, flip(data, 3));
  expect_mismatch(wrong_data, blob, id, join({data, data}));
}

TEST_F(ApplicationTest, TheIdIsLookedAtBeforeTheData) {
  const bytes blob =
      import_fixed(512, rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, id).add_blob(KM_TAG_APPLICATION_DATA, data));
  expect_mismatch(wrong_id, blob, data, id);
}

TEST_F(ApplicationTest, AKeyWithoutAnApplicationIsNotOpenedForOne) {
  const bytes blob = import_fixed(512);
  expect_open(blob, {}, {});
  expect_mismatch(wrong_id, blob, id, {});
  expect_mismatch(wrong_data, blob, {}, data);
}

TEST_F(ApplicationTest, AnEmptyIdIsAsGoodAsNone) {
  const bytes blob = import_fixed(512, rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, {}));
  expect_open(blob, {}, {});
  expect_mismatch(wrong_id, blob, id, {});
}

TEST_F(ApplicationTest, AKeyWithTwoIdsOpensForNobody) {
  const bytes twice =
      import_fixed(512, rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, id).add_blob(KM_TAG_APPLICATION_ID, id));
  expect_mismatch("Duplicated KM_TAG_APPLICATION_ID", twice, id, {});
  expect_mismatch("Duplicated KM_TAG_APPLICATION_ID", twice, {}, {});
  const bytes twice_data =
      import_fixed(512, rsa_key(512).add_blob(KM_TAG_APPLICATION_DATA, data).add_blob(KM_TAG_APPLICATION_DATA, data));
  expect_mismatch("Duplicated KM_TAG_APPLICATION_DATA", twice_data, {}, data);
  expect_mismatch(wrong_id, twice_data, id, data);
}

TEST_F(ApplicationTest, AnIdThatBeginGetsTwiceCountsAsNone) {
  const param_list twice =
      signature(KM_DIGEST_NONE, KM_PAD_NONE).add_blob(KM_TAG_APPLICATION_ID, id).add_blob(KM_TAG_APPLICATION_ID, id);
  const bytes bound = import_fixed(512, rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, id));
  expect_failure(refused(KM_ERROR_INVALID_KEY_BLOB, {wrong_id, "Wrong AppId or AppData"}),
                 [&] { return client().begin(KM_PURPOSE_SIGN, bound, twice); });
  EXPECT_TRUE(client().begin(KM_PURPOSE_SIGN, import_fixed(512), twice).ok());
}

TEST_F(ApplicationTest, DataThatBeginGetsTwiceCountsAsNone) {
  const param_list twice = signature(KM_DIGEST_NONE, KM_PAD_NONE)
                               .add_blob(KM_TAG_APPLICATION_DATA, data)
                               .add_blob(KM_TAG_APPLICATION_DATA, data);
  const bytes bound = import_fixed(512, rsa_key(512).add_blob(KM_TAG_APPLICATION_DATA, data));
  expect_failure(refused(KM_ERROR_INVALID_KEY_BLOB, {wrong_data, "Wrong AppId or AppData"}),
                 [&] { return client().begin(KM_PURPOSE_SIGN, bound, twice); });
  EXPECT_TRUE(client().begin(KM_PURPOSE_SIGN, import_fixed(512), twice).ok());
}

TEST_F(ApplicationTest, DeletingAsksForNoApplication) {
  const bytes blob = import_fixed(512, rsa_key(512).add_blob(KM_TAG_APPLICATION_ID, id));
  EXPECT_TRUE(client().delete_key(blob).ok());
}

}  // namespace
}  // namespace testing_support
