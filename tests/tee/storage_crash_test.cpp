// The stores when the process is killed in the middle of a write, and the RPMB store when somebody puts an older state
// back.
#include <gmock/gmock.h>

#include <fstream>

#include "tee/runtime/instance_scope.h"
#include "tests/tee/crash.h"
#include "tests/tee/world_fixture.h"

namespace hosted_tee::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::AnyOf;

constexpr TEE_UUID ta = first_ta::uuid;

class StoredDeviceTest : public ::testing::Test {
 protected:
  StoredDeviceTest() { options.state = folder.path() / "state"; }

  std::shared_ptr<secure_world> open() const { return secure_world::open(options); }
  void write(std::uint32_t storage, const char* id, const char* data) const {
    open()->write_object(ta, storage, id, data);
  }
  std::optional<std::string> read(std::uint32_t storage, const char* id) const {
    return open()->read_object(ta, storage, id);
  }
  /// make_file_system is the TA's own probe of the RPMB.
  TEE_Result make_file_system() const {
    const auto world = open();
    instance self(ta, 4096, world->device(), world->faults());
    const instance_scope scope(self);
    std::uint32_t state = 0;
    return TEE_RPMB_MakeFileSystem(&state);
  }
  fs::path in_state(const char* name) const { return options.state / name; }
  void save(const char* name) const {
    fs::copy_file(in_state(name), folder.path() / name, fs::copy_options::overwrite_existing);
  }
  void put_back(const char* name) const {
    fs::copy_file(folder.path() / name, in_state(name), fs::copy_options::overwrite_existing);
  }

  ::testing_support::temporary_folder folder;
  world_options options;
};

class CrashTest : public StoredDeviceTest, public ::testing::WithParamInterface<std::uint32_t> {
 protected:
  /// crash_everywhere kills `change` at each of its steps in turn, on a fresh device that holds "old"; `check` looks at
  /// what the next start finds. Answers how many steps there were.
  int crash_everywhere(const std::function<void(secure_world&)>& change, const std::function<void()>& check) const {
    int step = 0;
    for (bool died = true; died; ++step) {
      fs::remove_all(options.state);
      write(GetParam(), "key", "old");
      died = dies_at(step, [&](const step_action& at_step) {
        const auto world = open();
        world->faults().at_storage_step(at_step);
        change(*world);
      });
      SCOPED_TRACE("step " + std::to_string(step));
      EXPECT_EQ(make_file_system(), TEE_SUCCESS);
      check();
      write(GetParam(), "after", "works");
      EXPECT_EQ(read(GetParam(), "after"), "works");
      EXPECT_EQ(make_file_system(), TEE_SUCCESS);
    }
    return step - 1;
  }
  // SQLite alone has three steps; the RPMB's counter file has five for each of its two writes.
  int expected_steps() const { return GetParam() == TEE_STORAGE_RPMB ? 13 : 3; }
};

INSTANTIATE_TEST_SUITE_P(Both, CrashTest, ::testing::Values(TEE_STORAGE_PRIVATE, TEE_STORAGE_RPMB),
                         [](const auto& storage) { return storage.param == TEE_STORAGE_RPMB ? "Rpmb" : "Private"; });

TEST_P(CrashTest, AWriteIsThereWholeOrNotAtAll) {
  const int steps = crash_everywhere([](secure_world& world) { world.write_object(ta, GetParam(), "key", "new"); },
                                     [&] { EXPECT_THAT(read(GetParam(), "key"), AnyOf("old", "new")); });
  EXPECT_EQ(steps, expected_steps());
}

TEST_P(CrashTest, ADeletionToo) {
  const int steps = crash_everywhere([](secure_world& world) { world.delete_object(ta, GetParam(), "key"); },
                                     [&] { EXPECT_THAT(read(GetParam(), "key"), AnyOf("old", std::nullopt)); });
  EXPECT_EQ(steps, expected_steps());
}

TEST_P(CrashTest, AWriteThatReturnedIsThereForGood) {
  EXPECT_TRUE(dies_at(0, [&](const step_action& at_step) {
    const auto world = open();
    world->write_object(ta, GetParam(), "key", "new");
    at_step("returned");
  }));
  EXPECT_EQ(read(GetParam(), "key"), "new");
}

using RollbackTest = StoredDeviceTest;

TEST_F(RollbackTest, AnOlderDatabaseIsNoticedAndTheDeviceRunsOnWithoutRpmb) {
  write(TEE_STORAGE_RPMB, "key", "old");
  save("rpmb.db");
  write(TEE_STORAGE_RPMB, "key", "new");
  put_back("rpmb.db");
  EXPECT_EQ(make_file_system(), TEE_ERROR_SECURITY);
  EXPECT_FALSE(open()->has_rpmb());
  write(TEE_STORAGE_PRIVATE, "key", "other storage");
  EXPECT_EQ(read(TEE_STORAGE_PRIVATE, "key"), "other storage");
}

