// Persistent objects: name spaces, flags, sharing, data streams, damage.
#include <gmock/gmock.h>
#include <sqlite3.h>

#include <cstring>

#include "tee/runtime/instance_scope.h"
#include "tests/tee/world_fixture.h"

namespace hosted_tee::testing {
namespace {

constexpr std::uint32_t read_access = TEE_DATA_FLAG_ACCESS_READ;
constexpr std::uint32_t write_access = TEE_DATA_FLAG_ACCESS_WRITE;
constexpr std::uint32_t write_meta = TEE_DATA_FLAG_ACCESS_WRITE_META;
constexpr std::uint32_t share_all = TEE_DATA_FLAG_SHARE_READ | TEE_DATA_FLAG_SHARE_WRITE;

// Runs as a TA without an image: its instance is current for the whole test.
class StorageTest : public WorldTest, public ::testing::WithParamInterface<std::uint32_t> {
 protected:
  StorageTest() { enter(first_ta::uuid); }
  ~StorageTest() override { leave(); }

  void enter(const TEE_UUID& ta) {
    leave();
    self = std::make_unique<instance>(ta, 65536, world->device(), world->faults());
    scope.emplace(*self);
  }
  void leave() {
    scope.reset();
    self.reset();
  }
  void restart() {
    leave();
    start();
    enter(first_ta::uuid);
  }

  TEE_Result create(const char* id, std::string_view data, std::uint32_t flags) {
    return TEE_CreatePersistentObject(GetParam(), id, length(id), flags, nullptr, data.data(),
                                      static_cast<std::uint32_t>(data.size()), &object);
  }
  TEE_Result open(const char* id, std::uint32_t flags) {
    return TEE_OpenPersistentObject(GetParam(), id, length(id), flags, &object);
  }
  void put(const char* id, std::string_view data) {
    ASSERT_EQ(create(id, data, TEE_DATA_FLAG_OVERWRITE), TEE_SUCCESS);
    TEE_CloseObject(object);
  }
  std::string read(std::uint32_t size = 100) const {
    std::string data(size, '?');
    std::uint32_t count = 0;
    EXPECT_EQ(TEE_ReadObjectData(object, data.data(), size, &count), TEE_SUCCESS);
    data.resize(count);
    return data;
  }
  std::string content(const char* id) {
    if (open(id, read_access) != TEE_SUCCESS) return "absent";
    std::string data = read();
    TEE_CloseObject(object);
    return data;
  }
  TEE_Result write(std::string_view data) const {
    return TEE_WriteObjectData(object, data.data(), static_cast<std::uint32_t>(data.size()));
  }
  TEE_ObjectInfo info() const {
    TEE_ObjectInfo out{};
    EXPECT_EQ(TEE_GetObjectInfo1(object, &out), TEE_SUCCESS);
    return out;
  }
  /// panics tells whether `call` is a programmer error.
  static bool panics(const std::function<void()>& call) { return run_guarded(call).has_value(); }

  static std::uint32_t length(const char* id) { return static_cast<std::uint32_t>(std::strlen(id)); }

