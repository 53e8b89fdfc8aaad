// The state folder: one holder, one version, one device, whatever happens.
#include <gmock/gmock.h>

#include <fstream>
#include <sstream>
#include <thread>

#include "tee/runtime/uuid.h"
#include "tests/tee/crash.h"
#include "tests/tee/world_fixture.h"

namespace hosted_tee::testing {
namespace {

namespace fs = std::filesystem;
using ::testing::EndsWith;
using ::testing::HasSubstr;
using ::testing::Not;

class StateFolderTest : public ::testing::Test {
 protected:
  StateFolderTest() { options.state = folder.path() / "a" / "state"; }

  std::shared_ptr<secure_world> open() const { return secure_world::open(options); }

  /// fault tells why the folder can't be opened, with the message.
  std::pair<std::optional<world_fault>, std::string> fault() const {
    try {
      (void)open();
      return {std::nullopt, ""};
    } catch (const world_error& error) {
      return {error.fault(), error.what()};
    }
  }
  void write(const char* name, std::string_view content) const { std::ofstream(options.state / name) << content; }
  std::string read(const char* name) const {
    std::ostringstream out;
    out << std::ifstream(options.state / name).rdbuf();
    return out.str();
  }

  ::testing_support::temporary_folder folder;
  world_options options;
};

TEST_F(StateFolderTest, IsMadeForItsOwnerAlone) {
  (void)open();
  EXPECT_EQ(fs::status(options.state).permissions(), fs::perms::owner_all);
  for (const char* name : {"device", "private.db", "rpmb.db", "rpmb.counter", "lock", "version"}) {
    EXPECT_EQ(fs::status(options.state / name).permissions() & fs::perms::all,
              fs::perms::owner_read | fs::perms::owner_write)
        << name;
  }
}

TEST_F(StateFolderTest, KeepsTheDevicesIdentityAndDrawsItOnce) {
  const TEE_UUID first = open()->device_id();
  EXPECT_TRUE(same_uuid(open()->device_id(), first));
  fs::remove_all(options.state);
  EXPECT_FALSE(same_uuid(open()->device_id(), first));
}

TEST_F(StateFolderTest, EveryStartHasABootSeedOfItsOwn) {
  const auto first = open()->boot_seed();
  EXPECT_NE(open()->boot_seed(), first);
  options.boot_seed.emplace().fill(9);
  EXPECT_EQ(open()->boot_seed(), *options.boot_seed);
}

TEST_F(StateFolderTest, HasOneHolderAtATime) {
  const auto held = open();
  EXPECT_EQ(fault().first, world_fault::busy);
  EXPECT_TRUE(dies_at(0, [&](const step_action& step) {
    try {
      // Another process does not share the first one's list of devices; open_shared must find the lock.
      world_options elsewhere = options;
      fs::create_directory_symlink(options.state, folder.path() / "link");
      elsewhere.state = folder.path() / "link";
      (void)secure_world::open(elsewhere);
    } catch (const world_error& error) {
      if (error.fault() == world_fault::busy) step("busy");
    }
  }));
}

TEST_F(StateFolderTest, IsSharedInsideOneProcessUnderAnyOfItsNames) {
  const auto shared = secure_world::open_shared(options);
  EXPECT_EQ(secure_world::find_open(options.state), shared);
  EXPECT_EQ(secure_world::find_open(folder.path() / "a" / "." / "state" / ""), shared);
  fs::create_directory_symlink(folder.path() / "a", folder.path() / "b");
  world_options other = options;
  other.state = folder.path() / "b" / "state";
  EXPECT_EQ(secure_world::open_shared(other), shared);
}

TEST_F(StateFolderTest, IsFreeAgainWhenTheLastPointerGoes) {
  secure_world::open_shared(options).reset();
  EXPECT_EQ(secure_world::find_open(options.state), nullptr);
  EXPECT_EQ(fault().first, std::nullopt);
}

TEST_F(StateFolderTest, ThreadsThatComeAndGoNeverFindItBusy) {
  const auto come_and_go = [&] {
    for (int i = 0; i < 50; ++i) EXPECT_NO_THROW((void)secure_world::open_shared(options));
  };
  std::thread other(come_and_go);
  come_and_go();
  other.join();
}

TEST_F(StateFolderTest, OfANewerVersionIsRefusedUntouched) {
  (void)open();
  write("version", "2\n");
  const std::string device = read("device");
  EXPECT_EQ(fault().first, world_fault::newer);
  EXPECT_EQ(read("version"), "2\n");
  EXPECT_EQ(read("device"), device);
}

TEST_F(StateFolderTest, WithDamagedFilesIsRefused) {
  (void)open();
  const std::string device = read("device");
  for (const auto& [name, content] : {std::pair{"version", ""},
                                      {"version", "one"},
                                      {"version", "1x"},
                                      {"version", "0"},
                                      {"device", ""},
                                      {"device", "device-id = 7\n"},
                                      {"private.db", "not a database"}}) {
    const std::string before = read(name);
    write(name, content);
    const bool is_text = name != std::string("private.db");
    EXPECT_EQ(fault().first, is_text ? world_fault::malformed : world_fault::corrupt) << name << ": " << content;
    write(name, before);
  }
  EXPECT_EQ(fault().first, std::nullopt);
  fs::remove(options.state / "version");
  EXPECT_EQ(fault().first, world_fault::corrupt);
}

TEST_F(StateFolderTest, OfSomethingElseIsLeftAsItIs) {
  fs::create_directories(options.state);
  for (const char* name : {"letter", "other.tee-new", "private.db", ".hidden"}) {
    write(name, "precious");
    const auto [why, message] = fault();
    EXPECT_EQ(why, world_fault::foreign) << name;
    EXPECT_EQ(message, options.state.string() + " is neither empty nor a device's state");
    EXPECT_EQ(read(name), "precious");
    EXPECT_EQ(std::distance(fs::directory_iterator(options.state), fs::directory_iterator()), 1) << name;
    fs::remove(options.state / name);
  }
}

TEST_F(StateFolderTest, MayHoldSettingsAndWhatACrashLeftBeforeItsFirstStart) {
  fs::create_directories(options.state);
  write("settings", "rpmb = off\n");
  write("lock", "");
  write("version.tee-new", "1");
  EXPECT_FALSE(open()->has_rpmb());
  EXPECT_FALSE(fs::exists(options.state / "version.tee-new"));
  write("letter", "of a person who knows");
  EXPECT_EQ(fault().first, std::nullopt) << "once it is a device's state, more files do no harm";
}

TEST_F(StateFolderTest, ThatCantBeMadeIsAnIoFault) {
  std::ofstream(folder.path() / "a") << "a file in the way";
  EXPECT_EQ(fault().first, world_fault::io);
}

TEST_F(StateFolderTest, TakesSettingsThatAPersonWrote) {
  (void)open();
  write("settings",
        "# for a demonstration\n\nrpmb = off\ndevice-id = 00112233-4455-6677-8899-aabbccddeeff\n"
        "gpd.tee.trustedos.manufacturer = Somebody & Sons\n");
  const auto world = open();
  EXPECT_FALSE(world->has_rpmb());
  EXPECT_EQ(to_text(world->device_id()), "00112233-4455-6677-8899-aabbccddeeff");
  EXPECT_EQ(world->device().text_properties.at("gpd.tee.trustedos.manufacturer"), "Somebody & Sons");
}

TEST_F(StateFolderTest, OptionsOfATestGoBeforeSettings) {
  (void)open();
  write("settings", "rpmb = off\n");
  options.rpmb = true;
  options.device_id = TEE_UUID{1, 2, 3, {}};
  const auto world = open();
  EXPECT_TRUE(world->has_rpmb());
  EXPECT_TRUE(same_uuid(world->device_id(), *options.device_id));
}

TEST_F(StateFolderTest, NamesTheSettingThatItDoesNotKnow) {
  (void)open();
  for (const char* line : {"rpmb = maybe", "rpbm = off", "rpmb", "device-id = 7"}) {
    write("settings", std::string("# a comment\n") + line + "\n");
    const auto [why, message] = fault();
    EXPECT_EQ(why, world_fault::malformed);
    EXPECT_THAT(message, EndsWith(std::string("settings: can't make sense of line 2: ") + line));
  }
}

TEST_F(StateFolderTest, RefusesTwoSettingsOfOneName) {
  (void)open();
  for (const char* lines : {"rpmb = on\nrpmb = off", "rpmb = off\nrpmb = off",
                            "device-id = 00112233-4455-6677-8899-aabbccddeeff\n"
                            "device-id = 00112233-4455-6677-8899-aabbccddeeff",
                            "gpd.tee.description = a\ngpd.tee.description = b"}) {
    write("settings", lines);
    const auto [why, message] = fault();
    EXPECT_EQ(why, world_fault::malformed) << lines;
    EXPECT_THAT(message, HasSubstr("line 2"));
  }
}

TEST_F(StateFolderTest, AMalformedDeviceFileIsToldWithoutTheKeyInIt) {
  (void)open();
  const std::string device = read("device");
  const std::string key = device.substr(device.find("storage-key = ") + 14, 64);
  for (const std::string& content : {device + "0", "device-id = 7\n" + device, key, "storage-key = " + key + "0"}) {
    write("device", content);
    const auto [why, message] = fault();
    EXPECT_EQ(why, world_fault::malformed);
    EXPECT_THAT(message, HasSubstr("device"));
    EXPECT_THAT(message, Not(HasSubstr(key.substr(0, 8))));
  }
}

TEST_F(StateFolderTest, AnRpmbThatCantBeReadHasNotPassedItsCheck) {
  const auto world = open();
  // More than the database keeps in memory, so that it has to read.
  world->write_object(::testing_support::keymaster_ta, TEE_STORAGE_RPMB, "large", std::string(8U << 20, 'x'));
  EXPECT_TRUE(world->has_rpmb());
  write("rpmb.db", std::string(4096, '?'));
  EXPECT_FALSE(world->has_rpmb());
}

TEST_F(StateFolderTest, IsCompletedAfterACrashAtAnyStepOfItsMaking) {
  int step = 0;
  while (dies_at(step, [&](const step_action& at_step) {
    world_options first_start = options;
    first_start.at_storage_step = at_step;
    (void)secure_world::open(first_start);
  })) {
    const auto [why, message] = fault();
    EXPECT_EQ(why, std::nullopt) << "after step " << step << ": " << message;
    EXPECT_TRUE(open()->has_rpmb()) << "after step " << step;
    fs::remove_all(options.state);
    ++step;
  }
  EXPECT_GT(step, 15);
}

}  // namespace
}  // namespace hosted_tee::testing