TEST_F(RollbackTest, ObjectCallsOnARolledBackStoreFail) {
  write(TEE_STORAGE_RPMB, "key", "old");
  save("rpmb.db");
  write(TEE_STORAGE_RPMB, "key", "new");
  put_back("rpmb.db");
  const auto world = open();
  instance self(ta, 4096, world->device(), world->faults());
  const instance_scope scope(self);
  TEE_ObjectHandle object = nullptr;
  EXPECT_EQ(TEE_OpenPersistentObject(TEE_STORAGE_RPMB, "key", 3, 0, &object), TEE_ERROR_STORAGE_NOT_AVAILABLE);
  EXPECT_EQ(TEE_CreatePersistentObject(TEE_STORAGE_RPMB, "new", 3, 0, nullptr, "", 0, &object),
            TEE_ERROR_STORAGE_NOT_AVAILABLE);
}

TEST_F(RollbackTest, AMissingDatabaseOrCounterIsNoticed) {
  write(TEE_STORAGE_RPMB, "key", "x");
  for (const char* name : {"rpmb.db", "rpmb.counter"}) {
    save(name);
    fs::remove(in_state(name));
    EXPECT_EQ(make_file_system(), TEE_ERROR_SECURITY) << name;
    put_back(name);
    EXPECT_EQ(make_file_system(), TEE_SUCCESS) << name;
  }
}

TEST_F(RollbackTest, AResetOfTheWholeStorageIsNoticedToo) {
  write(TEE_STORAGE_RPMB, "key", "x");
  fs::remove(in_state("rpmb.db"));
  fs::remove(in_state("rpmb.counter"));
  EXPECT_EQ(make_file_system(), TEE_ERROR_SECURITY);
}

TEST_F(RollbackTest, ADeviceThatBeganWithoutRpmbCanGetItLater) {
  options.rpmb = false;
  (void)open();
  options.rpmb = true;
  EXPECT_EQ(make_file_system(), TEE_SUCCESS);
}

TEST_F(RollbackTest, ADamagedDatabaseOrCounterIsNoticed) {
  write(TEE_STORAGE_RPMB, "key", "x");
  for (const char* name : {"rpmb.db", "rpmb.counter"}) {
    save(name);
    std::ofstream(in_state(name), std::ios::trunc) << "neither a database nor a sealed record";
    EXPECT_EQ(make_file_system(), TEE_ERROR_SECURITY) << name;
    put_back(name);
    EXPECT_EQ(make_file_system(), TEE_SUCCESS) << name;
  }
}

TEST_F(RollbackTest, AnOlderCounterBesideTheLatestDatabaseIsNoticed) {
  write(TEE_STORAGE_RPMB, "key", "old");
  save("rpmb.counter");
  write(TEE_STORAGE_RPMB, "key", "new");
  put_back("rpmb.counter");
  EXPECT_EQ(make_file_system(), TEE_ERROR_SECURITY);
}

TEST_F(RollbackTest, AnotherDevicesFilesAreNotAccepted) {
  write(TEE_STORAGE_RPMB, "key", "x");
  save("rpmb.db");
  save("rpmb.counter");
  fs::remove_all(options.state);
  (void)open();
  put_back("rpmb.db");
  put_back("rpmb.counter");
  EXPECT_EQ(make_file_system(), TEE_ERROR_SECURITY);
}

// A crash between announcement and commit leaves an announced state that never came to be; the next start settles it,
// so that the state before is the only one from then on.
TEST_F(RollbackTest, AnAnnouncedWriteThatCrashedIsForgottenByTheNextStart) {
  write(TEE_STORAGE_RPMB, "key", "old");
  EXPECT_TRUE(dies_at(0, [&](const step_action& at_step) {
    const auto world = open();
    world->faults().at_storage_step([&](std::string_view step) {
      if (step == "rpmb:commit") at_step(step);
    });
    world->write_object(ta, TEE_STORAGE_RPMB, "key", "new");
  }));
  EXPECT_EQ(read(TEE_STORAGE_RPMB, "key"), "old");
  save("rpmb.db");
  write(TEE_STORAGE_RPMB, "key", "newer");
  put_back("rpmb.db");
  EXPECT_EQ(make_file_system(), TEE_ERROR_SECURITY);
}

TEST_F(RollbackTest, ADeviceWithoutRpmbSaysSo) {
  write(TEE_STORAGE_RPMB, "key", "x");
  options.rpmb = false;
  EXPECT_EQ(make_file_system(), TEE_ERROR_NOT_SUPPORTED);
  const auto world = open();
  instance self(ta, 4096, world->device(), world->faults());
  {
    const instance_scope scope(self);
    TEE_ObjectHandle object = nullptr;
    EXPECT_EQ(TEE_OpenPersistentObject(TEE_STORAGE_RPMB, "key", 3, 0, &object), TEE_ERROR_ITEM_NOT_FOUND);
    EXPECT_EQ(TEE_RPMB_MakeFileSystem(nullptr), TEE_ERROR_BAD_PARAMETERS);
  }
  EXPECT_FALSE(world->has_rpmb());
}

TEST_F(RollbackTest, SwitchingRpmbOffAndOnKeepsItsContent) {
  write(TEE_STORAGE_RPMB, "key", "x");
  options.rpmb = false;
  (void)open();
  options.rpmb = true;
  EXPECT_EQ(read(TEE_STORAGE_RPMB, "key"), "x");
}

}  // namespace
}  // namespace hosted_tee::testing