  std::unique_ptr<instance> self;
  std::optional<instance_scope> scope;
  TEE_ObjectHandle object = nullptr;
};

INSTANTIATE_TEST_SUITE_P(Both, StorageTest, ::testing::Values(TEE_STORAGE_PRIVATE, TEE_STORAGE_RPMB),
                         [](const auto& storage) { return storage.param == TEE_STORAGE_RPMB ? "Rpmb" : "Private"; });

TEST_P(StorageTest, KeepsWhatWasCreatedAcrossRestarts) {
  put("key", std::string_view("a\0b", 3));
  put("empty", "");
  restart();
  EXPECT_EQ(content("key"), std::string("a\0b", 3));
  EXPECT_EQ(content("empty"), "");
  EXPECT_EQ(open("ke", read_access), TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(object, nullptr);
}

TEST_P(StorageTest, GivesEachTaANameSpace) {
  put("key", "first's");
  enter(second_ta::uuid);
  EXPECT_EQ(content("key"), "absent");
  put("key", "second's");
  enter(first_ta::uuid);
  EXPECT_EQ(content("key"), "first's");
}

TEST_P(StorageTest, TheTwoStoragesAreSeparate) {
  put("key", "here");
  const std::uint32_t other = GetParam() == TEE_STORAGE_PRIVATE ? TEE_STORAGE_RPMB : TEE_STORAGE_PRIVATE;
  EXPECT_EQ(TEE_OpenPersistentObject(other, "key", 3, read_access, &object), TEE_ERROR_ITEM_NOT_FOUND);
  EXPECT_EQ(TEE_OpenPersistentObject(99, "key", 3, read_access, &object), TEE_ERROR_ITEM_NOT_FOUND);
}

TEST_P(StorageTest, CreatesOverAnObjectOnlyWhenTold) {
  put("key", "old");
  EXPECT_EQ(create("key", "new", read_access), TEE_ERROR_ACCESS_CONFLICT);
  EXPECT_EQ(object, nullptr);
  EXPECT_EQ(content("key"), "old");
  EXPECT_EQ(create("key", "new", read_access | TEE_DATA_FLAG_OVERWRITE), TEE_SUCCESS);
  EXPECT_EQ(read(), "new");
  EXPECT_EQ(create("key", "newer", TEE_DATA_FLAG_OVERWRITE), TEE_ERROR_ACCESS_CONFLICT) << "it is open";
}

TEST_P(StorageTest, RefusesAttributesAndFlagsThatItDoesNotKnow) {
  TEE_ObjectHandle key = nullptr;
  ASSERT_EQ(TEE_AllocateTransientObject(TEE_TYPE_AES, 128, &key), TEE_SUCCESS);
  EXPECT_EQ(TEE_CreatePersistentObject(GetParam(), "k", 1, 0, key, nullptr, 0, &object), TEE_ERROR_NOT_SUPPORTED);
  EXPECT_EQ(create("k", "", 0x8), TEE_ERROR_BAD_PARAMETERS);
  EXPECT_EQ(open("k", TEE_DATA_FLAG_OVERWRITE), TEE_ERROR_BAD_PARAMETERS);
  TEE_FreeTransientObject(key);
}

TEST_P(StorageTest, IdentifiersAreBytesUpToSixtyFour) {
  const std::string longest(64, '\0');
  EXPECT_EQ(TEE_CreatePersistentObject(GetParam(), longest.data(), 64, 0, nullptr, "", 0, &object), TEE_SUCCESS);
  EXPECT_EQ(TEE_CreatePersistentObject(GetParam(), longest.data(), 63, 0, nullptr, "", 0, &object), TEE_SUCCESS);
  EXPECT_EQ(TEE_CreatePersistentObject(GetParam(), nullptr, 0, 0, nullptr, "", 0, &object), TEE_SUCCESS);
  EXPECT_TRUE(panics([this] { (void)TEE_OpenPersistentObject(GetParam(), "", 65, 0, &object); }));
}

struct sharing_case {
  std::uint32_t first;
  std::uint32_t second;
  bool allowed;
};

TEST_P(StorageTest, HandlesShareAnObjectOnlyAsAllOfThemAllow) {
  constexpr std::uint32_t share_read = TEE_DATA_FLAG_SHARE_READ;
  constexpr std::uint32_t share_write = TEE_DATA_FLAG_SHARE_WRITE;
  put("key", "x");
  for (const auto& [first_flags, second_flags, allowed] : std::initializer_list<sharing_case>{
           {0, 0, true},
           {read_access, read_access, false},
           {read_access | share_read, read_access | share_read, true},
           {read_access | share_read, read_access, false},
           {read_access, share_read, false},
           {read_access | share_read, 0, false},
           {read_access | share_read, write_access | share_write, false},
           {read_access | share_all, write_access | share_all, true},
           {write_access | share_write, write_access | share_write, true},
           {write_access | share_write, write_access | share_read, false},
           {write_meta | share_all, 0, false},
           {share_all, write_meta | share_all, false},
       }) {
    ASSERT_EQ(open("key", first_flags), TEE_SUCCESS);
    const TEE_ObjectHandle opened_first = object;
    EXPECT_EQ(open("key", second_flags), allowed ? TEE_SUCCESS : TEE_ERROR_ACCESS_CONFLICT)
        << std::hex << first_flags << " and " << second_flags;
    if (object != nullptr) TEE_CloseObject(object);
    TEE_CloseObject(opened_first);
  }
}

TEST_P(StorageTest, SharingLooksAtAllInstancesOfTheTa) {
  put("key", "x");
  ASSERT_EQ(open("key", read_access), TEE_SUCCESS);
  instance another(first_ta::uuid, 65536, world->device(), world->faults());
  {
    const instance_scope in_another(another);
    TEE_ObjectHandle second_handle = nullptr;
    EXPECT_EQ(TEE_OpenPersistentObject(GetParam(), "key", 3, read_access, &second_handle), TEE_ERROR_ACCESS_CONFLICT);
  }
  TEE_CloseObject(object);
}

TEST_P(StorageTest, AccessThatWasNotAskedForIsAProgrammerError) {
  put("key", "x");
  ASSERT_EQ(open("key", write_access), TEE_SUCCESS);
  EXPECT_TRUE(panics([this] {
    std::uint32_t count = 0;
    (void)TEE_ReadObjectData(object, nullptr, 0, &count);
  }));
  EXPECT_TRUE(panics([this] { (void)TEE_CloseAndDeletePersistentObject1(object); }));
  EXPECT_TRUE(panics([this] { (void)TEE_RenamePersistentObject(object, "y", 1); }));
  TEE_CloseObject(object);
  ASSERT_EQ(open("key", read_access), TEE_SUCCESS);
  EXPECT_TRUE(panics([this] { (void)write("y"); }));
  EXPECT_TRUE(panics([this] { (void)TEE_TruncateObjectData(object, 0); }));
  EXPECT_TRUE(panics([] { (void)TEE_SeekObjectData(nullptr, 0, TEE_DATA_SEEK_SET); }));
}

TEST_P(StorageTest, ReadsInPiecesToTheEnd) {
  put("key", "abcdef");
  ASSERT_EQ(open("key", read_access), TEE_SUCCESS);
  EXPECT_EQ(read(4), "abcd");
  EXPECT_EQ(info().dataPosition, 4U);
  EXPECT_EQ(read(4), "ef");
  EXPECT_EQ(read(4), "");
}

TEST_P(StorageTest, WritesOverAndBehindTheStream) {
  ASSERT_EQ(create("key", "abc", read_access | write_access), TEE_SUCCESS);
  EXPECT_EQ(TEE_SeekObjectData(object, 2, TEE_DATA_SEEK_SET), TEE_SUCCESS);
  EXPECT_EQ(write("XY"), TEE_SUCCESS);
  EXPECT_EQ(TEE_SeekObjectData(object, 2, TEE_DATA_SEEK_CUR), TEE_SUCCESS);
  EXPECT_EQ(write("Z"), TEE_SUCCESS);
  EXPECT_EQ(TEE_SeekObjectData(object, 0, TEE_DATA_SEEK_SET), TEE_SUCCESS);
  EXPECT_EQ(read(), std::string("abXY\0\0Z", 7));
  EXPECT_EQ(info().dataSize, 7U);
}

TEST_P(StorageTest, TruncatesAndExtendsWithoutMovingThePosition) {
  ASSERT_EQ(create("key", "abcdef", read_access | write_access), TEE_SUCCESS);
  EXPECT_EQ(TEE_SeekObjectData(object, -1, TEE_DATA_SEEK_END), TEE_SUCCESS);
  EXPECT_EQ(TEE_TruncateObjectData(object, 2), TEE_SUCCESS);
  EXPECT_EQ(info().dataPosition, 5U);
  EXPECT_EQ(read(), "");
  EXPECT_EQ(TEE_TruncateObjectData(object, 4), TEE_SUCCESS);
  EXPECT_EQ(TEE_SeekObjectData(object, -100, TEE_DATA_SEEK_CUR), TEE_SUCCESS);
  EXPECT_EQ(read(), std::string("ab\0\0", 4));
}

TEST_P(StorageTest, PositionsAndSizesHaveTheirLimits) {
  ASSERT_EQ(create("key", "x", write_access), TEE_SUCCESS);
  EXPECT_EQ(TEE_SeekObjectData(object, 0x7FFFFFFF, TEE_DATA_SEEK_SET), TEE_SUCCESS);
  EXPECT_EQ(write("y"), TEE_ERROR_STORAGE_NO_SPACE);
  EXPECT_EQ(TEE_SeekObjectData(object, 0x7FFFFFFF, TEE_DATA_SEEK_CUR), TEE_SUCCESS);
  EXPECT_EQ(TEE_SeekObjectData(object, 1, TEE_DATA_SEEK_CUR), TEE_SUCCESS);
  EXPECT_EQ(TEE_SeekObjectData(object, 1, TEE_DATA_SEEK_CUR), TEE_ERROR_OVERFLOW);
  EXPECT_EQ(write("y"), TEE_ERROR_OVERFLOW);
  EXPECT_EQ(TEE_TruncateObjectData(object, 0xFFFFFFFF), TEE_ERROR_STORAGE_NO_SPACE);
}

TEST_P(StorageTest, TellsWhatAHandleIs) {
  ASSERT_EQ(create("key", "abc", read_access | share_all | TEE_DATA_FLAG_OVERWRITE), TEE_SUCCESS);
  const TEE_ObjectInfo told = info();
  EXPECT_EQ(told.objectType, TEE_TYPE_DATA);
  EXPECT_EQ(told.dataSize, 3U);
  EXPECT_EQ(told.dataPosition, 0U);
  EXPECT_EQ(told.keySize, 0U);
  EXPECT_EQ(told.handleFlags, read_access | share_all | TEE_HANDLE_FLAG_PERSISTENT | TEE_HANDLE_FLAG_INITIALIZED);
}

TEST_P(StorageTest, DeletesThroughAnExclusiveHandle) {
  put("key", "x");
  ASSERT_EQ(open("key", write_meta), TEE_SUCCESS);
  EXPECT_EQ(TEE_CloseAndDeletePersistentObject1(object), TEE_SUCCESS);
  EXPECT_EQ(self->objects.size(), 0U);
  EXPECT_EQ(content("key"), "absent");
  EXPECT_EQ(TEE_CloseAndDeletePersistentObject1(nullptr), TEE_SUCCESS);
}

TEST_P(StorageTest, RenamesButNotOntoAnother) {
  put("a", "of a");
  put("b", "of b");
  ASSERT_EQ(open("a", write_meta | read_access), TEE_SUCCESS);
  EXPECT_EQ(TEE_RenamePersistentObject(object, "b", 1), TEE_ERROR_ACCESS_CONFLICT);
  EXPECT_EQ(TEE_RenamePersistentObject(object, "c", 1), TEE_SUCCESS);
  EXPECT_EQ(read(), "of a");
  TEE_CloseObject(object);
  restart();
  EXPECT_EQ(content("a"), "absent");
  EXPECT_EQ(content("b"), "of b");
  EXPECT_EQ(content("c"), "of a");
}

TEST_P(StorageTest, OrderedFaultsLeaveNullHandlesAndNoCount) {
  put("key", "x");
  world->faults().fail_call("TEE_OpenPersistentObject", 1, TEE_ERROR_CORRUPT_OBJECT_2);
  EXPECT_EQ(open("key", read_access), TEE_ERROR_CORRUPT_OBJECT_2);
  EXPECT_EQ(object, nullptr);
  ASSERT_EQ(open("key", read_access), TEE_SUCCESS);
  world->faults().fail_call("TEE_ReadObjectData", 1, TEE_ERROR_GENERIC);
  std::uint32_t count = 5;
  EXPECT_EQ(TEE_ReadObjectData(object, nullptr, 0, &count), TEE_ERROR_GENERIC);
  EXPECT_EQ(count, 0U);
}

TEST_P(StorageTest, ATestCanPrepareAndExamineObjects) {
  world->write_object(first_ta::uuid, GetParam(), "key", "forty bytes that a person put here, or so");
  EXPECT_EQ(content("key"), "forty bytes that a person put here, or so");
  put("other", "from the TA");
  EXPECT_EQ(world->read_object(first_ta::uuid, GetParam(), "other"), "from the TA");
  world->delete_object(first_ta::uuid, GetParam(), "other");
  EXPECT_EQ(world->read_object(first_ta::uuid, GetParam(), "other"), std::nullopt);
  EXPECT_THROW((void)world->read_object(first_ta::uuid, 99, "other"), std::invalid_argument);
}

/// sql changes a database behind the device's back, while it is off.
void sql(const std::filesystem::path& file, const char* statement) {
  sqlite3* db = nullptr;
  ASSERT_EQ(sqlite3_open(file.c_str(), &db), SQLITE_OK);
  EXPECT_EQ(sqlite3_exec(db, statement, nullptr, nullptr, nullptr), SQLITE_OK) << sqlite3_errmsg(db);
  sqlite3_close(db);
}

class PrivateStorageTest : public StorageTest {
 protected:
  void tamper(const char* statement) {
    leave();
    world.reset();
    sql(folder.path() / "state" / "private.db", statement);
    start();
    enter(first_ta::uuid);
  }
};

INSTANTIATE_TEST_SUITE_P(Private, PrivateStorageTest, ::testing::Values(TEE_STORAGE_PRIVATE));

TEST_P(PrivateStorageTest, ATamperedRowIsACorruptObjectThatCanBeReplaced) {
  put("key", "x");
  tamper("UPDATE objects SET sealed = substr(sealed, 1, length(sealed) - 1) || x'00'");
  EXPECT_EQ(open("key", read_access), TEE_ERROR_CORRUPT_OBJECT);
  EXPECT_EQ(object, nullptr);
  tamper("UPDATE objects SET sealed = x'00'");
  EXPECT_EQ(open("key", read_access), TEE_ERROR_CORRUPT_OBJECT);
  EXPECT_EQ(create("key", "new", 0), TEE_ERROR_ACCESS_CONFLICT);
  EXPECT_EQ(create("key", "new", TEE_DATA_FLAG_OVERWRITE | read_access), TEE_SUCCESS);
  EXPECT_EQ(read(), "new");
}

TEST_P(PrivateStorageTest, ARowDoesNotOpenUnderAnotherNameOrTa) {
  put("key", "x");
  tamper("UPDATE objects SET id = CAST('yek' AS BLOB)");
  EXPECT_EQ(open("yek", read_access), TEE_ERROR_CORRUPT_OBJECT);
  EXPECT_EQ(open("key", read_access), TEE_ERROR_ITEM_NOT_FOUND);
}

TEST_P(PrivateStorageTest, NothingOfAnObjectLiesInTheFileInClear) {
  put("key", "a very secret value");
  std::string file;
  {
    leave();
    world.reset();
    std::unique_ptr<std::FILE, int (*)(std::FILE*)> in(
        std::fopen((folder.path() / "state" / "private.db").c_str(), "rb"), std::fclose);
    for (int c = 0; (c = std::fgetc(in.get())) != EOF;) file.push_back(static_cast<char>(c));
  }
  EXPECT_EQ(file.find("a very secret value"), std::string::npos);
  EXPECT_NE(file.find("SQLite"), std::string::npos);
}

TEST_P(PrivateStorageTest, ATasPersistentTimeSurvivesARestart) {
  TEE_Time time{5, 0};
  EXPECT_EQ(TEE_GetTAPersistentTime(&time), TEE_ERROR_TIME_NOT_SET);
  world->clock().set_ree({1000, 0});
  const TEE_Time noon{500, 250};
  EXPECT_EQ(TEE_SetTAPersistentTime(&noon), TEE_SUCCESS);
  restart();
  world->clock().set_ree({1060, 500});
  EXPECT_EQ(TEE_GetTAPersistentTime(&time), TEE_SUCCESS);
  EXPECT_EQ(time.seconds, 560U);
  EXPECT_EQ(time.millis, 750U);
  enter(second_ta::uuid);
  EXPECT_EQ(TEE_GetTAPersistentTime(&time), TEE_ERROR_TIME_NOT_SET);
}

}  // namespace
}  // namespace hosted_tee::testing
